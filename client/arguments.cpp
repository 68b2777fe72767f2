// client/arguments.cpp: from the words and options of a command to the arguments of its method.
#include "client/arguments.h"

#include <cstring>

#include "client/password_prompt.h"
#include "client/unit_name.h"

char *arguments_password(const command_line &line, bool is_new, GError **error) {
    gint64 fd = 0;

    if (line.options[OPTION_PASSWORD_FD] == nullptr)
        return password_ask(is_new ? "New password: " : "Password: ", is_new, error);
    if (!option_number(line, OPTION_PASSWORD_FD, &fd, error))
        return nullptr;
    return password_read(static_cast<int>(fd), is_new, error);
}

static char *password_of(source from, const command_line &line, GError **error) {
    const bool is_wanted =
        line.options[OPTION_ASK_PASSWORD] != nullptr || line.options[OPTION_PASSWORD_FD] != nullptr;

    if (from == source::OPTIONAL_PASSWORD && !is_wanted)
        return g_strdup("");
    return arguments_password(line, from != source::CURRENT_PASSWORD, error);
}

static char *first_choice(const argument &taken) {
    return g_strndup(taken.choices, std::strcspn(taken.choices, " "));
}

static char *text_of_word(const argument &taken, const char *word) {
    if (word == nullptr)
        return first_choice(taken);
    if (taken.kind == value_kind::UNIT)
        return unit_without_suffix(word, ".service");
    if (taken.kind == value_kind::TARGET)
        return unit_without_suffix(word, ".target");
    return g_strdup(word);
}

// Where words are taken, next counts them.
static char *text_of(const argument &taken, const command_line &line, guint *next, GError **error) {
    switch (taken.from) {
        case source::FIXED:
            return g_strdup(taken.name);
        case source::OPTION:
        case source::REQUIRED_OPTION: {
            const char *given = line.options[taken.option];
            return g_strdup(given != nullptr ? given : "");
        }
        case source::NEW_PASSWORD:
        case source::OPTIONAL_PASSWORD:
        case source::CURRENT_PASSWORD:
            return password_of(taken.from, line, error);
        default:
            return text_of_word(taken, word_at(line, (*next)++));
    }
}

static bool is_chosen(const argument &taken, const command_line &line, guint first) {
    for (guint i = first; i < line.words->len; i++)
        if (std::strcmp(word_at(line, i), taken.name) == 0)
            return true;
    return false;
}

// Empty elements, as of "a,,b" or "", are none.
static GStrv split_names(const char *text) {
    g_autoptr(GStrvBuilder) names = g_strv_builder_new();
    g_auto(GStrv) parts = g_strsplit(text, ",", -1);

    for (char **part = parts; *part != nullptr; part++)
        if (**part != '\0')
            g_strv_builder_add(names, *part);
    return g_strv_builder_end(names);
}

static GVariant *value_of(const char *signature, const argument &taken, const char *text) {
    if (std::strcmp(signature, "as") == 0) {
        g_auto(GStrv) names = split_names(text);
        return g_variant_new_strv(names, -1);
    }
    // A method that takes several names in one string has them joined by ":".
    if (taken.option != OPTION_NONE && option_of(taken.option).kind == value_kind::GROUPS) {
        g_auto(GStrv) names = split_names(text);
        g_autofree char *joined = g_strjoinv(":", names);
        return g_variant_new_string(joined);
    }
    return g_variant_new_string(text);
}

GVariant *arguments_build(const command &row, const command_line &line, GError **error) {
    if (row.build != nullptr)
        return row.build(line, error);

    const GDBusMethodInfo *method = method_find(row.method);
    g_auto(GVariantBuilder) built = G_VARIANT_BUILDER_INIT(G_VARIANT_TYPE_TUPLE);
    guint next = name_length(row);
    guint index = 0;
    for (const argument &taken : arguments_of(row)) {
        const char *signature = method->in_args[index++]->signature;
        if (taken.from == source::CHOSEN) {
            g_variant_builder_add(&built, "b", is_chosen(taken, line, next));
            continue;
        }
        if (std::strcmp(signature, "i") == 0) {
            gint64 number = 0;
            if (!option_number(line, taken.option, &number, error))
                return nullptr;
            g_variant_builder_add(&built, "i", static_cast<gint32>(number));
            continue;
        }
        g_auto(wiped_string) text = text_of(taken, line, &next, error);
        if (text == nullptr)
            return nullptr;
        g_variant_builder_add_value(&built, value_of(signature, taken, text));
    }
    return g_variant_builder_end(&built);
}
