// platform/authz/policy/policy_store.cpp: reads the policy file and looks up its accounts, anew
// whenever one of the three files is another one than was read.
#include "platform/authz/policy/policy_store.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <string_view>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/authz/authz_error.h"
#include "platform/authz/policy/file_stamp.h"

static constexpr std::size_t MAX_SIZE = std::size_t{64} * 1024;

static constexpr std::string_view BLANKS = " \t\n\v\f\r";

// "NAME:PASSWORD:ID:...", in both files.
static constexpr guint ID_FIELD = 2;

// A line of an account file. A user's has another ID, of the primary group; 0 where there is none.
struct account_form {
    guint fields;
    guint primary_field;
};

static constexpr account_form PASSWD_FORM = {7, 3};
static constexpr account_form GROUP_FORM = {4, 0};

struct policy_store {
    policy_places places;
    char *folder;   // of the policy file
    policy *rules;  // null where there is none
    policy_ids ids;
    file_stamp policy_file;
    file_stamp passwd_file;
    file_stamp group_file;
};

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

static bool check_owner(const struct stat &seen, uid_t owner, GError **error) {
    if (seen.st_uid != owner)
        return fail(error, "does not belong to root");
    if ((seen.st_mode & (S_IWGRP | S_IWOTH)) != 0)
        return fail(error, "others than root may write it");
    return true;
}

static bool read_owned(int fd, uid_t owner, struct stat *out_seen, GString *out_text,
                       GError **error) {
    if (fstat(fd, out_seen) != 0)
        return fail_with_errno(error);
    if (!S_ISREG(out_seen->st_mode))
        return fail(error, "not a regular file");
    return check_owner(*out_seen, owner, error) && read_all(fd, out_text, error);
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

// Who may write the folder may put another file of root's in the place of the policy, or none. It
// is looked at each time: its rights do not show in those of the file.
static bool check_folder(const policy_store *store, GError **error) {
    g_autoptr(GError) cause = nullptr;
    struct stat seen = {};

    const bool is_safe = stat(store->folder, &seen) == 0
                             ? check_owner(seen, store->places.owner, &cause)
                             : fail_with_errno(&cause);
    if (!is_safe)
        g_propagate_prefixed_error(error, g_steal_pointer(&cause), "%s: ", store->folder);
    return is_safe;
}

static bool load_policy(policy_store *store, const clock_reading &before, GError **error) {
    g_autoptr(GString) text = g_string_new(nullptr);
    g_autoptr(GError) cause = nullptr;
    struct stat seen = {};

    if (!read_policy(store->places, &seen, text, &cause)) {
        g_propagate_prefixed_error(error, g_steal_pointer(&cause), "%s: ", store->places.policy);
        return false;
    }
    store->rules = policy_parse({text->str, text->len}, &cause);
    if (store->rules == nullptr) {
        g_propagate_prefixed_error(error, g_steal_pointer(&cause), "%s:", store->places.policy);
        return false;
    }
    store->policy_file = file_stamp_of(seen, before);
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

static bool read_id(const char *field, guint64 *out_id) {
    return g_ascii_string_to_unsigned(field, 10, 0, G_MAXUINT32 - 1, out_id, nullptr);
}

// Whether the line has the form of its file: no field more or less, and numbers alone where they
// belong.
static bool read_fields(const account_form &form, std::string_view line, guint64 *out_id) {
    guint64 primary = 0;
    g_auto(GStrv) fields = g_strsplit(line.data(), ":", -1);

    return line.find('\0') == std::string_view::npos && g_strv_length(fields) == form.fields &&
           read_id(fields[ID_FIELD], out_id) &&
           (form.primary_field == 0 || read_id(fields[form.primary_field], &primary));
}

// Puts the ID of a line into the table where its name is wanted. The first line of a name decides;
// where that has another form, the name is nobody's, whatever other readers make of it. They pass
// over blanks before a name.
static void take_line(const account_form &form, std::string_view line, GHashTable *wanted,
                      GHashTable *ids) {
    const std::size_t begin = std::min(line.find_first_not_of(BLANKS), line.size());
    const std::string_view name = line.substr(begin, line.find_first_of(":\n", begin) - begin);
    g_autofree char *copy = g_strndup(name.data(), name.size());
    void *kept_name = nullptr;
    guint64 id = 0;

    if (!g_hash_table_steal_extended(wanted, copy, &kept_name, nullptr))
        return;
    if (begin == 0 && read_fields(form, line, &id))
        (void)g_hash_table_insert(ids, kept_name, GUINT_TO_POINTER(static_cast<guint>(id)));
}

// Where the file cannot be read to the last name that is wanted, nobody is known.
static void look_up(const account_form &form, const char *path, GHashTable *wanted, GHashTable *ids,
                    const clock_reading &before, file_stamp *out_stamp) {
    FILE *stream = fopen(path, "re");
    struct stat seen = {};
    char *line = nullptr;
    std::size_t size = 0;
    ssize_t length = 0;

    *out_stamp = {};
    if (stream == nullptr)
        return;
    if (fstat(fileno(stream), &seen) == 0) {
        while (g_hash_table_size(wanted) > 0 && (length = getline(&line, &size, stream)) >= 0)
            take_line(form, {line, static_cast<std::size_t>(length)}, wanted, ids);
        if (ferror(stream) == 0)
            *out_stamp = file_stamp_of(seen, before);
        else
            g_hash_table_remove_all(ids);
    }
    std::free(line);
    (void)fclose(stream);  // Nothing was written.
}

static void load_ids(policy_store *store, const clock_reading &before) {
    g_autoptr(GHashTable) users = names_in(store->rules, &policy_role::users);
    g_autoptr(GHashTable) groups = names_in(store->rules, &policy_role::groups);

    g_hash_table_remove_all(store->ids.users);
    g_hash_table_remove_all(store->ids.groups);
    look_up(PASSWD_FORM, store->places.passwd, users, store->ids.users, before,
            &store->passwd_file);
    look_up(GROUP_FORM, store->places.group, groups, store->ids.groups, before, &store->group_file);
}

policy_store *policy_store_new(const policy_places &places) {
    auto *store = g_new0(policy_store, 1);

    store->places = places;
    store->folder = g_path_get_dirname(places.policy);
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
    g_free(store->folder);
    g_free(store);
}

static void forget_policy(policy_store *store) {
    // What they hold points into the policy.
    g_hash_table_remove_all(store->ids.users);
    g_hash_table_remove_all(store->ids.groups);
    g_clear_pointer(&store->rules, policy_free);
    store->policy_file = {};
}

bool policy_store_refresh(policy_store *store, GError **error) {
    // Before all files: what changes one of them while it is read has a later time.
    const clock_reading now = read_clocks();
    const bool is_folder_safe = check_folder(store, error);
    const bool is_policy_current =
        is_folder_safe && store->rules != nullptr &&
        file_stamp_holds(store->policy_file, store->places.policy, AT_SYMLINK_NOFOLLOW, now);

    if (!is_policy_current) {
        forget_policy(store);
        if (!is_folder_safe || !load_policy(store, now, error))
            return false;
    }
    // The account files may be links.
    if (!is_policy_current || !file_stamp_holds(store->passwd_file, store->places.passwd, 0, now) ||
        !file_stamp_holds(store->group_file, store->places.group, 0, now))
        load_ids(store, now);
    return true;
}

bool policy_store_allows(const policy_store *store, const policy_caller &caller,
                         const char *action_id) {
    return policy_allows(store->rules, store->ids, caller, action_id);
}
