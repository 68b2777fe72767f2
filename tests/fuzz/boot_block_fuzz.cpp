// tests/fuzz/boot_block_fuzz.cpp: reads and writes in a boot block of any content. The parts of the
// input: a byte of choices, the first copy behind its CRC, the second one, a name, a value.
#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <map>

#include <fcntl.h>
#include <sys/mount.h>
#include <unistd.h>

#include "platform/bootparam/bootparam.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/scratch.h"
#include "tests/unit/platform/private_etc.h"

static constexpr const char *CONFIG = "/etc/fw_env.config";
static constexpr const char *COPIES[] = {"/etc/copy0", "/etc/copy1"};
static constexpr std::size_t SIZES[] = {256, 1024};
static constexpr std::size_t CRC_SIZE = 4;
// Of which each input watches one, by its length: every read goes through all of the files.
static constexpr const char *OTHERS[] = {"SERNO", "b", "flag"};

// The libraries' own; what they keep is theirs.
extern "C" const char *__lsan_default_suppressions();
extern "C" const char *__lsan_default_suppressions() {
    return "leak:libubootenv\n";
}

struct images {
    std::string copies[2];
    bool operator==(const images &other) const = default;
};

// The outcome of a read: the value behind a "=", or the result and the cause.
using outcomes = std::map<std::string, std::string>;

// As zlib has it.
static std::uint32_t crc32_of(std::string_view bytes) {
    std::uint32_t crc = 0xffffffff;
    for (const char byte : bytes) {
        crc ^= static_cast<unsigned char>(byte);
        for (int bit = 0; bit < 8; bit++)
            crc = (crc >> 1) ^ ((crc & 1) != 0 ? 0xedb88320U : 0U);
    }
    return ~crc;
}

// A copy begins with the CRC of its parameters, in the machine's byte order; a flag stands between
// them where there are two.
static std::string image_of(const std::string &part, std::size_t size, bool has_flag, bool is_valid,
                            char filler) {
    std::string body = part.substr(0, size - CRC_SIZE);
    body.resize(size - CRC_SIZE, filler);
    const std::uint32_t crc =
        is_valid ? crc32_of(std::string_view(body).substr(has_flag ? 1 : 0)) : 0x11223344;
    std::string image(CRC_SIZE, '\0');
    std::memcpy(image.data(), &crc, CRC_SIZE);
    return image + body;
}

// Whether the empty string that ends the parameters is missing.
static bool is_endless(const std::string &image, bool has_flag) {
    std::size_t at = CRC_SIZE + (has_flag ? 1 : 0);
    while (at < image.size() && image[at] != '\0') {
        at = image.find('\0', at);
        at = at == std::string::npos ? image.size() : at + 1;
    }
    return at >= image.size();
}

// They are written in place, so that the test's own descriptors stay good.
static int copy_fd(std::size_t i) {
    static constexpr int FLAGS = O_RDWR | O_CREAT | O_CLOEXEC;
    static const int fds[] = {open(COPIES[0], FLAGS, 0600), open(COPIES[1], FLAGS, 0600)};
    hold(fds[i] >= 0, "a copy can be made", COPIES[i]);
    return fds[i];
}

static void lay_copy(std::size_t i, const std::string &image) {
    const int fd = copy_fd(i);
    const bool is_written =
        pwrite(fd, image.data(), image.size(), 0) == static_cast<ssize_t>(image.size());
    hold(is_written && ftruncate(fd, static_cast<off_t>(image.size())) == 0,
         "a copy can be written", COPIES[i]);
}

static std::string lying_copy(std::size_t i) {
    char bytes[2 * SIZES[1]];
    const ssize_t length = pread(copy_fd(i), bytes, sizeof bytes, 0);
    hold(length >= 0, "a copy can be read", COPIES[i]);
    return {bytes, static_cast<std::size_t>(length)};
}

static void lay(const images &laid, std::size_t size, bool has_two) {
    static std::string laid_config;
    std::string config;
    for (std::size_t i = 0; i < (has_two ? 2U : 1U); i++) {
        lay_copy(i, laid.copies[i]);
        config += std::string(COPIES[i]) + " 0x0 " + (size == SIZES[0] ? "0x100" : "0x400") + "\n";
    }
    if (config != laid_config)
        write_whole(CONFIG, config);
    laid_config = config;
}

static images lying(bool has_two) {
    return {
        {lying_copy(0), has_two ? lying_copy(1) : ""}
    };
}

static void check_failure(int result, int error, int number) {
    hold(result == BOOTPARAM_FAILED || result == BOOTPARAM_INVALID || result == BOOTPARAM_BLANK ||
             result == BOOTPARAM_ABSENT,
         "a result is one of those that are told of", std::to_string(result));
    hold(error != 0 && error == number, "a failure has its cause, in errno too",
         std::to_string(error) + " " + std::to_string(number));
}

