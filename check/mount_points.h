// check/mount_points.h: where something is mounted, for kernels whose statx(2) does not tell: Linux
// before 5.8.
#pragma once

#include <glib.h>

class mount_points {
  public:
    // Reads the list, and does so before the process changes its root. root: what that will be, or
    // null.
    explicit mount_points(const char *root);
    ~mount_points();
    mount_points(const mount_points &) = delete;
    mount_points &operator=(const mount_points &) = delete;

    // Null, or why there is no list.
    const char *fault() const { return error_ != nullptr ? error_->message : nullptr; }
    // Whether the file, whose path is that below the root, is mounted over another. False without a
    // list.
    bool has(const char *path) const;

  private:
    char *list_ = nullptr;
    char *root_ = nullptr;  // without a slash at its end
    GError *error_ = nullptr;
};

// Whether a list in the form of proc(5)'s mountinfo has this mount point.
bool mountinfo_has(const char *list, const char *mount_point);
