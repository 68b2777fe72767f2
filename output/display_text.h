// output/display_text.h: texts of others made fit for a terminal, and how wide they are there;
// shared by the programs that people start.
#pragma once

// A copy in which control characters, and those that only change how others look, are written
// "\x1b" or "\u202e". Ends of lines and tabs stay where lines are kept.
char *display_escape(const char *text, bool keeps_lines);

// A JSON document with the same characters written as JSON has it, so that it is valid whatever a
// text holds, and fit for a terminal as it is. Ends of lines stay: they stand between its parts.
char *display_escape_json(const char *document);

// The columns that a text takes which has no control characters.
int display_width(const char *text);
