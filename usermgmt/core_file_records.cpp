// usermgmt/core_file_records.cpp: the lines of the three account files.
#include "usermgmt/core_file_records.h"

#include <cerrno>
#include <cstddef>
#include <cstring>

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include "usermgmt/account_records.h"
#include "usermgmt/name_set.h"
#include "usermgmt/record_block.h"
#include "usermgmt/secret.h"

static constexpr gint64 SECONDS_PER_DAY = 86400;

// shadow(5): the ageing fields, in days. They are the same for every user, whatever the file held.
static constexpr long MIN_DAYS = 0;
static constexpr long MAX_DAYS = 99999;
static constexpr long WARN_DAYS = 7;
static constexpr long INACTIVE_DAYS = 0;
static constexpr long NO_EXPIRY = -1;
static constexpr unsigned long NO_FLAG = static_cast<unsigned long>(-1);

// The C library's records hold pointers to non-constant characters.
static char *written(const char *text) {
    return const_cast<char *>(text);
}

// Room for the line that is being read, kept to the end of the file. fgetgrent and its like have
// their own, which grows by a kilobyte and has the line read anew each time: the square of its
// length, where a group lists every user.
class line_room {
  public:
    constexpr line_room() = default;
    line_room(const line_room &) = delete;
    line_room &operator=(const line_room &) = delete;

    char *text() { return text_; }
    std::size_t size() const { return size_; }

    // Loses the text. False with errno set where there is no memory.
    bool grow() {
        const std::size_t size = size_ != 0 ? 2 * size_ : FIRST_SIZE;
        release();
        text_ = static_cast<char *>(g_try_malloc(size));
        if (text_ == nullptr) {
            errno = ENOMEM;
            return false;
        }
        size_ = size;
        return true;
    }

    // Keeps errno.
    void release() {
        const int saved_errno = errno;
        if (text_ != nullptr)
            explicit_bzero(text_, size_);
        g_clear_pointer(&text_, g_free);
        size_ = 0;
        errno = saved_errno;
    }

  private:
    static constexpr std::size_t FIRST_SIZE = 1024;

    char *text_ = nullptr;
    std::size_t size_ = 0;
};

template <typename record>
using line_reader = int (*)(FILE *, record *, char *, std::size_t, record **);

// The stream's next record, whose strings stay until the next call; null at the end of the file,
// and on a failure, with errno set.
template <typename record>
static record *read_line(FILE *stream, line_reader<record> reader) {
    static line_room room;
    static record line;

    record *result = nullptr;
    fpos_t start;
    if (fgetpos(stream, &start) == 0 && (room.size() != 0 || room.grow()))
        while (reader(stream, &line, room.text(), room.size(), &result) == ERANGE)
            if (fsetpos(stream, &start) != 0 || !room.grow())
                break;
    if (result == nullptr)
        room.release();
    return result;
}

// A copy of a list of names in one block.
static char **copy_names(char *const *names) {
    std::size_t count = 0;
    std::size_t text_size = 0;
    for (; names[count] != nullptr; count++)
        text_size += std::strlen(names[count]) + 1;

    const std::size_t list_size = (count + 1) * sizeof *names;
    auto **copy = static_cast<char **>(g_malloc(list_size + text_size));
    char *room = reinterpret_cast<char *>(copy + count + 1);
    for (std::size_t i = 0; i < count; i++) {
        copy[i] = room;
        room = stpcpy(room, names[i]) + 1;
    }
    copy[count] = nullptr;
    return copy;
}

// The hash in the line's text is wiped as soon as it is copied.
gpointer fetch_passwd(FILE *stream) {
    static constexpr char *passwd::*texts[] = {&passwd::pw_name, &passwd::pw_passwd,
                                               &passwd::pw_gecos, &passwd::pw_dir,
                                               &passwd::pw_shell};
    const struct passwd *line = read_line<struct passwd>(stream, fgetpwent_r);
    if (line == nullptr)
        return nullptr;
    struct passwd *copy = copy_with_texts(line, texts);
    wipe_text(line->pw_passwd);
    return copy;
}

void free_passwd(gpointer record) {
    if (record == nullptr)
        return;
    wipe_text(static_cast<struct passwd *>(record)->pw_passwd);
    g_free(record);
}

gpointer fetch_shadow(FILE *stream) {
    static constexpr char *spwd::*texts[] = {&spwd::sp_namp, &spwd::sp_pwdp};
    const struct spwd *line = read_line<struct spwd>(stream, fgetspent_r);
    if (line == nullptr)
        return nullptr;
    struct spwd *copy = copy_with_texts(line, texts);
    wipe_text(line->sp_pwdp);
    return copy;
}

void free_shadow(gpointer record) {
    if (record == nullptr)
        return;
    wipe_text(static_cast<struct spwd *>(record)->sp_pwdp);
    g_free(record);
}

gpointer fetch_group(FILE *stream) {
    static constexpr char *group::*texts[] = {&group::gr_name, &group::gr_passwd};
    const struct group *line = read_line<struct group>(stream, fgetgrent_r);
    if (line == nullptr)
        return nullptr;
    struct group *copy = copy_with_texts(line, texts);
    wipe_text(line->gr_passwd);
    if (line->gr_mem != nullptr)
        copy->gr_mem = copy_names(line->gr_mem);
    return copy;
}

void free_group(gpointer record) {
    auto *line = static_cast<struct group *>(record);
    if (line == nullptr)
        return;
    wipe_text(line->gr_passwd);
    g_free(line->gr_mem);
    g_free(line);
}

const char *shadow_password(const internal_user *user) {
    return user->password != nullptr ? user->password : "*";
}

const char *passwd_password(const internal_user *user) {
    return user->shadowed ? "x" : shadow_password(user);
}

int write_passwd(const void *record, FILE *stream) {
    const auto *user = static_cast<const internal_user *>(record);

    struct passwd line = {};
    line.pw_name = user->name;
    line.pw_passwd = written(passwd_password(user));
    line.pw_uid = user->uid;
    line.pw_gid = user->gid;
    line.pw_gecos = written(user->gecos != nullptr ? user->gecos : "");
    line.pw_dir = user->home;
    line.pw_shell = user->shell;
    return putpwent(&line, stream);
}

int write_shadow(const void *record, FILE *stream) {
    const auto *user = static_cast<const internal_user *>(record);
    if (!user->shadowed)
        return 0;

    struct spwd line = {};
    line.sp_namp = user->name;
    line.sp_pwdp = written(shadow_password(user));
    line.sp_lstchg = user->last_change / SECONDS_PER_DAY;
    line.sp_min = MIN_DAYS;
    line.sp_max = MAX_DAYS;
    line.sp_warn = WARN_DAYS;
    line.sp_inact = INACTIVE_DAYS;
    line.sp_expire = NO_EXPIRY;
    line.sp_flag = NO_FLAG;
    return putspent(&line, stream);
}

int write_group(const void *record, FILE *stream) {
    const auto *group = static_cast<const internal_group *>(record);
    g_autoptr(GPtrArray) members = nullptr;
    if (g_hash_table_size(group->members) > 0)
        str_hash_to_ptr_array(group->members, &members, TRUE, FALSE);

    struct group line = {};
    line.gr_name = group->name;
    line.gr_passwd = group->password;
    line.gr_gid = group->gid;
    if (members != nullptr)
        line.gr_mem = reinterpret_cast<char **>(members->pdata);
    return putgrent(&line, stream);
}
