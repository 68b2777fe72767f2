// tests/fakes/authz/fake_authz.cpp: an authorization library that obeys files and keeps a record.
//
// FAKE_AUTHZ_DIRECTORY names a folder that the test owns. In it:
//   verdict     what a check answers, read at every check: "allow", "refuse-silently", or "refuse"
//               followed by lines with an error's domain, code and text
//   init-error  where it exists, the text with which authz_init fails
//   calls       a line for each call: "init TASKS", "check SENDER ACTION", "release"; TASKS is the
//               number of the process's threads
#include "platform/authz/authz.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdlib>
#include <cstring>

static constexpr const char *DEFAULT_DOMAIN = "fake-authz";
static constexpr int INIT_CODE = 7;

static char *path_of(const char *name) {
    const char *directory = g_getenv("FAKE_AUTHZ_DIRECTORY");
    if (directory == nullptr)
        g_error("the fake libauthz is loaded, but FAKE_AUTHZ_DIRECTORY is not set");
    return g_build_filename(directory, name, nullptr);
}

static char *read_file(const char *name) {
    g_autofree char *path = path_of(name);
    char *text = nullptr;
    if (!g_file_get_contents(path, &text, nullptr, nullptr))
        return nullptr;
    return g_strchomp(text);
}

static void record(const char *format, ...) G_GNUC_PRINTF(1, 2);
static void record(const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    g_autofree char *text = g_strdup_vprintf(format, arguments);
    va_end(arguments);
    g_autofree char *line = g_strconcat(text, "\n", nullptr);
    const gsize length = strlen(line);

    g_autofree char *path = path_of("calls");
    const int fd = open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (fd < 0 || write(fd, line, length) != static_cast<ssize_t>(length))
        g_error("the fake libauthz cannot record a call in %s", path);
    (void)close(fd);
}

static int count_tasks() {
    g_autoptr(GDir) tasks = g_dir_open("/proc/self/task", 0, nullptr);
    int count = 0;
    while (tasks != nullptr && g_dir_read_name(tasks) != nullptr)
        count++;
    return count;
}

int authz_init(GError **error) {
    record("init %d", count_tasks());

    g_autofree char *text = read_file("init-error");
    if (text == nullptr)
        return 1;
    g_set_error_literal(error, g_quark_from_static_string(DEFAULT_DOMAIN), INIT_CODE, text);
    return 0;
}

int authz_check(const char *sender, const char *action_id, GError **error) {
    record("check %s %s", sender, action_id);

    g_autofree char *verdict = read_file("verdict");
    if (verdict == nullptr)
        g_error("the fake libauthz has no verdict");
    g_auto(GStrv) lines = g_strsplit(verdict, "\n", 4);
    const guint count = g_strv_length(lines);
    if (count == 1 && g_str_equal(lines[0], "allow"))
        return 1;
    if (count == 1 && g_str_equal(lines[0], "refuse-silently"))
        return 0;
    if (count != 4 || !g_str_equal(lines[0], "refuse"))
        g_error("the fake libauthz does not know the verdict '%s'", verdict);
    g_set_error_literal(error, g_quark_from_string(lines[1]), atoi(lines[2]), lines[3]);
    return 0;
}

void authz_release(void) {
    record("release");
}
