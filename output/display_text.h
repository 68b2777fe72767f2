// client/display_text.h: texts from the bus made fit for a terminal, and how wide they are there.
#pragma once

// A copy in which control characters, and those that only change how others look, are written
// "\x1b" or "\u202e". Ends of lines and tabs stay where lines are kept.
char *display_escape(const char *text, bool keeps_lines);

// The columns that a text takes which has no control characters.
int display_width(const char *text);
