// usermgmt/record_check.cpp: whether a record survives being written and read.
#include "usermgmt/record_check.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include <grp.h>
#include <pwd.h>
#include <shadow.h>
#include <sys/types.h>

#include "usermgmt/core_file.h"
#include "usermgmt/core_file_records.h"
#include "usermgmt/secret.h"

// Any existing group serves for trying a member's name.
static constexpr guint32 SOME_GID = 1;
static char some_group_name[] = "group";

// What a row writes for one record. The text may hold a hash, so it is wiped, also where it grew.
class written_line {
  public:
    written_line() = default;
    ~written_line() { release(); }
    written_line(const written_line &) = delete;
    written_line &operator=(const written_line &) = delete;

    // False with errno set when the row refuses the record.
    bool write(const core_file *cf, const void *record) {
        wiped_stream_buffer buffer;
        FILE *stream = fopencookie(this, "w", {nullptr, append, nullptr, nullptr});
        if (stream == nullptr)
            return false;
        buffer.give_to(stream);
        errno = 0;
        const bool written = cf->write(record, stream) >= 0;
        const int saved_errno = errno;
        const bool closed = fclose(stream) == 0;
        if (!written)
            errno = saved_errno;
        return written && closed;
    }

    bool is_empty() const { return length_ == 0; }
    FILE *reopen() { return fmemopen(text_, length_, "r"); }

  private:
    static ssize_t append(void *cookie, const char *text, size_t length) {
        auto *line = static_cast<written_line *>(cookie);
        if (length > line->size_ - line->length_)
            line->grow(length);
        std::memcpy(line->text_ + line->length_, text, length);
        line->length_ += length;
        return static_cast<ssize_t>(length);
    }

    void grow(size_t more) {
        const size_t size = 2 * (length_ + more);
        auto *text = static_cast<char *>(g_malloc(size));
        if (length_ > 0)
            std::memcpy(text, text_, length_);
        release();
        text_ = text;
        size_ = size;
    }

    void release() {
        if (text_ != nullptr)
            explicit_bzero(text_, size_);
        g_free(text_);
    }

    char *text_ = nullptr;
    size_t length_ = 0;
    size_t size_ = 0;
};

using line_comparison = bool (*)(const void *intended, const void *line);

// Reads what was written: exactly one line, with the intended fields.
static bool reads_back(const core_file *cf, written_line *written, const void *intended,
                       line_comparison is_intended) {
    FILE *stream = written->reopen();
    if (stream == nullptr)
        return false;
    wiped_stream_buffer buffer;
    buffer.give_to(stream);
    gpointer line = cf->fetch(stream);
    gpointer second = line != nullptr ? cf->fetch(stream) : nullptr;
    const bool same = line != nullptr && second == nullptr && is_intended(intended, line);
    cf->free_record(line);
    cf->free_record(second);
    (void)fclose(stream);  // it was only read from
    return same;
}

static bool check_record(core_file_row row, const void *record, guint index,
                         line_comparison is_intended, GError **error) {
    const core_file *cf = &core_file_table[row];
    written_line written;
    int cause = 0;
    if (!written.write(cf, record))
        cause = errno != 0 ? errno : EINVAL;
    else if (!written.is_empty() && !reads_back(cf, &written, record, is_intended))
        cause = EINVAL;
    if (cause == 0)
        return true;
    g_set_error(error, COREFILE_ERROR, COREFILE_ERROR_WRITE,
                "unable to sync core files, failed to write 1/%d core file(s) %s: could not write "
                "entry #%u to %s.tmp: %s",
                static_cast<int>(CORE_FILE_COUNT), cf->name, index, cf->path, g_strerror(cause));
    return false;
}

static bool is_same_text(const char *read, const char *intended) {
    return g_strcmp0(read, intended != nullptr ? intended : "") == 0;
}

// The comment is left out: the C library stores blanks for what a line cannot hold.
static bool is_intended_passwd(const void *intended, const void *line) {
    const auto *user = static_cast<const internal_user *>(intended);
    const auto *read = static_cast<const struct passwd *>(line);
    return is_same_text(read->pw_name, user->name) &&
           is_same_text(read->pw_passwd, passwd_password(user)) && read->pw_uid == user->uid &&
           read->pw_gid == user->gid && is_same_text(read->pw_dir, user->home) &&
           is_same_text(read->pw_shell, user->shell);
}

static bool is_intended_shadow(const void *intended, const void *line) {
    const auto *user = static_cast<const internal_user *>(intended);
    const auto *read = static_cast<const struct spwd *>(line);
    return is_same_text(read->sp_namp, user->name) &&
           is_same_text(read->sp_pwdp, shadow_password(user));
}

static bool is_intended_group(const void *intended, const void *line) {
    const auto *group = static_cast<const internal_group *>(intended);
    const auto *read = static_cast<const struct group *>(line);
    return g_strcmp0(read->gr_name, group->name) == 0 && read->gr_gid == group->gid &&
           read->gr_mem != nullptr && read->gr_mem[0] != nullptr && read->gr_mem[1] == nullptr &&
           g_hash_table_contains(group->members, read->gr_mem[0]);
}

bool check_user_record(const internal_user *user, guint index, GError **error) {
    return check_record(CORE_FILE_ROW_PASSWD, user, index, is_intended_passwd, error) &&
           check_record(CORE_FILE_ROW_SHADOW, user, index, is_intended_shadow, error);
}

bool check_member_name(const char *username, guint index, GError **error) {
    g_autoptr(GHashTable) members = member_set_new();
    (void)g_hash_table_add(members, g_strdup(username));
    internal_group group = {};
    group.name = some_group_name;
    group.gid = SOME_GID;
    group.members = members;
    return check_record(CORE_FILE_ROW_GROUP, &group, index, is_intended_group, error);
}
