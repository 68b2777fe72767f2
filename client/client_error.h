// client/client_error.h: the errors that the client makes itself, as opposed to those it is sent.
#pragma once

#include <glib.h>

#define CLIENT_ERROR client_error_quark()

enum {
    CLIENT_ERROR_USAGE = 1,   // the command line is wrong
    CLIENT_ERROR_FAILED = 2,  // it is right, and could not be carried out
};

GQuark client_error_quark();

// They set an error and return false. What they quote may be any bytes.
bool fail_usage(GError **error, const char *format, ...) G_GNUC_PRINTF(2, 3);
bool fail_failed(GError **error, const char *format, ...) G_GNUC_PRINTF(2, 3);
