// platform/bootparam/boot_copies.cpp: the copies of the boot environment, beside libubootenv.
#include "platform/bootparam/boot_copies.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string_view>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <zlib.h>

// What stands before the parameters in each copy: their CRC and, where there are two, a counter.
static constexpr std::size_t CRC_SIZE = 4;
static constexpr std::size_t COPY_HEADER = CRC_SIZE + 1;

// U-Boot's list of flags, of which libubootenv makes a parameter only when it writes.
static constexpr std::string_view FLAGS = ".flags=";

// What ends the name of a UBI device before the name of a volume.
static constexpr char NAME_SEPARATOR = ':';

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
    copies_[count_] = {device, static_cast<off_t>(offset), size, copy_kind::UNCHECKED, -1};
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
    for (int i = 0; i < count_; i++)
        if (copies_[i].size <= COPY_HEADER)
            return -EINVAL;
    return count_ > 0 ? 0 : -EINVAL;
}

static int open_device(const char *device) {
    return ::open(device, O_RDONLY | O_NOCTTY | O_CLOEXEC);
}

int boot_copies::open_copy(copy *one) {
    const int fd = open_device(one->device);
    if (fd < 0)
        // libubootenv has found what it names, or it would not have taken the description.
        return errno == ENOENT && std::strchr(one->device, NAME_SEPARATOR) != nullptr ? 0 : -errno;

    struct stat status = {};
    const int result = fstat(fd, &status) == 0 ? find_copy_kind(fd, &status, &one->kind) : -errno;
    if (result == 0 && one->kind == copy_kind::KEPT_OPEN)
        one->fd = fd;
    else
        (void)close(fd);  // Nothing was written through it.
    return result;
}

int boot_copies::open() {
    int result = 0;
    for (int i = 0; i < count_ && result == 0; i++)
        result = open_copy(&copies_[i]);
    return result;
}

bool boot_copies::has_unchecked() const {
    for (int i = 0; i < count_; i++)
        if (copies_[i].kind == copy_kind::UNCHECKED)
            return true;
    return false;
}

std::size_t boot_copies::capacity() const {
    std::size_t smallest = copies_[0].size;
    for (int i = 1; i < count_; i++)
        smallest = std::min(smallest, copies_[i].size);
    return smallest - COPY_HEADER;
}

static bool read_at(int fd, off_t offset, char *bytes, std::size_t size) {
    const off_t start = offset < 0 ? lseek(fd, 0, SEEK_END) + offset : offset;
    return pread(fd, bytes, size, start) == static_cast<ssize_t>(size);
}

boot_copies::copy_bytes boot_copies::read_copy(const copy &one) {
    copy_bytes bytes(static_cast<char *>(std::malloc(one.size)));
    if (bytes == nullptr)
        return nullptr;

    const int fd = one.fd >= 0 ? one.fd : open_device(one.device);
    if (fd < 0)
        return nullptr;
    const bool is_whole = read_at(fd, one.offset, bytes.get(), one.size);
    if (fd != one.fd)
        (void)close(fd);  // Nothing was written through it.
    if (is_whole)
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
        if (copies_[i].kind == copy_kind::UNCHECKED)
            continue;
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
        longest = std::max(longest, list.size() + 1 + boot_copies::FLAG_LETTERS * (commas + 1));
    }
    return longest;
}

int boot_copies::flags_length(std::size_t *out_length) const {
    std::size_t longest = 0;
    for (int i = 0; i < count_; i++) {
        if (copies_[i].kind == copy_kind::UNCHECKED)
            continue;
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
        // Files that are written through, like sysfs's, may know no fsync.
        if (copies_[i].fd >= 0 && fsync(copies_[i].fd) != 0 && errno != EINVAL)
            return -errno;
    return 0;
}
