// methods/text_file.h: reading a whole file for a reply.
#pragma once

#include <glib.h>

// Reads the file at the path, which is used as given. Unlike g_file_get_contents it never waits (a
// FIFO fails, as does a device with nothing to read) and stops at what a reply can carry. A failed
// open gives g_file_get_contents's own error; every error is of the file-error domain. The caller
// owns the text, which has a NUL byte behind it.
bool read_text_file(const char *path, char **out_text, GError **error);