static std::string failed(int result, int error) {
    return std::to_string(result) + " " + std::to_string(error);
}

static const std::string REFUSED = failed(BOOTPARAM_FAILED, EBADMSG);

static std::string read_outcome(const std::string &name) {
    bootparam_chip chip;
    char untouched = '\0';
    char *value = &untouched;
    int error = 0;

    bootparam_default_chip(&chip);
    const int result = bootparam_read(name.c_str(), &value, 0, &error, &chip);
    if (result != BOOTPARAM_OK) {
        check_failure(result, error, errno);
        hold(value == &untouched, "a failure leaves the value alone", name);
        return failed(result, error);
    }
    const std::string text = value;
    std::free(value);
    return "=" + text;
}

static outcomes read_both(const std::string &name, const std::string &other) {
    outcomes both;
    both[name] = read_outcome(name);
    if (other != name)
        both[other] = read_outcome(other);
    return both;
}

static bool has_control(const std::string &text) {
    return std::any_of(text.begin(), text.end(),
                       [](char c) { return static_cast<unsigned char>(c) < 32 || c == 127; });
}

static bool is_acceptable(const std::string &name, const std::string &value) {
    return !name.empty() && name.find('=') == std::string::npos && name != ".flags" &&
           !has_control(name) && !value.empty() && !has_control(value);
}

static void check_written(const outcomes &before, const outcomes &after, const std::string &name,
                          const std::string &value) {
    const std::string blank = failed(BOOTPARAM_BLANK, ENODATA);
    hold(after.at(name) == "=" + value, "what was written is read", after.at(name));
    for (const auto &[other, outcome] : before) {
        const std::string &expected = outcome == blank ? failed(BOOTPARAM_ABSENT, ENOENT) : outcome;
        hold(other == name || after.at(other) == expected, "every other parameter stays",
             other + " " + outcome + " became " + after.at(other));
    }
}

static void check_copies(const images &before, const images &after) {
    for (int i = 0; i < 2; i++)
        hold(before.copies[i].size() == after.copies[i].size(), "a copy keeps its size");
    hold(before.copies[0] == after.copies[0] || before.copies[1] == after.copies[1],
         "a write leaves one of two copies alone");
}

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    const bool is_private = enter_private_etc() && mount("tmpfs", "/run/lock", "tmpfs",
                                                         MS_NOSUID | MS_NODEV, "mode=1777") == 0;
    hold(is_private, "the process has an /etc and locks of its own");
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::vector<std::string> parts = parts_of(data, size);
    parts.resize(5);
    const unsigned choices = parts[0].empty() ? 0 : static_cast<unsigned char>(parts[0][0]);
    const bool has_two = (choices & 4) == 0;
    const std::size_t copy_size = SIZES[(choices & 8) != 0 ? 1 : 0];
    const std::string name = parts[3].substr(0, parts[3].find('\n')).c_str();
    const std::string value = parts[4].substr(0, parts[4].find('\n')).c_str();
    const bool is_valid[] = {(choices & 1) == 0, has_two && (choices & 2) == 0};
    // What follows a short text: zero, or what lets it have no end.
    const char filler = (choices & 64) == 0 ? '\0' : 'x';
    const images before = {
        {image_of(parts[1], copy_size, has_two, is_valid[0], filler),
         has_two ? image_of(parts[2], copy_size, has_two, is_valid[1], filler) : ""}
    };
    const bool is_refused = (is_valid[0] && is_endless(before.copies[0], has_two)) ||
                            (is_valid[1] && is_endless(before.copies[1], has_two));

    lay(before, copy_size, has_two);
    const std::string other = OTHERS[size % std::size(OTHERS)];
    const outcomes read_before = read_both(name, other);
    hold(lying(has_two) == before, "a read changes nothing");
    hold((read_before.at(other) == REFUSED) == is_refused,
         "a block is refused where a valid copy has no end", read_before.at(other));

    bootparam_chip chip;
    int error = 0;
    bootparam_default_chip(&chip);
    const int result = bootparam_write(name.c_str(), value.c_str(), &error, &chip);
    if (result != BOOTPARAM_OK)
        check_failure(result, error, errno);
    hold((result == BOOTPARAM_INVALID) == !is_acceptable(name, value),
         "names and values are refused that no boot block takes", name);
    hold((failed(result, error) == REFUSED) == (is_refused && is_acceptable(name, value)),
         "such a block is not written", failed(result, error));
    const images after = lying(has_two);
    if (result == BOOTPARAM_OK)
        check_written(read_before, read_both(name, other), name, value);
    else
        hold(after == before, "a write that fails changes nothing", std::to_string(error));
    if (has_two)
        check_copies(before, after);
    return 0;
}
