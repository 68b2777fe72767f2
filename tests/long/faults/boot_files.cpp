// tests/long/faults/boot_files.cpp: the two copies of a boot block, byte for byte, by rules of the
// tests' own: how they are laid out, which one counts, and what a write makes of them.
#include "tests/long/faults/boot_files.h"

#include <cstdint>
#include <cstring>
#include <optional>

#include <zlib.h>

static constexpr const char *NAMES[] = {"copy0", "copy1"};
// A CRC of all that stands behind the counter.
static constexpr std::size_t COUNTER_AT = 4;
static constexpr std::size_t PARAMETERS_AT = 5;
static constexpr unsigned char LAST_COUNTER = 255;

struct valid_copy {
    unsigned char counter;
    boot_parameters parameters;
};

std::string long_boot_value() {
    return std::string(BOOT_COPY_SIZE / 2 + 100, 'k');
}

lying_file blank_boot_copy() {
    return plain_file(std::string(BOOT_COPY_SIZE, '\xff'), 0600);
}

static std::uint32_t sum_of(const std::string &copy) {
    return static_cast<std::uint32_t>(
        crc32(0, reinterpret_cast<const Bytef *>(copy.data() + PARAMETERS_AT),
              static_cast<uInt>(copy.size() - PARAMETERS_AT)));
}

lying_file boot_copy(unsigned char counter, const boot_parameters &parameters) {
    std::string text(PARAMETERS_AT, '\0');
    for (const auto &[name, value] : parameters) {
        text += name + "=" + value;
        text += '\0';
    }
    text.resize(BOOT_COPY_SIZE, '\0');
    text[COUNTER_AT] = static_cast<char>(counter);
    const std::uint32_t sum = sum_of(text);
    std::memcpy(text.data(), &sum, sizeof sum);
    return plain_file(text, 0600);
}

static std::optional<valid_copy> read_copy(const std::string &text) {
    std::uint32_t sum = 0;
    if (text.size() != BOOT_COPY_SIZE)
        return std::nullopt;
    std::memcpy(&sum, text.data(), sizeof sum);
    if (sum != sum_of(text))
        return std::nullopt;
    valid_copy copy = {static_cast<unsigned char>(text[COUNTER_AT]), {}};
    for (std::size_t at = PARAMETERS_AT; at < text.size() && text[at] != '\0';) {
        const std::string entry = text.c_str() + at;
        const std::size_t equals = entry.find('=');
        copy.parameters[entry.substr(0, equals)] = entry.substr(equals + 1);
        at += entry.size() + 1;
    }
    return copy;
}

// The newer one of two; the counter begins again behind its last value.
static int index_that_counts(const std::optional<valid_copy> (&copies)[2]) {
    if (!copies[0] || !copies[1])
        return copies[0] || !copies[1] ? 0 : 1;
    const unsigned char first = copies[0]->counter;
    const unsigned char second = copies[1]->counter;
    if (first == LAST_COUNTER && second == 0)
        return 1;
    if (second == LAST_COUNTER && first == 0)
        return 0;
    return second > first ? 1 : 0;
}

struct read_copies {
    explicit read_copies(const folder_state &files) {
        for (int i = 0; i < 2; i++)
            copies[i] = files.count(NAMES[i]) != 0 ? read_copy(files.at(NAMES[i]).text)
                                                   : std::optional<valid_copy>();
        counts = index_that_counts(copies);
    }
    std::optional<valid_copy> copies[2];
    int counts;
};

std::string boot_copy_to_write(const folder_state &before) {
    return NAMES[1 - read_copies(before).counts];
}

folder_state boot_files_after(const folder_state &before, const std::string &name,
                              const std::string &value, boot_write done) {
    const read_copies read(before);
    valid_copy next = read.copies[read.counts].value_or(valid_copy{LAST_COUNTER, {}});
    next.parameters[name] = value;
    next.counter++;
    folder_state files = before;
    std::string *text = &files[boot_copy_to_write(before)].text;
    const std::string made = boot_copy(next.counter, next.parameters).text;
    if (done == boot_write::ALL)
        *text = made;
    else if (done == boot_write::HALF)
        text->replace(0, made.size() / 2, made, 0, made.size() / 2);
    return files;
}

std::string boot_text_of(const std::string &a, const std::string &b, const std::string &c) {
    return "a=" + a + " b=" + (b == long_boot_value() ? "kept" : b) + " c=" + c;
}

std::string boot_text(const folder_state &files) {
    const read_copies read(files);
    const std::optional<valid_copy> &copy = read.copies[read.counts];
    if (!copy)
        return "blank";
    const auto value = [&copy](const char *name) {
        const auto found = copy->parameters.find(name);
        return found != copy->parameters.end() ? found->second : "none";
    };
    return boot_text_of(value("a"), value("b"), value("c"));
}
