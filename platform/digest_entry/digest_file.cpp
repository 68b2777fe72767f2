// platform/digest_entry/digest_file.cpp: adds users to a digest file, and removes them.
#include "platform/digest_entry/digest_file.h"

#include <cstring>
#include <iterator>
#include <span>

#include <grp.h>
#include <unistd.h>

#include <glib.h>

#include "platform/digest_entry/digest_entry.h"
#include "platform/digest_entry/digest_lines.h"

static constexpr const char *WEB_SERVER_GROUP = "www-data";

// In the order of file_result.
static constexpr digest_entry_error error_numbers[] = {
    DIGEST_ENTRY_ERROR_NONE, DIGEST_ENTRY_ERROR_BUSY,        DIGEST_ENTRY_ERROR_FOLDER,
    DIGEST_ENTRY_ERROR_LOCK, DIGEST_ENTRY_ERROR_NOT_REGULAR, DIGEST_ENTRY_ERROR_TOO_BIG,
    DIGEST_ENTRY_ERROR_READ, DIGEST_ENTRY_ERROR_WRITE,       DIGEST_ENTRY_ERROR_SYNC,
};
static_assert(std::size(error_numbers) == static_cast<std::size_t>(file_result::NOT_SYNCED) + 1);

// A file that the web server cannot read is answered with a server error at every request.
static file_access access_of_new_file(gid_t folder_group) {
    const struct group *web_server = getgrnam(WEB_SERVER_GROUP);

    return {geteuid(), web_server != nullptr ? web_server->gr_gid : folder_group, 0640};
}

static constexpr line_format digest_format = {digest_read_line, access_of_new_file};

static int update(const char *path, std::span<const line_change> changes) {
    const file_result result = keyed_lines_update(path, digest_format, changes);

    return error_numbers[static_cast<std::size_t>(result)];
}

static void add_to_sum(GChecksum *sum, std::string_view text) {
    g_checksum_update(sum, reinterpret_cast<const guchar *>(text.data()),
                      static_cast<gssize>(text.size()));
}

// Appends the sum in hexadecimal digits.
static void append_hash(std::string_view user, std::string_view password, wiped_text *out_text) {
    static constexpr char DIGITS[] = "0123456789abcdef";
    g_autoptr(GChecksum) sum = g_checksum_new(G_CHECKSUM_MD5);
    guchar bytes[DIGEST_HASH_LENGTH / 2];
    gsize length = sizeof bytes;

    add_to_sum(sum, user);
    add_to_sum(sum, ":");
    add_to_sum(sum, DIGEST_REALM);
    add_to_sum(sum, ":");
    add_to_sum(sum, password);
    g_checksum_get_digest(sum, bytes, &length);
    for (const guchar byte : bytes) {
        const char pair[] = {DIGITS[byte >> 4], DIGITS[byte & 15]};
        out_text->append({pair, sizeof pair});
    }

    // GLib frees its state with the sum in it, so the sum of nothing takes its place, there and
    // here.
    g_checksum_reset(sum);
    g_checksum_get_digest(sum, bytes, &length);
}

int digest_file_set(const char *path, const char *user, const char *password) {
    if (!digest_is_user(user))
        return DIGEST_ENTRY_ERROR_USER;
    if (*password == '\0')
        return DIGEST_ENTRY_ERROR_PASSWORD;

    wiped_text line;
    line.append(user);
    line.append(":");
    line.append(DIGEST_REALM);
    line.append(":");
    append_hash(user, password, &line);

    const line_change change = {user, line.view()};
    return update(path, {&change, 1});
}

int digest_file_delete(const char *path, const char *user) {
    if (!digest_is_user(user))
        return DIGEST_ENTRY_ERROR_USER;

    const line_change change = {user, {}};
    return update(path, {&change, 1});
}

static int update_by_list(const char *path, const char *user_list,
                          bool (*read_list)(std::string_view list, GArray *out_changes)) {
    g_autoptr(GArray) changes = g_array_new(FALSE, FALSE, sizeof(line_change));
    const std::string_view list = user_list;

    if (list.size() > atomic_file::MAX_SIZE)
        return DIGEST_ENTRY_ERROR_TOO_BIG;
    if (!read_list(list, changes))
        return DIGEST_ENTRY_ERROR_LIST;
    if (changes->len == 0)
        return DIGEST_ENTRY_ERROR_NONE;
    return update(path, {reinterpret_cast<const line_change *>(changes->data), changes->len});
}

int digest_file_set_list(const char *path, const char *user_list) {
    return update_by_list(path, user_list, digest_read_set_list);
}

int digest_file_delete_list(const char *path, const char *user_list) {
    return update_by_list(path, user_list, digest_read_delete_list);
}
