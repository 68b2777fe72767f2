// methods/system/text_answer.h: the answer of a method whose only result is a text.
#pragma once

#include <gio/gio.h>

#include "privane_system_binding.h"

struct method_call;

using text_completion = void (*)(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                                 const char *text);

// Completes the call with the text, "" for null, each byte that is no UTF-8 replaced by U+FFFD. A
// text that no message can carry fails with an error of the file-error domain.
bool answer_with_text(method_call &call, const char *text, text_completion complete);
