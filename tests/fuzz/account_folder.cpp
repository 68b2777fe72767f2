// tests/fuzz/account_folder.cpp: the three account files of an input, and what must hold of the
// databases that are loaded from them.
#include "tests/fuzz/account_folder.h"

#include <shadow.h>

#include <algorithm>
#include <cstdio>
#include <map>
#include <optional>

#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_files.h"

using optional_text = std::optional<std::string>;

static optional_text text_or_none(const char *text) {
    return text != nullptr ? optional_text(text) : std::nullopt;
}

account_texts texts_of(const std::vector<std::string> &parts) {
    const auto part = [&parts](std::size_t i) { return i < parts.size() ? parts[i] : ""; };
    account_texts texts = {part(0), part(2), part(1), parts.size() > 2, 0};
    if (parts.size() > 3 && !parts[3].empty())
        texts.open_flags =
            static_cast<guint32>(parts[3][0]) & (USERMGMT_OPEN_NO_CACHE | USERMGMT_OPEN_STRICT);
    return texts;
}

void lay(const account_texts &texts) {
    lay_memory_file("etc/passwd", texts.passwd);
    lay_memory_file("etc/group", texts.group);
    if (texts.has_shadow)
        lay_memory_file("etc/shadow", texts.shadow);
    else
        remove_memory_file("etc/shadow");
}

static std::string with_members_sorted(const std::string &group_file) {
    std::string sorted;
    views members;
    for (const std::string_view line : lines_of(group_file)) {
        const std::size_t start = line.rfind(':') + 1;
        split_into(line.substr(start), ',', &members);
        std::sort(members.begin(), members.end());
        sorted += line.substr(0, start);
        for (const std::string_view member : members) {
            sorted += member;
            sorted += ',';
        }
        sorted += '\n';
    }
    return sorted;
}

account_texts lying_texts() {
    return {text_of_memory_file("etc/passwd"), text_of_memory_file("etc/shadow"),
            with_members_sorted(text_of_memory_file("etc/group")), has_memory_file("etc/shadow"),
            0};
}

bool is_any_temporary_left() {
    return has_memory_file("etc/passwd.tmp") || has_memory_file("etc/shadow.tmp") ||
           has_memory_file("etc/group.tmp");
}

static void add_members(const internal_group *group, std::string *out_text) {
    views members;
    GHashTableIter iter;
    gpointer member;
    g_hash_table_iter_init(&iter, group->members);
    while (g_hash_table_iter_next(&iter, &member, nullptr))
        members.emplace_back(static_cast<const char *>(member));
    std::sort(members.begin(), members.end());
    for (const std::string_view one : members) {
        *out_text += one;
        *out_text += ',';
    }
}

// As the files tell it: "*" for no password, whole days, "" for what is absent.
std::string described(const usermgmt_ctx *ctx) {
    std::string text;
    const auto field = [&text](const char *value) {
        text += value != nullptr ? value : "";
        text += '|';
    };
    const auto number = [&text](gint64 value) {
        text += std::to_string(value);
        text += ' ';
    };
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries)) {
        field(user->name);
        field(user->password != nullptr ? user->password : "*");
        field(user->gecos);
        field(user->home);
        field(user->shell);
        number(user->type);
        number(user->uid);
        number(user->gid);
        number(user->shadowed);
        number(user->last_change / 86400);
        text += '\n';
    }
    for (const internal_group *group : records<const internal_group>(ctx->group_db.entries)) {
        field(group->name);
        field(group->password);
        number(group->type);
        number(group->gid);
        add_members(group, &text);
        text += '\n';
    }
    return text;
}

static bool is_compat(const char *name) {
    return *name == '+' || *name == '-';
}

bool has_compat_names(const usermgmt_ctx *ctx) {
    const auto users = records<const internal_user>(ctx->user_db.entries);
    const auto groups = records<const internal_group>(ctx->group_db.entries);
    bool found = false;
    for (const internal_user *user : users)
        found = found || is_compat(user->name);
    for (const internal_group *group : groups)
        found = found || is_compat(group->name);
    return found;
}

static guint32 expected_user_type(guint32 uid) {
    if (uid == 65534)
        return 5;
    return uid == 0 ? 1 : uid < 500 ? 2 : uid < 1000 ? 3 : uid <= 60000 ? 4 : 0;
}

static guint32 expected_group_type(guint32 gid) {
    if (gid >= 60001 && gid <= 60010)
        return 5;
    return gid == 0 ? 1 : gid < 500 ? 2 : gid < 1000 ? 3 : gid == 65534 ? 4 : 0;
}

// Of each name the hash in its first line.
static std::map<std::string, optional_text> first_hashes(const std::string &shadow) {
    std::map<std::string, optional_text> hashes;
    std::string text = shadow;
    FILE *stream = text.empty() ? nullptr : fmemopen(text.data(), text.size(), "r");
    if (stream == nullptr)
        return hashes;
    while (const struct spwd *line = fgetspent(stream))
        hashes.emplace(line->sp_namp, text_or_none(line->sp_pwdp));
    (void)fclose(stream);
    return hashes;
}

static void check_users(const usermgmt_ctx *ctx, const account_texts &texts) {
    const user_database &user_db = ctx->user_db;
    const auto hashes = first_hashes(texts.shadow);
    std::map<std::string_view, const internal_user *> last_of_name;

    for (const internal_user *user : records<const internal_user>(user_db.entries)) {
        last_of_name[user->name] = user;
        hold(user->type == expected_user_type(user->uid) && user->type != 0,
             "a user's type follows from the UID", user->name);
        hold(group_database_find_gid(&ctx->group_db, user->gid) != nullptr,
             "every user's primary group exists", user->name);
        if (!user->shadowed)
            continue;
        const auto hash = hashes.find(user->name);
        hold(texts.has_shadow && hash != hashes.end(), "a shadowed user has a shadow line",
             user->name);
        hold(text_or_none(user->password) == hash->second, "the first shadow line of a name counts",
             user->name);
    }
    hold(g_hash_table_size(user_db.name_hash) == last_of_name.size(),
         "the index of users has one entry for each name");
    for (const auto &[name, user] : last_of_name)
        hold(user_database_find(&user_db, user->name) == user, "the index finds every user", name);
}

static void check_groups(const usermgmt_ctx *ctx) {
    const group_database &group_db = ctx->group_db;
    std::map<guint32, const internal_group *> last_of_gid;

    for (const internal_group *group : records<const internal_group>(group_db.entries)) {
        last_of_gid[group->gid] = group;
        hold(group->type == expected_group_type(group->gid) && group->type != 0,
             "a group's type follows from the GID", group->name);
        hold(group_database_find(&group_db, group->name) == group,
             "the index finds every group, and no name comes twice", group->name);
        hold(group->password == nullptr || *group->password != '\0',
             "an empty group password is absent", group->name);
    }
    hold(g_hash_table_size(group_db.name_hash) == group_db.entries->len,
         "the index of groups has one entry for each");
    hold(g_hash_table_size(group_db.gid_hash) == last_of_gid.size(),
         "the index of GIDs has one entry for each");
    for (const auto &[gid, group] : last_of_gid)
        hold(group_database_find_gid(&group_db, gid) == group, "the index finds every GID",
             group->name);
}

void check_loaded(const usermgmt_ctx *ctx, const account_texts &texts) {
    hold(ctx->initialised && !ctx->user_db.dirty && !ctx->group_db.dirty,
         "what was just loaded is ready and unchanged");
    hold((ctx->has_shadow != FALSE) == texts.has_shadow, "the shadow file is seen");
    check_users(ctx, texts);
    check_groups(ctx);
}
