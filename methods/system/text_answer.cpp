// methods/system/text_answer.cpp: the answer of a method whose only result is a text.
#include "methods/system/text_answer.h"

#include "service/method.h"
#include "service/reply.h"

bool answer_with_text(method_call &call, const char *text, text_completion complete) {
    g_autofree char *sendable = sendable_text(text);
    if (!check_reply_size(wire_size(sendable), &call.error))
        return pass_on(call, "");

    complete(call.skeleton, call.invocation, sendable);
    return true;
}
