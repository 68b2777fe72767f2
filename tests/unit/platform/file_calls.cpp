// tests/unit/platform/file_calls.cpp: the file calls of the code under test, seen and made to fail.
#include "tests/unit/platform/file_calls.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

static file_calls *active;

file_calls::file_calls() {
    active = this;
}

file_calls::~file_calls() {
    active = nullptr;
}

bool file_calls::enter(const std::string &line) {
    const auto at_index = faults_.find(lines_.size());
    const auto at_line = lines_to_fail_.find(line);

    lines_.push_back(line);
    if (before) {
        active = nullptr;  // What the test itself does is not recorded.
        before(line);
        active = this;
    }
    if (at_index != faults_.end()) {
        errno = at_index->second;
        return false;
    }
    if (at_line != lines_to_fail_.end() && at_line->second.times-- > 0) {
        errno = at_line->second.error;
        return false;
    }
    return true;
}

const std::string *file_calls::label_of(int fd) const {
    const auto found = labels_.find(fd);

    return found != labels_.end() ? &found->second : nullptr;
}

static std::string last_part(const std::string &path) {
    return path.substr(path.rfind('/') + 1);
}

static bool enter(const std::string &line) {
    return active == nullptr || active->enter(line);
}

// Descriptors that were not opened under these eyes are not recorded.
static bool enter(const char *call, int fd, const std::string &details = "") {
    const std::string *label = active != nullptr ? active->label_of(fd) : nullptr;

    return label == nullptr || active->enter(std::string(call) + " " + *label + details);
}

static std::string in_octal(mode_t mode) {
    char text[16];

    (void)std::snprintf(text, sizeof text, " %04o", mode);
    return text;
}

struct flag_name {
    int flag;
    const char *name;
};

static constexpr flag_name flag_names[] = {
    {O_CREAT,     " CREAT"    },
    {O_EXCL,      " EXCL"     },
    {O_NOFOLLOW,  " NOFOLLOW" },
    {O_NONBLOCK,  " NONBLOCK" },
    {O_DIRECTORY, " DIRECTORY"},
    {O_CLOEXEC,   " CLOEXEC"  },
};

static std::string open_line(const char *call, const char *path, int flags, mode_t mode) {
    std::string line = std::string(call) + " " + last_part(path);

    for (const flag_name &row : flag_names) {
        if ((flags & row.flag) == row.flag)
            line += row.name;
    }
    if ((flags & O_CREAT) != 0)
        line += in_octal(mode);
    return line;
}

static int opened(int fd, const char *path) {
    if (fd >= 0 && active != nullptr)
        active->opened(fd, last_part(path));
    return fd;
}

// The linker sends the calls here (--wrap), those with large file offsets under their second name.

#define MODE_ARGUMENT(mode, last)         \
    mode_t mode = 0;                      \
    std::va_list arguments;               \
    va_start(arguments, last);            \
    if (((last)&O_CREAT) != 0)            \
        mode = va_arg(arguments, mode_t); \
    va_end(arguments)

#define WRAP_OPEN(name)                                                     \
    int real_##name(const char *path, int flags, ...) asm("__real_" #name); \
    int wrap_##name(const char *path, int flags, ...) asm("__wrap_" #name); \
    int wrap_##name(const char *path, int flags, ...) {                     \
        MODE_ARGUMENT(mode, flags);                                         \
        if (!enter(open_line("open", path, flags, mode)))                   \
            return -1;                                                      \
        return opened(real_##name(path, flags, mode), path);                \
    }
WRAP_OPEN(open)
WRAP_OPEN(open64)

#define WRAP_OPENAT(name)                                                               \
    int real_##name(int folder, const char *path, int flags, ...) asm("__real_" #name); \
    int wrap_##name(int folder, const char *path, int flags, ...) asm("__wrap_" #name); \
    int wrap_##name(int folder, const char *path, int flags, ...) {                     \
        MODE_ARGUMENT(mode, flags);                                                     \
        if (!enter(open_line("openat", path, flags, mode)))                             \
            return -1;                                                                  \
        return opened(real_##name(folder, path, flags, mode), path);                    \
    }
WRAP_OPENAT(openat)
WRAP_OPENAT(openat64)

