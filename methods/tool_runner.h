// methods/tool_runner.h: running a tool and waiting for it.
//
// A tool is an absolute path and an argument vector, never a shell's command. It inherits the
// environment; its standard input is the null device, its output and errors go where the service's
// own go unless they are captured, and it has no other descriptor.
#pragma once

#include <span>

#include <glib.h>

// What becomes of the tool's output. What is not captured goes where the service's own goes.
enum class tool_capture {
    NOTHING,
    OUTPUT,
    OUTPUT_WITHOUT_ERRORS,  // the tool's standard error goes to the null device
    BOTH,
};

// The captured texts are null where nothing was captured, else end at the first NUL byte.
struct tool_result {
    char *output;
    char *error_output;
    int wait_status;  // waitpid(2); -1 until the tool has ended
};

void tool_result_clear(tool_result *result);
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(tool_result, tool_result_clear)

// Runs the tool to its end, however long that takes and however much it prints. What it leaves
// behind with a captured output still open is waited for too, and prints into the same text.
// False, with an error of GLib's spawn domain and the wait status at -1, when it could not be
// started. The vector ends with a null.
bool run_tool(const char *const *argv, tool_capture capture, tool_result *result, GError **error);

// The same with tool_capture::OUTPUT, in a time that does not grow with the service's memory. The
// tool then ignores SIGPIPE, as the service does. Where that fails, run_tool tries once more, whose
// error tells why: for tools that may run twice.
bool run_tool_without_fork(const char *const *argv, tool_result *result, GError **error);

// Whether the tool ended by itself, with status 0.
bool tool_succeeded(const tool_result &result);
