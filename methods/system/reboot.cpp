// methods/system/reboot.cpp: the methods that restart the device and reset it to factory defaults.
#include "methods/system/reboot.h"

#include "methods/tool_runner.h"
#include "service/method.h"

static constexpr const char *SYSFLASH = "/sbin/sysflash";

struct reset_mode {
    const char *word;  // what arms it; null for the plain restart
    const char *argv[4];
};

// The first word that a text holds wins.
static constexpr reset_mode plain_reboot = {
    nullptr, {SYSFLASH, "reboot"}
};
static constexpr reset_mode reset_modes[] = {
    {"ONVIF_HARD_RESET", {SYSFLASH, "factorydefault", "onvifhard"}},
    {"SOFT_RESET",       {SYSFLASH, "factorydefault", "soft"}     },
};

// What the next restart does. Lives in memory only.
static const reset_mode *armed_mode = &plain_reboot;

bool handle_update_release_file(method_call &call, const char *text) {
    for (const reset_mode &mode : reset_modes) {
        if (g_strstr_len(text, -1, mode.word) == nullptr)
            continue;
        armed_mode = &mode;

        privane_system__complete_update_release_file(call.skeleton, call.invocation);
        return true;
    }
    // Deliberate: no error is set, so the answer is "Unknown".
    return false;
}

bool handle_reboot(method_call &call) {
    g_auto(tool_result) result = {};
    g_autoptr(GError) error = nullptr;
    if (!run_tool(armed_mode->argv, tool_capture::NOTHING, &result, &error))
        g_warning("%sFailed to call sysflash: %s", PRIVANE_LOG_PREFIX, error->message);
    armed_mode = &plain_reboot;

    // Deliberate: the raw wait status, and no error when the tool could not be started.
    privane_system__complete_reboot(call.skeleton, call.invocation, result.wait_status);
    return true;
}