#define WRAP_FSTAT(name)                                               \
    int real_##name(int fd, struct stat *status) asm("__real_" #name); \
    int wrap_##name(int fd, struct stat *status) asm("__wrap_" #name); \
    int wrap_##name(int fd, struct stat *status) {                     \
        return enter("fstat", fd) ? real_##name(fd, status) : -1;      \
    }
WRAP_FSTAT(fstat)
WRAP_FSTAT(fstat64)

ssize_t real_read(int fd, void *bytes, size_t size) asm("__real_read");
ssize_t wrap_read(int fd, void *bytes, size_t size) asm("__wrap_read");
ssize_t wrap_read(int fd, void *bytes, size_t size) {
    return enter("read", fd) ? real_read(fd, bytes, size) : -1;
}

ssize_t real_write(int fd, const void *bytes, size_t size) asm("__real_write");
ssize_t wrap_write(int fd, const void *bytes, size_t size) asm("__wrap_write");
ssize_t wrap_write(int fd, const void *bytes, size_t size) {
    if (!enter("write", fd))
        return -1;
    return real_write(fd, bytes, active != nullptr ? std::min(size, active->write_limit()) : size);
}

int real_flock(int fd, int operation) asm("__real_flock");
int wrap_flock(int fd, int operation) asm("__wrap_flock");
int wrap_flock(int fd, int operation) {
    return enter("flock", fd) ? real_flock(fd, operation) : -1;
}

int real_unlinkat(int folder, const char *path, int flags) asm("__real_unlinkat");
int wrap_unlinkat(int folder, const char *path, int flags) asm("__wrap_unlinkat");
int wrap_unlinkat(int folder, const char *path, int flags) {
    return enter("unlinkat " + last_part(path)) ? real_unlinkat(folder, path, flags) : -1;
}

int real_renameat(int from, const char *old_path, int to,
                  const char *new_path) asm("__real_renameat");
int wrap_renameat(int from, const char *old_path, int to,
                  const char *new_path) asm("__wrap_renameat");
int wrap_renameat(int from, const char *old_path, int to, const char *new_path) {
    return enter("renameat " + last_part(old_path) + " " + last_part(new_path))
               ? real_renameat(from, old_path, to, new_path)
               : -1;
}

int real_mkdir(const char *path, mode_t mode) asm("__real_mkdir");
int wrap_mkdir(const char *path, mode_t mode) asm("__wrap_mkdir");
int wrap_mkdir(const char *path, mode_t mode) {
    return enter("mkdir " + last_part(path) + in_octal(mode)) ? real_mkdir(path, mode) : -1;
}

int real_fchown(int fd, uid_t owner, gid_t group) asm("__real_fchown");
int wrap_fchown(int fd, uid_t owner, gid_t group) asm("__wrap_fchown");
int wrap_fchown(int fd, uid_t owner, gid_t group) {
    const std::string details = " " + std::to_string(owner) + " " + std::to_string(group);

    return enter("fchown", fd, details) ? real_fchown(fd, owner, group) : -1;
}

int real_fchmod(int fd, mode_t mode) asm("__real_fchmod");
int wrap_fchmod(int fd, mode_t mode) asm("__wrap_fchmod");
int wrap_fchmod(int fd, mode_t mode) {
    return enter("fchmod", fd, in_octal(mode)) ? real_fchmod(fd, mode) : -1;
}

int real_fsync(int fd) asm("__real_fsync");
int wrap_fsync(int fd) asm("__wrap_fsync");
int wrap_fsync(int fd) {
    return enter("fsync", fd) ? real_fsync(fd) : -1;
}

int real_close(int fd) asm("__real_close");
int wrap_close(int fd) asm("__wrap_close");
int wrap_close(int fd) {
    const bool succeeds = enter("close", fd);
    const int saved_errno = errno;
    const int result = real_close(fd);

    if (active != nullptr)
        active->closed(fd);
    if (succeeds)
        return result;
    errno = saved_errno;
    return -1;
}

struct group *real_getgrnam(const char *name) asm("__real_getgrnam");
struct group *wrap_getgrnam(const char *name) asm("__wrap_getgrnam");
struct group *wrap_getgrnam(const char *name) {
    static struct group own = {};

    if (active == nullptr || active->group_answer() == file_calls::groups::REAL)
        return real_getgrnam(name);
    (void)active->enter(std::string("getgrnam ") + name);
    own.gr_gid = getegid();
    return active->group_answer() == file_calls::groups::OWN ? &own : nullptr;
}
