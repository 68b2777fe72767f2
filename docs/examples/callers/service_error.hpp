// docs/examples/callers/service_error.hpp: domain and code of an error, from its name on the bus.
#pragma once

#include <charconv>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>

struct service_error {
    std::string domain;
    int code = 0;
};

// Nothing where the text is not all of one number.
template <typename number>
std::optional<number> parse_number(std::string_view text, int base) {
    number parsed = 0;
    const auto [end, fault] = std::from_chars(text.begin(), text.end(), parsed, base);
    return fault == std::errc() && end == text.end() ? std::optional(parsed) : std::nullopt;
}

inline bool is_letter_or_digit(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

// What is no letter or digit stands as "_" and two hexadecimal digits.
inline std::optional<std::string> decode_domain(std::string_view written) {
    std::string domain;
    while (!written.empty()) {
        if (is_letter_or_digit(written[0])) {
            domain += written[0];
            written.remove_prefix(1);
            continue;
        }
        // Without a sign, as only a type without one is read.
        const auto byte = parse_number<unsigned char>(written.substr(1, 2), 16);
        if (written[0] != '_' || written.size() < 3 || !byte || *byte == 0)
            return std::nullopt;
        domain += static_cast<char>(*byte);
        written.remove_prefix(3);
    }
    return domain.empty() ? std::nullopt : std::optional(domain);
}

// Nothing for an error that is none of the service's, such as the bus's own. Needs no D-Bus
// library.
inline std::optional<service_error> decode_error(std::string_view name) {
    constexpr std::string_view prefix = "org.gtk.GDBus.UnmappedGError.Quark._";
    constexpr std::string_view mark = ".Code";
    const auto end = name.rfind(mark);
    if (!name.starts_with(prefix) || end == std::string_view::npos || end < prefix.size())
        return std::nullopt;

    const auto domain = decode_domain(name.substr(prefix.size(), end - prefix.size()));
    const auto code = parse_number<int>(name.substr(end + mark.size()), 10);
    return domain && code ? std::optional(service_error{*domain, *code}) : std::nullopt;
}
