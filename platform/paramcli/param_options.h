// platform/paramcli/param_options.h: what the option block holds; internal.
#pragma once

#include <string_view>

#include "platform/paramcli/paramcli.h"

void param_options_reset(paramcli_options *options);

// Whether the block was reset and holds what these functions put there.
bool param_options_are_valid(const paramcli_options *options);

// The lines that are pending, of a valid block.
std::string_view param_options_pending(const paramcli_options *options);

// 0, or a number of paramcli.h.
int param_options_add(paramcli_options *options, std::string_view name, std::string_view value);
