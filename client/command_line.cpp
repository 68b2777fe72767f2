// client/command_line.cpp: the words and options of a command line.
#include "client/command_line.h"

#include <cstring>

#include <getopt.h>

#include "client/client_error.h"

static constexpr int DEFAULT_TIMEOUT_SECONDS = 60;
static constexpr int LONGEST_TIMEOUT_SECONDS = 86400;

// getopt_long's number of the first option; those below are characters.
static constexpr int FIRST_LONG = 256;

// What getopt gives back for a word that is no option, as "-" in front of SHORT_OPTIONS asks for.
static constexpr int A_WORD = 1;

// The digits take the rest of their word along: "-1.5" is a number and no option.
static constexpr const char *SHORT_OPTIONS = "-:hj0::1::2::3::4::5::6::7::8::9::.::";

static void list_long_options(option *out_options) {
    for (const command_option &row : command_options())
        out_options[row.id] = {row.name, row.value != nullptr ? required_argument : no_argument,
                               nullptr, FIRST_LONG + row.id};
    out_options[OPTION_COUNT] = {nullptr, 0, nullptr, 0};
}

static bool parse_json_mode(const char *text, json_mode *out_mode, GError **error) {
    if (json_mode_find(text, out_mode))
        return true;
    return fail_usage(error, "--json takes %s, not '%s'", JSON_MODE_WORDS, text);
}

static bool parse_timeout(const char *text, int *out_ms, GError **error) {
    gint64 seconds = 0;

    if (!parse_number(text, 0, LONGEST_TIMEOUT_SECONDS, &seconds))
        return fail_usage(error, "--timeout takes a number of seconds up to %d, not '%s'",
                          LONGEST_TIMEOUT_SECONDS, text);
    *out_ms = seconds == 0 ? G_MAXINT : static_cast<int>(seconds * 1000);
    return true;
}

static bool take_option(int found, bool on_terminal, command_line *line, GError **error) {
    const auto id = static_cast<option_id>(found - FIRST_LONG);

    if (found == 'h') {
        line->options[OPTION_HELP] = "";
        return true;
    }
    if (found == 'j') {
        line->json = on_terminal ? json_mode::PRETTY : json_mode::SHORT;
        return true;
    }
    line->options[id] = optarg != nullptr ? optarg : "";
    if (id == OPTION_JSON)
        return parse_json_mode(optarg, &line->json, error);
    if (id == OPTION_TIMEOUT)
        return parse_timeout(optarg, &line->timeout_ms, error);
    return true;
}

static bool fail_option(int found, char **argv, GError **error) {
    // getopt tells a short option by its character, and of a long one the number or nothing.
    if (found == ':')
        return fail_usage(error, "option %s needs a value", argv[optind - 1]);
    if (optopt >= FIRST_LONG)
        return fail_usage(error, "option --%s takes no value",
                          option_of(static_cast<option_id>(optopt - FIRST_LONG)).name);
    if (optopt != 0)
        return fail_usage(error, "unknown option -%c", optopt);
    return fail_usage(error, "unknown option %s", argv[optind - 1]);
}

static const command_option *find_option(const char *name, gsize length) {
    for (const command_option &row : command_options())
        if (std::strlen(row.name) == length && std::strncmp(row.name, name, length) == 0)
            return &row;
    return nullptr;
}

// getopt_long takes any beginning of a name for it: "--password=secret" would be a descriptor, and
// every beginning that somebody uses would bind us.
static bool check_names(int argc, char **argv, GError **error) {
    for (int i = 1; i < argc; i++) {
        if (!g_str_has_prefix(argv[i], "--"))
            continue;
        const char *name = argv[i] + 2;
        const gsize length = std::strcspn(name, "=");
        if (length == 0)
            return true;  // What follows are words.
        const command_option *row = find_option(name, length);
        if (row == nullptr)
            return fail_usage(error, "unknown option --%.*s", static_cast<int>(length), name);
        if (row->value != nullptr && name[length] == '\0')
            i++;
    }
    return true;
}

static bool read_words(int argc, char **argv, bool on_terminal, command_line *line,
                       GError **error) {
    option long_options[OPTION_COUNT + 1];

    list_long_options(long_options);
    opterr = 0;
    optind = 0;  // The GNU way to begin anew.
    for (;;) {
        const int found = getopt_long(argc, argv, SHORT_OPTIONS, long_options, nullptr);

        if (found == -1)
            break;
        if (found == '?' || found == ':')
            return fail_option(found, argv, error);
        if (found == A_WORD)
            g_ptr_array_add(line->words, optarg);
        else if (g_ascii_isdigit(found) || found == '.')
            g_ptr_array_add(line->words, argv[optind - 1]);
        else if (!take_option(found, on_terminal, line, error))
            return false;
    }
    for (; optind < argc; optind++)
        g_ptr_array_add(line->words, argv[optind]);
    return true;
}

bool command_line_parse(int argc, char **argv, bool on_terminal, command_line *out_line,
                        GError **error) {
    g_auto(command_line) line = {};

    for (int i = 1; i < argc; i++)
        if (!g_utf8_validate(argv[i], -1, nullptr))
            return fail_usage(error, "'%s' is no UTF-8", argv[i]);
    line.words = g_ptr_array_new();
    line.timeout_ms = DEFAULT_TIMEOUT_SECONDS * 1000;
    if (!check_names(argc, argv, error) || !read_words(argc, argv, on_terminal, &line, error))
        return false;
    *out_line = line;
    line.words = nullptr;
    return true;
}

void command_line_clear(command_line *line) {
    g_clear_pointer(&line->words, g_ptr_array_unref);
}

const char *word_at(const command_line &line, guint index) {
    return index < line.words->len ? static_cast<const char *>(line.words->pdata[index]) : nullptr;
}

bool option_number(const command_line &line, option_id id, gint64 *out_number, GError **error) {
    const char *text = line.options[id];
    const gint64 lowest = id == OPTION_PASSWORD_FD ? 0 : G_MININT32;

    if (parse_number(text, lowest, G_MAXINT32, out_number))
        return true;
    return fail_usage(error, "--%s takes a number, not '%s'", option_of(id).name, text);
}

bool parse_number(const char *text, gint64 lowest, gint64 highest, gint64 *out_number) {
    return g_ascii_string_to_signed(text, 10, lowest, highest, out_number, nullptr);
}

bool is_choice(const char *choices, const char *word) {
    g_auto(GStrv) words = g_strsplit(choices, " ", -1);
    return g_strv_contains(words, word);
}
