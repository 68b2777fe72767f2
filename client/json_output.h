// client/json_output.h: answers as JSON.
#pragma once

#include <gio/gio.h>
#include <json-glib/json-glib.h>

#include "client/command_line.h"

// Of a LIST: an array with an object for each element. The results are arrays of equal length, one
// for each of the columns, in which blanks stand between the names.
JsonNode *json_of_list(GVariant *results, const char *columns);

// An object of the results under the names that the interface document has for them; name, where
// it is not null, is put in front.
JsonNode *json_of_results(GVariant *results, const GDBusMethodInfo *method, const char *name);

// With an end of line.
char *json_format(JsonNode *node, json_mode mode);
