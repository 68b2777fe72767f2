// tests/fuzz/log_records_fuzz.cpp: log records of any text: each is one line of valid and printable
// UTF-8 that ends. The first byte chooses the level; the parts are the domain and the text.
#include <algorithm>
#include <cerrno>
#include <cstdarg>

#include <syslog.h>
#include <unistd.h>

#include <glib.h>

#include "platform/log_backend/log_backend.h"
#include "tests/fuzz/fuzz.h"

static constexpr std::size_t MAX_TEXT = 4096;
static constexpr std::size_t MAX_MARK = sizeof " [18446744073709551615 more bytes]";
static constexpr std::size_t MAX_LINE = 2 * (MAX_TEXT + MAX_MARK) + 32;
static constexpr int ERRNO_BEFORE = 4242;

struct level {
    int bits;
    const char *name;
    int priority;
};
static constexpr level levels[] = {
    {G_LOG_LEVEL_CRITICAL,              "critical", LOG_WARNING},
    {G_LOG_LEVEL_WARNING,               "warning",  LOG_WARNING},
    {G_LOG_LEVEL_MESSAGE,               "message",  LOG_NOTICE },
    {G_LOG_LEVEL_INFO,                  "info",     LOG_INFO   },
    {G_LOG_LEVEL_DEBUG,                 "debug",    LOG_DEBUG  },
    {1 << G_LOG_LEVEL_USER_SHIFT,       "error",    LOG_ERR    },
    {1 << (G_LOG_LEVEL_USER_SHIFT + 1), "message",  LOG_NOTICE },
};

static std::vector<std::string> records;
static int last_priority;

// The linker sends the calls here (--wrap).

ssize_t real_write(int fd, const void *bytes, size_t size) asm("__real_write");
ssize_t wrap_write(int fd, const void *bytes, size_t size) asm("__wrap_write");
ssize_t wrap_write(int fd, const void *bytes, size_t size) {
    if (fd != STDOUT_FILENO)
        return real_write(fd, bytes, size);
    records.emplace_back(static_cast<const char *>(bytes), size);
    errno = 0;
    return static_cast<ssize_t>(size);
}

static void record_syslog(int priority, const char *format, va_list arguments) G_GNUC_PRINTF(2, 0);
static void record_syslog(int priority, const char *format, va_list arguments) {
    g_autofree char *text = g_strdup_vprintf(format, arguments);
    last_priority = priority;
    records.emplace_back(text);
    errno = 0;
}

void wrap_syslog(int priority, const char *format, ...) asm("__wrap_syslog") G_GNUC_PRINTF(2, 3);
void wrap_syslog(int priority, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    record_syslog(priority, format, arguments);
    va_end(arguments);
}

void wrap_syslog_chk(int priority, int flag, const char *format, ...) asm("__wrap___syslog_chk")
    G_GNUC_PRINTF(3, 4);
void wrap_syslog_chk(int priority, int, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    record_syslog(priority, format, arguments);
    va_end(arguments);
}

static bool is_printable_ascii(const std::string &text) {
    return std::all_of(text.begin(), text.end(), [](char c) { return c >= ' ' && c <= '~'; });
}

static bool is_harmful(gunichar character) {
    return character < 0x20 || (character >= 0x7f && character <= 0x9f) || character == 0x2028 ||
           character == 0x2029 || (character >= 0x202a && character <= 0x202e) ||
           (character >= 0x2066 && character <= 0x2069);
}

static std::string logged(const level &row, const std::string &domain, const std::string &text) {
    records.clear();
    errno = ERRNO_BEFORE;
    g_log(domain.empty() ? nullptr : domain.c_str(), static_cast<GLogLevelFlags>(row.bits), "%s",
          text.c_str());
    hold(errno == ERRNO_BEFORE, "a record leaves errno alone");
    hold(records.size() == 1, "a record is one write",
         [] { return std::to_string(records.size()); });
    return records[0];
}

static void check(const level &row, const std::string &domain, const std::string &text,
                  const std::string &line) {
    hold(line.size() <= MAX_LINE, "a record is bounded",
         [&line] { return std::to_string(line.size()); });
    hold(g_utf8_validate(line.data(), static_cast<gssize>(line.size()), nullptr),
         "a record is UTF-8", line);
    const std::string shown = line + '\0';
    for (const char *at = shown.c_str(); *at != '\0'; at = g_utf8_find_next_char(at, nullptr))
        hold(!is_harmful(g_utf8_get_char(at)), "a record has nothing that ends or turns it", line);
    const std::string start = std::string(row.name) + ": ";
    hold(line.starts_with(start), "a record begins with its level", line);
    if (is_printable_ascii(domain) && is_printable_ascii(text) && domain.size() <= MAX_TEXT &&
        text.size() <= MAX_TEXT)
        hold(line == start + (domain.empty() ? "" : domain + ": ") + text,
             "a plain text is written as it is", line);
}

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    g_setenv("G_MESSAGES_DEBUG", "all", TRUE);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    chosen_bytes input(data, size);
    const level &row = levels[input.next() % std::size(levels)];
    const std::string_view rest = input.rest();
    std::vector<std::string> parts =
        parts_of(reinterpret_cast<const std::uint8_t *>(rest.data()), rest.size());
    parts.insert(parts.begin(), parts.size() == 1 ? 1U : 0U, "");
    const std::string domain = parts[0].c_str();
    const std::string text = parts[1].c_str();

    log_backend_stdout();
    std::string line = logged(row, domain, text);
    hold(line.ends_with('\n'), "a line has its end", line);
    line.pop_back();
    check(row, domain, text, line);

    log_backend_syslog();
    hold(logged(row, domain, text) == line, "both ways say the same", line);
    hold(last_priority == (LOG_DAEMON | row.priority), "a record keeps its priority");
    return 0;
}
