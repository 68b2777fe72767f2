// tests/fuzz/memory_files.cpp: the files below the relative folder "etc", which are only in memory.
#include "tests/fuzz/memory_files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <memory>
#include <vector>

#include "tests/fuzz/fuzz.h"

// Which calls are taken here: those of the code under test, or what the trace of the unit tests
// passes on of them.
#ifndef TAKEN_CALLS
#define TAKEN_CALLS "__wrap_"
#endif

namespace {

// As much of an inode as is looked at.
struct content {
    std::string text;
    ino_t number = 0;
    mode_t mode = 0;
    time_t changed = 0;  // a count of changes
};
using shared_content = std::shared_ptr<content>;

struct named_content {
    std::string path;
    shared_content what;
};

// A descriptor is one of nothing, so that it can be told from others, and closed.
struct open_file {
    shared_content what;
    FILE *stream = nullptr;
};

struct open_stream {
    shared_content what;
    std::size_t at;
    int fd;  // -1 for what is only read
};

}  // namespace

static std::vector<named_content> files;    // a few
static std::vector<open_file> descriptors;  // at the place of their number
static time_t changes;

static bool is_in_memory(const char *path) {
    return std::strncmp(path, "etc", 3) == 0 && (path[3] == '/' || path[3] == '\0');
}

static std::vector<named_content>::iterator find(const char *path) {
    return std::find_if(files.begin(), files.end(),
                        [path](const named_content &one) { return one.path == path; });
}

static shared_content content_of(const char *path) {
    const auto found = find(path);
    if (found == files.end())
        errno = ENOENT;
    return found != files.end() ? found->what : nullptr;
}

static shared_content make(const char *path, mode_t mode) {
    static ino_t numbers;
    auto made = std::make_shared<content>();
    made->number = ++numbers;
    made->mode = S_IFREG | mode;
    made->changed = ++changes;
    const auto found = find(path);
    if (found != files.end())
        found->what = made;
    else
        files.push_back({path, made});
    return made;
}

void lay_memory_file(const char *path, std::string_view text) {
    make(path, 0600)->text = text;
}

void remove_memory_file(const char *path) {
    const auto found = find(path);
    if (found != files.end())
        files.erase(found);
}

bool has_memory_file(const char *path) {
    return find(path) != files.end();
}

std::string text_of_memory_file(const char *path) {
    const auto found = find(path);
    return found != files.end() ? found->what->text : "";
}

static open_file *opened(int fd) {
    const auto place = static_cast<std::size_t>(fd);
    const bool is_ours = fd >= 0 && place < descriptors.size() && descriptors[place].what;
    return is_ours ? &descriptors[place] : nullptr;
}

// One that was closed without a stream is forgotten when its number comes again.
static int descriptor_of(const shared_content &what) {
    static const int nothing = open("/dev/null", O_RDWR | O_CLOEXEC);
    const int fd = fcntl(nothing, F_DUPFD_CLOEXEC, 0);
    hold(fd >= 0, "a descriptor can be had");
    descriptors.resize(std::max(descriptors.size(), static_cast<std::size_t>(fd) + 1));
    descriptors[static_cast<std::size_t>(fd)] = {what, nullptr};
    return fd;
}

static ssize_t read_stream(void *cookie, char *bytes, size_t size) {
    auto *stream = static_cast<open_stream *>(cookie);
    const std::string &text = stream->what->text;
    const std::size_t count = std::min(size, text.size() - std::min(stream->at, text.size()));
    std::memcpy(bytes, text.data() + stream->at, count);
    stream->at += count;
    return static_cast<ssize_t>(count);
}

static ssize_t write_stream(void *cookie, const char *bytes, size_t size) {
    auto *stream = static_cast<open_stream *>(cookie);
    stream->what->text.append(bytes, size);
    stream->what->changed = ++changes;
    return static_cast<ssize_t>(size);
}

static int seek_stream(void *cookie, off64_t *offset, int whence) {
    auto *stream = static_cast<open_stream *>(cookie);
    const std::size_t origin = whence == SEEK_SET   ? 0
                               : whence == SEEK_CUR ? stream->at
                                                    : stream->what->text.size();
    stream->at = origin + static_cast<std::size_t>(*offset);
    *offset = static_cast<off64_t>(stream->at);
    return 0;
}

static int close_stream(void *cookie) {
    const std::unique_ptr<open_stream> stream(static_cast<open_stream *>(cookie));
    if (stream->fd < 0)
        return 0;
    descriptors[static_cast<std::size_t>(stream->fd)] = {};
    return close(stream->fd);
}

static FILE *stream_of(const shared_content &what, int fd) {
    static constexpr cookie_io_functions_t reading = {read_stream, nullptr, seek_stream,
                                                      close_stream};
    static constexpr cookie_io_functions_t writing = {nullptr, write_stream, nullptr, close_stream};
    auto stream = std::make_unique<open_stream>(open_stream{what, 0, fd});
    FILE *file = fopencookie(stream.get(), fd >= 0 ? "w" : "r", fd >= 0 ? writing : reading);
    hold(file != nullptr, "a stream can be had");
    if (fd >= 0)
        descriptors[static_cast<std::size_t>(fd)].stream = file;
    (void)stream.release();  // close_stream frees it
    return file;
}

// stat, open and fopen are taken under both of their names: which one is used depends on how large
// file offsets are.

static int memory_stat(const char *path, struct stat *st,
                       int (*real)(const char *, struct stat *)) {
    if (!is_in_memory(path))
        return real(path, st);
    const shared_content what = content_of(path);
    if (what == nullptr)
        return -1;
    *st = {};
    st->st_ino = what->number;
    st->st_mode = what->mode;
    st->st_size = static_cast<off_t>(what->text.size());
    st->st_mtim.tv_sec = what->changed;
    st->st_ctim.tv_sec = what->changed;
    return 0;
}

