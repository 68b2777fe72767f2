// client/verbs.cpp: looking up commands and telling what they take; the table is in verb_table.cpp.
#include "client/verbs.h"

#include <algorithm>
#include <cstring>

#include "client/client_error.h"
#include "privane_system_binding.h"

std::span<const argument> arguments_of(const command &row) {
    std::size_t count = 0;

    while (count < std::size(row.arguments) && row.arguments[count].from != source::NONE)
        count++;
    return std::span(row.arguments).first(count);
}

guint name_length(const command &row) {
    return row.verb != nullptr ? 2 : 1;
}

const GDBusMethodInfo *method_find(const char *name) {
    const GDBusInterfaceInfo *interface = privane_system__interface_info();

    for (GDBusMethodInfo **method = interface->methods; *method != nullptr; method++)
        if (g_ascii_strcasecmp((*method)->name, name) == 0)
            return *method;
    return nullptr;
}

bool noun_is_known(const char *noun) {
    return std::ranges::any_of(
        commands(), [noun](const command &row) { return std::strcmp(row.noun, noun) == 0; });
}

static const command *fail_to_find(const char *noun, const char *verb, GError **error) {
    if (!noun_is_known(noun))
        (void)fail_usage(error, "unknown command '%s'; privanectl --help lists all", noun);
    else if (verb == nullptr)
        (void)fail_usage(error, "'%s' needs a verb; privanectl %s --help lists them", noun, noun);
    else
        (void)fail_usage(error, "unknown verb '%s' of '%s'; privanectl %s --help lists them", verb,
                         noun, noun);
    return nullptr;
}

const command *command_find(const command_line &line, GError **error) {
    const char *noun = word_at(line, 0);
    const char *verb = word_at(line, 1);

    if (noun == nullptr) {
        (void)fail_usage(error, "no command; privanectl --help lists all");
        return nullptr;
    }
    for (const command &row : commands()) {
        if (std::strcmp(row.noun, noun) != 0)
            continue;
        if ((row.verb == nullptr || g_strcmp0(row.verb, verb) == 0) &&
            (row.selector == OPTION_NONE || line.options[row.selector] != nullptr))
            return &row;
    }
    return fail_to_find(noun, verb, error);
}

static bool is_password(source from) {
    return from == source::NEW_PASSWORD || from == source::OPTIONAL_PASSWORD ||
           from == source::CURRENT_PASSWORD;
}

static bool is_taken_by(const argument &taken, option_id id) {
    const bool is_option = taken.from == source::OPTION || taken.from == source::REQUIRED_OPTION;

    if (id == OPTION_PASSWORD_FD)
        return is_password(taken.from);
    if (id == OPTION_ASK_PASSWORD)
        return taken.from == source::OPTIONAL_PASSWORD;
    return is_option && taken.option == id;
}

bool takes_option(const command &row, option_id id) {
    return id < FIRST_OWN_OPTION || id == row.selector ||
           std::ranges::any_of(arguments_of(row),
                               [id](const argument &taken) { return is_taken_by(taken, id); });
}

// The words that must be there, and the most that may.
static void count_words(const command &row, guint *out_least, guint *out_most) {
    guint least = name_length(row);
    guint most = least;

    for (const argument &taken : arguments_of(row)) {
        if (taken.from == source::WORD)
            least++;
        if (taken.from == source::WORD || taken.from == source::OPTIONAL_WORD ||
            taken.from == source::CHOSEN)
            most++;
        if (taken.from == source::WORDS)
            most = G_MAXUINT;
    }
    *out_least = least;
    *out_most = most;
}

// Of the words behind the name and the WORDs that stand alone, what CHOSEN arguments are named.
static bool check_chosen(const command &row, const command_line &line, guint first,
                         GError **error) {
    for (guint i = first; i < line.words->len; i++) {
        bool is_known = false;
        for (const argument &taken : arguments_of(row))
            is_known |=
                taken.from == source::CHOSEN && std::strcmp(taken.name, word_at(line, i)) == 0;
        if (!is_known)
            return fail_usage(error, "'%s' is nothing that %s %s takes", word_at(line, i), row.noun,
                              row.verb);
    }
    return true;
}

static bool check_change(const command &row, const command_line &line, bool has_chosen,
                         GError **error) {
    bool changes = has_chosen;

    for (const command_option &option : command_options().subspan(FIRST_OWN_OPTION)) {
        const char *value = line.options[option.id];
        if (value != nullptr && option.value != nullptr && *value == '\0')
            return fail_usage(error, "an empty --%s changes nothing; see user clear", option.name);
        changes |= value != nullptr;
    }
    if (!changes)
        return fail_usage(error, "nothing to change; privanectl %s --help tells what can be",
                          row.noun);
    return true;
}

