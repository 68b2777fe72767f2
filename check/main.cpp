// check/main.cpp: privane-check, which tells what a write of the service would do to the account
// files. It only reads.
#include <cstdio>
#include <string>
#include <vector>

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
};

static int status_of(const findings &found) {
    if (found.has(gravity::UNUSABLE))
        return CANNOT_WORK;
    if (found.has(gravity::LOSS))
        return ACCOUNTS_ARE_LOST;
    return found.has(gravity::CHANGE) ? LINES_CHANGE : NOTHING_CHANGES;
}

static void add_error(findings *out, const char *file, const GError *error) {
    out->add({gravity::UNUSABLE, "unreadable", file, 0, "", error->message});
}

static bool read_files(account_files *files, findings *out) {
    bool are_read = true;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const core_file &file = core_file_table[row];
        if (!review_file(file, out)) {
            are_read = are_read && row == CORE_FILE_ROW_SHADOW && !out->has(gravity::UNUSABLE);
            continue;
        }
        g_autoptr(GError) error = nullptr;
        if (!read_account_lines(file, &files->lines[row], &files->has_last_end[row], &error)) {
            add_error(out, file.path, error);
            are_read = false;
        }
    }
    return are_read;
}

static void check_accounts(findings *out) {
    account_files files;
    if (!read_files(&files, out))
        return;
    // What loading logs is told here.
    (void)setlogmask(LOG_MASK(LOG_EMERG));
    g_autoptr(GError) error = nullptr;
    usermgmt_ctx *ctx = usermgmt_open(0, &error);
    if (ctx == nullptr) {
        add_error(out, core_file_table[CORE_FILE_ROW_PASSWD].path, error);
        return;
    }
    review_lines(files, ctx, out);
    (void)usermgmt_close(ctx);
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
        "The service is not started: its first change would lose what is named above. "
        "The maker of a device who wants that makes the file " ACCOUNT_LOSS_MARKER ".\n",
        stderr);
    return ACCOUNTS_ARE_LOST;
}

struct settings {
    gboolean is_guard;
    char *root;
    char *json;
};

static bool parse(int argc, char **argv, settings *out) {
    const GOptionEntry entries[] = {
        {"guard",             0, G_OPTION_FLAG_NONE, G_OPTION_ARG_NONE, &out->is_guard,
         "only tell what would be lost, and whether the service may start", nullptr},
        {"json", 0, G_OPTION_FLAG_NONE, G_OPTION_ARG_STRING, &out->json,
         "short, pretty or off (the default)", "FORM"},
        {"root",     0, G_OPTION_FLAG_NONE, G_OPTION_ARG_FILENAME, &out->root,
         "look at the files below this folder; needs root", "FOLDER"},
        {             },
    };
    g_autoptr(GOptionContext) context = g_option_context_new("- check the account files");
    g_option_context_set_description(
        context,
        "Tells what a change of any account would do to /etc/passwd, /etc/shadow and /etc/group.\n"
        "Exit status: 0 nothing; 1 lines would change; 2 usage; 3 accounts would be lost;\n"
        "4 the service could not work with these files.\n");
    g_option_context_add_main_entries(context, entries, nullptr);
    g_autoptr(GError) error = nullptr;
    if (!g_option_context_parse(context, &argc, &argv, &error)) {
        (void)std::fprintf(stderr, "privane-check: %s\n", error->message);
        return false;
    }
    static constexpr const char *forms[] = {"short", "pretty", "off", nullptr};
    if (argc > 1 || (out->json != nullptr && !g_strv_contains(forms, out->json))) {
        (void)std::fprintf(stderr, "privane-check: %s\n",
                           argc > 1 ? "no arguments are known" : "--json is short, pretty or off");
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
    if (chosen.root != nullptr && (chroot(chosen.root) != 0 || chdir("/") != 0)) {
        (void)std::fprintf(stderr, "privane-check: %s: %m\n", chosen.root);
        return WRONG_CALL;
    }

    findings found;
    check_accounts(&found);
    if (chosen.is_guard)
        found.keep(gravity::LOSS);
    std::vector<std::string> order;
    for (const core_file &file : core_file_table)
        order.emplace_back(file.path);
    found.sort(order);
    const bool is_json = chosen.json != nullptr && g_strcmp0(chosen.json, "off") != 0;
    if (is_json)
        print_json(found, g_strcmp0(chosen.json, "pretty") == 0);
    else
        print_text(found);
    return chosen.is_guard ? guard(found) : status_of(found);
}
