// service/intake.h: how much of what others send the service takes into its memory.
//
// GDBus reads in a thread of its own and keeps every call until the main loop comes to it, and
// every answer until the bus takes it, both without a bound. Whom the bus lets send could so grow
// the service without any action, and keep those with one waiting for minutes. The numbers below
// bound memory and the time for which anybody waits: with polkit's answer, a call that is refused
// for want of an action takes up to 5 ms, so all that may wait together is done within a second.
// That holds for a polkit that answers at once and a bus that drops no answer; a polkit that hangs
// holds up each call for the deadline, and an answer that is lost for a second or so.
//
// A message reaches the filter when GDBus has built it, one at a time: what a single message costs
// until then, at most the bus's limit for one, is not bounded here.
#pragma once

#include <gio/gio.h>

// An estimate of what a call's arguments take: their bytes, and so much more for each element of a
// list, which GDBus keeps as a value of its own.
inline constexpr gsize INTAKE_ELEMENT_COST = 128;

// The largest arguments anybody has a use for are a digest list of all 59,001 web users, with 56
// bytes each 3.2 MiB.
inline constexpr gsize INTAKE_CALL_COST = gsize{4} * 1024 * 1024;

// Calls that have a place. Beyond the shared ones a place is only for who has none, so that one who
// sends many at once leaves places for 128 others. Senders are connections: of these a user may
// have 256 by the bus's default.
inline constexpr guint INTAKE_CALLS = 192;
inline constexpr guint INTAKE_SHARED_CALLS = 64;
inline constexpr guint INTAKE_SENDER_CALLS = 16;

// What their arguments take together; one sender's, as much as the largest call. Small ones of who
// has no place go beyond that, which adds at most 12 MiB.
inline constexpr gsize INTAKE_SHARED_COST = 4 * INTAKE_CALL_COST;
inline constexpr gsize INTAKE_SENDER_COST = INTAKE_CALL_COST;
inline constexpr gsize INTAKE_SMALL_COST = gsize{64} * 1024;

// Refusals that the bus has not taken yet. Beyond them calls go unanswered: somebody who does not
// wait for answers must not fill the memory with them.
inline constexpr guint INTAKE_REFUSALS = 256;
inline constexpr guint INTAKE_SENDER_REFUSALS = 16;

// Puts the connection under these limits for as long as it lives. A call has a place from its
// arrival until its answer goes out, or, without one, until it is served. One that gets none is
// answered at once with org.freedesktop.DBus.Error.LimitsExceeded; so is one that is too large.
// Nobody is answered who wants no answer. Signals that the bus did not make go no further when they
// are sent to this connection alone. The interface is the one that is exported at the path.
void intake_guard(GDBusConnection *connection, const char *path, GDBusInterfaceInfo *interface);
