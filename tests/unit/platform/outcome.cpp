// tests/unit/platform/outcome.cpp: how a child of a test tells the test what a call returned.
#include "tests/unit/platform/outcome.h"

std::string describe_outcome(int result, const GError *error) {
    const std::string number = std::to_string(result);

    if (error == nullptr)
        return result != 0 ? number : number + " no error";
    if (result != 0)
        return number + " with an error";
    return number + " " + g_quark_to_string(error->domain) + " " + std::to_string(error->code) +
           " " + error->message;
}

void say(const std::string &text) {
    g_print("%s", text.c_str());
}
