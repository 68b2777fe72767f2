// client/options.cpp: the table of the options.
#include "client/options.h"

#include <cstddef>
#include <iterator>

static constexpr command_option flag(option_id id, const char *name, const char *help) {
    return {id, name, nullptr, value_kind::TEXT, nullptr, help};
}

static constexpr command_option valued(option_id id, const char *name, const char *value,
                                       value_kind kind, const char *help) {
    return {id, name, value, kind, nullptr, help};
}

static constexpr command_option choice(option_id id, const char *name, const char *value,
                                       const char *choices, const char *help) {
    return {id, name, value, value_kind::CHOICE, choices, help};
}

static constexpr command_option OPTIONS[] = {
    flag(OPTION_HELP, "help", "Show this text, or that of a command"),
    flag(OPTION_VERSION, "version", "Show the version"),
    choice(OPTION_JSON, "json", "MODE", "short pretty off",
           "Print JSON: short, pretty or off; -j is pretty on a terminal, else short"),
    flag(OPTION_NO_LEGEND, "no-legend", "Print neither titles nor counts"),
    valued(OPTION_ADDRESS, "address", "ADDRESS", value_kind::TEXT,
           "The bus at ADDRESS instead of the system bus"),
    valued(OPTION_TIMEOUT, "timeout", "SECONDS", value_kind::NUMBER,
           "How long to wait for an answer; 60 unless told, 0 for ever"),
    valued(OPTION_GROUP, "group", "GROUP", value_kind::GROUP, "The primary group"),
    valued(OPTION_GROUPS, "groups", "GROUP,...", value_kind::GROUPS, "The secondary groups"),
    valued(OPTION_COMMENT, "comment", "TEXT", value_kind::TEXT, "The comment"),
    valued(OPTION_SHELL, "shell", "PATH", value_kind::FILE_PATH, "The login shell"),
    valued(OPTION_UID, "uid", "UID", value_kind::NUMBER, "The UID, 1000 to 60000"),
    flag(OPTION_SYSTEM, "system", "Make a system account, with a UID of 500 to 999"),
    flag(OPTION_NAMES, "names", "The names alone"),
    flag(OPTION_ASK_PASSWORD, "ask-password", "Ask for a password on the terminal"),
    valued(OPTION_PASSWORD_FD, "password-fd", "FD", value_kind::NUMBER,
           "Read the password from descriptor FD, up to the end of its first line"),
};

static constexpr bool is_in_order() {
    for (std::size_t i = 0; i < std::size(OPTIONS); i++)
        if (OPTIONS[i].id != i)
            return false;
    return std::size(OPTIONS) == OPTION_COUNT;
}
static_assert(is_in_order());

std::span<const command_option> command_options() {
    return OPTIONS;
}

const command_option &option_of(option_id id) {
    return OPTIONS[id];
}
