// client/client_error.cpp: the errors that the client makes itself.
#include "client/client_error.h"

#include <cstdarg>

G_DEFINE_QUARK(privanectl, client_error)

static void set_error(GError **error, int code, const char *format, va_list arguments)
    G_GNUC_PRINTF(3, 0);

static void set_error(GError **error, int code, const char *format, va_list arguments) {
    g_autoptr(GError) made = g_error_new_valist(CLIENT_ERROR, code, format, arguments);
    g_autofree char *valid = g_utf8_make_valid(made->message, -1);

    g_set_error_literal(error, CLIENT_ERROR, code, valid);
}

bool fail_usage(GError **error, const char *format, ...) {
    va_list arguments;

    va_start(arguments, format);
    set_error(error, CLIENT_ERROR_USAGE, format, arguments);
    va_end(arguments);
    return false;
}

bool fail_failed(GError **error, const char *format, ...) {
    va_list arguments;

    va_start(arguments, format);
    set_error(error, CLIENT_ERROR_FAILED, format, arguments);
    va_end(arguments);
    return false;
}
