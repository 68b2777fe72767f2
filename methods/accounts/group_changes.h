// methods/accounts/group_changes.h: the methods that add and remove groups. They announce nothing.
#pragma once

struct method_call;

bool handle_add_group(method_call &call, const char *group);
bool handle_remove_group(method_call &call, const char *group);
