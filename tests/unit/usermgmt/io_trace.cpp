// tests/unit/usermgmt/io_trace.cpp: the file calls of the code under test, seen and made to fail.
#include "tests/unit/usermgmt/io_trace.h"

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <shadow.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>

#include <glib.h>

// What a call on a path or a descriptor is passed on to: the C library's own, or what stands in for
// it.
#ifndef REAL_CALLS
#define REAL_CALLS "__real_"
#endif

static io_trace *active;

io_trace::io_trace() {
    active = this;
}

io_trace::~io_trace() {
    active = nullptr;
}

void io_trace::fail(const std::string &call, const std::string &path, int nth, int error) {
    faults_.push_back({call + " " + path, nth, error});
}

bool io_trace::enter(const char *call, const std::string &path, const std::string &details) {
    const std::string line = std::string(call) + " " + path;
    calls_.push_back(line + details);
    if (before) {
        active = nullptr;  // what the test itself does is no part of the trace
        before(calls_.back());
        active = this;
    }
    for (fault &armed : faults_) {
        if (armed.call != line || --armed.countdown != 0)
            continue;
        has_struck_ = true;
        if (armed.error != 0)
            errno = armed.error;
        return false;
    }
    errno = EDOM;  // a call that succeeds may leave anything there
    return true;
}

const std::string *io_trace::path_of(int fd) const {
    const auto found = paths_.find(fd);
    return found != paths_.end() ? &found->second : nullptr;
}

static bool enter(const char *call, const char *path, const std::string &details = "") {
    return active == nullptr || active->enter(call, path, details);
}

// For a descriptor that was not opened under the trace's eyes, nothing is recorded.
static bool enter(const char *call, int fd, const std::string &details = "") {
    const std::string *path = active != nullptr && fd >= 0 ? active->path_of(fd) : nullptr;
    return path == nullptr || active->enter(call, *path, details);
}

static std::string in_octal(mode_t mode) {
    g_autofree char *text = g_strdup_printf(" %04o", mode);
    return text;
}

static std::string open_details(int flags, mode_t mode) {
    std::string details = (flags & O_CREAT) != 0 ? in_octal(mode) : "";
    details += (flags & O_EXCL) != 0 ? " O_EXCL" : "";
    details += (flags & O_NOFOLLOW) != 0 ? " O_NOFOLLOW" : "";
    details += (flags & O_DIRECTORY) != 0 ? " O_DIRECTORY" : "";
    details += (flags & O_CLOEXEC) != 0 ? " O_CLOEXEC" : "";
    return details;
}

// The linker sends the calls here (--wrap), stat, open and fopen under both of their names: which
// one is used depends on how large file offsets are.

static int traced_stat(const char *path, struct stat *st,
                       int (*real)(const char *, struct stat *)) {
    return enter("stat", path) ? real(path, st) : -1;
}

int real_stat(const char *path, struct stat *st) asm(REAL_CALLS "stat");
int wrap_stat(const char *path, struct stat *st) asm("__wrap_stat");
int wrap_stat(const char *path, struct stat *st) {
    return traced_stat(path, st, real_stat);
}

int real_stat64(const char *path, struct stat *st) asm(REAL_CALLS "stat64");
int wrap_stat64(const char *path, struct stat *st) asm("__wrap_stat64");
int wrap_stat64(const char *path, struct stat *st) {
    return traced_stat(path, st, real_stat64);
}

static int traced_open(const char *path, int flags, mode_t mode,
                       int (*real)(const char *, int, ...)) {
    if (!enter("open", path, open_details(flags, mode)))
        return -1;
    const int fd = real(path, flags, mode);
    if (fd >= 0 && active != nullptr)
        active->opened(fd, path);
    return fd;
}

