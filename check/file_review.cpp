// check/file_review.cpp: what kind of file an account file is, and whose.
#include "check/file_review.h"

#include <cerrno>

#include <fcntl.h>
#include <glib.h>
#include <sys/stat.h>

static constexpr const char *GSHADOW = "/etc/gshadow";
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

static file_state review_missing(const core_file &file, const char *text, findings *out) {
    const bool can_start = has_shadow_words(file);

    add(out, gravity::UNUSABLE, "missing", file,
        can_start
            ? g_strdup_printf("%s: passwords stand in passwd, and no user can be changed", text)
            : g_strdup(text));
    return can_start ? file_state::ABSENT : file_state::HOPELESS;
}

// A link in a circle, or through a file, leads nowhere for the service either. What else failed may
// succeed when it starts.
static file_state review_unreadable(const core_file &file, int cause, findings *out) {
    add(out, gravity::UNUSABLE, "unreadable", file, g_strdup(g_strerror(cause)));
    return cause == ELOOP || cause == ENOTDIR ? file_state::HOPELESS : file_state::UNKNOWN;
}

// A folder cannot be read, nor a socket be opened. What else is no file may give any lines, or
// none, to who opens it, and is not opened here: a pipe would wait for its writer.
static file_state review_no_file(const core_file &file, unsigned mode, findings *out) {
    add(out, gravity::UNUSABLE, "no-file", file, g_strdup("is no ordinary file"));
    return S_ISDIR(mode) || S_ISSOCK(mode) ? file_state::HOPELESS : file_state::UNKNOWN;
}

static file_state review_link(const core_file &file, findings *out) {
    add(out, gravity::CHANGE, "symbolic-link", file,
        g_strdup("is a symbolic link; a write puts a file in its place, and what it leads to "
                 "stays old"));
    struct statx target = {};
    if (statx(AT_FDCWD, file.path, 0, WANTED, &target) != 0)
        return errno == ENOENT ? review_missing(file, "leads to no file", out)
                               : review_unreadable(file, errno, out);
    return S_ISREG(target.stx_mode) ? file_state::READABLE
                                    : review_no_file(file, target.stx_mode, out);
}

// Follows no link: the rename that replaces a file does not either.
file_state review_file(const core_file &file, const mount_points &mounts, findings *out) {
    struct statx status = {};
    if (statx(AT_FDCWD, file.path, AT_SYMLINK_NOFOLLOW, WANTED, &status) != 0)
        return errno == ENOENT ? review_missing(file, "is not there", out)
                               : review_unreadable(file, errno, out);
    if (S_ISLNK(status.stx_mode))
        return review_link(file, out);
    if (!S_ISREG(status.stx_mode))
        return review_no_file(file, status.stx_mode, out);
    review_mount(file, status, mounts, out);
    review_owner(file, status, out);
    review_mode(file, status.stx_mode, out);
    return file_state::READABLE;
}

void review_gshadow(findings *out) {
    struct statx status = {};
    // What else keeps it from being seen keeps others from it, too.
    if (statx(AT_FDCWD, GSHADOW, AT_SYMLINK_NOFOLLOW, STATX_TYPE, &status) == 0)
        out->add(
            gravity::NOTICE, "gshadow", GSHADOW, 0, nullptr,
            g_strdup("is there, and is not kept in step with the group file: a device has none"));
}
