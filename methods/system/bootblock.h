// methods/system/bootblock.h: the methods on the parameters of the boot block.
#pragma once

struct method_call;

bool handle_read_serno(method_call &call);
bool handle_read_bootblock_param(method_call &call, const char *name);
bool handle_add_bootblock_param(method_call &call, const char *name, const char *value);
