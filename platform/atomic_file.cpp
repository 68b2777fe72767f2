// platform/atomic_file.cpp: locking a small file, reading it, and replacing it whole.
#include "platform/atomic_file.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <glib.h>

// Access bits, set-ID bits and the sticky bit: what fchmod takes of a mode.
static constexpr mode_t MODE_BITS = 07777;
static constexpr mode_t PRIVATE_MODE = 0600;

static constexpr gint64 LOCK_PAUSE_US = 10'000;

wiped_text::~wiped_text() {
    if (bytes_ != nullptr)
        explicit_bzero(bytes_, size_);
    g_free(bytes_);
}

void wiped_text::append(std::string_view bytes) {
    if (bytes.empty())
        return;
    if (bytes.size() > size_ - length_) {
        const std::size_t size = 2 * (length_ + bytes.size());
        char *moved = static_cast<char *>(g_malloc(size));
        if (bytes_ != nullptr) {
            std::memcpy(moved, bytes_, length_);
            explicit_bzero(bytes_, size_);
            g_free(bytes_);
        }
        bytes_ = moved;
        size_ = size;
    }
    std::memcpy(bytes_ + length_, bytes.data(), bytes.size());
    length_ += bytes.size();
}

static void close_if_open(int fd) {
    if (fd >= 0)
        (void)close(fd);  // What matters was checked before.
}

// Both take part of the path, so neither can fail where the path is absolute.
static const char *name_in_folder(const char *path) {
    return std::strrchr(path, '/') + 1;
}

static char *folder_of(const char *path) {
    return g_path_get_dirname(path);
}

atomic_file::~atomic_file() {
    close_if_open(lock_fd_);
    close_if_open(folder_fd_);
}

file_result atomic_file::open_folder() {
    g_autofree char *folder = folder_of(path_);

    folder_fd_ = open(folder, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    return folder_fd_ >= 0 ? file_result::DONE : file_result::NO_FOLDER;
}

// Its owner and mode keep everybody else from holding the lock.
file_result atomic_file::open_lock() {
    g_autofree char *name = g_strconcat(name_in_folder(path_), ".lock", nullptr);
    struct stat status = {};

    lock_fd_ =
        openat(folder_fd_, name, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC,
               PRIVATE_MODE);
    if (lock_fd_ < 0 || fstat(lock_fd_, &status) != 0 || !S_ISREG(status.st_mode) ||
        status.st_uid != geteuid())
        return file_result::NO_LOCK;
    if ((status.st_mode & MODE_BITS) != PRIVATE_MODE && fchmod(lock_fd_, PRIVATE_MODE) != 0)
        return file_result::NO_LOCK;
    return file_result::DONE;
}

file_result atomic_file::lock(int deadline_ms) {
    const gint64 deadline = g_get_monotonic_time() + gint64{deadline_ms} * 1000;

    if (const file_result result = open_folder(); result != file_result::DONE)
        return result;
    if (const file_result result = open_lock(); result != file_result::DONE)
        return result;

    while (flock(lock_fd_, LOCK_EX | LOCK_NB) != 0) {
        if (errno != EWOULDBLOCK && errno != EINTR)
            return file_result::NO_LOCK;
        if (g_get_monotonic_time() >= deadline)
            return file_result::BUSY;
        g_usleep(LOCK_PAUSE_US);
    }
    return file_result::DONE;
}

file_result atomic_file::read_open(int fd, wiped_text *out_text) {
    struct stat status = {};
    char block[4096];
    ssize_t count = 0;
    std::size_t total = 0;

    if (fstat(fd, &status) != 0)
        return file_result::NOT_READ;
    if (!S_ISREG(status.st_mode))
        return file_result::NOT_REGULAR;
    access_ = {status.st_uid, status.st_gid, status.st_mode & MODE_BITS};

    while (total <= MAX_SIZE && (count = ::read(fd, block, sizeof block)) != 0) {
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0)
            break;
        out_text->append({block, static_cast<std::size_t>(count)});
        total += static_cast<std::size_t>(count);
    }
    explicit_bzero(block, sizeof block);
    if (count < 0)
        return file_result::NOT_READ;
    return total <= MAX_SIZE ? file_result::DONE : file_result::TOO_BIG;
}

