// check/file_review.cpp: what kind of file an account file is, and whose.
#include "check/file_review.h"

#include <cerrno>

#include <fcntl.h>
#include <glib.h>
#include <sys/stat.h>

static constexpr mode_t MODE_BITS = 07777;
static constexpr unsigned WANTED = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID;

static void add(findings *out, gravity weight, const char *kind, const core_file &file,
                std::string text) {
    out->add({weight, kind, file.path, 0, "", std::move(text)});
}

static bool has_shadow_words(const core_file &file) {
    return file.id == CORE_FILE_ROW_SHADOW;
}

static void review_owner(const core_file &file, const struct statx &status, findings *out) {
    if (status.stx_uid != 0 || (status.stx_gid != 0 && !has_shadow_words(file)))
        add(out, gravity::CHANGE, "owner", file,
            "belongs to " + std::to_string(status.stx_uid) + ":" + std::to_string(status.stx_gid) +
                "; a write gives it to root");
    else if (status.stx_gid != 0)
        add(out, gravity::CHANGE, "group-of-file", file,
            "belongs to the group " + std::to_string(status.stx_gid) +
                "; a write gives it to the group root, and who reads it by that group no longer "
                "can");
}

static void review_mode(const core_file &file, mode_t mode, findings *out) {
    g_autofree char *shown = g_strdup_printf("%04o", mode & MODE_BITS);
    if (has_shadow_words(file) && (mode & 0007) != 0)
        add(out, gravity::NOTICE, "open-to-others", file,
            std::string("has mode ") + shown + ": everybody may read the hashes");
    else if ((mode & 0022) != 0)
        add(out, gravity::NOTICE, "open-to-others", file,
            std::string("has mode ") + shown + ": others than root may write it");
}

// Follows no link: the rename that replaces a file does not either.
bool review_file(const core_file &file, findings *out) {
    struct statx status = {};
    if (statx(AT_FDCWD, file.path, AT_SYMLINK_NOFOLLOW, WANTED, &status) != 0) {
        if (errno == ENOENT && file.id == CORE_FILE_ROW_SHADOW)
            add(out, gravity::NOTICE, "missing", file, "is not there: passwords stand in passwd");
        else
            add(out, gravity::UNUSABLE, errno == ENOENT ? "missing" : "unreadable", file,
                g_strerror(errno));
        return false;
    }
    if (S_ISLNK(status.stx_mode)) {
        add(out, gravity::CHANGE, "symbolic-link", file,
            "is a symbolic link; a write puts a file in its place, and what it leads to stays old");
        struct statx target = {};
        if (statx(AT_FDCWD, file.path, 0, WANTED, &target) != 0 || !S_ISREG(target.stx_mode)) {
            add(out, gravity::UNUSABLE, "unreadable", file, "leads to no file");
            return false;
        }
        return true;
    }
    if (!S_ISREG(status.stx_mode)) {
        add(out, gravity::UNUSABLE, "no-file", file, "is no ordinary file");
        return false;
    }
    if ((status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0)
        add(out, gravity::UNUSABLE, "mount-point", file,
            "is mounted over another file, which no write can replace; mount its folder instead");
    review_owner(file, status, out);
    review_mode(file, status.stx_mode, out);
    return true;
}
