// methods/system/readers.h: small methods that read, start or relay something.
#pragma once

struct method_call;

bool handle_get_slabinfo(method_call &call);

// Any file that the process may open, except what would block or never end (methods/text_file.h).
bool handle_read_log_file(method_call &call, const char *path);

bool handle_get_network_speed_duplex(method_call &call);

// Answers with the process's ID at once; -1 where it cannot be started, also for elements that are
// too many or too long for the kernel (execve(2): E2BIG). No elements start it without arguments.
bool handle_pinsrv(method_call &call, const char *const *arguments);

bool handle_rtspread_config(method_call &call);
