/* docs/examples/library/paramcli_folder.c: a libparamcli.so.1 that keeps a file for each parameter.
 *
 * /etc/camera/parameters/root.System.RootPwdSet holds "yes" and a line end. A block takes one
 * parameter, which is all that the service puts in: so one rename is one replacement.
 */
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "paramcli.h"

static const char PARENT[] = "/etc/camera";
static const char STORE[] = "/etc/camera/parameters";

/* No name begins with a dot. */
static const char TEMPORARY[] = ".new";

/* Three seconds: a call of the bus waits meanwhile, and all behind it. */
enum { BLOCK_MARK = 0x666f6c64, NAME_LIMIT = 200, LOCK_TRIES = 60, LOCK_PAUSE_US = 50000 };

static int is_name(const char *name) {
    const size_t length = strlen(name);
    if (length == 0 || length > NAME_LIMIT || strchr(".# ", name[0]) != NULL ||
        name[length - 1] == ' ')
        return 0;
    for (const char *at = name; *at != '\0'; at++) {
        const unsigned char byte = (unsigned char)*at;
        if (byte < ' ' || byte == 0x7f || byte == '=' || byte == '/')
            return 0;
    }
    return 1;
}

/* What is pending is the name and the value, each ended by a null byte. */
static int is_block(const struct paramcli_options *options) {
    return options != NULL && options->mark == BLOCK_MARK &&
           options->length <= sizeof options->pending &&
           (options->length == 0 || (options->pending[options->length - 1] == '\0' &&
                                     strlen(options->pending) + 1 < options->length));
}

static int add(struct paramcli_options *options, const char *name, const char *value) {
    if (!is_block(options) || name == NULL || value == NULL)
        return PARAMCLI_ERROR_INVALID;
    if (!is_name(name))
        return PARAMCLI_ERROR_NAME;
    if (strchr(value, '\n') != NULL)
        return PARAMCLI_ERROR_VALUE;
    const size_t name_size = strlen(name) + 1, value_size = strlen(value) + 1;
    if (options->length != 0 && strcmp(options->pending, name) != 0)
        return PARAMCLI_ERROR_FULL;
    if (value_size > sizeof options->pending - name_size)
        return PARAMCLI_ERROR_FULL;
    memcpy(options->pending, name, name_size);
    memcpy(options->pending + name_size, value, value_size);
    options->length = (unsigned int)(name_size + value_size);
    return PARAMCLI_ERROR_NONE;
}

static int write_whole(int fd, const char *bytes, size_t size) {
    while (size > 0) {
        const ssize_t written = write(fd, bytes, size);
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return 0;
        bytes += written;
        size -= (size_t)written;
    }
    return 1;
}

/* Others read the parameters, so the mode does not depend on the umask. */
static int write_temporary(int folder, const char *value) {
    if (unlinkat(folder, TEMPORARY, 0) != 0 && errno != ENOENT)
        return 0;
    const int fd =
        openat(folder, TEMPORARY, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (fd < 0)
        return 0;
    const int written = write_whole(fd, value, strlen(value)) && write_whole(fd, "\n", 1) &&
                        fchmod(fd, 0644) == 0 && fsync(fd) == 0;
    return close(fd) == 0 && written;
}

static int replace(int folder, const char *name, const char *value) {
    if (!write_temporary(folder, value) || renameat(folder, TEMPORARY, folder, name) != 0) {
        (void)unlinkat(folder, TEMPORARY, 0);
        return PARAMCLI_ERROR_WRITE;
    }
    return fsync(folder) == 0 ? PARAMCLI_ERROR_NONE : PARAMCLI_ERROR_SYNC;
}

static int lock(int folder) {
    for (int tries = 0; tries < LOCK_TRIES; tries++) {
        if (flock(folder, LOCK_EX | LOCK_NB) == 0)
            return PARAMCLI_ERROR_NONE;
        if (errno != EWOULDBLOCK && errno != EINTR)
            return PARAMCLI_ERROR_LOCK;
        (void)usleep(LOCK_PAUSE_US);
    }
    return PARAMCLI_ERROR_BUSY;
}

static int store(struct paramcli_options *options) {
    if (!is_block(options))
        return PARAMCLI_ERROR_INVALID;
    if (options->length == 0)
        return PARAMCLI_ERROR_NONE;
    /* Where one cannot be made, opening the folder tells. */
    (void)mkdir(PARENT, 0755);
    (void)mkdir(STORE, 0755);
    const int folder = open(STORE, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (folder < 0)
        return PARAMCLI_ERROR_FOLDER;
    const char *name = options->pending, *value = name + strlen(name) + 1;
    int result = lock(folder);
    if (result == PARAMCLI_ERROR_NONE)
        result = replace(folder, name, value);
    (void)close(folder); /* which gives the lock back */
    if (result == PARAMCLI_ERROR_NONE)
        options->length = 0;
    return result;
}

/* The slot stays as it is where nothing failed: the service clears it once for several calls. */
static void tell(int result, int *error) {
    if (result != PARAMCLI_ERROR_NONE && error != NULL)
        *error = result;
}

void paramcli_reset_options(struct paramcli_options *options) {
    options->mark = BLOCK_MARK;
    options->length = 0;
}

void paramcli_set_custom_param(const char *name, const char *value,
                               struct paramcli_options *options, int *error) {
    tell(add(options, name, value), error);
}

void paramcli_sync(struct paramcli_options *options, int *error) {
    tell(store(options), error);
}
