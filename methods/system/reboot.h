// methods/system/reboot.h: the methods that restart the device and reset it to factory defaults.
#pragma once

struct method_call;

bool handle_update_release_file(method_call &call, const char *text);
bool handle_reboot(method_call &call);
