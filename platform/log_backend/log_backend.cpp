// platform/log_backend/log_backend.cpp: renders GLib's log records as single lines and delivers
// them.
#include "platform/log_backend/log_backend.h"

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <glib.h>

// Long enough for every text of ours; syslog daemons commonly cut a line at 8 KiB.
static constexpr std::size_t MAX_TEXT = 4096;

struct level_row {
    int level;
    const char *name;
    int priority;
};

// GLib's own mapping to priorities. The first level above GLib's is the program's fatal one.
static constexpr level_row level_table[] = {
    {G_LOG_LEVEL_ERROR,           "error",    LOG_ERR    },
    {G_LOG_LEVEL_CRITICAL,        "critical", LOG_WARNING},
    {G_LOG_LEVEL_WARNING,         "warning",  LOG_WARNING},
    {G_LOG_LEVEL_MESSAGE,         "message",  LOG_NOTICE },
    {G_LOG_LEVEL_INFO,            "info",     LOG_INFO   },
    {G_LOG_LEVEL_DEBUG,           "debug",    LOG_DEBUG  },
    {1 << G_LOG_LEVEL_USER_SHIFT, "error",    LOG_ERR    },
};
static constexpr level_row other_level = {0, "message", LOG_NOTICE};

// A program's own levels lie outside the values of GLib's enumeration, so that in C++ reading
// them as one is undefined.
static int bits_of(const GLogLevelFlags &level) {
    int bits = 0;

    static_assert(sizeof bits == sizeof level);
    std::memcpy(&bits, &level, sizeof bits);
    return bits;
}

// GLib's rule, which never drops a program's own levels.
static bool is_unwanted(int level, const char *domain) {
    return level < 1 << G_LOG_LEVEL_USER_SHIFT &&
           g_log_writer_default_would_drop(static_cast<GLogLevelFlags>(level), domain) != FALSE;
}

static const level_row &row_of(int level) {
    for (const level_row &row : level_table) {
        if ((level & row.level) != 0)
            return row;
    }
    return other_level;
}

static bool is_between(gunichar first, gunichar character, gunichar last) {
    return first <= character && character <= last;
}

// What could end a line, drive a terminal, or show a record in another order than it was written:
// the controls of ASCII and Latin-1, the two separators, and the marks of writing direction.
static bool is_unprintable(gunichar character) {
    return g_unichar_iscntrl(character) != FALSE || character == 0x061c ||
           is_between(0x200e, character, 0x200f) || is_between(0x2028, character, 0x202e) ||
           is_between(0x2066, character, 0x2069);
}

// The length of the printable character that text begins with; 0 where its first byte needs an
// escape.
static std::size_t printable_length(const char *text, std::size_t available) {
    const gunichar character = g_utf8_get_char_validated(text, static_cast<gssize>(available));

    // The two highest values stand for a wrong and for an incomplete sequence.
    if (character >= static_cast<gunichar>(-2) || is_unprintable(character))
        return 0;
    return static_cast<std::size_t>(g_unichar_to_utf8(character, nullptr));
}

// The limit counts bytes as written, so that escapes cannot stretch a record past it.
static void append_visible(GString *line, const char *text, std::size_t limit) {
    const std::size_t length = std::strlen(text);
    const std::size_t start = line->len;
    std::size_t done = 0;

    while (done < length) {
        const char *rest = text + done;
        const std::size_t whole = printable_length(rest, length - done);
        const std::size_t width = whole != 0 ? whole : std::strlen("\\xNN");

        if (line->len - start + width > limit) {
            g_string_append_printf(line, " [%zu more bytes]", length - done);
            return;
        }
        if (whole != 0) {
            g_string_append_len(line, rest, static_cast<gssize>(whole));
            done += whole;
        } else {
            g_string_append_printf(line, "\\x%02X",
                                   static_cast<unsigned>(static_cast<std::uint8_t>(*rest)));
            ++done;
        }
    }
}

static void append_record(GString *line, const level_row &row, const char *domain,
                          const char *message) {
    g_string_append(line, row.name);
    g_string_append(line, ": ");
    if (domain != nullptr && *domain != '\0') {
        append_visible(line, domain, MAX_TEXT);
        g_string_append(line, ": ");
    }
    append_visible(line, message != nullptr ? message : "(NULL) message", MAX_TEXT);
}

// A log that cannot be written has nowhere to say so: what does not go out is dropped.
static void write_all(int fd, const char *bytes, std::size_t length) {
    while (length > 0) {
        const ssize_t written = write(fd, bytes, length);
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return;
        bytes += written;
        length -= static_cast<std::size_t>(written);
    }
}

// Callers log between a failing call and the use of errno, so both handlers leave it alone.
static void handle_stdout(const char *domain, GLogLevelFlags level, const char *message,
                          void *to_journal) {
    const int bits = bits_of(level);
    if (is_unwanted(bits, domain))
        return;

    const int saved_errno = errno;
    const level_row &row = row_of(bits);
    g_autoptr(GString) line = g_string_new(nullptr);

    if (to_journal != nullptr)
        g_string_append_printf(line, "<%d>", row.priority);
    append_record(line, row, domain, message);
    g_string_append_c(line, '\n');
    write_all(STDOUT_FILENO, line->str, line->len);
    errno = saved_errno;
}

static void handle_syslog(const char *domain, GLogLevelFlags level, const char *message, void *) {
    const int bits = bits_of(level);
    if (is_unwanted(bits, domain))
        return;

    const int saved_errno = errno;
    const level_row &row = row_of(bits);
    g_autoptr(GString) line = g_string_new(nullptr);

    append_record(line, row, domain, message);
    syslog(LOG_DAEMON | row.priority, "%s", line->str);
    errno = saved_errno;
}

// systemd names the journal's stream by device and inode, so that a redirected output is told
// from it.
static bool is_stdout_journal() {
    const char *journal = g_getenv("JOURNAL_STREAM");
    struct stat status = {};

    if (journal == nullptr || fstat(STDOUT_FILENO, &status) != 0)
        return false;

    g_autofree char *ours = g_strdup_printf("%" G_GUINT64_FORMAT ":%" G_GUINT64_FORMAT,
                                            guint64{status.st_dev}, guint64{status.st_ino});
    return std::strcmp(journal, ours) == 0;
}

void log_backend_stdout(void) {
    static char journal_mark;

    g_log_set_default_handler(handle_stdout, is_stdout_journal() ? &journal_mark : nullptr);
}

void log_backend_syslog(void) {
    openlog("privane_system", LOG_PID, LOG_DAEMON);
    g_log_set_default_handler(handle_syslog, nullptr);
}
