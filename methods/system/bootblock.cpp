// methods/system/bootblock.cpp: the methods on the parameters of the boot block.
#include "methods/system/bootblock.h"

#include <cerrno>
#include <cstdlib>

#include "methods/system/text_answer.h"
#include "platform/bootparam/bootparam.h"
#include "service/method.h"

static constexpr const char *SERIAL_NUMBER = "SERNO";
static constexpr int FIRST_UNIT = 0;
static constexpr int READ_FLAGS = 0;

// What the boot-block library allocated.
typedef char *library_string;
G_DEFINE_AUTO_CLEANUP_FREE_FUNC(library_string, free, nullptr)

struct read_outcome {
    int result;
    int error;
};

// Reads one parameter. False with call.error set when there is no chip; else the outcome tells.
static bool read_parameter(method_call &call, const char *name, char **value,
                           read_outcome *outcome) {
    struct bootparam_chip chip;
    bootparam_default_chip(&chip);
    if (bootparam_set_chip(FIRST_UNIT, &outcome->error, &chip) != 0)
        return fail(call, PRIVANE_ERROR_CHIP, "Failed to set chip parameters, error=%d",
                    outcome->error);
    outcome->result = bootparam_read(name, value, READ_FLAGS, &outcome->error, &chip);
    return true;
}

// Deliberate: a boot block without the parameter is no failure; the value is then empty.
static bool has_value(const read_outcome &outcome) {
    return outcome.result == BOOTPARAM_OK || outcome.result == BOOTPARAM_ABSENT ||
           outcome.result == BOOTPARAM_BLANK;
}

bool handle_read_serno(method_call &call) {
    g_auto(library_string) value = nullptr;
    read_outcome outcome = {};
    if (!read_parameter(call, SERIAL_NUMBER, &value, &outcome))
        return false;
    if (!has_value(outcome))
        return fail(call, PRIVANE_ERROR_READ_BOOTBLOCK,
                    "Failed to read bootblock parameter \"SERNO\", res=%d, error=%d",
                    outcome.result, outcome.error);

    return answer_with_text(call, value, privane_system__complete_read_serno);
}

bool handle_read_bootblock_param(method_call &call, const char *name) {
    g_auto(library_string) value = nullptr;
    read_outcome outcome = {};
    if (!read_parameter(call, name, &value, &outcome))
        return false;
    if (!has_value(outcome))
        return fail(call, PRIVANE_ERROR_READ_BOOTBLOCK,
                    "Failed to read bootblock parameter \"%s\", res=%d, error=%d", name,
                    outcome.result, outcome.error);

    return answer_with_text(call, value, privane_system__complete_read_bootblock_param);
}

bool handle_add_bootblock_param(method_call &call, const char *name, const char *value) {
    struct bootparam_chip chip;
    int error = 0;
    bootparam_default_chip(&chip);
    errno = 0;
    if (bootparam_set_chip(FIRST_UNIT, &error, &chip) != 0)
        return fail(call, PRIVANE_ERROR_CHIP, "Failed to set chip parameters %d %m", error);
    errno = 0;
    if (bootparam_write(name, value, &error, &chip) != 0)
        return fail(call, PRIVANE_ERROR_WRITE_BOOTBLOCK,
                    "Failed to write bootblock parameter %d %m", error);

    privane_system__complete_add_bootblock_param(call.skeleton, call.invocation);
    return true;
}
