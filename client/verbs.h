// client/verbs.h: the one table of what the client can do. Its help, its completion, and the tables
// of its manual page and its document follow it.
#pragma once

#include <cstddef>
#include <span>

#include <gio/gio.h>

#include "client/command_line.h"

struct session;

// Where an argument comes from.
enum class source {
    NONE,
    WORD,
    OPTIONAL_WORD,  // the first of its choices where it is not given
    WORDS,          // all that are left, of which there may have to be one
    OPTION,
    REQUIRED_OPTION,
    CHOSEN,             // true where one of the words is its name
    NEW_PASSWORD,       // asked for twice
    OPTIONAL_PASSWORD,  // asked for twice where an option wants it, else empty
    CURRENT_PASSWORD,   // asked for once
    FIXED,              // its name is its value
};

struct argument {
    source from;
    const char *name;  // in the usage; of an option and a password none
    value_kind kind;
    const char *choices;  // of a CHOICE
    option_id option;
};

// What an answer is printed as. In JSON, whatever is no list is an object of the method's results,
// under the names of the interface document.
enum class shape {
    NOTHING,
    TEXT,     // as it comes
    LINE,     // one value on a line
    ANSWER,   // yes or no
    RECORD,   // a line for each result
    SUBJECT,  // likewise, after the name of what was asked for
    LIST,     // a row for each element; the columns name the members of its JSON objects
};

struct command {
    const char *noun = nullptr;
    const char *verb = nullptr;  // null where the noun says it all
    option_id selector =
        OPTION_NONE;  // tells rows with the same noun and verb apart; the last of them has none
    const char *method = nullptr;  // null: the client's own
    argument arguments[6] = {};
    shape answer = shape::NOTHING;
    const char *columns = nullptr;  // of a LIST
    const char *help = nullptr;     // null: not told to users
    bool needs_change = false;  // one of the options or chosen words must be there, and not empty

    // Where the arguments are not those of the method one by one; null with an error.
    GVariant *(*build)(const command_line &line, GError **error) = nullptr;
    // Of methods that tell a failure in their results; false with an error.
    bool (*judge)(GVariant *results, GError **error) = nullptr;
    // Of the client's own; false with an error.
    bool (*run)(const session &run, GError **error) = nullptr;
};

std::span<const command> commands();

// What is given as arguments, up to the first of source NONE.
std::span<const argument> arguments_of(const command &row);

// Null with a usage error. It has looked at noun and verb alone.
const command *command_find(const command_line &line, GError **error);

bool noun_is_known(const char *noun);

// The number of words that name a command.
guint name_length(const command &row);

// Whether the options and words are the command's, as far as the client can tell; false with a
// usage error. Afterwards a password may be asked for: nobody types one in vain.
bool command_check(const command &row, const command_line &line, GError **error);

bool takes_option(const command &row, option_id id);

// The arguments as they stand in the help: "user show NAME".
char *command_usage(const command &row);

const GDBusMethodInfo *method_find(const char *name);
