// platform/authz/policy/policy_store.cpp: reads the policy file and looks up its accounts, anew
// whenever one of the three files is another one than was read.
#include "platform/authz/policy/policy_store.h"

#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/authz/authz_error.h"

static constexpr std::size_t MAX_SIZE = std::size_t{64} * 1024;

// Tells a file from what it was before. The time of the last change of its attributes comes with
// each of its content, and nobody can set it.
struct file_state {
    bool exists;
    // Whether a change from now on would be seen; not in the moment of the last one, since two of
    // them may have the same time.
    bool settled;
    dev_t device;
    ino_t inode;
    off_t size;
    struct timespec written;
    struct timespec changed;
};

struct policy_store {
    policy_places places;
    policy *rules;  // null where there is none
    policy_ids ids;
    file_state policy_file;
    file_state passwd_file;
    file_state group_file;
};

static bool is_same_time(const struct timespec &left, const struct timespec &right) {
    return left.tv_sec == right.tv_sec && left.tv_nsec == right.tv_nsec;
}

// The clock that files get their times from; the beginning of time where it cannot be told.
static struct timespec file_clock() {
    struct timespec now = {};

    if (clock_gettime(CLOCK_REALTIME_COARSE, &now) != 0)
        return {};
    return now;
}

// Whether a file that changed then would show another time for a change that came after the given
// moment. A file system without fractions of a second keeps each for a second.
static bool is_settled(const struct timespec &changed, const struct timespec &moment) {
    if (changed.tv_nsec == 0)
        return changed.tv_sec + 1 < moment.tv_sec;
    return changed.tv_sec < moment.tv_sec ||
           (changed.tv_sec == moment.tv_sec && changed.tv_nsec < moment.tv_nsec);
}

// The clock was asked before the file was: what changes it while it is read has a later time.
static file_state state_of(const struct stat &seen, const struct timespec &before) {
    return {true,         is_settled(seen.st_ctim, before),
            seen.st_dev,  seen.st_ino,
            seen.st_size, seen.st_mtim,
            seen.st_ctim};
}

// A link in the policy file's place is no policy; the account files may be links.
static bool is_current(const file_state &known, const char *path, int flags) {
    struct stat seen = {};

    if (fstatat(AT_FDCWD, path, &seen, flags) != 0)
        return !known.exists && errno == ENOENT;
    return known.exists && known.settled && known.device == seen.st_dev &&
           known.inode == seen.st_ino && known.size == seen.st_size &&
           is_same_time(known.written, seen.st_mtim) && is_same_time(known.changed, seen.st_ctim);
}

static bool fail(GError **error, const char *why) {
    g_set_error_literal(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_FAILED, why);
    return false;
}

static bool fail_with_errno(GError **error) {
    const int saved_errno = errno;
    return fail(error, g_strerror(saved_errno));
}

static bool read_all(int fd, GString *out_text, GError **error) {
    char block[4096];
    ssize_t count = 0;

    while (out_text->len <= MAX_SIZE && (count = read(fd, block, sizeof block)) != 0) {
        if (count > 0)
            g_string_append_len(out_text, block, count);
        else if (errno != EINTR)
            return fail_with_errno(error);
    }
    return out_text->len <= MAX_SIZE || fail(error, "larger than 64 KiB");
}

static bool read_owned(int fd, uid_t owner, struct stat *out_seen, GString *out_text,
                       GError **error) {
    if (fstat(fd, out_seen) != 0)
        return fail_with_errno(error);
    if (!S_ISREG(out_seen->st_mode))
        return fail(error, "not a regular file");
    if (out_seen->st_uid != owner)
        return fail(error, "does not belong to root");
    if ((out_seen->st_mode & (S_IWGRP | S_IWOTH)) != 0)
        return fail(error, "others than root may write it");
    return read_all(fd, out_text, error);
}

static bool read_policy(const policy_places &places, struct stat *out_seen, GString *out_text,
                        GError **error) {
    // Without O_NONBLOCK a FIFO in the file's place would stop the caller for good.
    const int fd = open(places.policy, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);

    if (fd < 0 && (errno == ELOOP || errno == ENXIO))
        return fail(error, "not a regular file");
    if (fd < 0)
        return fail_with_errno(error);
    const bool is_read = read_owned(fd, places.owner, out_seen, out_text, error);
    (void)close(fd);  // Nothing was written.
    return is_read;
}

