// client/completion.cpp: what may stand next on a command line.
#include "client/completion.h"

#include <cstring>

#include "client/completion_values.h"
#include "client/verbs.h"
#include "privane_system_binding.h"

// A command line that is not finished: its last word is what is completed.
struct unfinished {
    GPtrArray *words;          // const char *: what is no option, the last word left out
    const char *last;          // borrowed
    const char *pending;       // the option whose value the last word is, or null
    GStrvBuilder *candidates;  // borrowed
};

// Null for what is no option with its value in the next word.
static const command_option *find_valued(const char *word) {
    if (!g_str_has_prefix(word, "--"))
        return nullptr;
    for (const command_option &option : command_options())
        if (option.value != nullptr && std::strcmp(option.name, word + 2) == 0)
            return &option;
    return nullptr;
}

static void add_candidate(const unfinished &line, const char *prefix, const char *candidate,
                          const char *typed) {
    if (!g_str_has_prefix(candidate, typed))
        return;
    g_autofree char *whole = g_strconcat(prefix, candidate, nullptr);
    g_strv_builder_add(line.candidates, whole);
}

// prefix: what stands in front of the typed part in the last word.
static void add_values(const unfinished &line, value_kind kind, const char *choices,
                       const char *prefix, const char *typed) {
    g_auto(GStrv) values = completion_values(kind, choices);

    // The shell completes paths itself. The service's folder is not that of the shell: what does
    // not begin at the root is another file there.
    if (kind == value_kind::FILE_PATH && (*typed == '\0' || *typed == '/'))
        add_candidate(line, prefix, ":files", "");
    for (char **value = values; *value != nullptr; value++)
        add_candidate(line, prefix, *value, typed);
}

// Of a list that "," joins, the last element is completed.
static void add_option_values(const unfinished &line, const command_option &option,
                              const char *prefix, const char *typed) {
    const char *comma = option.kind == value_kind::GROUPS ? std::strrchr(typed, ',') : nullptr;
    const char *element = comma != nullptr ? comma + 1 : typed;
    g_autofree char *before = g_strndup(typed, static_cast<gsize>(element - typed));
    g_autofree char *whole = g_strconcat(prefix, before, nullptr);

    add_values(line, option.kind, option.choices, whole, element);
}

static bool fits(const command &row, const unfinished &line) {
    if (row.help == nullptr)
        return false;
    for (guint i = 0; i < line.words->len && i < name_length(row); i++) {
        const char *name = i == 0 ? row.noun : row.verb;
        if (std::strcmp(name, static_cast<const char *>(line.words->pdata[i])) != 0)
            return false;
    }
    return true;
}

static void add_options(const unfinished &line) {
    for (const command_option &option : command_options()) {
        bool is_taken = false;
        for (const command &row : commands())
            is_taken |= fits(row, line) && line.words->len >= name_length(row) &&
                        takes_option(row, option.id);
        if (!is_taken && option.id >= FIRST_OWN_OPTION)
            continue;
        g_autofree char *whole =
            g_strconcat("--", option.name, option.value != nullptr ? "=" : "", nullptr);
        add_candidate(line, "", whole, line.last);
    }
}

static void add_names(const unfinished &line) {
    for (const command &row : commands()) {
        if (!fits(row, line) || line.words->len >= name_length(row))
            continue;
        add_candidate(line, "", line.words->len == 0 ? row.noun : row.verb, line.last);
    }
}

// What a unit's method wants next to its own name.
static void add_detail(const unfinished &line, const char *method) {
    value_kind kind = value_kind::UNIT;
    const char *choices = nullptr;

    if (g_ascii_strcasecmp(method, "SetDefaultTarget") == 0) {
        kind = value_kind::TARGET;
    } else if (g_ascii_strcasecmp(method, "GetActiveNetworkInfo") == 0) {
        kind = value_kind::CHOICE;
        choices = "all tcp-udp";
    } else if (!g_str_has_suffix(method, "Service")) {
        return;
    }
    add_values(line, kind, choices, "", line.last);
}

static void add_argument(const unfinished &line, const command &row) {
    guint index = name_length(row);

    for (const argument &taken : arguments_of(row)) {
        const bool is_word = taken.from == source::WORD || taken.from == source::OPTIONAL_WORD;
        if (taken.from == source::CHOSEN) {
            add_values(line, taken.kind, taken.choices, "", line.last);
            continue;
        }
        if (!is_word && taken.from != source::WORDS)
            continue;
        if (index++ != line.words->len && taken.from != source::WORDS)
            continue;
        if (std::strcmp(row.noun, "explain") == 0 && index > 2)
            add_detail(line, static_cast<const char *>(line.words->pdata[1]));
        else
            add_values(line, taken.kind, taken.choices, "", line.last);
        return;
    }
}

static void add_arguments(const unfinished &line) {
    for (const command &row : commands()) {
        if (!fits(row, line) || line.words->len < name_length(row))
            continue;
        add_argument(line, row);
        return;  // Rows of the same name take the same words.
    }
}

static void complete(const unfinished &line) {
    const char *equals = std::strchr(line.last, '=');

    if (line.pending != nullptr) {
        add_option_values(line, *find_valued(line.pending), "", line.last);
    } else if (g_str_has_prefix(line.last, "--") && equals != nullptr) {
        g_autofree char *name = g_strndup(line.last, static_cast<gsize>(equals - line.last));
        g_autofree char *prefix = g_strconcat(name, "=", nullptr);
        const command_option *option = find_valued(name);
        if (option != nullptr)
            add_option_values(line, *option, prefix, equals + 1);
    } else if (*line.last == '-') {
        add_options(line);
    } else {
        add_names(line);
        add_arguments(line);
    }
}

char **completion_candidates(const char *const *words) {
    g_autoptr(GPtrArray) plain = g_ptr_array_new();
    g_autoptr(GStrvBuilder) candidates = g_strv_builder_new();
    unfinished line = {plain, "", nullptr, candidates};

    for (const char *const *word = words; *word != nullptr; word++) {
        if (word[1] == nullptr) {
            line.last = *word;
            break;
        }
        const bool is_value = line.pending != nullptr;
        line.pending = !is_value && find_valued(*word) != nullptr ? *word : nullptr;
        if (!is_value && **word != '-')
            g_ptr_array_add(plain, const_cast<char *>(*word));
    }
    complete(line);
    return g_strv_builder_end(candidates);
}

bool run_complete(const session &run, GError **error) {
    const GPtrArray *given = run.line->words;
    g_autofree const char **words = g_new0(const char *, given->len);
    GString *text = g_string_new(nullptr);

    for (guint i = 1; i < given->len; i++)
        words[i - 1] = word_at(*run.line, i);
    g_auto(GStrv) candidates = completion_candidates(words);
    for (guint i = 0; candidates[i] != nullptr; i++)
        if (!g_strv_contains(candidates + i + 1, candidates[i]))
            g_string_append_printf(text, "%s\n", candidates[i]);
    g_autofree char *shown = g_string_free(text, FALSE);
    return session_print(shown, error);
}
