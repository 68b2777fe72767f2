// tests/fakes/folder/fake_folder.cpp: the folder through which a test and a fake talk.
#include "tests/fakes/folder/fake_folder.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>

#include <glib.h>

static constexpr gint64 NANOSECONDS = 1'000'000'000;

const char *fake_folder(const char *variable) {
    const char *folder = g_getenv(variable);
    if (folder == nullptr)
        g_error("a fake is loaded, but %s is not set", variable);
    return folder;
}

static gint64 monotonic_time() {
    struct timespec now = {};
    (void)clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec * NANOSECONDS + now.tv_nsec;
}

static void append_line(const char *folder, const GString *line) {
    g_autofree char *path = g_build_filename(folder, "calls", nullptr);
    const int fd = open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (fd < 0 || write(fd, line->str, line->len) != static_cast<ssize_t>(line->len))
        g_error("a fake cannot record a call in %s", path);
    (void)close(fd);
}

static void run_hook(const char *folder) {
    g_autofree char *hook = g_build_filename(folder, "hook", nullptr);
    if (!g_file_test(hook, G_FILE_TEST_IS_EXECUTABLE))
        return;
    char *argv[] = {hook, nullptr};
    g_autoptr(GError) error = nullptr;
    int wait_status = -1;
    if (!g_spawn_sync(nullptr, argv, nullptr, G_SPAWN_DEFAULT, nullptr, nullptr, nullptr, nullptr,
                      &wait_status, &error) ||
        !g_spawn_check_wait_status(wait_status, &error))
        g_error("the hook of a fake failed: %s", error->message);
}

void fake_record(const char *folder, std::span<const char *const> words) {
    g_autoptr(GString) line = g_string_new(nullptr);
    g_string_append_printf(line, "%" G_GINT64_FORMAT, monotonic_time());
    for (const char *word : words) {
        if (word == nullptr)
            g_error("a fake was handed a null pointer");
        g_autofree char *encoded = g_uri_escape_string(word, nullptr, FALSE);
        g_string_append_printf(line, " %s", encoded);
    }
    g_string_append_c(line, '\n');
    append_line(folder, line);
    run_hook(folder);
}

int fake_number(const char *folder, const char *name) {
    g_autofree char *path = g_build_filename(folder, name, nullptr);
    g_autofree char *text = nullptr;
    return g_file_get_contents(path, &text, nullptr, nullptr) ? atoi(text) : 0;
}
