// check/mount_points.cpp: reads the list of mounts.
#include "check/mount_points.h"

#include <cstdlib>
#include <cstring>

static constexpr const char *LIST = "/proc/self/mountinfo";

// Of a line: an ID, that of its parent, a device, the root within it, the mount point.
static constexpr guint MOUNT_POINT = 4;

// As the kernel writes a path.
static char *escape(const char *path) {
    GString *escaped = g_string_new(nullptr);

    for (const char *at = path; *at != '\0'; at++) {
        if (std::strchr(" \t\n\\", *at) != nullptr)
            g_string_append_printf(escaped, "\\%03o", static_cast<unsigned>(*at));
        else
            g_string_append_c(escaped, *at);
    }
    return g_string_free(escaped, FALSE);
}

bool mountinfo_has(const char *list, const char *mount_point) {
    g_autofree char *wanted = escape(mount_point);
    g_auto(GStrv) lines = g_strsplit(list, "\n", -1);

    for (char **line = lines; *line != nullptr; line++) {
        g_auto(GStrv) fields = g_strsplit(*line, " ", MOUNT_POINT + 2);
        if (g_strv_length(fields) > MOUNT_POINT && std::strcmp(fields[MOUNT_POINT], wanted) == 0)
            return true;
    }
    return false;
}

mount_points::mount_points(const char *root) {
    if (!g_file_get_contents(LIST, &list_, nullptr, &error_))
        return;
    // A root that is none is told by who enters it.
    char *resolved = root != nullptr ? realpath(root, nullptr) : nullptr;
    root_ = g_strdup(resolved != nullptr && std::strcmp(resolved, "/") != 0 ? resolved : "");
    std::free(resolved);
}

mount_points::~mount_points() {
    g_free(list_);
    g_free(root_);
    g_clear_error(&error_);
}

// The folder may be a link; the file itself is looked at as it is.
bool mount_points::has(const char *path) const {
    g_autofree char *folder = g_path_get_dirname(path);
    g_autofree char *name = g_path_get_basename(path);
    char *resolved = realpath(folder, nullptr);
    g_autofree char *inside =
        g_build_filename(resolved != nullptr ? resolved : folder, name, nullptr);

    std::free(resolved);
    if (list_ == nullptr)
        return false;
    g_autofree char *whole = g_strconcat(root_, inside, nullptr);
    return mountinfo_has(list_, whole);
}