static bool check_options(const command &row, const command_line &line, GError **error) {
    g_autofree char *name =
        row.verb != nullptr ? g_strdup_printf("%s %s", row.noun, row.verb) : g_strdup(row.noun);

    for (const command_option &option : command_options())
        if (line.options[option.id] != nullptr && !takes_option(row, option.id))
            return fail_usage(error, "'%s' takes no --%s%s%s", name, option.name,
                              row.selector != OPTION_NONE ? " with --" : "",
                              row.selector != OPTION_NONE ? option_of(row.selector).name : "");
    for (const argument &taken : arguments_of(row))
        if (taken.from == source::REQUIRED_OPTION && line.options[taken.option] == nullptr)
            return fail_usage(error, "'%s' needs --%s", name, option_of(taken.option).name);
    if (line.options[OPTION_ASK_PASSWORD] != nullptr && line.options[OPTION_PASSWORD_FD] != nullptr)
        return fail_usage(error, "--ask-password and --password-fd exclude each other");
    return true;
}

// Words are counted before.
static bool check_choices(const command &row, const command_line &line, GError **error) {
    guint index = name_length(row);

    for (const argument &taken : arguments_of(row)) {
        if (taken.from != source::WORD && taken.from != source::OPTIONAL_WORD)
            continue;
        const char *word = word_at(line, index++);
        if (taken.kind != value_kind::CHOICE || word == nullptr || is_choice(taken.choices, word))
            continue;
        g_autofree char *listed = g_strdup(taken.choices);
        return fail_usage(error, "%s is one of %s, not '%s'", taken.name,
                          g_strdelimit(listed, " ", '|'), word);
    }
    return true;
}

static bool check_option_values(const command_line &line, GError **error) {
    gint64 number = 0;

    for (const command_option &option : command_options()) {
        const char *value = line.options[option.id];
        if (value == nullptr)
            continue;
        if (option.kind == value_kind::NUMBER && !option_number(line, option.id, &number, error))
            return false;
        // Nothing at all is no secondary group; see check_change.
        if (option.kind == value_kind::GROUPS && *value != '\0' &&
            value[std::strspn(value, ",")] == '\0')
            return fail_usage(error, "--%s=%s names no group", option.name, value);
    }
    return true;
}

bool command_check(const command &row, const command_line &line, GError **error) {
    guint least = 0;
    guint most = 0;

    if (!check_options(row, line, error))
        return false;
    count_words(row, &least, &most);
    if (line.words->len < least || line.words->len > most) {
        g_autofree char *usage = command_usage(row);
        return fail_usage(error, "usage: privanectl %s", usage);
    }
    if (!check_choices(row, line, error) || !check_option_values(line, error))
        return false;
    const bool has_chosen = row.needs_change && line.words->len > least;
    if (has_chosen && !check_chosen(row, line, least, error))
        return false;
    return !row.needs_change || check_change(row, line, has_chosen, error);
}

static void add_option(GString *usage, option_id id, bool is_required) {
    const command_option &option = option_of(id);

    g_string_append_printf(usage, is_required ? " --%s%s%s" : " [--%s%s%s]", option.name,
                           option.value != nullptr ? "=" : "",
                           option.value != nullptr ? option.value : "");
}

static void add_argument(GString *usage, const argument &taken) {
    switch (taken.from) {
        case source::WORD:
            g_string_append_printf(usage, " %s", taken.name);
            return;
        case source::OPTIONAL_WORD:
        case source::CHOSEN:
            g_string_append_printf(usage, " [%s]", taken.name);
            return;
        case source::WORDS:
            g_string_append_printf(usage, " [%s...]", taken.name);
            return;
        case source::OPTION:
        case source::REQUIRED_OPTION:
            add_option(usage, taken.option, taken.from == source::REQUIRED_OPTION);
            return;
        case source::OPTIONAL_PASSWORD:
            g_string_append(usage, " [--ask-password | --password-fd=FD]");
            return;
        case source::NEW_PASSWORD:
        case source::CURRENT_PASSWORD:
            add_option(usage, OPTION_PASSWORD_FD, false);
            return;
        case source::FIXED:
        case source::NONE:
            return;
    }
}

char *command_usage(const command &row) {
    GString *usage = g_string_new(row.noun);

    if (row.verb != nullptr)
        g_string_append_printf(usage, " %s", row.verb);
    for (const argument &taken : arguments_of(row))
        if (taken.option == OPTION_NONE || taken.option != row.selector)
            add_argument(usage, taken);
    if (row.selector != OPTION_NONE)
        add_option(usage, row.selector, true);
    return g_string_free(usage, FALSE);
}
