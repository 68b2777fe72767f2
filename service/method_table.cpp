// service/method_table.cpp: the methods that the service answers, in the order of the interface.
#include "service/method_table.h"

#include <array>

#include "methods/accounts/digest.h"
#include "methods/accounts/group_changes.h"
#include "methods/accounts/password_check.h"
#include "methods/accounts/queries.h"
#include "methods/accounts/user_changes.h"
#include "service/method.h"

// AddSystemUser is guarded by the action of AddUser.
static constexpr std::array method_table = {
    method<"digest", handle_digest>("handle-digest"),
    method<"authuserbasic", handle_auth_user_basic>("handle-auth-user-basic"),
    method<"checkuser", handle_check_user>("handle-check-user"),
    method<"checkgroup", handle_check_group>("handle-check-group"),
    method<"adduser", handle_add_system_user>("handle-add-system-user"),
    method<"modifyuser", handle_modify_user>("handle-modify-user"),
    method<"clearuserfields", handle_clear_user_fields>("handle-clear-user-fields"),
    method<"adduser", handle_add_user>("handle-add-user"),
    method<"adduiduser", handle_add_uid_user>("handle-add-uid-user"),
    method<"removeuser", handle_remove_user>("handle-remove-user"),
    method<"getuser", handle_get_user>("handle-get-user"),
    method<"chpasswduser", handle_chpasswd_user>("handle-chpasswd-user"),
    method<"addgroup", handle_add_group>("handle-add-group"),
    method<"removegroup", handle_remove_group>("handle-remove-group"),
    method<"getgroup", handle_get_group>("handle-get-group"),
    method<"getgrouplist", handle_get_group_list>("handle-get-group-list"),
    method<"getdigestlist", handle_get_digest_list>("handle-get-digest-list"),
    method<"getgrouplistfull", handle_get_group_list_full>("handle-get-group-list-full"),
    method<"getuserlist", handle_get_user_list>("handle-get-user-list"),
};

static constexpr std::size_t IMPLEMENTED_METHODS = 19;
static_assert(method_table.size() == IMPLEMENTED_METHODS);

void connect_methods(ServiceState *state) {
    for (const method_row &row : method_table)
        row.connect(row.signal, state);
}
