// service/method_table.cpp: the methods that the service answers, in the order of the interface.
#include "service/method_table.h"

#include <array>

#include "methods/accounts/queries.h"
#include "service/method.h"

static constexpr std::array method_table = {
    method<"checkuser", handle_check_user>("handle-check-user"),
    method<"checkgroup", handle_check_group>("handle-check-group"),
    method<"getuser", handle_get_user>("handle-get-user"),
    method<"getgroup", handle_get_group>("handle-get-group"),
    method<"getgrouplist", handle_get_group_list>("handle-get-group-list"),
    method<"getgrouplistfull", handle_get_group_list_full>("handle-get-group-list-full"),
    method<"getuserlist", handle_get_user_list>("handle-get-user-list"),
};

static constexpr std::size_t IMPLEMENTED_METHODS = 7;
static_assert(method_table.size() == IMPLEMENTED_METHODS);

void connect_methods(ServiceState *state) {
    for (const method_row &row : method_table)
        row.connect(row.signal, state);
}
