// tests/long/faults/boot_cases.cpp: the service's writes of the boot block that are struck.
#include "tests/long/faults/boot_cases.h"

#include <cstdlib>

#include <sys/stat.h>

#include <glib.h>

#include "methods/system/bootblock.h"
#include "platform/bootparam/bootparam.h"
#include "service/method.h"
#include "tests/long/faults/boot_files.h"
#include "tests/long/faults/glib_log.h"

static constexpr const char *BOOT_FOLDER = "/etc/boot";
static constexpr const char *BOOT_CONFIG = "/etc/fw_env.config";

// There is no bus that could take the answer.
static int answers;
void wrap_answer(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation) asm(
    "__wrap_privane_system__complete_add_bootblock_param");
void wrap_answer(PrivaneSystem * /*skeleton*/, GDBusMethodInvocation * /*invocation*/) {
    answers++;
}

static store_answer write_boot_parameter(const char *name, const char *value) {
    method_call call = {};
    store_answer answer;
    answers = 0;
    const glib_log log;
    const bool done = handle_add_bootblock_param(call, name, value);
    answer.log = log.taken();
    if (done != (call.error == nullptr) || answers != (done ? 1 : 0))
        answer.wrong = "the handler answers " + std::to_string(answers) + " times";
    if (call.error != nullptr) {
        answer.number = call.error->code;
        answer.error =
            std::string(g_quark_to_string(call.error->domain)) + ": " + call.error->message;
    } else if (!done) {
        answer.number = -1;
    }
    g_clear_error(&call.error);
    return answer;
}

static std::string read_boot_parameter(const char *name) {
    bootparam_chip chip;
    char *value = nullptr;
    int error = 0;
    bootparam_default_chip(&chip);
    const int result = bootparam_read(name, &value, 0, &error, &chip);
    std::string text = value != nullptr ? value : "";
    std::free(value);
    if (result == BOOTPARAM_OK)
        return text;
    return result == BOOTPARAM_BLANK    ? "blank"
           : result == BOOTPARAM_ABSENT ? "none"
                                        : "failed with " + std::to_string(error);
}

static std::string read_boot_block() {
    const std::string a = read_boot_parameter("a");
    return a == "blank" ? a : boot_text_of(a, read_boot_parameter("b"), read_boot_parameter("c"));
}

std::string judge_boot_block(const folder_state &expected) {
    const std::string now = read_boot_block();
    if (now != boot_text(expected))
        return "the boot block is read as " + now + " instead of " + boot_text(expected);
    const folder_state files = look_at_folder(BOOT_FOLDER);
    if (files != expected)
        return "the copies are not what they have to be, but say " + boot_text(files) +
               state_difference(expected, files, true);
    return "";
}

std::string write_on_boot_block() {
    const folder_state before = look_at_folder(BOOT_FOLDER);
    if (const store_answer answer = write_boot_parameter("later", "1"); answer.number != 0)
        return "the next write fails: " + answer.error;
    if (const std::string later = read_boot_parameter("later"); later != "1")
        return "the next write is read as " + later;
    const std::string wrong = judge_boot_block(boot_files_after(before, "later", "1"));
    return wrong.empty() ? "" : "the next write: " + wrong;
}

// Its CRC is wrong.
static lying_file broken(lying_file copy) {
    copy.text[9] ^= 1;
    return copy;
}

static void add_case(std::vector<store_case> *cases, const char *name, const folder_state &files,
                     const char *written, const lying_file &made) {
    folder_state after = files;
    after[written] = made;
    cases->push_back({std::string("boot block write, ") + name, store_kind::BOOT_BLOCK, BOOT_FOLDER,
                      files, after, "", [] { return write_boot_parameter("a", "new"); }});
}

void add_boot_cases(std::vector<store_case> *cases) {
    const std::string kept = long_boot_value();
    const boot_parameters older = {
        {"a", "old"  },
        {"b", kept   },
        {"c", "older"}
    };
    const boot_parameters newest = {
        {"a", "old"   },
        {"b", kept    },
        {"c", "newest"}
    };
    const boot_parameters from_older = {
        {"a", "new"  },
        {"b", kept   },
        {"c", "older"}
    };
    const boot_parameters from_newest = {
        {"a", "new"   },
        {"b", kept    },
        {"c", "newest"}
    };
    const std::string config = "/etc/boot/copy0 0x0 0x2000\n/etc/boot/copy1 0x0 0x2000\n";
    const auto both = [](const lying_file &first, const lying_file &second) {
        return folder_state{
            {"copy0", first },
            {"copy1", second}
        };
    };
    if (!g_file_set_contents(BOOT_CONFIG, config.c_str(), -1, nullptr) ||
        mkdir(BOOT_FOLDER, 0700) != 0)
        std::exit(125);

    add_case(cases, "blank copies", both(blank_boot_copy(), blank_boot_copy()), "copy1",
             boot_copy(0, {
                              {"a", "new"}
    }));
    add_case(cases, "one blank copy",
             both(blank_boot_copy(), boot_copy(0,
                                               {
                                                   {"b", kept}
    })),
             "copy0", boot_copy(1, {{"a", "new"}, {"b", kept}}));
    add_case(cases, "copy0 newer", both(boot_copy(3, newest), boot_copy(2, older)), "copy1",
             boot_copy(4, from_newest));
    add_case(cases, "copy0 newer, broken", both(broken(boot_copy(3, newest)), boot_copy(2, older)),
             "copy0", boot_copy(3, from_older));
    add_case(cases, "copy1 newer, its counter begins again",
             both(boot_copy(255, older), boot_copy(0, newest)), "copy0", boot_copy(1, from_newest));
    add_case(cases, "copy1 newer, broken", both(boot_copy(5, older), broken(boot_copy(6, newest))),
             "copy1", boot_copy(6, from_older));
}
