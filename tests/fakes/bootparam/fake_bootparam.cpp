// tests/fakes/bootparam/fake_bootparam.cpp: a boot block that obeys files and keeps a record.
//
// FAKE_BOOTPARAM_DIRECTORY names the folder (tests/fakes/folder). A call's words are the function's
// name and its arguments, the error slot as it was found; the chip record is not among them, but it
// must be as bootparam_default_chip left it. Further files:
//   set-chip-result, read-result, write-result  what the function returns
//   error                                       the number that one which fails stores in the slot
//   errno                                       what one which fails leaves in errno; without it
//                                               errno stays as the caller had it
//   value                                       what a read stores, whatever it returns
#include "platform/bootparam/bootparam.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <string>

#include <glib.h>

#include "tests/fakes/folder/fake_folder.h"

static constexpr int DEFAULT_MARK = 0x5a;

static const char *folder() {
    return fake_folder("FAKE_BOOTPARAM_DIRECTORY");
}

static void record(std::initializer_list<const char *> words) {
    fake_record(folder(), {words.begin(), words.size()});
}

static struct bootparam_chip default_chip() {
    struct bootparam_chip chip;
    std::memset(&chip, DEFAULT_MARK, sizeof chip);
    return chip;
}

static void require_default(const struct bootparam_chip *chip) {
    const struct bootparam_chip fresh = default_chip();
    if (std::memcmp(chip, &fresh, sizeof fresh) != 0)
        g_error("the chip record handed to the fake libbootparam has no defaults");
}

static int answer(const char *result_name, int callers_errno, int *error) {
    const int result = fake_number(folder(), result_name);
    const int number = fake_number(folder(), "error");
    const int cause = fake_number(folder(), "errno");
    if (result != 0)
        *error = number;
    errno = result != 0 && cause != 0 ? cause : callers_errno;
    return result;
}

void bootparam_default_chip(struct bootparam_chip *chip) {
    *chip = default_chip();
    record({__func__});
}

int bootparam_set_chip(int unit, int *error, struct bootparam_chip *chip) {
    const int callers_errno = errno;
    require_default(chip);
    record({__func__, std::to_string(unit).c_str(), std::to_string(*error).c_str()});
    return answer("set-chip-result", callers_errno, error);
}

int bootparam_read(const char *name, char **value, int flags, int *error,
                   struct bootparam_chip *chip) {
    const int callers_errno = errno;
    require_default(chip);
    if (*value != nullptr)
        g_error("the slot for a value handed to the fake libbootparam holds one");
    record({__func__, name, std::to_string(flags).c_str(), std::to_string(*error).c_str()});

    g_autofree char *path = g_build_filename(folder(), "value", nullptr);
    g_autofree char *text = nullptr;
    if (g_file_get_contents(path, &text, nullptr, nullptr))
        *value = strdup(text);
    return answer("read-result", callers_errno, error);
}

int bootparam_write(const char *name, const char *value, int *error, struct bootparam_chip *chip) {
    const int callers_errno = errno;
    require_default(chip);
    record({__func__, name, value, std::to_string(*error).c_str()});
    return answer("write-result", callers_errno, error);
}
