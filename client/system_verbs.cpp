// client/system_verbs.cpp: the arguments and results of system commands that are not plain ones.
#include "client/system_verbs.h"

#include <cstring>

#include <sys/wait.h>

#include "client/client_error.h"

static constexpr gint64 MICROSECONDS = 1000000;

// A number with up to six digits behind its point, as microseconds. Both parts must fit the bus.
static bool parse_seconds(const char *text, gint64 *out_seconds, gint64 *out_microseconds) {
    g_auto(GStrv) parts = g_strsplit(text, ".", 2);
    gint64 fraction = 0;

    if (parts[0] == nullptr || !parse_number(parts[0], G_MININT32, G_MAXINT32, out_seconds))
        return false;
    *out_microseconds = 0;
    if (parts[1] == nullptr)
        return true;
    const std::size_t digits = std::strlen(parts[1]);
    if (digits == 0 || digits > 6 || std::strspn(parts[1], "0123456789") != digits)
        return false;
    (void)parse_number(parts[1], 0, MICROSECONDS, &fraction);  // It is a number.
    for (std::size_t i = digits; i < 6; i++)
        fraction *= 10;
    *out_microseconds = fraction;
    return true;
}

// A date of the local time zone, unless it names another.
static bool parse_date(const char *text, gint64 *out_seconds, gint64 *out_microseconds) {
    g_autofree char *written = g_strdup(text);
    g_autoptr(GTimeZone) zone = g_time_zone_new_local();

    // A person writes a blank where the standard has "T".
    char *blank = std::strchr(written, ' ');
    if (blank != nullptr)
        *blank = 'T';
    g_autoptr(GDateTime) date = g_date_time_new_from_iso8601(written, zone);
    if (date == nullptr)
        return false;
    *out_seconds = g_date_time_to_unix(date);
    *out_microseconds = g_date_time_get_microsecond(date);
    return *out_seconds >= G_MININT32 && *out_seconds <= G_MAXINT32;
}

// A time below 0 counts its microseconds upwards, as the kernel wants them: -5.5 is -6 and half a
// million.
static bool parse_epoch(const char *text, gint64 *out_seconds, gint64 *out_microseconds) {
    if (!parse_seconds(text, out_seconds, out_microseconds))
        return false;
    if (*text == '-' && *out_microseconds != 0) {
        *out_seconds -= 1;
        *out_microseconds = MICROSECONDS - *out_microseconds;
    }
    return *out_seconds >= G_MININT32;
}

static GVariant *time_arguments(gint64 seconds, gint64 microseconds) {
    return g_variant_new("(ii)", static_cast<gint32>(seconds), static_cast<gint32>(microseconds));
}

GVariant *build_clock_set(const command_line &line, GError **error) {
    const char *text = word_at(line, 2);
    gint64 seconds = 0;
    gint64 microseconds = 0;
    const bool is_time = *text == '@' ? parse_epoch(text + 1, &seconds, &microseconds)
                                      : parse_date(text, &seconds, &microseconds);

    if (is_time)
        return time_arguments(seconds, microseconds);
    (void)fail_usage(error, "'%s' is no time; write \"2026-01-31 23:59:59\" or @SECONDS", text);
    return nullptr;
}

GVariant *build_clock_adjust(const command_line &line, GError **error) {
    const char *text = word_at(line, 2);
    gint64 seconds = 0;
    gint64 microseconds = 0;

    if (!parse_seconds(text, &seconds, &microseconds)) {
        (void)fail_usage(error, "'%s' is no number of seconds", text);
        return nullptr;
    }
    // "-1.5" is -1 s and -500000 us: adjtime(3) adds the two.
    if (*text == '-')
        microseconds = -microseconds;
    return time_arguments(seconds, microseconds);
}

GVariant *build_pinsrv(const command_line &line, GError **) {
    g_autoptr(GStrvBuilder) words = g_strv_builder_new();

    // The command's own name stands where the service puts the program's.
    for (guint i = 0; i < line.words->len; i++)
        g_strv_builder_add(words, word_at(line, i));
    g_auto(GStrv) argv = g_strv_builder_end(words);
    return g_variant_new("(^as)", argv);
}

GVariant *build_reset(const command_line &line, GError **error) {
    static constexpr struct {
        const char *kind;
        const char *text;
    } KINDS[] = {
        {"hard", "ONVIF_HARD_RESET"},
        {"soft", "SOFT_RESET"      },
    };
    const char *kind = word_at(line, 2);

    for (const auto &row : KINDS)
        if (std::strcmp(row.kind, kind) == 0)
            return g_variant_new("(s)", row.text);
    (void)fail_usage(error, "KIND is one of hard|soft, not '%s'", kind);
    return nullptr;
}

static gint32 number_of(GVariant *results) {
    gint32 number = 0;

    g_variant_get(results, "(i)", &number);
    return number;
}

bool judge_clock(GVariant *results, GError **error) {
    if (number_of(results) == 0)
        return true;
    return fail_failed(error, "The kernel refused the time");
}

bool judge_pinsrv(GVariant *results, GError **error) {
    if (number_of(results) >= 0)
        return true;
    return fail_failed(error, "The PIN server could not be started");
}

bool judge_reboot(GVariant *results, GError **error) {
    const int status = number_of(results);

    if (status == 0)
        return true;
    if (status < 0)
        return fail_failed(error, "The tool that reboots could not be started");
    if (WIFSIGNALED(status))
        return fail_failed(error, "The tool that reboots was ended by signal %d", WTERMSIG(status));
    return fail_failed(error, "The tool that reboots failed with status %d", WEXITSTATUS(status));
}
