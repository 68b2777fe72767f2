// client/options.cpp: the table of the options.
#include "client/options.h"

#include <cstddef>
#include <iterator>

static constexpr command_option OPTIONS[] = {
    {OPTION_HELP,         "help",         nullptr,     value_kind::TEXT,      nullptr,
     "Show this text, or that of a command"                                                                               },
    {OPTION_VERSION,      "version",      nullptr,     value_kind::TEXT,      nullptr,            "Show the version"      },
    {OPTION_JSON,         "json",         "MODE",      value_kind::CHOICE,    "short pretty off",
     "Print JSON: short, pretty or off; -j is pretty on a terminal, else short"                                           },
    {OPTION_NO_LEGEND,    "no-legend",    nullptr,     value_kind::TEXT,      nullptr,
     "Print neither titles nor counts"                                                                                    },
    {OPTION_ADDRESS,      "address",      "ADDRESS",   value_kind::TEXT,      nullptr,
     "The bus at ADDRESS instead of the system bus"                                                                       },
    {OPTION_TIMEOUT,      "timeout",      "SECONDS",   value_kind::TEXT,      nullptr,
     "How long to wait for an answer; 60 unless told, 0 for ever"                                                         },
    {OPTION_GROUP,        "group",        "GROUP",     value_kind::GROUP,     nullptr,            "The primary group"     },
    {OPTION_GROUPS,       "groups",       "GROUP,...", value_kind::GROUPS,    nullptr,            "The secondary groups"  },
    {OPTION_COMMENT,      "comment",      "TEXT",      value_kind::TEXT,      nullptr,            "The comment"           },
    {OPTION_SHELL,        "shell",        "PATH",      value_kind::FILE_PATH, nullptr,            "The login shell"       },
    {OPTION_UID,          "uid",          "UID",       value_kind::TEXT,      nullptr,            "The UID, 1000 to 60000"},
    {OPTION_SYSTEM,       "system",       nullptr,     value_kind::TEXT,      nullptr,
     "Make a system account, with a UID of 500 to 999"                                                                    },
    {OPTION_NAMES,        "names",        nullptr,     value_kind::TEXT,      nullptr,            "The names alone"       },
    {OPTION_ASK_PASSWORD, "ask-password", nullptr,     value_kind::TEXT,      nullptr,
     "Ask for a password on the terminal"                                                                                 },
    {OPTION_PASSWORD_FD,  "password-fd",  "FD",        value_kind::TEXT,      nullptr,
     "Read the password from descriptor FD, up to the end of its first line"                                              },
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
