// check/file_review.cpp: what kind of file an account file is, and whose.
#include "check/file_review.h"

#include <cerrno>

#include <fcntl.h>
#include <glib.h>
#include <sys/stat.h>

static constexpr unsigned MODE_BITS = 07777;
static constexpr unsigned WANTED = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID;

// Takes the text.
static void add(findings *out, gravity weight, const char *kind, const core_file &file,
                char *text) {
    out->add(weight, kind, file.path, 0, nullptr, text);
}

static bool has_shadow_words(const core_file &file) {
    return file.id == CORE_FILE_ROW_SHADOW;
}

static void review_owner(const core_file &file, const struct statx &status, findings *out) {
    if (status.stx_uid != 0 || (status.stx_gid != 0 && !has_shadow_words(file)))
        add(out, gravity::CHANGE, "owner", file,
            g_strdup_printf("belongs to %u:%u; a write gives it to root", status.stx_uid,
                            status.stx_gid));
    else if (status.stx_gid != 0)
        add(out, gravity::CHANGE, "group-of-file", file,
            g_strdup_printf("belongs to the group %u; a write gives it to the group root, and who "
                            "reads it by that group no longer can",
                            status.stx_gid));
}

static void review_mode(const core_file &file, unsigned mode, findings *out) {
    if (has_shadow_words(file) && (mode & 0007) != 0)
        add(out, gravity::NOTICE, "open-to-others", file,
            g_strdup_printf("has mode %04o: everybody may read the hashes", mode & MODE_BITS));
    else if ((mode & 0022) != 0)
        add(out, gravity::NOTICE, "open-to-others", file,
            g_strdup_printf("has mode %04o: others than root may write it", mode & MODE_BITS));
}

static void review_mount(const core_file &file, const struct statx &status,
                         const mount_points &mounts, findings *out) {
    const bool is_told = (status.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) != 0;

    if (!is_told && mounts.fault() != nullptr)
        add(out, gravity::NOTICE, "mounts-unknown", file,
            g_strdup_printf("may be mounted over another file, which no write could replace: %s",
                            mounts.fault()));
    else if (is_told ? (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0 : mounts.has(file.path))
        add(out, gravity::UNUSABLE, "mount-point", file,
            g_strdup("is mounted over another file, which no write can replace; mount its folder "
                     "instead"));
}

// Follows no link: the rename that replaces a file does not either.
bool review_file(const core_file &file, const mount_points &mounts, findings *out) {
    struct statx status = {};
    if (statx(AT_FDCWD, file.path, AT_SYMLINK_NOFOLLOW, WANTED, &status) != 0) {
        if (errno == ENOENT && file.id == CORE_FILE_ROW_SHADOW)
            add(out, gravity::NOTICE, "missing", file,
                g_strdup("is not there: passwords stand in passwd"));
        else
            add(out, gravity::UNUSABLE, errno == ENOENT ? "missing" : "unreadable", file,
                g_strdup(g_strerror(errno)));
        return false;
    }
    if (S_ISLNK(status.stx_mode)) {
        add(out, gravity::CHANGE, "symbolic-link", file,
            g_strdup("is a symbolic link; a write puts a file in its place, and what it leads to "
                     "stays old"));
        struct statx target = {};
        if (statx(AT_FDCWD, file.path, 0, WANTED, &target) != 0 || !S_ISREG(target.stx_mode)) {
            add(out, gravity::UNUSABLE, "unreadable", file, g_strdup("leads to no file"));
            return false;
        }
        return true;
    }
    if (!S_ISREG(status.stx_mode)) {
        add(out, gravity::UNUSABLE, "no-file", file, g_strdup("is no ordinary file"));
        return false;
    }
    review_mount(file, status, mounts, out);
    review_owner(file, status, out);
    review_mode(file, status.stx_mode, out);
    return true;
}
