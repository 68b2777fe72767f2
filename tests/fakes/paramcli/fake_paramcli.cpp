// tests/fakes/paramcli/fake_paramcli.cpp: a parameter store that obeys files and keeps a record.
//
// FAKE_PARAMCLI_DIRECTORY names the folder (tests/fakes/folder). A call's words are the function's
// name and its arguments, the error slot as it was found. Further files:
//   set-error   the number that paramcli_set_custom_param stores in the error slot
//   sync-error  the number that paramcli_sync stores there
// On success the slot stays untouched, so that one that was not cleared is noticed.
#include "platform/paramcli/paramcli.h"

#include <cstring>
#include <initializer_list>
#include <string>

#include <glib.h>

#include "tests/fakes/folder/fake_folder.h"

static constexpr int RESET_MARK = 0x5a;

static const char *folder() {
    return fake_folder("FAKE_PARAMCLI_DIRECTORY");
}

static void record(std::initializer_list<const char *> words) {
    fake_record(folder(), {words.begin(), words.size()});
}

static struct paramcli_options fresh_options() {
    struct paramcli_options options;
    std::memset(&options, RESET_MARK, sizeof options);
    return options;
}

static void require_reset(const struct paramcli_options *options) {
    const struct paramcli_options fresh = fresh_options();
    if (std::memcmp(options, &fresh, sizeof fresh) != 0)
        g_error("the options handed to the fake libparamcli were not reset");
}

static void store_error(const char *name, int *error) {
    const int number = fake_number(folder(), name);
    if (number != 0)
        *error = number;
}

void paramcli_reset_options(struct paramcli_options *options) {
    *options = fresh_options();
    record({__func__});
}

void paramcli_set_custom_param(const char *name, const char *value,
                               struct paramcli_options *options, int *error) {
    require_reset(options);
    record({__func__, name, value, std::to_string(*error).c_str()});
    store_error("set-error", error);
}

void paramcli_sync(struct paramcli_options *options, int *error) {
    require_reset(options);
    record({__func__, std::to_string(*error).c_str()});
    store_error("sync-error", error);
}
