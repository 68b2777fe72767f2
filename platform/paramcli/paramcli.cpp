// platform/paramcli/paramcli.cpp: the library's functions, on the device's parameter file.
#include "platform/paramcli/paramcli.h"

#include "platform/paramcli/param_file.h"
#include "platform/paramcli/param_options.h"

static constexpr const char *PARAMETER_FILE = "/etc/privane/parameters.conf";

static void report(int number, int *error) {
    if (number != PARAMCLI_ERROR_NONE && error != nullptr)
        *error = number;
}

static bool is_usable(const paramcli_options *options) {
    return options != nullptr && param_options_are_valid(options);
}

void paramcli_reset_options(struct paramcli_options *options) {
    if (options != nullptr)
        param_options_reset(options);
}

void paramcli_set_custom_param(const char *name, const char *value,
                               struct paramcli_options *options, int *error) {
    const bool usable = name != nullptr && value != nullptr && is_usable(options);

    report(usable ? param_options_add(options, name, value) : int{PARAMCLI_ERROR_INVALID}, error);
}

void paramcli_sync(struct paramcli_options *options, int *error) {
    report(
        is_usable(options) ? param_file_sync(PARAMETER_FILE, options) : int{PARAMCLI_ERROR_INVALID},
        error);
}
