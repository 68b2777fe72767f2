// methods/accounts/queries.h: the read-only account methods. They never write, notify or lock.
#pragma once

struct method_call;

bool handle_check_user(method_call &call, const char *user);
bool handle_check_group(method_call &call, const char *group);
bool handle_get_user(method_call &call, const char *user);
bool handle_get_user_list(method_call &call);
bool handle_get_group(method_call &call, const char *group);
bool handle_get_group_list(method_call &call);
bool handle_get_group_list_full(method_call &call);
