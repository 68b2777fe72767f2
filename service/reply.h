// service/reply.h: what may go out on the bus: valid UTF-8, and no more than one message carries.
//
// GDBus ends the process over a string array with an invalid element, and the bus daemon drops a
// connection that sends a message above its limit.
#pragma once

#include <glib.h>

// A copy in valid UTF-8, each invalid byte replaced by U+FFFD; "" for null. Owned by the caller.
char *sendable_text(const char *text);

// The same for each string of a list, in its place: lists are long, and nearly all of it is valid.
// The list is one for g_strfreev, not null; an invalid string is freed and replaced.
void make_sendable(char **list);

// Bytes that a string, or an array of strings, takes in a message at most.
gsize wire_size(const char *text);
gsize wire_size(const char *const *list);

// False, with an error of the file-error domain, when a reply with a body of that size could not be
// delivered.
bool check_reply_size(gsize size, GError **error);
