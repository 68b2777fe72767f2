// check/line_review.cpp: compares the lines of the account files with what a write makes of them.
#include "check/line_review.h"

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <map>
#include <set>

#include "check/hash_cost.h"
#include "usermgmt/account_types.h"

static constexpr std::size_t PASSWORD = 1, MEMBERS = 3, FIRST_AGE = 3;
static constexpr const char *ELSEWHERE = "x";
static constexpr const char *LOCKED = "*";

static constexpr const char *passwd_fields[] = {"name",    "password",       "UID",  "GID",
                                                "comment", "home directory", "shell"};
static constexpr const char *shadow_fields[] = {
    "name",           "password",          "day of the last change", "minimum age", "maximum age",
    "warning period", "inactivity period", "expiration day",         "flag"};
static constexpr const char *group_fields[] = {"name", "password", "GID", "members"};
static constexpr std::span<const char *const> field_names[] = {passwd_fields, shadow_fields,
                                                               group_fields};

using names = std::set<std::string, std::less<>>;

class line_review {
  public:
    line_review(const account_files &files, const usermgmt_ctx *ctx, findings *out)
        : files_(files), ctx_(ctx), out_(out) {}
    void run();

  private:
    void add(gravity weight, const char *kind, int row, const account_line &line, std::string text,
             bool has_account = true);
    void review_others(int row);
    void review_malformed(int row, const account_line &line);
    void review_passwd();
    void review_shadow();
    void review_order();
    void review_groups();
    void explain_lost_user(const account_line &line);
    void explain_lost_group(const account_line &line);
    void compare(int row, const account_line &line, const void *record);
    void review_members(const account_line &line);
    void review_twice(int row, const char *what);
    void review_hash(int row, const account_line &line);
    void review_root();

    const account_files &files_;
    const usermgmt_ctx *ctx_;
    findings *out_;
    names shadowed_;  // the users that keep a line in the shadow file
    names users_;     // those with a line in passwd
    names shadow_names_;
};

void line_review::add(gravity weight, const char *kind, int row, const account_line &line,
                      std::string text, bool has_account) {
    out_->add({weight, kind, core_file_table[row].path, line.number, has_account ? line.name : "",
               std::move(text)});
}

// Nobody can log in by it, but it may have been meant for an account.
void line_review::review_malformed(int row, const account_line &line) {
    const bool looks_like_account = row != CORE_FILE_ROW_SHADOW && !line.field(0).empty() &&
                                    line.field_count() >= std::size(group_fields);
    out_->add({looks_like_account ? gravity::LOSS : gravity::CHANGE, "malformed-line",
               core_file_table[row].path, line.number,
               looks_like_account ? std::string(line.field(0)) : "",
               "no entry by the C library's rules; a write drops the line"});
}

// Lines that are no entries, and a last line without its end.
void line_review::review_others(int row) {
    for (const account_line &line : files_.lines[row]) {
        if (line.is_entry)
            continue;
        const std::size_t first = line.text.find_first_not_of(" \t");
        if (first == std::string::npos)
            add(gravity::CHANGE, "blank-line", row, line, "a blank line, which a write drops",
                false);
        else if (line.text[first] == '#')
            add(gravity::CHANGE, "comment", row, line, "a comment, which a write drops", false);
        else
            review_malformed(row, line);
    }
    if (!files_.has_last_end[row])
        add(gravity::CHANGE, "no-line-end", row, files_.lines[row].back(),
            "the last line has no end; a write adds it", false);
}

// What becomes of a field, in words; empty where it means the same.
static std::string change_of_field(int row, std::size_t index, const account_line &line,
                                   std::string_view written) {
    const std::string_view old = line.field(index);
    if (old == written)
        return "";
    if (row == CORE_FILE_ROW_GROUP && index == MEMBERS) {  // of a set, whose order means nothing
        const auto &members = line.members;
        const bool is_repeated =
            std::adjacent_find(members.begin(), members.end()) != members.end();
        return is_repeated ? "each member is listed once" : "";
    }
    const std::string name = field_names[row][index];
    if (index != PASSWORD)
        return "the " + name + " \"" + std::string(old) + "\" becomes \"" + std::string(written) +
               "\"";
    return written == ELSEWHERE || written == LOCKED
               ? "the password field becomes \"" + std::string(written) + "\""
               : "the password field becomes another";
}

