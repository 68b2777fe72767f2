// client/explain.h: the command that tells who may call a method.
#pragma once

#include "client/session.h"

// As command::run.
bool run_explain(const session &run, GError **error);
