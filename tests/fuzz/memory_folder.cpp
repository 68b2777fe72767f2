// tests/fuzz/memory_folder.cpp: a folder whose files are only in memory. The linker sends the calls
// of the code under test here (--wrap); those on other files are passed on.
#include "tests/fuzz/memory_folder.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <map>
#include <memory>
#include <vector>

#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/scratch.h"

namespace {

struct content {
    std::string text;
    mode_t mode;
    uid_t owner;
    gid_t group;
};
using shared_content = std::shared_ptr<content>;

struct open_file {
    shared_content what;
    std::size_t at;
};

}  // namespace

// No process has as many descriptors.
static constexpr int FIRST_NUMBER = 1 << 24;

static std::map<std::string, shared_content> files;
static std::vector<open_file> descriptors;

const std::string &memory_folder_path() {
    return scratch_path();
}

static shared_content make(const std::string &name, mode_t mode) {
    return files[name] = std::make_shared<content>(content{"", mode, geteuid(), getegid()});
}

void lay_in_memory_folder(const std::string &name, std::string_view text) {
    make(name, S_IFREG | 0600)->text = text;
}

std::string text_in_memory_folder(const std::string &name) {
    const auto found = files.find(name);
    return found != files.end() ? found->second->text : "";
}

std::size_t count_in_memory_folder() {
    return files.size();
}

// The lowest that is free, as a system gives it.
static int descriptor_of(const shared_content &what) {
    const auto unused = std::find_if(descriptors.begin(), descriptors.end(),
                                     [](const open_file &one) { return one.what == nullptr; });
    const auto place = unused - descriptors.begin();
    if (unused == descriptors.end())
        descriptors.push_back({what, 0});
    else
        *unused = {what, 0};
    return FIRST_NUMBER + static_cast<int>(place);
}

static open_file *opened(int fd) {
    const auto place = static_cast<std::size_t>(fd - FIRST_NUMBER);
    if (fd < FIRST_NUMBER)
        return nullptr;
    hold(place < descriptors.size() && descriptors[place].what != nullptr,
         "a descriptor that is used is open");
    return &descriptors[place];
}

static int fail(int error) {
    errno = error;
    return -1;
}

static int memory_openat(const char *name, int flags, mode_t mode) {
    const auto found = files.find(name);
    if (found == files.end() && (flags & O_CREAT) == 0)
        return fail(ENOENT);
    if (found != files.end() && (flags & O_EXCL) != 0)
        return fail(EEXIST);
    hold((flags & O_TRUNC) == 0, "no file is cut", name);
    return descriptor_of(found != files.end() ? found->second : make(name, S_IFREG | mode));
}

static mode_t mode_of(int flags, va_list arguments) {
    return (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
}

int real_open64(const char *path, int flags, ...) asm("__real_open64");
int wrap_open64(const char *path, int flags, ...) asm("__wrap_open64");
int wrap_open64(const char *path, int flags, ...) {
    static const auto folder = std::make_shared<content>(content{"", S_IFDIR, 0, 0});
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = mode_of(flags, arguments);
    va_end(arguments);
    return path == memory_folder_path() ? descriptor_of(folder) : real_open64(path, flags, mode);
}

int real_openat64(int folder, const char *name, int flags, ...) asm("__real_openat64");
int wrap_openat64(int folder, const char *name, int flags, ...) asm("__wrap_openat64");
int wrap_openat64(int folder, const char *name, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = mode_of(flags, arguments);
    va_end(arguments);
    return opened(folder) != nullptr ? memory_openat(name, flags, mode)
                                     : real_openat64(folder, name, flags, mode);
}

int real_fstat64(int fd, struct stat *st) asm("__real_fstat64");
int wrap_fstat64(int fd, struct stat *st) asm("__wrap_fstat64");
int wrap_fstat64(int fd, struct stat *st) {
    const open_file *file = opened(fd);
    if (file == nullptr)
        return real_fstat64(fd, st);
    *st = {};
    st->st_mode = file->what->mode;
    st->st_uid = file->what->owner;
    st->st_gid = file->what->group;
    st->st_size = static_cast<off_t>(file->what->text.size());
    return 0;
}

ssize_t real_read(int fd, void *bytes, size_t size) asm("__real_read");
ssize_t wrap_read(int fd, void *bytes, size_t size) asm("__wrap_read");
ssize_t wrap_read(int fd, void *bytes, size_t size) {
    open_file *file = opened(fd);
    if (file == nullptr)
        return real_read(fd, bytes, size);
    const std::size_t count = std::min(size, file->what->text.size() - file->at);
    std::memcpy(bytes, file->what->text.data() + file->at, count);
    file->at += count;
    return static_cast<ssize_t>(count);
}

ssize_t real_write(int fd, const void *bytes, size_t size) asm("__real_write");
ssize_t wrap_write(int fd, const void *bytes, size_t size) asm("__wrap_write");
ssize_t wrap_write(int fd, const void *bytes, size_t size) {
    const open_file *file = opened(fd);
    if (file == nullptr)
        return real_write(fd, bytes, size);
    file->what->text.append(static_cast<const char *>(bytes), size);
    return static_cast<ssize_t>(size);
}

int real_close(int fd) asm("__real_close");
int wrap_close(int fd) asm("__wrap_close");
int wrap_close(int fd) {
    open_file *file = opened(fd);
    if (file == nullptr)
        return real_close(fd);
    *file = {};
    return 0;
}

int real_flock(int fd, int operation) asm("__real_flock");
int wrap_flock(int fd, int operation) asm("__wrap_flock");
int wrap_flock(int fd, int operation) {
    return opened(fd) != nullptr ? 0 : real_flock(fd, operation);
}

int real_fsync(int fd) asm("__real_fsync");
int wrap_fsync(int fd) asm("__wrap_fsync");
int wrap_fsync(int fd) {
    return opened(fd) != nullptr ? 0 : real_fsync(fd);
}

int real_fchmod(int fd, mode_t mode) asm("__real_fchmod");
int wrap_fchmod(int fd, mode_t mode) asm("__wrap_fchmod");
int wrap_fchmod(int fd, mode_t mode) {
    const open_file *file = opened(fd);
    if (file == nullptr)
        return real_fchmod(fd, mode);
    file->what->mode = S_IFREG | mode;
    return 0;
}

int real_fchown(int fd, uid_t owner, gid_t group) asm("__real_fchown");
int wrap_fchown(int fd, uid_t owner, gid_t group) asm("__wrap_fchown");
int wrap_fchown(int fd, uid_t owner, gid_t group) {
    const open_file *file = opened(fd);
    if (file == nullptr)
        return real_fchown(fd, owner, group);
    file->what->owner = owner;
    file->what->group = group;
    return 0;
}

int real_unlinkat(int folder, const char *name, int flags) asm("__real_unlinkat");
int wrap_unlinkat(int folder, const char *name, int flags) asm("__wrap_unlinkat");
int wrap_unlinkat(int folder, const char *name, int flags) {
    if (opened(folder) == nullptr)
        return real_unlinkat(folder, name, flags);
    return files.erase(name) == 1 ? 0 : fail(ENOENT);
}

int real_renameat(int folder, const char *from, int other, const char *to) asm("__real_renameat");
int wrap_renameat(int folder, const char *from, int other, const char *to) asm("__wrap_renameat");
int wrap_renameat(int folder, const char *from, int other, const char *to) {
    if (opened(folder) == nullptr)
        return real_renameat(folder, from, other, to);
    const auto found = files.find(from);
    if (found == files.end())
        return fail(ENOENT);
    files[to] = found->second;
    files.erase(found);
    return 0;
}
