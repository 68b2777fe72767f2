// methods/system/diagnostics.h: fixed diagnostic tools, run with whitelisted words.
//
// An answer is what the tool printed, up to the first NUL byte and in valid UTF-8
// (methods/system/text_answer.h); "" where it printed nothing. How long a tool takes is up to it
// (methods/tool_runner.h).
#pragma once

struct method_call;

// These two answer with the tool's standard error unless it ended with status 0.
bool handle_execute_lldpcli(method_call &call, const char *command);
bool handle_execute_ethtool(method_call &call, const char *flag, const char *interface);

// Answers with whatever the tool printed before it ended or was killed.
bool handle_execute_smartctl(method_call &call, const char *flag, const char *device);

// The action of GetActiveNetworkInfo names its mode. Null with call.error set for an unknown mode.
char *network_info_action(method_call &call, const char *mode);

// Fails unless the tool ended with status 0; one that was killed counts as exit code 0.
bool handle_get_active_network_info(method_call &call, const char *mode);