static bool load_policy(policy_store *store, GError **error) {
    g_autoptr(GString) text = g_string_new(nullptr);
    g_autoptr(GError) cause = nullptr;
    struct stat seen = {};
    const struct timespec before = file_clock();

    g_clear_pointer(&store->rules, policy_free);
    store->policy_file = {};
    if (!read_policy(store->places, &seen, text, &cause)) {
        g_propagate_prefixed_error(error, g_steal_pointer(&cause), "%s: ", store->places.policy);
        return false;
    }
    store->rules = policy_parse({text->str, text->len}, &cause);
    if (store->rules == nullptr) {
        g_propagate_prefixed_error(error, g_steal_pointer(&cause), "%s:", store->places.policy);
        return false;
    }
    store->policy_file = state_of(seen, before);
    return true;
}

// All names of one of the lists, each once; the policy keeps them.
static GHashTable *names_in(const policy *rules, char **policy_role::*list) {
    GHashTable *names = g_hash_table_new(g_str_hash, g_str_equal);

    for (guint i = 0; i < rules->roles->len; i++) {
        const auto *role = static_cast<const policy_role *>(g_ptr_array_index(rules->roles, i));
        for (char **name = role->*list; name != nullptr && *name != nullptr; name++)
            (void)g_hash_table_add(names, *name);  // Known already, or not.
    }
    return names;
}

// Puts the ID of a line "NAME:PASSWORD:ID:..." into the table where the name is wanted. As for the
// C library a line without a number is none, and the first of a name counts.
static void take_line(char *line, GHashTable *wanted, GHashTable *ids) {
    char *colon = std::strchr(line, ':');
    void *name = nullptr;
    guint64 id = 0;

    if (colon == nullptr)
        return;
    *colon = '\0';
    if (!g_hash_table_lookup_extended(wanted, line, &name, nullptr) ||
        g_hash_table_contains(ids, name))
        return;
    g_auto(GStrv) fields = g_strsplit(colon + 1, ":", 3);
    if (g_strv_length(fields) == 3 &&
        g_ascii_string_to_unsigned(fields[1], 10, 0, G_MAXUINT32 - 1, &id, nullptr))
        (void)g_hash_table_insert(ids, name, GUINT_TO_POINTER(static_cast<guint>(id)));
}

// Where the file cannot be read, nobody is known.
static void look_up(const char *path, GHashTable *wanted, GHashTable *ids, file_state *out_state) {
    const struct timespec before = file_clock();
    FILE *stream = fopen(path, "re");
    struct stat seen = {};
    char *line = nullptr;
    std::size_t size = 0;

    *out_state = {};
    if (stream == nullptr)
        return;
    if (fstat(fileno(stream), &seen) == 0) {
        while (getline(&line, &size, stream) >= 0)
            take_line(line, wanted, ids);
        if (ferror(stream) == 0)
            *out_state = state_of(seen, before);
    }
    std::free(line);
    (void)fclose(stream);  // Nothing was written.
}

static void load_ids(policy_store *store) {
    g_autoptr(GHashTable) users = names_in(store->rules, &policy_role::users);
    g_autoptr(GHashTable) groups = names_in(store->rules, &policy_role::groups);

    g_hash_table_remove_all(store->ids.users);
    g_hash_table_remove_all(store->ids.groups);
    look_up(store->places.passwd, users, store->ids.users, &store->passwd_file);
    look_up(store->places.group, groups, store->ids.groups, &store->group_file);
}

policy_store *policy_store_new(const policy_places &places) {
    auto *store = g_new0(policy_store, 1);

    store->places = places;
    // Their keys are the policy's.
    store->ids = {g_hash_table_new(g_str_hash, g_str_equal),
                  g_hash_table_new(g_str_hash, g_str_equal)};
    return store;
}

void policy_store_free(policy_store *store) {
    if (store == nullptr)
        return;
    g_hash_table_unref(store->ids.users);
    g_hash_table_unref(store->ids.groups);
    policy_free(store->rules);
    g_free(store);
}

bool policy_store_refresh(policy_store *store, GError **error) {
    const bool is_policy_current =
        store->rules != nullptr &&
        is_current(store->policy_file, store->places.policy, AT_SYMLINK_NOFOLLOW);

    if (!is_policy_current) {
        // What they hold points into the policy.
        g_hash_table_remove_all(store->ids.users);
        g_hash_table_remove_all(store->ids.groups);
        if (!load_policy(store, error))
            return false;
    }
    if (!is_policy_current || !is_current(store->passwd_file, store->places.passwd, 0) ||
        !is_current(store->group_file, store->places.group, 0))
        load_ids(store);
    return true;
}

bool policy_store_allows(const policy_store *store, const policy_caller &caller,
                         const char *action_id) {
    return policy_allows(store->rules, store->ids, caller, action_id);
}