// The mode is there only where a file may be made.
static mode_t mode_argument(int flags, va_list arguments) {
    return (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
}

int real_open(const char *path, int flags, ...) asm(REAL_CALLS "open");
int wrap_open(const char *path, int flags, ...) asm("__wrap_open");
int wrap_open(const char *path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = mode_argument(flags, arguments);
    va_end(arguments);
    return traced_open(path, flags, mode, real_open);
}

int real_open64(const char *path, int flags, ...) asm(REAL_CALLS "open64");
int wrap_open64(const char *path, int flags, ...) asm("__wrap_open64");
int wrap_open64(const char *path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = mode_argument(flags, arguments);
    va_end(arguments);
    return traced_open(path, flags, mode, real_open64);
}

static FILE *traced_fopen(const char *path, const char *mode,
                          FILE *(*real)(const char *, const char *)) {
    if (!enter("fopen", path, std::string(" ") + mode))
        return nullptr;
    FILE *file = real(path, mode);
    if (file != nullptr && active != nullptr)
        active->opened(fileno(file), path);
    return file;
}

FILE *real_fopen(const char *path, const char *mode) asm(REAL_CALLS "fopen");
FILE *wrap_fopen(const char *path, const char *mode) asm("__wrap_fopen");
FILE *wrap_fopen(const char *path, const char *mode) {
    return traced_fopen(path, mode, real_fopen);
}

FILE *real_fopen64(const char *path, const char *mode) asm(REAL_CALLS "fopen64");
FILE *wrap_fopen64(const char *path, const char *mode) asm("__wrap_fopen64");
FILE *wrap_fopen64(const char *path, const char *mode) {
    return traced_fopen(path, mode, real_fopen64);
}

int real_unlink(const char *path) asm(REAL_CALLS "unlink");
int wrap_unlink(const char *path) asm("__wrap_unlink");
int wrap_unlink(const char *path) {
    return enter("unlink", path) ? real_unlink(path) : -1;
}

int real_rename(const char *from, const char *to) asm(REAL_CALLS "rename");
int wrap_rename(const char *from, const char *to) asm("__wrap_rename");
int wrap_rename(const char *from, const char *to) {
    return enter("rename", from, std::string(" ") + to) ? real_rename(from, to) : -1;
}

FILE *real_fdopen(int fd, const char *mode) asm(REAL_CALLS "fdopen");
FILE *wrap_fdopen(int fd, const char *mode) asm("__wrap_fdopen");
FILE *wrap_fdopen(int fd, const char *mode) {
    return enter("fdopen", fd, std::string(" ") + mode) ? real_fdopen(fd, mode) : nullptr;
}

int real_fchmod(int fd, mode_t mode) asm(REAL_CALLS "fchmod");
int wrap_fchmod(int fd, mode_t mode) asm("__wrap_fchmod");
int wrap_fchmod(int fd, mode_t mode) {
    return enter("fchmod", fd, in_octal(mode)) ? real_fchmod(fd, mode) : -1;
}

int wrap_fsync(int fd) asm("__wrap_fsync");
// A test survives no power failure, so that nothing is gained by waiting for the disk.
int wrap_fsync(int fd) {
    return enter("fsync", fd) && fcntl(fd, F_GETFD) >= 0 ? 0 : -1;
}

int real_fflush(FILE *file) asm("__real_fflush");
int wrap_fflush(FILE *file) asm("__wrap_fflush");
int wrap_fflush(FILE *file) {
    return file == nullptr || enter("fflush", fileno(file)) ? real_fflush(file) : EOF;
}

int real_fclose(FILE *file) asm("__real_fclose");
int wrap_fclose(FILE *file) asm("__wrap_fclose");
int wrap_fclose(FILE *file) {
    const bool succeeds = enter("fclose", fileno(file));
    const int saved_errno = errno;
    const int result = real_fclose(file);
    if (succeeds)
        return result;
    errno = saved_errno;
    return EOF;
}

int real_putpwent(const struct passwd *line, FILE *file) asm("__real_putpwent");
int wrap_putpwent(const struct passwd *line, FILE *file) asm("__wrap_putpwent");
int wrap_putpwent(const struct passwd *line, FILE *file) {
    return enter("putpwent", fileno(file)) ? real_putpwent(line, file) : -1;
}

int real_putspent(const struct spwd *line, FILE *file) asm("__real_putspent");
int wrap_putspent(const struct spwd *line, FILE *file) asm("__wrap_putspent");
int wrap_putspent(const struct spwd *line, FILE *file) {
    return enter("putspent", fileno(file)) ? real_putspent(line, file) : -1;
}

int real_putgrent(const struct group *line, FILE *file) asm("__real_putgrent");
int wrap_putgrent(const struct group *line, FILE *file) asm("__wrap_putgrent");
int wrap_putgrent(const struct group *line, FILE *file) {
    return enter("putgrent", fileno(file)) ? real_putgrent(line, file) : -1;
}
