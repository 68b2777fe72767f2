// platform/authz/policy/policy_file.cpp: reads the policy file's text, and decides by what it says.
//
// A line that could mean something else to somebody makes the whole text no policy: a list that is
// half understood grants what nobody wanted, or locks out whoever is to repair it.
#include "platform/authz/policy/policy_file.h"

#include <algorithm>
#include <cstddef>
#include <cstring>

#include "platform/authz/authz_error.h"
#include "platform/authz/authz_form.h"

static constexpr std::string_view ROLE_BEGIN = "[role ";
static constexpr char ROLE_END = ']';
static constexpr const char *LIST_SEPARATOR = ";";
static constexpr const char *ANYTHING_BELOW = ".*";

// The C library's limit, without the terminator; a role's is the same for simplicity.
static constexpr std::size_t MAX_NAME_LENGTH = 255;

// Of what a message quotes from the file.
static constexpr glong MAX_QUOTED = 64;

struct reading {
    GPtrArray *roles;
    policy_role *role;  // the last one, or null
    guint role_line;    // in which it begins
    guint line;         // that is being read
    GError **error;
};

static bool is_name_byte(char byte) {
    return g_ascii_isalnum(byte) || byte == '_' || byte == '-' || byte == '.';
}

// What a role, an account or a group may be called. The tools that make accounts take no other
// names; one of digits alone could be meant as an ID.
static bool is_name(const char *name) {
    const std::size_t length = std::strlen(name);
    bool has_letter = false;

    if (length == 0 || length > MAX_NAME_LENGTH || *name == '-' || *name == '.')
        return false;
    for (std::size_t i = 0; i < length; i++) {
        const bool is_last_dollar = name[i] == '$' && i > 0 && i + 1 == length;
        if (!is_name_byte(name[i]) && !is_last_dollar)
            return false;
        has_letter = has_letter || !g_ascii_isdigit(name[i]);
    }
    return has_letter;
}

// An ID has two parts at least, none of them empty.
static bool is_pattern(const char *pattern) {
    g_autofree char *id = g_str_has_suffix(pattern, ANYTHING_BELOW)
                              ? g_strndup(pattern, std::strlen(pattern) - 1)
                              : g_strconcat(pattern, ".", nullptr);

    return authz_has_action_form(id) && *id != '.' && std::strstr(id, "..") == nullptr &&
           std::strchr(pattern, '.') != nullptr;
}

struct key {
    const char *name;
    char **policy_role::*list;
    bool (*is_element)(const char *element);
    const char *element;  // what it is meant to be
};

static constexpr key keys[] = {
    {"users",   &policy_role::users,   is_name,    "name of a user"       },
    {"groups",  &policy_role::groups,  is_name,    "name of a group"      },
    {"actions", &policy_role::actions, is_pattern, "pattern of action IDs"},
};

// The text, which is UTF-8, as a message may quote it.
static char *quote(std::string_view text) {
    g_autofree char *copy = g_strndup(text.data(), text.size());

    if (g_utf8_strlen(copy, -1) <= MAX_QUOTED)
        return g_steal_pointer(&copy);
    g_autofree char *beginning = g_utf8_substring(copy, 0, MAX_QUOTED);
    return g_strconcat(beginning, "...", nullptr);
}

G_GNUC_PRINTF(3, 4)
static bool refuse(const reading &state, guint line, const char *format, ...) {
    va_list arguments;

    va_start(arguments, format);
    g_autofree char *why = g_strdup_vprintf(format, arguments);
    va_end(arguments);
    g_set_error(state.error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_FAILED, "%u: %s", line, why);
    return false;
}

static void role_free(void *data) {
    auto *role = static_cast<policy_role *>(data);

    g_free(role->name);
    g_strfreev(role->users);
    g_strfreev(role->groups);
    g_strfreev(role->actions);
    g_free(role);
}

// Of a kind that shows nothing, or that shows what stands around it in another order or on another
// line: to whoever reads the file it says something else than here, in a comment as well.
static bool is_hidden(gunichar character) {
    const GUnicodeType type = g_unichar_type(character);
    return type == G_UNICODE_CONTROL || type == G_UNICODE_FORMAT ||
           type == G_UNICODE_LINE_SEPARATOR || type == G_UNICODE_PARAGRAPH_SEPARATOR;
}

// 0 where there is none; itself no character of a line that is UTF-8.
static gunichar find_hidden(std::string_view line) {
    const char *end = line.data() + line.size();

    for (const char *p = line.data(); p < end; p = g_utf8_find_next_char(p, nullptr)) {
        const gunichar character = g_utf8_get_char(p);
        if (is_hidden(character))
            return character;
    }
    return 0;
}

static bool end_role(const reading &state) {
    const policy_role *role = state.role;

    if (role == nullptr)
        return true;
    if (role->actions == nullptr)
        return refuse(state, state.role_line, "role '%s' has no actions", role->name);
    if (role->users == nullptr && role->groups == nullptr)
        return refuse(state, state.role_line, "role '%s' has neither users nor groups", role->name);
    return true;
}

static bool has_role(const reading &state, const char *name) {
    for (guint i = 0; i < state.roles->len; i++) {
        const auto *role = static_cast<const policy_role *>(g_ptr_array_index(state.roles, i));
        if (std::strcmp(role->name, name) == 0)
            return true;
    }
    return false;
}

