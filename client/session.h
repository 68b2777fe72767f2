// client/session.h: one run of the client: what was asked for, and how to print what comes of it.
#pragma once

#include <gio/gio.h>

#include "client/command_line.h"

struct command;

inline constexpr const char *SERVICE_NAME = "com.zintor.PrivaneSystem";
inline constexpr const char *SERVICE_PATH = "/com/zintor/PrivaneSystem";

struct session {
    const command_line *line;
    const command *asked;
    bool on_terminal;  // of standard output
    bool in_color;
};

// Makes the bus of the command line the system bus of this process; before anything connects.
void session_choose_bus(const session &run);

// The system bus, or null with an error.
GDBusConnection *session_connect(GError **error);

// What the service answers to a method, or null with an error.
GVariant *session_call(const session &run, const GDBusMethodInfo *method, GVariant *arguments,
                       GError **error);

// Prints to standard output, at once; false with an error.
bool session_print(const char *text, GError **error);
