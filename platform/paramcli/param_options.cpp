// platform/paramcli/param_options.cpp: keeps parameters as lines in the caller's option block.
#include "platform/paramcli/param_options.h"

#include <algorithm>
#include <cstddef>
#include <cstring>

static constexpr unsigned MARK = 0x50415231;

static_assert(sizeof(paramcli_options) == 4096, "the size is part of the library's ABI");

static bool is_control(char byte) {
    return static_cast<unsigned char>(byte) < ' ' || byte == '\x7f';
}

static bool is_name(std::string_view name) {
    if (name.empty() || name.front() == '#' || name.front() == ' ' || name.back() == ' ')
        return false;
    return std::none_of(name.begin(), name.end(),
                        [](char byte) { return byte == '=' || is_control(byte); });
}

void param_options_reset(paramcli_options *options) {
    explicit_bzero(options, sizeof *options);
    options->mark = MARK;
}

bool param_options_are_valid(const paramcli_options *options) {
    return options->mark == MARK && options->length <= sizeof options->pending &&
           (options->length == 0 || options->pending[options->length - 1] == '\n');
}

std::string_view param_options_pending(const paramcli_options *options) {
    return {options->pending, options->length};
}

static void append(paramcli_options *options, std::string_view text) {
    text.copy(options->pending + options->length, text.size());
    options->length += static_cast<unsigned>(text.size());
}

int param_options_add(paramcli_options *options, std::string_view name, std::string_view value) {
    const std::size_t room = sizeof options->pending - options->length;

    if (!is_name(name))
        return PARAMCLI_ERROR_NAME;
    if (value.find_first_of("\n\r") != std::string_view::npos)
        return PARAMCLI_ERROR_VALUE;
    if (name.size() + value.size() + 2 > room)
        return PARAMCLI_ERROR_FULL;

    append(options, name);
    append(options, "=");
    append(options, value);
    append(options, "\n");
    return PARAMCLI_ERROR_NONE;
}
