// methods/accounts/digest.h: the methods on the web server's HTTP digest file.
#pragma once

struct method_call;

bool handle_digest(method_call &call, const char *const *arguments);
bool handle_get_digest_list(method_call &call);
