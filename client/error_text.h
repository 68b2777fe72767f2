// client/error_text.h: an error as one line: the service's text, its domain and its code.
#pragma once

#include <glib.h>

// Splits the name that GDBus gives to an error of a domain which no bus name is known for. False
// for any other name.
bool error_name_split(const char *bus_name, char **out_domain, int *out_code);

// "Failed to add user 'x', user already exists (usermgmt 6)": of an error of the bus its name
// stands in the brackets, of the client's own nothing does. What would break the line is escaped.
char *error_text_line(const GError *error);
