// platform/paramcli/param_file.cpp: reads and replaces the lines of the parameter file.
#include "platform/paramcli/param_file.h"

#include <cerrno>
#include <cstddef>
#include <iterator>
#include <string_view>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <glib.h>

#include "platform/keyed_lines.h"
#include "platform/paramcli/param_options.h"

// In the order of file_result.
static constexpr paramcli_error error_numbers[] = {
    PARAMCLI_ERROR_NONE, PARAMCLI_ERROR_BUSY,        PARAMCLI_ERROR_FOLDER,
    PARAMCLI_ERROR_LOCK, PARAMCLI_ERROR_NOT_REGULAR, PARAMCLI_ERROR_TOO_BIG,
    PARAMCLI_ERROR_READ, PARAMCLI_ERROR_WRITE,       PARAMCLI_ERROR_SYNC,
};
static_assert(std::size(error_numbers) == static_cast<std::size_t>(file_result::NOT_SYNCED) + 1);

static found_line read_line(std::string_view text, wiped_text *) {
    const std::size_t end = text.find('\n');
    found_line line = {};

    line.length = end != std::string_view::npos ? end + 1 : text.size();
    const std::size_t equals = text.substr(0, line.length).find('=');
    line.is_entry = equals != std::string_view::npos && !text.starts_with('#');
    if (line.is_entry)
        line.key = text.substr(0, equals);
    return line;
}

static file_access access_of_new_file(gid_t folder_group) {
    return {geteuid(), folder_group, 0644};
}

static constexpr line_format param_format = {read_line, access_of_new_file};

static bool sync_folder(const char *folder) {
    const int fd = open(folder, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0)
        return false;

    const bool synced = fsync(fd) == 0;
    (void)close(fd);  // Nothing was written through it.
    return synced;
}

// A new folder has to survive a power cut like the file in it.
static bool make_folder_of(const char *path) {
    g_autofree char *folder = g_path_get_dirname(path);
    g_autofree char *parent = g_path_get_dirname(folder);

    if (mkdir(folder, 0755) != 0 && errno != EEXIST)
        return false;
    // Until there is a file, an earlier try may have made the folder and failed to sync it.
    return g_file_test(path, G_FILE_TEST_EXISTS) || sync_folder(parent);
}

static int store(const char *path, std::string_view pending) {
    g_autoptr(GArray) changes = g_array_new(FALSE, FALSE, sizeof(line_change));

    while (!pending.empty()) {
        const std::string_view line = pending.substr(0, pending.find('\n'));
        const line_change change = {line.substr(0, line.find('=')), line};

        g_array_append_val(changes, change);
        pending.remove_prefix(line.size() + 1);
    }
    if (!make_folder_of(path))
        return PARAMCLI_ERROR_FOLDER;

    const file_result result = keyed_lines_update(
        path, param_format, {reinterpret_cast<const line_change *>(changes->data), changes->len});
    return error_numbers[static_cast<std::size_t>(result)];
}

int param_file_sync(const char *path, paramcli_options *options) {
    const std::string_view pending = param_options_pending(options);

    if (pending.empty())
        return PARAMCLI_ERROR_NONE;

    const int number = store(path, pending);
    if (number == PARAMCLI_ERROR_NONE)
        param_options_reset(options);
    return number;
}
