// methods/accounts/user_changes.h: the methods that change users.
#pragma once

#include <glib.h>

struct method_call;

bool handle_add_user(method_call &call, const char *name, const char *password, const char *group,
                     const char *joined_groups, const char *comment);
bool handle_add_uid_user(method_call &call, const char *name, const char *password,
                         const char *group, const char *joined_groups, const char *comment,
                         gint uid);
bool handle_add_system_user(method_call &call, const char *name, const char *password,
                            const char *group, const char *const *groups, const char *shell,
                            const char *comment);
bool handle_modify_user(method_call &call, const char *name, const char *password,
                        const char *group, const char *const *groups, const char *shell,
                        const char *comment);
bool handle_clear_user_fields(method_call &call, const char *name, gboolean clear_password,
                              gboolean clear_groups, gboolean clear_comment);
bool handle_chpasswd_user(method_call &call, const char *name, const char *password);
bool handle_remove_user(method_call &call, const char *name);
