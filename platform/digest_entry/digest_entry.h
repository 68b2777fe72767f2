/* platform/digest_entry/digest_entry.h: the web server's HTTP digest password file. */
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

/*
 * The file is /etc/apache2/digest_auth_passwd, in the layout of Apache's htdigest tool, a line for
 * each user:
 *
 *     user:PRIVANE:0123456789abcdef0123456789abcdef
 *
 * PRIVANE is the realm that these functions work on. The 32 lower-case hexadecimal digits are the
 * MD5 sum of "user:PRIVANE:password".
 *
 * A line belongs to a user when Apache takes it for that user and realm. Apache heeds the first
 * such line only: it is changed in its place, and further ones are removed. Lines of other realms,
 * comments and everything else stay byte for byte where they are; a last line without a line end
 * gets one, and one that ends in a backslash, by which Apache would join the next one to it, is
 * followed by a line with a blank before a user is added. A file that would stay as it is is not
 * written, only made sure to last.
 *
 * The file is replaced as a whole or not at all, and keeps its owner, group and mode; a web server
 * that reads it meets the old or the new one. Where it is missing, it is made with mode 0640, of
 * the caller and the group www-data or, where there is no such group, of its folder's group. The
 * folder must exist. A file above 1 MiB is refused.
 *
 * Writers lock digest_auth_passwd.lock, beside the file, with flock(2), and wait for each other for
 * at most 3 seconds. What changes the file without that lock, as the htdigest tool does, may be
 * lost.
 */

/* What the functions answer. The numbers stay as they are. */
enum digest_entry_error {
    DIGEST_ENTRY_ERROR_NONE = 0,
    DIGEST_ENTRY_ERROR_INVALID = 1,     /* a null argument, or flags that are not the function's */
    DIGEST_ENTRY_ERROR_USER = 2,        /* no valid user name */
    DIGEST_ENTRY_ERROR_PASSWORD = 3,    /* an empty password */
    DIGEST_ENTRY_ERROR_LIST = 4,        /* a line of the list is not valid */
    DIGEST_ENTRY_ERROR_BUSY = 5,        /* another writer held the lock for too long */
    DIGEST_ENTRY_ERROR_FOLDER = 6,      /* the file's folder cannot be opened */
    DIGEST_ENTRY_ERROR_LOCK = 7,        /* the lock file cannot be opened or locked */
    DIGEST_ENTRY_ERROR_NOT_REGULAR = 8, /* the file is a symbolic link, a folder or a device */
    DIGEST_ENTRY_ERROR_TOO_BIG = 9,     /* the list or the file, as it is or would become */
    DIGEST_ENTRY_ERROR_READ = 10,       /* the file cannot be opened or read */
    DIGEST_ENTRY_ERROR_WRITE = 11,      /* the file could not be replaced */
    DIGEST_ENTRY_ERROR_SYNC = 12        /* the new file could not be made to last */
};

#pragma GCC visibility push(default)

/*
 * All four answer 0 on success and one of the numbers above otherwise; the file is then as it was.
 * With DIGEST_ENTRY_ERROR_SYNC it was replaced for a moment, and a disk that fails further may keep
 * it so.
 *
 * A user name has 1 to 255 bytes, of any encoding, without ":" and line ends, and does not begin
 * with "#" or a blank: Apache would never match it.
 */

/*
 * Adds the user, or changes the password. The password is any text but the empty one, which would
 * let in whoever knows the name. flags is 0.
 */
int digest_entry_set(const char *user, const char *password, int flags);

/* Removes the user; one who has no entry is removed already. flags is 0. */
int digest_entry_delete(const char *user, int flags);

/*
 * Adds or changes every user of a list in one replacement. The list has the lines of the file,
 * "user:PRIVANE:" and the 32 lower-case digits, each ended by a newline that the last one may lack;
 * so it carries no clear text, and in a shell it is made by
 *
 *     sum=$(printf '%s:PRIVANE:%s' "$user" "$password" | md5sum | cut -d ' ' -f 1)
 *     printf '%s:PRIVANE:%s\n' "$user" "$sum"
 *
 * One line that is not valid, an empty one included, refuses the whole list. Where a user comes
 * twice, the last line counts. An empty list changes nothing. flags is 1.
 */
int digest_entry_set_list(const char *user_list, int flags);

/*
 * Removes every user of a list in one replacement. A line is a user name, or a line of the kind
 * above, of which only the user name counts; otherwise as for digest_entry_set_list. flags is 1.
 */
int digest_entry_delete_list(const char *user_list, int flags);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif
