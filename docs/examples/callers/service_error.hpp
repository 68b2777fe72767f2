// docs/examples/callers/service_error.hpp: domain and code of an error, from its name on the bus.
#pragma once

#include <charconv>
#include <optional>
#include <string>
#include <string_view>

struct service_error {
    std::string domain;
    int code = 0;
};

// Nothing for an error that is none of the service's, such as the bus's own. Needs no D-Bus
// library.
inline std::optional<service_error> decode_error(std::string_view name) {
    constexpr std::string_view prefix = "org.gtk.GDBus.UnmappedGError.Quark._";
    constexpr std::string_view mark = ".Code";
    const auto end = name.rfind(mark);
    if (!name.starts_with(prefix) || end == name.npos || end < prefix.size())
        return std::nullopt;

    service_error found;
    const std::string_view number = name.substr(end + mark.size());
    if (std::from_chars(number.begin(), number.end(), found.code).ptr != number.end())
        return std::nullopt;
    // What is no letter or digit stands as "_" and two hexadecimal digits.
    const std::string_view domain = name.substr(prefix.size(), end - prefix.size());
    for (std::size_t i = 0; i < domain.size(); i++) {
        if (domain[i] != '_') {
            found.domain += domain[i];
            continue;
        }
        int byte = 0;
        const std::string_view digits = domain.substr(i + 1, 2);
        if (digits.size() != 2 ||
            std::from_chars(digits.begin(), digits.end(), byte, 16).ptr != digits.end())
            return std::nullopt;
        found.domain += static_cast<char>(byte);
        i += 2;
    }
    return found;
}
