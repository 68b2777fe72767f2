// methods/accounts/password_check.h: the method that checks a password.
#pragma once

struct method_call;

bool handle_auth_user_basic(method_call &call, const char *user, const char *password);
