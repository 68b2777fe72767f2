// usermgmt/core_file_cache.h: the parsed account files that a context keeps, internal to usermgmt.
#pragma once

#include <ctime>

#include <sys/types.h>

#include <glib.h>

struct core_file_data;
struct usermgmt_ctx;

// Bits of a file mask.
enum core_file_mask : guint32 {
    CORE_FILE_PASSWD = 2,
    CORE_FILE_GROUP = 4,
    CORE_FILE_SHADOW = 8,
    CORE_FILE_ALL = 255,
};

// What tells one version of a file from another. Zeroed when the file was never read or written.
struct core_file_stamp {
    dev_t device;
    ino_t inode;
    off_t size;
    struct timespec modified;
};

// Reads the masked files into their slots, which must be empty, the shadow file only when the
// context has one. At the first failure all slots of the mask are released; the error is
// core_file_read_data's.
gboolean core_file_parse(usermgmt_ctx *ctx, guint32 mask, GError **error);

// Releases the masked slots.
void core_file_free_data(usermgmt_ctx *ctx, guint32 mask);

// Logs a warning for each file about to be written that is not the one the context last read or
// wrote: another program's changes are about to be lost.
void core_file_warn_of_strangers(const usermgmt_ctx *ctx, const core_file_data *outgoing);

// Takes the file of a row, as it now is, for the context's own.
void core_file_remember(usermgmt_ctx *ctx, int row);