void line_review::compare(int row, const account_line &line, const void *record) {
    account_line written = {line.number, ""};
    if (!write_account_line(core_file_table[row], record, &written.text)) {
        add(gravity::UNUSABLE, "unwritable", row, line,
            std::string("cannot be written, and so no change of any account can: ") +
                g_strerror(errno));
        return;
    }
    std::string changes;
    bool is_ageing = row == CORE_FILE_ROW_SHADOW;
    for (std::size_t i = 0; i < field_names[row].size(); i++) {
        const std::string change = change_of_field(row, i, line, written.field(i));
        if (change.empty())
            continue;
        is_ageing = is_ageing && i >= FIRST_AGE;
        changes += (changes.empty() ? "" : "; ") + change;
    }
    if (line.field_count() > field_names[row].size())
        changes +=
            (changes.empty() ? std::string() : "; ") + "what follows the last field is dropped";
    if (!changes.empty())
        add(gravity::CHANGE, is_ageing ? "ageing" : "fields", row, line, changes);
}

void line_review::explain_lost_user(const account_line &line) {
    if (line.field(PASSWORD) == ELSEWHERE && !shadow_names_.contains(line.name))
        add(gravity::LOSS, "no-shadow-line", CORE_FILE_ROW_PASSWD, line,
            "a write drops the user: its password is in the shadow file, which has no line of it");
    else if (group_database_find_gid(&ctx_->group_db, line.primary_group) == nullptr)
        add(gravity::LOSS, "no-primary-group", CORE_FILE_ROW_PASSWD, line,
            "a write drops the user: no group that is kept has its GID " +
                std::to_string(line.primary_group));
    else if (user_type_of_uid(line.id) == 0)
        add(gravity::LOSS, "uid-out-of-range", CORE_FILE_ROW_PASSWD, line,
            "a write drops the user: the UID " + std::to_string(line.id) +
                " is in no range of this device");
    else
        add(gravity::LOSS, "dropped", CORE_FILE_ROW_PASSWD, line, "a write drops the user");
}

void line_review::explain_lost_group(const account_line &line) {
    if (group_type_of_gid(line.id) == 0)
        add(gravity::LOSS, "gid-out-of-range", CORE_FILE_ROW_GROUP, line,
            "a write drops the group: the GID " + std::to_string(line.id) +
                " is in no range of this device");
    else
        add(gravity::LOSS, "repeated-group", CORE_FILE_ROW_GROUP, line,
            "a write drops this line: the group stands in an earlier one");
}

static bool is_of(const account_line &line, const internal_user *user) {
    return line.name == user->name && line.id == user->uid && line.primary_group == user->gid;
}

static bool is_of(const account_line &line, const internal_group *group) {
    return line.name == group->name && line.id == group->gid;
}

// What is loaded is a part of the entries, in their order.
template <typename record>
static const record *next_if(const GPtrArray *loaded, guint *at, const account_line &line) {
    if (*at >= loaded->len)
        return nullptr;
    const auto *found = static_cast<const record *>(loaded->pdata[*at]);
    if (!is_of(line, found))
        return nullptr;
    (*at)++;
    return found;
}

void line_review::review_passwd() {
    guint at = 0;
    for (const account_line &line : files_.lines[CORE_FILE_ROW_PASSWD]) {
        if (!line.is_entry)
            continue;
        users_.insert(line.name);
        const internal_user *user = next_if<internal_user>(ctx_->user_db.entries, &at, line);
        if (user == nullptr) {
            explain_lost_user(line);
            continue;
        }
        if (user->shadowed)
            shadowed_.insert(user->name);
        compare(CORE_FILE_ROW_PASSWD, line, user);
        review_hash(CORE_FILE_ROW_PASSWD, line);
    }
}

