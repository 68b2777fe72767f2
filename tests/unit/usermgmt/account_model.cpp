// tests/unit/usermgmt/account_model.cpp: what operations have to leave in memory and on disk,
// worked out by rules of its own.
#include "tests/unit/usermgmt/account_model.h"

#include <algorithm>

static guint32 type_of_uid(guint32 uid) {
    if (uid == 65534)
        return 5;
    return uid == 0 ? 1 : uid < 500 ? 2 : uid < 1000 ? 3 : uid <= 60000 ? 4 : 0;
}

static guint32 type_of_gid(guint32 gid) {
    if (gid >= 60001 && gid <= 60010)
        return 5;
    return gid == 0 ? 1 : gid < 500 ? 2 : gid < 1000 ? 3 : gid == 65534 ? 4 : 0;
}

std::string cheap_hash(const char *clear_text, const char *setting) {
    const std::string old = setting;
    const std::size_t salt_end = old.size() > 3 ? old.find('$', 3) : std::string::npos;
    if (old[0] != '$' || salt_end == std::string::npos || std::string(clear_text).size() > 511)
        return "*0";
    const std::string prefix = old.substr(0, salt_end + 1);
    guint64 sum = 14695981039346656037U;
    for (const char c : prefix + clear_text)
        sum = (sum ^ static_cast<unsigned char>(c)) * 1099511628211U;
    const std::string digits = std::to_string(sum);
    return prefix + std::string(43 - digits.size(), 'H') + digits;
}

account_model::account_model(account_lines files, guint32 open_flags)
    : open_flags_(open_flags), disk_(std::move(files)) {
    reopen();
}

void account_model::reopen() {
    cache_ = disk_;
    has_shadow_ = disk_.has_shadow;
    load_groups();
    load_users();
    reloaded_ = true;
    std::fill(std::begin(replaced_), std::end(replaced_), false);
}

void account_model::load_groups() {
    groups_.clear();
    groups_dirty_ = false;
    for (const group_line &line : (no_cache() ? disk_ : cache_).group) {
        const guint32 type = type_of_gid(line.gid);
        if (type == 0 || group(line.name) != nullptr)
            continue;
        groups_.push_back({type, line.name, line.password.empty() ? optional_text() : line.password,
                           line.gid, line.members});
    }
}

void account_model::load_users() {
    const account_lines &source = no_cache() ? disk_ : cache_;
    users_.clear();
    users_dirty_ = false;
    for (const passwd_line &line : source.passwd) {
        const bool shadowed = line.password == "x";
        const auto secret =
            std::find_if(source.shadow.begin(), source.shadow.end(),
                         [&line](const shadow_line &other) { return other.name == line.name; });
        const bool has_secret = has_shadow_ && secret != source.shadow.end();
        const guint32 type = type_of_uid(line.uid);
        if (type == 0 || group_of(line.gid) == nullptr || (shadowed && !has_secret))
            continue;
        users_.push_back({type, shadowed, line.name, shadowed ? secret->password : line.password,
                          line.gecos, line.home, line.shell, line.uid, line.gid,
                          shadowed ? secret->days * 86400 : 0});
    }
}

void account_model::reload(guint32 mask, const operation_result &result) {
    const bool users = (mask & (LOAD_PASSWD | LOAD_SHADOW)) != 0;
    if (!result.groups_unread && ((mask & LOAD_GROUP) != 0 || (users && no_cache())))
        load_groups();
    if (!result.users_unread && users)
        load_users();
    reloaded_ = reloaded_ || mask != 0;
}

static std::string comment_in_line(std::string text) {
    std::replace_if(
        text.begin(), text.end(), [](char c) { return c == ':' || c == '\n'; }, ' ');
    return text;
}

void account_model::write(int rows) {
    std::vector<passwd_line> passwd;
    std::vector<shadow_line> shadow;
    std::vector<group_line> group;
    for (const model_user &user : users_) {
        const std::string password = user.password.value_or("*");
        passwd.push_back({user.name, user.shadowed ? "x" : password, user.uid, user.gid,
                          comment_in_line(user.gecos.value_or("")), user.home.value_or(""),
                          user.shell.value_or("")});
        if (user.shadowed)
            shadow.push_back({user.name, password, user.last_change / 86400});
    }
    for (const model_group &one : groups_)
        group.push_back({one.name, one.password.value_or(""), one.gid, one.members});

    const auto replace = [this, rows](int row, bool dirty, auto *kept, auto now) {
        replaced_[row] = dirty && row < rows;
        if (!replaced_[row])
            return;
        *kept = std::move(now);
        disk_.texts[row] = as_text(*kept);
    };
    replace(CORE_FILE_ROW_PASSWD, users_dirty_, &disk_.passwd, std::move(passwd));
    replace(CORE_FILE_ROW_SHADOW, users_dirty_, &disk_.shadow, std::move(shadow));
    replace(CORE_FILE_ROW_GROUP, groups_dirty_, &disk_.group, std::move(group));
}

