// client/answer_output.h: the answer of a method as the command's user wants it.
#pragma once

#include <gio/gio.h>

#include "client/session.h"

char *answer_format(const session &run, const GDBusMethodInfo *method, GVariant *results);
