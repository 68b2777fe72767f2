// tests/fuzz/fuzz.cpp: what the fuzz targets share.
#include "tests/fuzz/fuzz.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>

static constexpr std::string_view SEPARATOR = "%%\n";

// GLib ends the process over a fatal record by SIGTRAP, for which libFuzzer does not wait: it would
// not keep the input.
static const auto old_trap = std::signal(SIGTRAP, [](int) { std::abort(); });

void fail_hold(const char *property, std::string_view detail) {
    (void)std::fprintf(stderr, "\nThis does not hold: %s\n%.*s\n", property,
                       static_cast<int>(std::min<std::size_t>(detail.size(), 4000)), detail.data());
    std::abort();
}

std::vector<std::string> parts_of(const std::uint8_t *data, std::size_t size) {
    std::string_view text(reinterpret_cast<const char *>(data), size);
    std::vector<std::string> parts;
    std::size_t start = 0;  // of the line that may be a separator
    for (;;) {
        if (text.substr(start).starts_with(SEPARATOR)) {
            parts.emplace_back(text.substr(0, start));
            text.remove_prefix(start + SEPARATOR.size());
            start = 0;
            continue;
        }
        const std::size_t end = text.find('\n', start);
        if (end == std::string_view::npos)
            break;
        start = end + 1;
    }
    parts.emplace_back(text);
    return parts;
}

views lines_of(std::string_view text) {
    views lines = split(text, '\n');
    if (lines.back().empty())
        lines.pop_back();
    return lines;
}

views split(std::string_view text, char separator) {
    views texts;
    texts.reserve(static_cast<std::size_t>(std::count(text.begin(), text.end(), separator)) + 1);
    split_into(text, separator, &texts);
    return texts;
}

void split_into(std::string_view text, char separator, views *out_texts) {
    out_texts->clear();
    for (std::size_t end; (end = text.find(separator)) != std::string_view::npos;
         text.remove_prefix(end + 1))
        out_texts->push_back(text.substr(0, end));
    out_texts->push_back(text);
}

bool has_only(std::string_view text, std::string_view allowed) {
    return text.find_first_not_of(allowed) == std::string_view::npos;
}

std::uint8_t chosen_bytes::next() {
    if (size_ == 0)
        return 0;
    size_--;
    return *data_++;
}