void account_model::follow(const operation &what, const operation_result &result) {
    const bool shadow_missing =
        result.error.find("could not stat() core file at 'etc/shadow'") != std::string::npos &&
        !disk_.has_shadow;
    reloaded_ = false;
    std::fill(std::begin(replaced_), std::end(replaced_), false);
    if (!result.succeeded && !result.fault_struck && !shadow_missing) {
        refused(what, result);
        return;
    }
    require(what.account.has_value(), "did something without a name");
    const write_request request = objection_.empty() ? change(what, result) : write_request();
    if (!request.wanted)
        return;
    require(!(result.succeeded && users_dirty_ && !disk_.has_shadow), "wrote a missing file");
    if (result.succeeded) {
        write(CORE_FILE_COUNT);
        users_dirty_ = false;
        groups_dirty_ = false;
    } else {
        write(result.fault_struck ? what.fault->replaced : 0);
        reload(request.mask, result);
    }
}

void account_model::require(bool condition, const char *text) {
    if (!condition && objection_.empty())
        objection_ = text;
}

model_user *account_model::user(const std::string &name) {
    for (model_user &user : users_)
        if (user.name == name)
            return &user;
    return nullptr;
}

model_group *account_model::group(const std::string &name) {
    for (model_group &group : groups_)
        if (group.name == name)
            return &group;
    return nullptr;
}

model_group *account_model::group_of(guint32 gid) {
    for (model_group &group : groups_)
        if (group.gid == gid)
            return &group;
    return nullptr;
}

static std::string shown(const char *text) {
    return text != nullptr ? "'" + std::string(text) + "'" : "none";
}

static bool is_same(const optional_text &expected, const char *text) {
    return expected ? text != nullptr && *expected == text : text == nullptr;
}

static bool is_same_user(const model_user &expected, const internal_user *user) {
    return expected.name == user->name && expected.type == user->type &&
           expected.shadowed == (user->shadowed != FALSE) && expected.uid == user->uid &&
           expected.gid == user->gid && expected.last_change == user->last_change &&
           is_same(expected.password, user->password) && is_same(expected.gecos, user->gecos) &&
           is_same(expected.home, user->home) && is_same(expected.shell, user->shell);
}

static bool is_same_group(const model_group &expected, const internal_group *group) {
    bool same = expected.name == group->name && expected.type == group->type &&
                expected.gid == group->gid && is_same(expected.password, group->password) &&
                expected.members.size() == g_hash_table_size(group->members);
    for (const std::string &member : expected.members)
        same = same && g_hash_table_contains(group->members, member.c_str());
    return same;
}

std::string account_model::difference_from(const usermgmt_ctx *ctx) const {
    const user_database &user_db = ctx->user_db;
    const group_database &group_db = ctx->group_db;
    if (user_db.entries->len != users_.size() || group_db.entries->len != groups_.size())
        return std::to_string(user_db.entries->len) + " users and " +
               std::to_string(group_db.entries->len) + " groups instead of " +
               std::to_string(users_.size()) + " and " + std::to_string(groups_.size());
    if (g_hash_table_size(user_db.name_hash) != users_.size() ||
        g_hash_table_size(group_db.name_hash) != groups_.size() ||
        g_hash_table_size(group_db.gid_hash) != groups_.size())
        return "an index has another size than its records";
    if ((user_db.dirty != FALSE) != users_dirty_ || (group_db.dirty != FALSE) != groups_dirty_)
        return "users dirty " + std::to_string(user_db.dirty) + ", groups dirty " +
               std::to_string(group_db.dirty);

    auto expected_user = users_.begin();
    for (const internal_user *user : records<const internal_user>(user_db.entries)) {
        if (user_database_find(&user_db, user->name) != user)
            return "user " + shown(user->name) + " is not in its index";
        if (!is_same_user(*expected_user, user))
            return "user '" + expected_user->name + "' is now " + shown(user->name) + " password " +
                   shown(user->password) + " gid " + std::to_string(user->gid) + " gecos " +
                   shown(user->gecos) + " shell " + shown(user->shell);
        ++expected_user;
    }
    auto expected_group = groups_.begin();
    for (const internal_group *group : records<const internal_group>(group_db.entries)) {
        if (group_database_find(&group_db, group->name) != group ||
            group_database_find_gid(&group_db, group->gid) != group)
            return "group " + shown(group->name) + " is not in its indexes";
        if (!is_same_group(*expected_group, group))
            return "group '" + expected_group->name + "' is now " + shown(group->name) + " with " +
                   std::to_string(g_hash_table_size(group->members)) + " members";
        ++expected_group;
    }
    return "";
}
