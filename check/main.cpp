// check/main.cpp: privane-check, which tells what a write of the service would do to the account
// files. It only reads.
#include <cerrno>
#include <cstdio>

#include <glib.h>
#include <sys/prctl.h>
#include <syslog.h>
#include <unistd.h>

#include "check/file_review.h"
#include "check/findings.h"
#include "check/line_review.h"
#include "check/report.h"
#include "usermgmt/usermgmt.h"

enum exit_status {
    NOTHING_CHANGES = 0,  // notices aside
    LINES_CHANGE = 1,
    WRONG_CALL = 2,
    ACCOUNTS_ARE_LOST = 3,
    CANNOT_WORK = 4,
    CANNOT_TELL = 5,
};

static int status_of(const findings &found) {
    if (found.has(gravity::UNUSABLE))
        return CANNOT_WORK;
    if (found.has(gravity::LOSS))
        return ACCOUNTS_ARE_LOST;
    return found.has(gravity::CHANGE) ? LINES_CHANGE : NOTHING_CHANGES;
}

// What the lines are could not be found out, though a service may start with them.
static void add_unjudged(findings *out, const char *file, const char *cause) {
    out->add(gravity::LOSS, "not-judged", file, 0, nullptr,
             g_strdup_printf("what a write would drop cannot be told: %s", cause));
}

static void review_all_lines(const account_file (&files)[CORE_FILE_COUNT], findings *out) {
    // What loading logs is told here.
    (void)setlogmask(LOG_MASK(LOG_EMERG));
    g_autoptr(GError) error = nullptr;
    usermgmt_ctx *ctx = usermgmt_open(0, &error);
    if (ctx == nullptr) {
        // The files were just read: what failed now may succeed when the service starts.
        const char *file = core_file_table[CORE_FILE_ROW_PASSWD].path;
        out->add(gravity::UNUSABLE, "unreadable", file, 0, nullptr, g_strdup(error->message));
        add_unjudged(out, file, error->message);
        return;
    }
    review_lines(files, ctx, out);
    (void)usermgmt_close(ctx);
}

// False where they were not all read.
static bool read_files(const file_state (&states)[CORE_FILE_COUNT],
                       account_file (&files)[CORE_FILE_COUNT], findings *out) {
    bool are_read = true;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const core_file &file = core_file_table[row];
        g_autoptr(GError) error = nullptr;
        if (states[row] == file_state::UNKNOWN) {
            add_unjudged(out, file.path, "it cannot be read as a file");
            are_read = false;
        } else if (states[row] == file_state::READABLE &&
                   !read_account_file(file, &files[row], &error)) {
            out->add(gravity::UNUSABLE, "unreadable", file.path, 0, nullptr,
                     g_strdup(error->message));
            add_unjudged(out, file.path, error->message);
            are_read = false;
        }
    }
    return are_read;
}

static void check_accounts(const mount_points &mounts, findings *out) {
    file_state states[CORE_FILE_COUNT] = {};
    bool can_start = true;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        states[row] = review_file(core_file_table[row], mounts, out);
        can_start = can_start && states[row] != file_state::HOPELESS;
    }
    review_gshadow(out);
    // A service that does not start loses nothing, and tells itself why.
    if (!can_start)
        return;
    account_file files[CORE_FILE_COUNT] = {};
    if (read_files(states, files, out))
        review_all_lines(files, out);
    for (account_file &file : files)
        account_file_clear(&file);
}

static bool print(const char *text) {
    if (std::fputs(text, stdout) != EOF && std::fflush(stdout) == 0)
        return true;
    const int saved = errno;
    (void)std::fprintf(stderr, "privane-check: cannot write to standard output: %s\n",
                       g_strerror(saved));
    return false;
}

// For the unit: whether the service may be started.
static int guard(const findings &found) {
    if (!found.has(gravity::LOSS))
        return 0;
    if (access(ACCOUNT_LOSS_MARKER, F_OK) == 0) {
        (void)std::fputs(ACCOUNT_LOSS_MARKER " says that this is wanted.\n", stderr);
        return 0;
    }
    (void)std::fputs(
        "The service is not started: its first change would lose accounts, or might, as told "
        "above. "
        "The maker of a device who wants that makes the file " ACCOUNT_LOSS_MARKER ".\n",
        stderr);
    return ACCOUNTS_ARE_LOST;
}

struct settings {
    gboolean is_guard;
    char *root;
    char *json;
    json_mode mode;
};

static bool parse(int argc, char **argv, settings *out) {
    const GOptionEntry entries[] = {
        {"guard",             0, G_OPTION_FLAG_NONE, G_OPTION_ARG_NONE, &out->is_guard,
         "only tell what would be lost, and whether the service may start", nullptr},
        {"json", 0, G_OPTION_FLAG_NONE, G_OPTION_ARG_STRING, &out->json,
         "short, pretty or off (the default)", "FORM"},
        {"root",     0, G_OPTION_FLAG_NONE, G_OPTION_ARG_FILENAME, &out->root,
         "look at the files below this folder", "FOLDER"},
        {             },
    };
    g_autoptr(GOptionContext) context = g_option_context_new("- check the account files");
    g_option_context_set_description(
        context,
        "Tells what a change of any account would do to /etc/passwd, /etc/shadow and /etc/group.\n"
        "Only root may run it.\n"
        "Exit status: 0 nothing; 1 lines would change; 2 usage, not root, or no such FOLDER;\n"
        "3 accounts would be lost, or what would be cannot be told;\n"
        "4 the service could not work with these files; 5 what was found could not be told.\n");
    g_option_context_add_main_entries(context, entries, nullptr);
    g_autoptr(GError) error = nullptr;
    if (!g_option_context_parse(context, &argc, &argv, &error)) {
        (void)std::fprintf(stderr, "privane-check: %s\n", error->message);
        return false;
    }
    if (argc > 1) {
        (void)std::fputs("privane-check: no arguments are known\n", stderr);
        return false;
    }
    if (out->json != nullptr && !json_mode_find(out->json, &out->mode)) {
        (void)std::fprintf(stderr, "privane-check: --json is %s\n", JSON_MODE_WORDS);
        return false;
    }
    return true;
}

int main(int argc, char **argv) {
    settings chosen = {};
    if (!parse(argc, argv, &chosen))
        return WRONG_CALL;
    (void)prctl(PR_SET_DUMPABLE, 0);  // it holds every hash
    if (geteuid() != 0) {
        (void)std::fputs("privane-check: only root may read the files\n", stderr);
        return WRONG_CALL;
    }
    const mount_points mounts(chosen.root);
    // What turns messages into UTF-8 is loaded by the first one, and must not come from the image.
    (void)g_strerror(EINVAL);
    if (chosen.root != nullptr && (chroot(chosen.root) != 0 || chdir("/") != 0)) {
        (void)std::fprintf(stderr, "privane-check: %s: %m\n", chosen.root);
        return WRONG_CALL;
    }

    findings found;
    check_accounts(mounts, &found);
    if (chosen.is_guard)
        found.keep(gravity::LOSS);
    found.sort();
    g_autofree char *text = report_format(found, chosen.mode);
    const bool is_told = print(text);
    // Whether the service may start does not hang on who listens.
    if (chosen.is_guard)
        return guard(found);
    return is_told ? status_of(found) : CANNOT_TELL;
}
