// tests/fuzz/load_fuzz.cpp: the databases loaded from any three files: indexes, queries, reload.
#include <cstring>

#include "tests/fuzz/account_folder.h"
#include "tests/fuzz/fuzz.h"
#include "tests/unit/usermgmt/log_capture.h"

static void free_entry(gpointer entry) {
    usermgmt_free_user_entry(static_cast<user_entry *>(entry));
    g_free(entry);
}

static void query_users(const usermgmt_ctx *ctx) {
    guint count = 0;
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries)) {
        g_auto(user_entry) entry = {};
        g_autoptr(GError) error = nullptr;
        const internal_user *found = user_database_find(&ctx->user_db, user->name);
        hold(usermgmt_user_exists(ctx, user->name) &&
                 usermgmt_get_user_type(ctx, user->name) == found->type,
             "every user can be asked for", user->name);
        hold(usermgmt_get_user(ctx, user->name, &entry, &error) && error == nullptr,
             "every user is answered", user->name);
        hold(g_str_equal(entry.name, user->name) && static_cast<guint32>(entry.uid) == found->uid &&
                 g_strcmp0(entry.password, found->password) == 0,
             "a user is answered as it is", user->name);
        hold(!g_strv_contains(entry.groups, entry.group), "the primary group is no secondary one",
             user->name);
        count++;
    }
    g_auto(GStrv) names = nullptr;
    GList *entries = nullptr;
    g_autoptr(GError) error = nullptr;
    hold(usermgmt_get_all_users(ctx, &names, &entries, &error), "all users are answered");
    hold(g_strv_length(names) == count && g_list_length(entries) == count,
         "no user is left out of the answer");
    g_list_free_full(entries, free_entry);
}

static void query_groups(const usermgmt_ctx *ctx) {
    g_auto(GStrv) names = nullptr;
    g_autoptr(GError) error = nullptr;
    hold(usermgmt_get_all_groups(ctx, &names, &error), "all groups are answered");
    hold(g_strv_length(names) == ctx->group_db.entries->len, "no group is left out of the answer");
    for (char **name = names; *name != nullptr; name++) {
        const internal_group *group = group_database_find(&ctx->group_db, *name);
        guint32 gid = 0;
        g_auto(GStrv) members = nullptr;
        hold(usermgmt_get_group(ctx, *name, &gid, &members, &error), "every group is answered",
             *name);
        hold(gid == group->gid && g_strv_length(members) == g_hash_table_size(group->members),
             "a group is answered as it is", *name);
        hold(usermgmt_get_group_type(ctx, *name) == group->type, "a group's type is answered",
             *name);
    }
    guint missing = 0;
    hold(usermgmt_groups_exist(ctx, names, &missing), "the groups that exist do exist");
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const account_texts texts = texts_of(parts_of(data, size));
    const bool is_strict = (texts.open_flags & USERMGMT_OPEN_STRICT) != 0;
    g_autoptr(GError) error = nullptr;

    lay(texts);
    const open_database ctx(usermgmt_open(texts.open_flags | USERMGMT_OPEN_TRYLOCK, &error));
    hold((ctx == nullptr) == (error != nullptr), "a failing open has an error, and only that");
    hold(ctx != nullptr || is_strict, "only a strict open refuses a file",
         error != nullptr ? error->message : "");
    if (ctx != nullptr) {
        check_loaded(ctx.get(), texts);
        query_users(ctx.get());
        query_groups(ctx.get());
        const std::string before = described(ctx.get());
        usermgmt_reload(ctx.get(), CORE_FILE_ALL);
        check_loaded(ctx.get(), texts);
        hold(described(ctx.get()) == before, "a reload changes nothing", before);
    }
    for (const std::string &line : take_syslog())
        hold(ctx == nullptr || !is_strict || line.find("passwd line") != std::string::npos,
             "a strict open that succeeds has skipped nothing", line);
    return 0;
}
