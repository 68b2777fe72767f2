// service/read_buffer.h: keeps passwords from staying where GDBus reads messages into.
//
// GDBus reads all messages of a connection into one buffer and never clears it: the end of a
// message stays there until another one is as long. Behind a call that carries a password, whether
// it is served or refused, the service therefore sends a message of zeros to itself, which goes
// through the same buffer. A call that names no method may have been meant for one with a password,
// and is treated alike. Of the zeros there is one message at a time, so that nobody can fill the
// bus's queue with them; those that the bus drops, since others filled it, are sent again.
#pragma once

#include <gio/gio.h>

#include "service/intake.h"

// What is overwritten of a message's arguments, at most: those of the largest call that is served.
inline constexpr gsize READ_BUFFER_OVERWRITTEN = INTAKE_CALL_COST;

// For as long as the connection lives. To be called before intake_guard, whose filter lets through
// neither refused calls nor the zeros. The interface is the one that is exported.
void read_buffer_guard(GDBusConnection *connection, GDBusInterfaceInfo *interface);
