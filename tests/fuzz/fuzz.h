// tests/fuzz/fuzz.h: what the fuzz targets share: how one fails, and how it takes its input apart.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <type_traits>
#include <vector>

// One input: the target's work. Returns 0, or does not return.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size);

// Before the first input; not every target has one.
extern "C" int LLVMFuzzerInitialize(int *argc, char ***argv);

// Ends the process, as a crash would.
[[noreturn]] void fail_hold(const char *property, std::string_view detail);

// For a property that has to hold. The detail may be of any bytes.
inline void hold(bool holds, const char *property, std::string_view detail = {}) {
    if (!holds)
        fail_hold(property, detail);
}

// The same with a detail that is only put together where it is needed.
template <typename work>
requires std::is_invocable_r_v<std::string, work>
void hold(bool holds, const char *property, const work &detail) {
    if (!holds)
        fail_hold(property, detail());
}

// An input of several texts: what stands between its lines "%%". There is always a first text.
std::vector<std::string> parts_of(const std::uint8_t *data, std::size_t size);

// What points into another text.
using views = std::vector<std::string_view>;

// The lines of a text without their ends; a last one that lacks the end counts.
views lines_of(std::string_view text);

// The texts between the separators; one more than there are separators.
views split(std::string_view text, char separator);
// The same into a list that is there already.
void split_into(std::string_view text, char separator, views *out_texts);

// Whether every byte of the text, which may be empty, is one of those.
bool has_only(std::string_view text, std::string_view allowed);

// The input as a row of choices.
class chosen_bytes {
  public:
    chosen_bytes(const std::uint8_t *data, std::size_t size) : data_(data), size_(size) {}

    bool is_empty() const { return size_ == 0; }
    // 0 when nothing is left.
    std::uint8_t next();
    std::string_view rest() const { return {reinterpret_cast<const char *>(data_), size_}; }

  private:
    const std::uint8_t *data_;
    std::size_t size_;
};