file_result atomic_file::read(wiped_text *out_text) {
    // Without O_NONBLOCK a FIFO in the file's place would stop the caller for good.
    const int fd = openat(folder_fd_, name_in_folder(path_),
                          O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);

    exists_ = fd >= 0 || errno != ENOENT;
    if (!exists_)
        return file_result::DONE;
    if (fd < 0)  // ELOOP is a symbolic link, ENXIO a socket or a device without a driver.
        return errno == ELOOP || errno == ENXIO ? file_result::NOT_REGULAR : file_result::NOT_READ;

    const file_result result = read_open(fd, out_text);
    close_if_open(fd);
    return result;
}

file_result atomic_file::folder_group(gid_t *out_group) const {
    struct stat status = {};

    if (fstat(folder_fd_, &status) != 0)
        return file_result::NO_FOLDER;
    *out_group = status.st_gid;
    return file_result::DONE;
}

// The new file until it is renamed; what is left of it then is removed.
class temporary_file {
  public:
    temporary_file(int folder_fd, const char *final_name)
        : folder_fd_(folder_fd),
          final_name_(final_name),
          name_(g_strconcat(final_name, ".tmp", nullptr)) {}
    ~temporary_file();
    temporary_file(const temporary_file &) = delete;
    temporary_file &operator=(const temporary_file &) = delete;

    bool create();
    bool write_all(std::string_view text) const;
    bool finish(const file_access &access);
    bool rename_into_place();

  private:
    int folder_fd_;
    const char *final_name_;
    char *name_;
    int fd_ = -1;
    bool exists_ = false;
};

temporary_file::~temporary_file() {
    close_if_open(fd_);
    if (exists_)
        (void)unlinkat(folder_fd_, name_, 0);  // Where even this fails, the next writer removes it.
    g_free(name_);
}

// A leftover goes and the file is made anew, so that it is private from its first moment and no
// planted link is followed.
bool temporary_file::create() {
    if (unlinkat(folder_fd_, name_, 0) != 0 && errno != ENOENT)
        return false;
    fd_ = openat(folder_fd_, name_, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                 PRIVATE_MODE);
    exists_ = fd_ >= 0;
    return exists_;
}

bool temporary_file::write_all(std::string_view text) const {
    while (!text.empty()) {
        const ssize_t written = write(fd_, text.data(), text.size());
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return false;
        text.remove_prefix(static_cast<std::size_t>(written));
    }
    return true;
}

// The owner comes first: a change of owner clears the set-ID bits.
bool temporary_file::finish(const file_access &access) {
    if (fchown(fd_, access.owner, access.group) != 0 || fchmod(fd_, access.mode) != 0 ||
        fsync(fd_) != 0)
        return false;

    const int fd = fd_;
    fd_ = -1;  // A failing close has still closed it.
    return close(fd) == 0;
}

bool temporary_file::rename_into_place() {
    exists_ = renameat(folder_fd_, name_, folder_fd_, final_name_) != 0;
    return !exists_;
}

file_result atomic_file::replace(std::string_view text, const file_access &of_new_file) {
    if (text.size() > MAX_SIZE)
        return file_result::TOO_BIG;

    temporary_file temporary(folder_fd_, name_in_folder(path_));
    if (!temporary.create() || !temporary.write_all(text) ||
        !temporary.finish(exists_ ? access_ : of_new_file) || !temporary.rename_into_place())
        return file_result::NOT_WRITTEN;

    return sync_folder();
}

file_result atomic_file::sync_folder() const {
    return fsync(folder_fd_) == 0 ? file_result::DONE : file_result::NOT_SYNCED;
}

void atomic_file::take_back(std::string_view old_text) {
    if (exists_)
        (void)replace(old_text, access_);  // The failure before is the one to report.
    else
        (void)unlinkat(folder_fd_, name_in_folder(path_), 0);  // Likewise.
}
