// methods/tool_runner.cpp: running a tool and waiting for it.
#include "methods/tool_runner.h"

#include <sys/wait.h>
#include <unistd.h>

void tool_result_clear(tool_result *result) {
    g_clear_pointer(&result->output, g_free);
    g_clear_pointer(&result->error_output, g_free);
    result->wait_status = -1;
}

static bool spawn(const char *const *argv, tool_capture capture, GSpawnFlags flags,
                  tool_result *result, GError **error) {
    const bool wants_output = capture != tool_capture::NOTHING;
    const bool wants_errors = capture == tool_capture::BOTH;

    result->wait_status = -1;
    return g_spawn_sync(nullptr, const_cast<char **>(argv), nullptr, flags, nullptr, nullptr,
                        wants_output ? &result->output : nullptr,
                        wants_errors ? &result->error_output : nullptr, &result->wait_status,
                        error);
}

bool run_tool(const char *const *argv, tool_capture capture, tool_result *result, GError **error) {
    const GSpawnFlags flags = capture == tool_capture::OUTPUT_WITHOUT_ERRORS
                                  ? G_SPAWN_STDERR_TO_DEV_NULL
                                  : G_SPAWN_DEFAULT;
    return spawn(argv, capture, flags, result, error);
}

// Only where GLib has no descriptors to close does it do without fork, which copies the page
// tables.
bool run_tool_without_fork(const char *const *argv, tool_result *result, GError **error) {
    static constexpr unsigned FIRST_OTHER = STDERR_FILENO + 1;
    static constexpr unsigned LAST = ~0U;
    return (close_range(FIRST_OTHER, LAST, CLOSE_RANGE_CLOEXEC) == 0 &&
            spawn(argv, tool_capture::OUTPUT, G_SPAWN_LEAVE_DESCRIPTORS_OPEN, result, nullptr)) ||
           run_tool(argv, tool_capture::OUTPUT, result, error);
}

bool tool_succeeded(const tool_result &result) {
    return WIFEXITED(result.wait_status) && WEXITSTATUS(result.wait_status) == 0;
}
