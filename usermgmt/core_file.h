// usermgmt/core_file.h: reading the account files and replacing them atomically, internal to
// usermgmt.
#pragma once

#include <cstdio>
#include <span>

#include <glib.h>

// Errors of this unit: domain "corefile". The numbers reach bus callers and never change.
enum corefile_error {
    COREFILE_ERROR_READ = 100,   // a file could not be read
    COREFILE_ERROR_WRITE = 101,  // a file could not be written, or would not give the record back
    COREFILE_ERROR_MISSING_FUNCTION = 102,  // a file that cannot be read or written
    COREFILE_ERROR_SEVERAL_FILES = 103,     // several files could not be written
    COREFILE_ERROR_MISSING_DATA = 104,      // nothing to write
    COREFILE_ERROR_UNKNOWN = 105,           // a failure without a reason
};

#define COREFILE_ERROR corefile_error_quark()
GQuark corefile_error_quark();

// One account file: where it is, and how its records are read and written.
struct core_file {
    int id;
    const char *name;
    const char *path;
    // A heap copy of the stream's next C-library record; null at the end of the file, where errno
    // is ENOENT, and on a failure, where errno is its cause. Null also ends the reading: the room
    // of the lines is wiped and freed then.
    gpointer (*fetch)(FILE *stream);
    // Writes one record of a database. Negative on failure, with errno set.
    int (*write)(const void *record, FILE *stream);
    // Frees what fetch returned.
    void (*free_record)(gpointer record);
};

// The order of the rows is the order of reading and writing.
enum core_file_row {
    CORE_FILE_ROW_PASSWD,
    CORE_FILE_ROW_SHADOW,
    CORE_FILE_ROW_GROUP,
    CORE_FILE_COUNT,
};

extern const core_file core_file_table[CORE_FILE_COUNT];

// Records of one file, on their way in or out.
struct core_file_data {
    GPtrArray *data;  // owns its records when it came from reading
    gboolean dirty;   // the file has to be written
    // Set by a write: the live file was replaced, also where the sync of its directory then failed.
    gboolean replaced;
};

// Reads a whole file into data, which must be empty. On failure data stays empty.
// COREFILE_ERROR_READ or COREFILE_ERROR_MISSING_FUNCTION.
gboolean core_file_read_data(const core_file *descriptor, core_file_data *dst_data, GError **error);

// Writes every dirty file to a temporary file beside it, then renames them into place in order,
// each followed by the sync of its directory. The mode is kept, the owner is not. Where nothing was
// renamed, every live file is as it was and no temporary file is left. With stop_on_error, the
// first file that fails stops the writing, and the first rename that fails stops the renaming. The
// dirty flag of each file that made it is cleared.
gboolean core_file_sync_all(std::span<const core_file> descriptors, core_file_data *src_data,
                            gboolean stop_on_error, GError **error);

// The same for one file.
gboolean core_file_sync(const core_file *cf, core_file_data *src_data, GError **error);