void line_review::review_shadow() {
    names seen;
    for (const account_line &line : files_.lines[CORE_FILE_ROW_SHADOW]) {
        if (!line.is_entry)
            continue;
        const std::string &name = line.name;
        if (!seen.insert(name).second) {
            add(gravity::CHANGE, "repeated-shadow-line", CORE_FILE_ROW_SHADOW, line,
                "a write drops this line: the user stands in an earlier one, which counts");
        } else if (shadowed_.contains(name)) {
            compare(CORE_FILE_ROW_SHADOW, line, user_database_find(&ctx_->user_db, name.c_str()));
            review_hash(CORE_FILE_ROW_SHADOW, line);
        } else if (!users_.contains(name)) {
            add(gravity::CHANGE, "no-passwd-line", CORE_FILE_ROW_SHADOW, line,
                "a write drops this line: no user has this name");
        } else if (user_database_find(&ctx_->user_db, name.c_str()) != nullptr) {
            add(gravity::CHANGE, "unused-shadow-line", CORE_FILE_ROW_SHADOW, line,
                "a write drops this line: the user's password stands in passwd");
        }
    }
}

// The lines of the shadow file follow those of passwd once they are written.
void line_review::review_order() {
    names seen;
    std::vector<std::string> before;
    for (const account_line &line : files_.lines[CORE_FILE_ROW_SHADOW])
        if (line.is_entry && shadowed_.contains(line.name) && seen.insert(line.name).second)
            before.push_back(line.name);
    seen.clear();
    std::vector<std::string> after;
    for (const internal_user *user : records<const internal_user>(ctx_->user_db.entries))
        if (user->shadowed && seen.insert(user->name).second)
            after.emplace_back(user->name);
    if (before != after)
        out_->add(
            {gravity::NOTICE, "order", core_file_table[CORE_FILE_ROW_SHADOW].path, 0, "",
             "its lines stand in another order than those of passwd, which a write gives them"});
}

void line_review::review_members(const account_line &line) {
    for (const std::string &member : line.members)
        if (!users_.contains(member))
            add(gravity::NOTICE, "unknown-member", CORE_FILE_ROW_GROUP, line,
                "lists \"" + member +
                    "\", who has no account: an account of that name would be a member, and the "
                    "group cannot be removed");
}

void line_review::review_groups() {
    guint at = 0;
    for (const account_line &line : files_.lines[CORE_FILE_ROW_GROUP]) {
        if (!line.is_entry)
            continue;
        const internal_group *group = next_if<internal_group>(ctx_->group_db.entries, &at, line);
        if (group == nullptr) {
            explain_lost_group(line);
            continue;
        }
        compare(CORE_FILE_ROW_GROUP, line, group);
        review_members(line);
    }
}

// Names and IDs that stand twice are kept, but an operation finds only one of them.
void line_review::review_twice(int row, const char *what) {
    std::map<std::string, unsigned> by_name;
    std::map<guint32, unsigned> by_id;
    for (const account_line &line : files_.lines[row]) {
        if (!line.is_entry)
            continue;
        const auto [name, is_new] = by_name.emplace(line.name, line.number);
        if (!is_new && row == CORE_FILE_ROW_PASSWD)
            add(gravity::NOTICE, "repeated-name", row, line,
                "has the name of line " + std::to_string(name->second) +
                    "; a change reaches the last of them");
        const auto [id, is_first] = by_id.emplace(line.id, line.number);
        if (!is_first)
            add(gravity::NOTICE, "repeated-id", row, line,
                std::string("has the ") + what + " of line " + std::to_string(id->second));
    }
}

void line_review::review_hash(int row, const account_line &line) {
    const std::string_view hash = line.field(PASSWORD);
    if (is_absurd_hash(hash))
        add(gravity::NOTICE, "costly-hash", row, line,
            "each check of the password takes " + std::to_string(hash_rounds(hash)) +
                " rounds, in which the service serves nobody else");
}

void line_review::review_root() {
    const internal_user *root = user_database_find(&ctx_->user_db, "root");
    if (root == nullptr || root->uid != 0)
        out_->add({gravity::NOTICE, "no-root", core_file_table[CORE_FILE_ROW_PASSWD].path, 0,
                   "root", "no user that is kept has the name root and the UID 0"});
}

void line_review::run() {
    for (const account_line &line : files_.lines[CORE_FILE_ROW_SHADOW])
        shadow_names_.insert(line.name);
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        review_others(row);
    review_passwd();
    review_shadow();
    review_order();
    review_groups();
    review_twice(CORE_FILE_ROW_PASSWD, "UID");
    review_twice(CORE_FILE_ROW_GROUP, "GID");
    review_root();
}

void review_lines(const account_files &files, const usermgmt_ctx *ctx, findings *out) {
    line_review(files, ctx, out).run();
}