static bool begin_role(reading *state, std::string_view line) {
    g_autofree char *quoted = quote(line);

    if (!end_role(*state))
        return false;
    if (!line.starts_with(ROLE_BEGIN) || !line.ends_with(ROLE_END))
        return refuse(*state, state->line, "unknown section '%s'", quoted);

    line.remove_prefix(ROLE_BEGIN.size());
    line.remove_suffix(1);
    g_autofree char *name = g_strndup(line.data(), line.size());
    g_autofree char *quoted_name = quote(line);
    if (!is_name(name))
        return refuse(*state, state->line, "'%s' is no name of a role", quoted_name);
    if (has_role(*state, name))
        return refuse(*state, state->line, "repeated role '%s'", quoted_name);

    state->role = g_new0(policy_role, 1);
    state->role->name = g_steal_pointer(&name);
    state->role_line = state->line;
    g_ptr_array_add(state->roles, state->role);
    return true;
}

static bool read_list(const reading &state, const key &known, std::string_view value) {
    g_autofree char *text = g_strndup(value.data(), value.size());
    // An empty text is one element, as it is between two separators.
    g_auto(GStrv) list = *text != '\0' ? g_strsplit(text, LIST_SEPARATOR, -1) : nullptr;

    if (state.role->*known.list != nullptr)
        return refuse(state, state.line, "repeated key '%s'", known.name);
    if (list == nullptr)
        return refuse(state, state.line, "empty element in '%s'", known.name);
    g_autoptr(GHashTable) seen = g_hash_table_new(g_str_hash, g_str_equal);
    for (char **element = list; *element != nullptr; element++) {
        if (**element == '\0')
            return refuse(state, state.line, "empty element in '%s'", known.name);
        if (!known.is_element(*element)) {
            g_autofree char *quoted = quote(*element);
            return refuse(state, state.line, "'%s' is no %s", quoted, known.element);
        }
        if (g_hash_table_add(seen, *element) == FALSE) {
            g_autofree char *quoted = quote(*element);
            return refuse(state, state.line, "repeated element '%s'", quoted);
        }
    }
    state.role->*known.list = g_steal_pointer(&list);
    return true;
}

static bool read_key(const reading &state, std::string_view line) {
    const std::size_t equals = line.find('=');

    if (equals == std::string_view::npos)
        return refuse(state, state.line, "no '=' in the line");
    const std::string_view name = line.substr(0, equals);
    g_autofree char *quoted = quote(name);
    for (const key &known : keys) {
        if (name != known.name)
            continue;
        if (state.role == nullptr)
            return refuse(state, state.line, "key '%s' outside a role", known.name);
        return read_list(state, known, line.substr(equals + 1));
    }
    return refuse(state, state.line, "unknown key '%s'", quoted);
}

static bool read_line(reading *state, std::string_view line) {
    if (!g_utf8_validate(line.data(), static_cast<gssize>(line.size()), nullptr))
        return refuse(*state, state->line, "not UTF-8");
    const gunichar hidden = find_hidden(line);
    if (hidden != 0)
        return refuse(*state, state->line,
                      g_unichar_iscntrl(hidden) ? "a control character, U+%04X"
                                                : "a hidden character, U+%04X",
                      hidden);
    if (line.find_first_not_of(' ') == std::string_view::npos || line.front() == '#')
        return true;
    return line.front() == '[' ? begin_role(state, line) : read_key(*state, line);
}

policy *policy_parse(std::string_view text, GError **error) {
    g_autoptr(policy) rules = g_new0(policy, 1);

    rules->roles = g_ptr_array_new_with_free_func(role_free);
    reading state = {rules->roles, nullptr, 0, 0, error};
    while (!text.empty()) {
        const std::size_t length = text.find('\n');
        state.line++;
        // A text that was cut off must not pass as one of fewer or shorter words.
        if (length == std::string_view::npos) {
            (void)refuse(state, state.line, "the last line does not end");  // Null tells it, too.
            return nullptr;
        }
        if (!read_line(&state, text.substr(0, length)))
            return nullptr;
        text.remove_prefix(length + 1);
    }
    // It grants nothing either way; but a file that lost its content must not pass for one that
    // somebody meant.
    if (state.role == nullptr)
        (void)refuse(state, std::max(state.line, 1U), "no role in the file");
    else if (end_role(state))
        return g_steal_pointer(&rules);
    return nullptr;
}

void policy_free(policy *rules) {
    if (rules == nullptr)
        return;
    g_ptr_array_unref(rules->roles);
    g_free(rules);
}

static bool is_among(guint32 id, const guint32 *ids, gsize count) {
    for (gsize i = 0; i < count; i++) {
        if (ids[i] == id)
            return true;
    }
    return false;
}

static bool names_one(char **names, GHashTable *known, const guint32 *ids, gsize count) {
    for (char **name = names; name != nullptr && *name != nullptr; name++) {
        void *id = nullptr;
        if (g_hash_table_lookup_extended(known, *name, nullptr, &id) &&
            is_among(GPOINTER_TO_UINT(id), ids, count))
            return true;
    }
    return false;
}

static bool matches(const char *pattern, const char *action_id) {
    const std::size_t length = std::strlen(pattern);

    if (!g_str_has_suffix(pattern, ANYTHING_BELOW))
        return std::strcmp(pattern, action_id) == 0;
    return std::strncmp(pattern, action_id, length - 1) == 0 && action_id[length - 1] != '\0';
}

static bool grants(const policy_role &role, const char *action_id) {
    for (char **pattern = role.actions; *pattern != nullptr; pattern++) {
        if (matches(*pattern, action_id))
            return true;
    }
    return false;
}

bool policy_allows(const policy *rules, const policy_ids &ids, const policy_caller &caller,
                   const char *action_id) {
    for (guint i = 0; i < rules->roles->len; i++) {
        const auto *role = static_cast<const policy_role *>(g_ptr_array_index(rules->roles, i));
        if (grants(*role, action_id) &&
            (names_one(role->users, ids.users, &caller.uid, 1) ||
             names_one(role->groups, ids.groups, caller.gids, caller.gid_count)))
            return true;
    }
    return false;
}
