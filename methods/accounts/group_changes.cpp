// methods/accounts/group_changes.cpp: the methods that add and remove groups. They announce
// nothing.
#include "methods/accounts/group_changes.h"

#include "service/method.h"
#include "usermgmt/usermgmt.h"

bool handle_add_group(method_call &call, const char *group) {
    if (!usermgmt_add_group(call.state->usermgmt_context, group, nullptr, &call.error))
        return pass_on(call, "");

    privane_system__complete_add_group(call.skeleton, call.invocation);
    return true;
}

bool handle_remove_group(method_call &call, const char *group) {
    if (!usermgmt_delete_group(call.state->usermgmt_context, group, &call.error))
        return pass_on(call, "");

    privane_system__complete_remove_group(call.skeleton, call.invocation);
    return true;
}
