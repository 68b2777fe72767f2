// tests/unit/usermgmt/operation_call.cpp: calls the function of usermgmt.h that an operation stands
// for.
#include "tests/unit/usermgmt/operation_call.h"

#include "tests/unit/usermgmt/changed_accounts.h"

static const char *or_null(const optional_text &text) {
    return text ? text->c_str() : nullptr;
}

bool call_operation(usermgmt_ctx *ctx, const operation &what, lines *warnings, GError **error) {
    const char *account = or_null(what.account);
    std::vector<const char *> names;
    if (what.names)
        for (const std::string &name : *what.names)
            names.push_back(name.c_str());
    entry_fields fields = {
        what.type,    or_null(what.name),  or_null(what.password), or_null(what.group),
        std::nullopt, or_null(what.gecos), or_null(what.shell),    what.uid};
    if (what.names)
        fields.groups = names;
    const filled_entry entry(fields);
    names.push_back(nullptr);

    switch (what.kind) {
        case operation_kind::add_user:
            return usermgmt_add_user(ctx, account, entry.get(), error);
        case operation_kind::modify_user: {
            gboolean done = FALSE;
            *warnings =
                glib_log_of([&] { done = usermgmt_modify_user(ctx, account, entry.get(), error); });
            return done;
        }
        case operation_kind::delete_user:
            return usermgmt_delete_user(ctx, account, error);
        case operation_kind::disable_password:
            return usermgmt_disable_password(ctx, account, error);
        case operation_kind::add_group:
            return usermgmt_add_group(ctx, account, names.data(), error);
        case operation_kind::delete_group:
            return usermgmt_delete_group(ctx, account, error);
        case operation_kind::reopen:
            break;
    }
    return false;
}
