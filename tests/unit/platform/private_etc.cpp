// tests/unit/platform/private_etc.cpp: a /etc of its own for a process.
#include "tests/unit/platform/private_etc.h"

#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>

#include <glib.h>

static bool write_map(const char *path, unsigned id) {
    g_autofree char *line = g_strdup_printf("0 %u 1\n", id);

    return g_file_set_contents_full(path, line, -1, G_FILE_SET_CONTENTS_NONE, 0600, nullptr);
}

// An ordinary user may mount in a user namespace of its own, as its root.
static bool enter_namespaces() {
    const uid_t uid = geteuid();
    const gid_t gid = getegid();

    if (uid == 0)
        return unshare(CLONE_NEWNS) == 0;
    return unshare(CLONE_NEWUSER | CLONE_NEWNS) == 0 &&
           g_file_set_contents_full("/proc/self/setgroups", "deny", -1, G_FILE_SET_CONTENTS_NONE,
                                    0600, nullptr) &&
           write_map("/proc/self/uid_map", uid) && write_map("/proc/self/gid_map", gid);
}

bool enter_private_etc() {
    return enter_namespaces() && mount("none", "/", "", MS_REC | MS_PRIVATE, nullptr) == 0 &&
           mount("tmpfs", "/etc", "tmpfs", MS_NOSUID | MS_NODEV, "mode=0755") == 0;
}
