// service/method.cpp: how a method's work reports its failure.
#include "service/method.h"

#include <cstdarg>

static bool log_failure(const method_call &call) {
    g_log(G_LOG_DOMAIN, G_LOG_LEVEL_WARNING, "%s%s", PRIVANE_LOG_PREFIX, call.error->message);
    return false;
}

bool fail(method_call &call, int code, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    call.error = g_error_new_valist(PRIVANE_ERROR, code, format, arguments);
    va_end(arguments);
    return log_failure(call);
}

bool pass_on(method_call &call, const char *prefix) {
    // A lower layer's failed precondition sets no error; the answer is then "Unknown".
    if (call.error == nullptr)
        return false;
    g_prefix_error(&call.error, "%s", prefix);
    return log_failure(call);
}

void connect_method(const char *signal, GCallback serve, ServiceState *state) {
    (void)g_signal_connect_data(state->skeleton, signal, serve, state, nullptr,
                                static_cast<GConnectFlags>(0));
}
