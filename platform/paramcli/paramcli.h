/* platform/paramcli/paramcli.h: the device's parameter store. */
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/*
 * The store is the file /etc/privane/parameters.conf, a line for each parameter:
 *
 *     root.System.RootPwdSet=yes
 *
 * The name is what stands before the first "=" and the value what stands behind it. Nothing is
 * quoted, escaped or trimmed: a value is any text without a line end. Where a name comes twice, the
 * first line counts, and further ones go when it is set. Lines without "=" and lines that begin
 * with "#" are no parameters; they stay byte for byte where they are. A last line without a line
 * end gets one.
 *
 * The file is replaced as a whole or not at all, and keeps its owner, group and mode; a reader
 * needs no lock and meets the old or the new one. Where it is missing, it is made with mode 0644,
 * of the caller and its folder's group, and so is its folder, with mode 0755 less the umask. A file
 * that would stay as it is is not written, only made sure to last; one above 1 MiB is refused.
 *
 * Writers lock parameters.conf.lock, beside the file, with flock(2), and wait for each other for at
 * most 3 seconds. What changes the file without that lock may be lost.
 */

/* The numbers of failures. They stay as they are. */
enum paramcli_error {
    PARAMCLI_ERROR_NONE = 0,
    PARAMCLI_ERROR_INVALID = 1,     /* a null argument, or a block that was never reset */
    PARAMCLI_ERROR_NAME = 2,        /* no valid name */
    PARAMCLI_ERROR_VALUE = 3,       /* a value with a line end */
    PARAMCLI_ERROR_FULL = 4,        /* no room in the block */
    PARAMCLI_ERROR_BUSY = 5,        /* another writer held the lock for too long */
    PARAMCLI_ERROR_FOLDER = 6,      /* the file's folder cannot be made or opened */
    PARAMCLI_ERROR_LOCK = 7,        /* the lock file cannot be opened or locked */
    PARAMCLI_ERROR_NOT_REGULAR = 8, /* the file is a symbolic link, a folder or a device */
    PARAMCLI_ERROR_TOO_BIG = 9,     /* the file, as it is or would become */
    PARAMCLI_ERROR_READ = 10,       /* the file cannot be opened or read */
    PARAMCLI_ERROR_WRITE = 11,      /* the file could not be replaced */
    PARAMCLI_ERROR_SYNC = 12        /* the new file could not be made to last */
};

/*
 * What is to be stored with the next sync. It is the caller's, holds no pointers and needs no
 * release. A parameter takes the bytes of its name and value and two more.
 */
struct paramcli_options {
    unsigned int mark;   /* tells a block that was reset */
    unsigned int length; /* of what is pending */
    char pending[4088];
};

#pragma GCC visibility push(default)

/*
 * Every function that takes an error slot sets it to one of the numbers above when it fails, and
 * leaves it alone on success. The slot may be null.
 */

/* Makes the block, whatever it held, empty. */
void paramcli_reset_options(struct paramcli_options *options);

/*
 * Adds a parameter to the block; the store is not touched. A name is not empty, has no "=", no
 * control character and no blank at its ends, and does not begin with "#". Of several values for
 * one name the last counts. On failure the block is as it was.
 */
void paramcli_set_custom_param(const char *name, const char *value,
                               struct paramcli_options *options, int *error);

/*
 * Stores all parameters of the block in one replacement, and empties the block. On failure the
 * block and the store are as they were; with PARAMCLI_ERROR_SYNC the store was replaced for a
 * moment, and a disk that fails further may keep it so. With an empty block nothing happens.
 */
void paramcli_sync(struct paramcli_options *options, int *error);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif
