// platform/bootparam/boot_copies.cpp: the copies of the boot environment, beside libubootenv.
#include "platform/bootparam/boot_copies.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <string_view>

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>
#include <zlib.h>

// What stands before the parameters in each copy: their CRC and, where there are two, a counter.
static constexpr std::size_t CRC_SIZE = 4;
static constexpr std::size_t COPY_HEADER = CRC_SIZE + 1;

// U-Boot's list of flags, of which libubootenv makes a parameter only when it writes.
static constexpr std::string_view FLAGS = ".flags=";
// libubootenv may write two letters for a parameter where the list had fewer.
static constexpr std::size_t FLAG_LETTERS = 2;

static constexpr const char *LOCK = "/var/lock/fw_printenv.lock";
static constexpr int LOCK_TRIES = 300;
static constexpr struct timespec LOCK_PAUSE = {0, 10'000'000};

boot_copies::~boot_copies() {
    const int saved_errno = errno;
    for (int i = 0; i < count_; i++) {
        if (copies_[i].fd >= 0)
            (void)close(copies_[i].fd);  // Nothing was written through it.
        std::free(copies_[i].device);
    }
    errno = saved_errno;
}

// The lines hold the device, the offset and the size; more may follow.
bool boot_copies::read_line(const char *line) {
    char *device = nullptr;
    long long offset = 0;
    std::size_t size = 0;

    if (*line == '#' || std::sscanf(line, "%ms %lli %zx", &device, &offset, &size) != 3) {
        std::free(device);
        return false;
    }
    copies_[count_] = {device, static_cast<off_t>(offset), size, -1};
    count_++;
    return true;
}

int boot_copies::read_config(const char *path) {
    FILE *config = std::fopen(path, "re");
    if (config == nullptr)
        return -errno;

    char *line = nullptr;
    std::size_t length = 0;
    while (count_ < MAX_COPIES && getline(&line, &length, config) != -1)
        (void)read_line(line);  // Comments and what is no copy are passed over.
    std::free(line);
    (void)std::fclose(config);  // It was only read.
    return count_ > 0 && copies_[0].size > COPY_HEADER ? 0 : -EINVAL;
}

int boot_copies::open() {
    for (int i = 0; i < count_; i++) {
        copies_[i].fd = ::open(copies_[i].device, O_RDONLY | O_NOCTTY | O_CLOEXEC);
        if (copies_[i].fd < 0)
            return -errno;
    }
    return 0;
}

std::size_t boot_copies::capacity() const {
    return copies_[0].size - COPY_HEADER;
}

boot_copies::copy_bytes boot_copies::read_copy(const copy &one) {
    copy_bytes bytes(static_cast<char *>(std::malloc(one.size)));
    if (bytes == nullptr)
        return nullptr;

    const off_t start = one.offset < 0 ? lseek(one.fd, 0, SEEK_END) + one.offset : one.offset;
    if (pread(one.fd, bytes.get(), one.size, start) == static_cast<ssize_t>(one.size))
        return bytes;
    errno = EIO;  // as libubootenv has it, whatever the cause
    return nullptr;
}

// The CRC is in the machine's byte order, and is of as much as zlib's type for lengths can tell,
// for libubootenv, too.
static bool is_valid(const char *crc, std::string_view parameters) {
    std::uint32_t expected = 0;
    std::memcpy(&expected, crc, sizeof expected);
    return expected == crc32(0, reinterpret_cast<const Bytef *>(parameters.data()),
                             static_cast<uInt>(parameters.size()));
}

// An empty string stands behind the last parameter, or where the first would.
static bool has_end(std::string_view parameters) {
    return parameters.front() == '\0' ||
           parameters.find(std::string_view("\0\0", 2)) != std::string_view::npos;
}

int boot_copies::check_ends() const {
    const std::size_t header = count_ == 1 ? CRC_SIZE : COPY_HEADER;
    for (int i = 0; i < count_; i++) {
        const copy_bytes bytes = read_copy(copies_[i]);
        if (bytes == nullptr)
            return -errno;
        const std::string_view parameters(bytes.get() + header, copies_[i].size - header);
        if (!has_end(parameters) && is_valid(bytes.get(), parameters))
            return -EBADMSG;
    }
    return 0;
}

// The list ends with a NUL, as does what stands before it.
static std::size_t flags_in(std::string_view text) {
    std::size_t longest = 0;
    for (std::size_t at = text.find(FLAGS); at != std::string_view::npos;
         at = text.find(FLAGS, at + 1)) {
        const std::string_view list = text.substr(at, text.find('\0', at) - at);
        const auto commas = static_cast<std::size_t>(std::count(list.begin(), list.end(), ','));
        longest = std::max(longest, list.size() + 1 + FLAG_LETTERS * (commas + 1));
    }
    return longest;
}

int boot_copies::flags_length(std::size_t *out_length) const {
    std::size_t longest = 0;
    for (int i = 0; i < count_; i++) {
        const copy_bytes bytes = read_copy(copies_[i]);
        if (bytes == nullptr)
            return -errno;
        longest = std::max(longest, flags_in({bytes.get(), copies_[i].size}));
    }
    *out_length = longest;
    return 0;
}

int boot_copies::sync() const {
    for (int i = 0; i < count_; i++)
        // Flash is written through: its devices know no fsync.
        if (fsync(copies_[i].fd) != 0 && errno != EINVAL)
            return -errno;
    return 0;
}

int await_boot_lock() {
    const int fd = open(LOCK, O_RDWR | O_CREAT | O_NOFOLLOW | O_NOCTTY | O_CLOEXEC, 0600);
    if (fd < 0)
        return -errno;

    int result = -EBUSY;
    for (int tries = 0; tries < LOCK_TRIES && result == -EBUSY; tries++) {
        if (flock(fd, LOCK_EX | LOCK_NB) == 0)
            result = 0;
        else if (errno != EWOULDBLOCK && errno != EINTR)
            result = -errno;
        else
            (void)nanosleep(&LOCK_PAUSE, nullptr);  // A shorter pause does no harm.
    }
    (void)close(fd);  // which gives the lock back
    return result;
}
