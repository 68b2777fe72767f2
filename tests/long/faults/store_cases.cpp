// tests/long/faults/store_cases.cpp: the operations on the web server's passwords, the parameters
// and the boot block that are struck, the files that they start from, and those that they end in.
#include "tests/long/faults/store_cases.h"

#include <cstdlib>
#include <cstring>

#include <sys/stat.h>
#include <unistd.h>

#include <glib.h>

#include "methods/accounts/notify.h"
#include "platform/digest_entry/digest_file.h"
#include "platform/paramcli/param_file.h"
#include "platform/paramcli/paramcli.h"
#include "tests/long/faults/boot_cases.h"
#include "tests/long/faults/boot_files.h"
#include "tests/long/faults/glib_log.h"

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

struct store_start {
    std::string name;
    folder_state files;
    bool has_file;
};

static std::vector<store_start> starts_of(const std::string &name, const lying_file &file) {
    lying_file link = plain_file("../../outside", 0777);
    link.mode = S_IFLNK | 0777;
    const lying_file lock = plain_file("", 0600);
    const lying_file own = plain_file("alice:PRIV", 0600);
    return {
        {"",                   {{name, file}, {name + ".lock", lock}},                   true },
        {", first time",       {},                                                       false},
        {", own leftover",     {{name, file}, {name + ".tmp", own}},                     true },
        {", foreign leftover", {{name, file}, {name + ".tmp", web_file("root", 04666)}}, true },
        {", link as leftover", {{name, file}, {name + ".tmp", link}},                    true },
    };
}

// The lock stays, a temporary file does not.
static folder_state end_of(const std::string &name, const lying_file &file) {
    folder_state files = {
        {name + ".lock", plain_file("", 0600)}
    };
    if (!file.text.empty())
        files[name] = file;
    return files;
}

struct digest_row {
    const char *name;
    int (*change)(const char *path);
    const char *after;
    const char *after_first_time;  // "" where there is no file even then
};

// The sums are md5sum's, of "alice:PRIVANE:secret" and "carol:PRIVANE:secret".
static constexpr digest_row digest_rows[] = {
    {"digest set",               [](const char *path) { return digest_file_set(path, "alice", "secret"); },
     "alice:PRIVANE:427f14472e033f24869b1602e6871ed7\n"
     "bob:PRIVANE:fedcba9876543210fedcba9876543210\n"
     "alice:OTHER:00000000000000000000000000000000\n",         "alice:PRIVANE:427f14472e033f24869b1602e6871ed7\n"   },
    {"digest set of a new user",
     [](const char *path) { return digest_file_set(path, "carol", "secret"); },
     "alice:PRIVANE:0123456789abcdef0123456789abcdef\n"
     "bob:PRIVANE:fedcba9876543210fedcba9876543210\n"
     "alice:OTHER:00000000000000000000000000000000\n"
     "carol:PRIVANE:ea73789203e420776a22a84326d23dd1\n",       "carol:PRIVANE:ea73789203e420776a22a84326d23dd1\n"   },
    {"digest delete",            [](const char *path) { return digest_file_delete(path, "bob"); },
     "alice:PRIVANE:0123456789abcdef0123456789abcdef\n"
     "alice:OTHER:00000000000000000000000000000000\n",         ""                                                   },
    {"digest set list",
     [](const char *path) {
         return digest_file_set_list(path,
                                     "bob:PRIVANE:11111111111111111111111111111111\n"
                                     "dave:PRIVANE:22222222222222222222222222222222\n");
     },                                                                                                     "alice:PRIVANE:0123456789abcdef0123456789abcdef\n"
     "bob:PRIVANE:11111111111111111111111111111111\n"
     "alice:OTHER:00000000000000000000000000000000\n"
     "dave:PRIVANE:22222222222222222222222222222222\n", "bob:PRIVANE:11111111111111111111111111111111\n"
     "dave:PRIVANE:22222222222222222222222222222222\n"},
    {"digest delete list",
     [](const char *path) { return digest_file_delete_list(path, "alice\nbob\n"); },
     "alice:OTHER:00000000000000000000000000000000\n",         ""                                                   },
};

static void add_digest_cases(const std::string &folder, std::vector<store_case> *cases) {
    for (const digest_row &one : digest_rows) {
        const auto run = [change = one.change, path = folder + "/digest"] {
            store_answer answer;
            const glib_log log;
            answer.number = change(path.c_str());
            answer.log = log.taken();
            return answer;
        };
        for (const store_start &start : starts_of("digest", web_file(digest_text, 0640)))
            cases->push_back(
                {one.name + start.name, store_kind::DIGEST, folder, start.files,
                 end_of("digest", start.has_file ? web_file(one.after, 0640)
                                                 : plain_file(one.after_first_time, 0640)),
                 "digest", run});
    }
}

// The block is emptied by success, and as it was after a failure.
static store_answer sync_parameters(const std::string &path) {
    paramcli_options empty;
    paramcli_options options;
    int error = 0;
    std::memset(&empty, 0, sizeof empty);
    std::memset(&options, 0, sizeof options);
    paramcli_reset_options(&empty);
    paramcli_reset_options(&options);
    paramcli_set_custom_param("root.System.RootPwdSet", "yes", &options, &error);
    paramcli_set_custom_param("root.New", "2", &options, &error);
    const paramcli_options before = options;

    store_answer answer;
    const glib_log log;
    answer.number = error != 0 ? error : param_file_sync(path.c_str(), &options);
    answer.log = log.taken();
    const paramcli_options &expected = answer.number == 0 ? empty : before;
    if (options.mark != expected.mark || options.length != expected.length ||
        std::memcmp(options.pending, expected.pending, expected.length) != 0)
        answer.wrong =
            "the block holds what it may not: " + std::string(options.pending, options.length);
    return answer;
}

// The service's own change, which fails nobody's call.
static store_answer set_flag() {
    static constexpr const char *FAILED =
        "warning Updating root user failed to sync param! Error: ";
    store_answer answer;
    const glib_log log;
    set_root_password_flag();
    answer.log = log.taken();
    if (answer.log.size() == 1 && answer.log[0].starts_with(FAILED))
        answer.number = std::atoi(answer.log[0].c_str() + std::strlen(FAILED));
    return answer;
}

static void add_param_cases(const std::string &folder, std::vector<store_case> *cases) {
    const auto run = [path = folder + "/params"] { return sync_parameters(path); };
    for (const store_start &start : starts_of("params", web_file(param_text, 0604)))
        cases->push_back(
            {"parameter sync" + start.name, store_kind::PARAMETERS, folder, start.files,
             end_of("params",
                    start.has_file
                        ? web_file("# a comment\nroot.System.RootPwdSet=yes\nroot.Other=1\n"
                                   "root.New=2\n",
                                   0604)
                        : plain_file("root.System.RootPwdSet=yes\nroot.New=2\n", 0644)),
             "params", run});
    const char *name = "parameters.conf";
    cases->push_back({"root's password flag, no folder",
                      store_kind::ROOT_FLAG,
                      "/etc/privane",
                      {},
                      end_of(name, plain_file("root.System.RootPwdSet=yes\n", 0644)),
                      name,
                      set_flag,
                      true});
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

folder_state store_files_after(const store_case &one, const folder_state &start) {
    return one.kind == store_kind::BOOT_BLOCK && start != one.files
               ? boot_files_after(start, "a", "new")
               : one.after;
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
