// client/command_line.h: the words and options of a command line, before anybody knows the command.
#pragma once

#include <glib.h>

#include "client/options.h"
#include "output/json_mode.h"

// All texts are argv's own.
struct command_line {
    const char *options[OPTION_COUNT];  // null where not given, "" for one without a value
    GPtrArray *words;                   // const char *
    json_mode json;
    int timeout_ms;  // of GDBus: G_MAXINT is for ever
};

// Sets a usage error for an unknown option, a wrong value of an option that every command has, and
// anything that is no UTF-8. Nothing is to be cleared then. on_terminal: what "-j" depends on.
bool command_line_parse(int argc, char **argv, bool on_terminal, command_line *out_line,
                        GError **error);

void command_line_clear(command_line *line);
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(command_line, command_line_clear)

// Null where there are not so many.
const char *word_at(const command_line &line, guint index);

// The value of an option that is given and takes a number; false with a usage error.
bool option_number(const command_line &line, option_id id, gint64 *out_number, GError **error);

bool parse_number(const char *text, gint64 lowest, gint64 highest, gint64 *out_number);

// Whether the word is one of a list, in which blanks stand between the words.
bool is_choice(const char *choices, const char *word);
