/* tests/fakes/failing_read/failing_read.c: an open(2) and an fopen(3), the ones for large files, of
 * which the one that FAILING_CALL names fails with EIO for the file FAILING_FILE. Preloaded.
 */
#include <errno.h>
#include <fcntl.h>
#include <stdarg.h>
#include <stdbool.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/syscall.h>
#include <unistd.h>

static bool is_in(const char *variable, const char *text) {
    const char *value = getenv(variable);

    return value != NULL && strcmp(value, text) == 0;
}

static bool fails(const char *call, const char *path) {
    const bool does = is_in("FAILING_CALL", call) && is_in("FAILING_FILE", path);

    if (does)
        errno = EIO;
    return does;
}

static int open_file(const char *path, int flags, mode_t mode) {
    return (int)syscall(SYS_openat, AT_FDCWD, path, flags, mode);
}

int open(const char *path, int flags, ...) {
    va_list rest;
    va_start(rest, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(rest, mode_t) : 0;
    va_end(rest);
    return fails("open", path) ? -1 : open_file(path, flags, mode);
}

/* For reading, which is all that the checker does. */
FILE *fopen(const char *restrict path, const char *restrict mode) {
    const int file = fails("fopen", path) ? -1 : open_file(path, O_RDONLY | O_CLOEXEC, 0);

    (void)mode;
    return file >= 0 ? fdopen(file, "r") : NULL;
}
