// client/options.h: the options of the command line, those of all commands and those of some.
#pragma once

#include <span>

// What a word of the command line stands for: how it is completed, and how it is changed before it
// goes to the service.
enum class value_kind {
    TEXT,
    NUMBER,
    USER,
    GROUP,
    GROUPS,     // names joined by ","
    UNIT,       // a service, with or without its suffix
    TARGET,     // likewise
    METHOD,     // of the interface
    FILE_PATH,  // a path
    DISK,       // the device of one
    INTERFACE,  // of the network
    CHOICE,     // one of the words that are listed
};

enum option_id {
    OPTION_HELP,
    OPTION_VERSION,
    OPTION_JSON,
    OPTION_NO_LEGEND,
    OPTION_ADDRESS,
    OPTION_TIMEOUT,
    // Those above go with every command, those below with the commands that list them.
    OPTION_GROUP,
    OPTION_GROUPS,
    OPTION_COMMENT,
    OPTION_SHELL,
    OPTION_UID,
    OPTION_SYSTEM,
    OPTION_NAMES,
    OPTION_ASK_PASSWORD,
    OPTION_PASSWORD_FD,
    OPTION_COUNT,
    OPTION_NONE = OPTION_COUNT,
};

inline constexpr option_id FIRST_OWN_OPTION = OPTION_GROUP;

struct command_option {
    option_id id;
    const char *name;
    const char *value;  // what stands for it in the usage; null: the option takes none
    value_kind kind;
    const char *choices;  // of a CHOICE: its words, each followed by a blank but the last
    const char *help;
};

// In the order of their numbers.
std::span<const command_option> command_options();
const command_option &option_of(option_id id);
