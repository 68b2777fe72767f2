// tests/long/faults/store_cases.cpp: the operations on the web server's passwords, the parameters
// and the boot block that are struck, and the files that they start from.
#include "tests/long/faults/store_cases.h"

#include <cstdlib>

#include <sys/stat.h>
#include <unistd.h>

#include <glib.h>

#include "platform/bootparam/bootparam.h"
#include "platform/digest_entry/digest_file.h"
#include "platform/paramcli/param_file.h"
#include "platform/paramcli/paramcli.h"

static constexpr const char *BOOT_FOLDER = "/etc/boot";
static constexpr const char *BOOT_CONFIG = "/etc/fw_env.config";
static constexpr std::size_t COPY_SIZE = 0x2000;

static const std::string digest_text =
    "alice:PRIVANE:0123456789abcdef0123456789abcdef\n"
    "bob:PRIVANE:fedcba9876543210fedcba9876543210\n"
    "alice:OTHER:00000000000000000000000000000000\n";
static const std::string param_text = "# a comment\nroot.System.RootPwdSet=no\nroot.Other=1";

static bool is_root() {
    return geteuid() == 0;
}

static lying_file web_file(const std::string &text, mode_t mode) {
    lying_file file = plain_file(text, mode);
    if (is_root())
        file.owner = file.group = 33;
    return file;
}

using starts = std::vector<std::pair<std::string, folder_state>>;

static starts starts_of(const std::string &name, const lying_file &file) {
    lying_file link = plain_file("../../outside", 0777);
    link.mode = S_IFLNK | 0777;
    const lying_file lock = plain_file("", 0600);
    return {
        {"",                   {{name, file}, {name + ".lock", lock}}                         },
        {", first time",       {}                                                             },
        {", own leftover",     {{name, file}, {name + ".tmp", plain_file("alice:PRIV", 0600)}}},
        {", foreign leftover", {{name, file}, {name + ".tmp", web_file("root", 04666)}}       },
        {", link as leftover", {{name, file}, {name + ".tmp", link}}                          },
    };
}

static void add_digest_cases(const std::string &folder, std::vector<store_case> *cases) {
    static std::string path;
    path = folder + "/digest";
    struct row {
        const char *name;
        int (*run)();
    };
    static constexpr row rows[] = {
        {"digest set",               [] { return digest_file_set(path.c_str(), "alice", "secret"); }},
        {"digest set of a new user",
         [] { return digest_file_set(path.c_str(), "carol", "secret"); }                            },
        {"digest delete",            [] { return digest_file_delete(path.c_str(), "bob"); }         },
        {"digest set list",
         [] {
             return digest_file_set_list(path.c_str(),
                                         "bob:PRIVANE:11111111111111111111111111111111\n"
                                         "dave:PRIVANE:22222222222222222222222222222222\n");
         }                                                                                          },
        {"digest delete list",
         [] { return digest_file_delete_list(path.c_str(), "alice\nbob\n"); }                       },
    };
    for (const row &one : rows)
        for (const auto &[name, files] : starts_of("digest", web_file(digest_text, 0640)))
            cases->push_back({one.name + name, folder, files, "digest", one.run});
}

static int sync_parameter(const std::string &path) {
    paramcli_options options;
    int error = 0;
    paramcli_reset_options(&options);
    paramcli_set_custom_param("root.System.RootPwdSet", "yes", &options, &error);
    paramcli_set_custom_param("root.New", "2", &options, &error);
    return error != 0 ? error : param_file_sync(path.c_str(), &options);
}

static void add_param_cases(const std::string &folder, std::vector<store_case> *cases) {
    const auto run = [path = folder + "/params"] { return sync_parameter(path); };
    for (const auto &[name, files] : starts_of("params", web_file(param_text, 0604)))
        cases->push_back({"parameter sync" + name, folder, files, "params", run});
    cases->push_back({"parameter sync, no folder", folder, {}, "params", run, true});
}

static int write_boot_parameter(const char *name, const char *value) {
    bootparam_chip chip;
    int error = 0;
    bootparam_default_chip(&chip);
    const int result = bootparam_set_chip(0, &error, &chip);
    return result != 0 ? result : bootparam_write(name, value, &error, &chip);
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

std::string read_boot_block() {
    const std::string a = read_boot_parameter("a");
    return a == "blank"
               ? a
               : "a=" + a + " b=" + read_boot_parameter("b") + " c=" + read_boot_parameter("c");
}

std::string judge_boot_block(const std::string &before, const std::string &after) {
    const std::string now = read_boot_block();
    return now == before || now == after ? "" : "the boot block is now " + now;
}

std::string write_on_boot_block() {
    const std::string before = read_boot_block();
    if (const int result = write_boot_parameter("later", "1"); result != 0)
        return "the next write answers " + std::to_string(result);
    const std::string now = read_boot_block();
    if (read_boot_parameter("later") != "1" ||
        now != (before == "blank" ? "a=none b=none c=none" : before))
        return "after the next write the boot block is " + now;
    return "";
}

static void add_boot_cases(std::vector<store_case> *cases) {
    const folder_state blank = {
        {"copy0", plain_file(std::string(COPY_SIZE, '\xff'), 0600)},
        {"copy1", plain_file(std::string(COPY_SIZE, '\xff'), 0600)}
    };
    const std::string config = "/etc/boot/copy0 0x0 0x2000\n/etc/boot/copy1 0x0 0x2000\n";
    const store_case write = {"boot block write", BOOT_FOLDER, blank, "",
                              [] { return write_boot_parameter("a", "new"); }};
    if (!g_file_set_contents(BOOT_CONFIG, config.c_str(), -1, nullptr) ||
        mkdir(BOOT_FOLDER, 0700) != 0)
        std::exit(125);

    put_back_folder(BOOT_FOLDER, blank);
    cases->push_back(write);
    cases->back().name += ", blank copies";
    if (write_boot_parameter("b", "kept") != 0)
        std::exit(125);
    cases->push_back(write);
    cases->back().name += ", one blank copy";
    cases->back().files = look_at_folder(BOOT_FOLDER);
    for (const char *name : {"copy0", "copy1"}) {
        // What only the newer copy knows tells which one was read.
        if (write_boot_parameter("c", name) != 0 || write_boot_parameter("a", "old") != 0 ||
            write_boot_parameter("c", "newest") != 0)
            std::exit(125);
        cases->push_back(write);
        cases->back().name += std::string(", two copies, writing began with ") + name;
        cases->back().files = look_at_folder(BOOT_FOLDER);
        cases->push_back(cases->back());
        cases->back().name += ", broken";
        cases->back().files[name].text[9] ^= 1;
    }
}

std::vector<store_case> store_cases(const std::string &folder) {
    std::vector<store_case> cases;
    for (const char *name : {"web", "store"})
        if (mkdir((folder + "/" + name).c_str(), 0755) != 0)
            std::exit(125);
    add_digest_cases(folder + "/web", &cases);
    add_param_cases(folder + "/store", &cases);
    add_boot_cases(&cases);
    return cases;
}

folder_state look_at_store(const store_case &one) {
    return access(one.folder.c_str(), F_OK) == 0 ? look_at_folder(one.folder) : folder_state();
}

void put_back_store(const store_case &one, const folder_state &files) {
    (void)mkdir(one.folder.c_str(), 0755);  // which is there but in one case
    put_back_folder(one.folder, files);
    if (one.folder_is_made && files.empty())
        (void)rmdir(one.folder.c_str());
}
