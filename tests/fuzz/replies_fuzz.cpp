// tests/fuzz/replies_fuzz.cpp: what the account queries and the digest methods answer, whatever the
// files hold. The parts of the input are those of the account files, then the digest file, and the
// two words of a Digest call.
#include "methods/accounts/digest.h"
#include "methods/accounts/queries.h"
#include "methods/text_file.h"
#include "platform/digest_entry/digest_entry.h"
#include "tests/fuzz/account_folder.h"
#include "tests/fuzz/bus_call.h"
#include "tests/fuzz/fuzz.h"
#include "tests/unit/usermgmt/log_capture.h"

static std::string digest_text;
static std::vector<std::string> digest_calls;

// In place of the real ones: neither the machine's file is read nor changed.
bool read_text_file(const char *path, char **out_text, GError **) {
    hold(path == std::string("/etc/apache2/digest_auth_passwd"), "the list comes of its file",
         path);
    *out_text = g_strdup(digest_text.c_str());
    return true;
}
int digest_entry_set_list(const char *user_list, int flags) {
    digest_calls.push_back("set " + std::to_string(flags) + " " + user_list);
    return DIGEST_ENTRY_ERROR_LIST;
}
int digest_entry_delete_list(const char *user_list, int flags) {
    digest_calls.push_back("delete " + std::to_string(flags) + " " + user_list);
    return DIGEST_ENTRY_ERROR_LIST;
}

template <typename... in_args>
static bool served(usermgmt_ctx *ctx, bool (*work)(method_call &, in_args...), in_args... in) {
    bus_call bus;
    bus.state.usermgmt_context = ctx;
    return bus.serve(work, in...);
}

static void ask_for_user(usermgmt_ctx *ctx, const internal_user *user) {
    bus_call bus;
    const char *name = user->name;
    bus.state.usermgmt_context = ctx;
    hold(bus.serve(handle_get_user, name), "every user of the database is answered", name);
    hold(served(ctx, handle_check_user, name), "every user can be asked for", name);
}

static void ask_for_all(usermgmt_ctx *ctx) {
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries))
        ask_for_user(ctx, user);
    for (const internal_group *group : records<const internal_group>(ctx->group_db.entries)) {
        const char *name = group->name;
        hold(served(ctx, handle_get_group, name) && served(ctx, handle_check_group, name),
             "every group of the database is answered", name);
    }
    hold(served(ctx, handle_get_user_list), "the list of users is answered");
    hold(served(ctx, handle_get_group_list), "the list of groups is answered");
    hold(served(ctx, handle_get_group_list_full), "the full list of groups is answered");
}

// A name that a caller gives, which need not be UTF-8 for the work.
static void ask_for(usermgmt_ctx *ctx, const char *name) {
    hold(served(ctx, handle_get_user, name) == (usermgmt_user_exists(ctx, name) != FALSE),
         "a user is answered when there is one", name);
    hold(served(ctx, handle_get_group, name) == (usermgmt_group_exists(ctx, name) != FALSE),
         "a group is answered when there is one", name);
}

static void change_digest(const char *action, const char *list) {
    const char *const words[] = {action, list, nullptr};
    const bool sets = g_str_equal(action, "set") || g_str_equal(action, "create");
    const bool deletes = g_str_equal(action, "delete");

    digest_calls.clear();
    bus_call bus;
    const bool done = bus.serve(handle_digest, static_cast<const char *const *>(words));
    hold(done == (sets || deletes), "only the three actions are taken", action);
    hold(digest_calls.size() == (done ? 1U : 0U), "an action is one call of the library", action);
    hold(!done || digest_calls[0] == std::string(sets ? "set 1 " : "delete 1 ") + list,
         "the library gets the list as it is", list);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::vector<std::string> parts = parts_of(data, size);
    account_texts texts = texts_of(parts);
    g_autoptr(GError) error = nullptr;

    parts.resize(7);
    texts.open_flags = 0;
    lay(texts);
    bus_call unused;  // A record of GLib's is no reason to end.
    const open_database ctx(usermgmt_open(USERMGMT_OPEN_TRYLOCK, &error));
    hold(ctx != nullptr, "any files can be loaded", error != nullptr ? error->message : "");
    ask_for_all(ctx.get());
    ask_for(ctx.get(), parts[6].c_str());

    digest_text = parts[4].c_str();
    hold(served(ctx.get(), handle_get_digest_list), "the list of the digest file is answered");
    if (parts[5].ends_with('\n'))
        parts[5].pop_back();
    change_digest(parts[5].c_str(), parts[6].c_str());
    (void)take_syslog();
    return 0;
}
