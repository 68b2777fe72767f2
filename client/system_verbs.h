// client/system_verbs.h: the arguments and results of system commands that are not plain ones.
#pragma once

#include <gio/gio.h>

#include "client/command_line.h"

// As command::build.
GVariant *build_clock_set(const command_line &line, GError **error);
GVariant *build_clock_adjust(const command_line &line, GError **error);
GVariant *build_pinsrv(const command_line &line, GError **error);
GVariant *build_reset(const command_line &line, GError **error);

// As command::judge.
bool judge_clock(GVariant *results, GError **error);
bool judge_pinsrv(GVariant *results, GError **error);
bool judge_reboot(GVariant *results, GError **error);