int real_stat(const char *path, struct stat *st) asm("__real_stat");
int take_stat(const char *path, struct stat *st) asm(TAKEN_CALLS "stat");
int take_stat(const char *path, struct stat *st) {
    return memory_stat(path, st, real_stat);
}

int real_stat64(const char *path, struct stat *st) asm("__real_stat64");
int take_stat64(const char *path, struct stat *st) asm(TAKEN_CALLS "stat64");
int take_stat64(const char *path, struct stat *st) {
    return memory_stat(path, st, real_stat64);
}

// The folder itself, or a file that is made to be written.
static int memory_open(const char *path, int flags, mode_t mode) {
    static const auto folder = std::make_shared<content>();
    if ((flags & O_DIRECTORY) != 0)
        return descriptor_of(folder);
    hold((flags & (O_CREAT | O_EXCL)) == (O_CREAT | O_EXCL), "a file is only opened anew", path);
    if (has_memory_file(path)) {
        errno = EEXIST;
        return -1;
    }
    return descriptor_of(make(path, mode));
}

static int taken_open(const char *path, int flags, va_list arguments,
                      int (*real)(const char *, int, ...)) {
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    return is_in_memory(path) ? memory_open(path, flags, mode) : real(path, flags, mode);
}

int real_open(const char *path, int flags, ...) asm("__real_open");
int take_open(const char *path, int flags, ...) asm(TAKEN_CALLS "open");
int take_open(const char *path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const int fd = taken_open(path, flags, arguments, real_open);
    va_end(arguments);
    return fd;
}

int real_open64(const char *path, int flags, ...) asm("__real_open64");
int take_open64(const char *path, int flags, ...) asm(TAKEN_CALLS "open64");
int take_open64(const char *path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const int fd = taken_open(path, flags, arguments, real_open64);
    va_end(arguments);
    return fd;
}

static FILE *memory_fopen(const char *path, const char *mode,
                          FILE *(*real)(const char *, const char *)) {
    if (!is_in_memory(path))
        return real(path, mode);
    if (*mode == 'w') {
        const int fd = memory_open(path, O_CREAT | O_EXCL, 0600);
        return stream_of(opened(fd)->what, fd);
    }
    const shared_content what = content_of(path);
    return what != nullptr ? stream_of(what, -1) : nullptr;
}

FILE *real_fopen(const char *path, const char *mode) asm("__real_fopen");
FILE *take_fopen(const char *path, const char *mode) asm(TAKEN_CALLS "fopen");
FILE *take_fopen(const char *path, const char *mode) {
    return memory_fopen(path, mode, real_fopen);
}

FILE *real_fopen64(const char *path, const char *mode) asm("__real_fopen64");
FILE *take_fopen64(const char *path, const char *mode) asm(TAKEN_CALLS "fopen64");
FILE *take_fopen64(const char *path, const char *mode) {
    return memory_fopen(path, mode, real_fopen64);
}

FILE *real_fdopen(int fd, const char *mode) asm("__real_fdopen");
FILE *take_fdopen(int fd, const char *mode) asm(TAKEN_CALLS "fdopen");
FILE *take_fdopen(int fd, const char *mode) {
    const open_file *file = opened(fd);
    return file != nullptr ? stream_of(file->what, fd) : real_fdopen(fd, mode);
}

int real_fchmod(int fd, mode_t mode) asm("__real_fchmod");
int take_fchmod(int fd, mode_t mode) asm(TAKEN_CALLS "fchmod");
int take_fchmod(int fd, mode_t mode) {
    const open_file *file = opened(fd);
    if (file == nullptr)
        return real_fchmod(fd, mode);
    file->what->mode = S_IFREG | mode;
    file->what->changed = ++changes;
    return 0;
}

int real_fsync(int fd) asm("__real_fsync");
int take_fsync(int fd) asm(TAKEN_CALLS "fsync");
int take_fsync(int fd) {
    return opened(fd) != nullptr ? 0 : real_fsync(fd);
}

int real_unlink(const char *path) asm("__real_unlink");
int take_unlink(const char *path) asm(TAKEN_CALLS "unlink");
int take_unlink(const char *path) {
    if (!is_in_memory(path))
        return real_unlink(path);
    if (content_of(path) == nullptr)
        return -1;
    remove_memory_file(path);
    return 0;
}

int real_rename(const char *from, const char *to) asm("__real_rename");
int take_rename(const char *from, const char *to) asm(TAKEN_CALLS "rename");
int take_rename(const char *from, const char *to) {
    if (!is_in_memory(from))
        return real_rename(from, to);
    const shared_content what = content_of(from);
    if (what == nullptr)
        return -1;
    remove_memory_file(from);
    remove_memory_file(to);
    what->changed = ++changes;
    files.push_back({to, what});
    return 0;
}

// The trace of the unit tests has no eye for these.

int real_access(const char *path, int mode) asm("__real_access");
int wrap_access(const char *path, int mode) asm("__wrap_access");
int wrap_access(const char *path, int mode) {
    if (!is_in_memory(path))
        return real_access(path, mode);
    return content_of(path) != nullptr ? 0 : -1;
}

int real_fileno(FILE *stream) asm("__real_fileno");
int wrap_fileno(FILE *stream) asm("__wrap_fileno");
int wrap_fileno(FILE *stream) {
    const auto found =
        std::find_if(descriptors.begin(), descriptors.end(),
                     [stream](const open_file &one) { return one.stream == stream; });
    return stream != nullptr && found != descriptors.end()
               ? static_cast<int>(found - descriptors.begin())
               : real_fileno(stream);
}
