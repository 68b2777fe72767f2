// tests/fuzz/policy_file_fuzz.cpp: policy files of any bytes, and what they grant. The input is the
// file and, in a second part, an action ID to ask for in each line.
#include <algorithm>
#include <cstdlib>

#include "platform/authz/policy/policy_file.h"
#include "tests/fuzz/fuzz.h"

static constexpr std::string_view NAME_BYTES =
    "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-.$";
static constexpr std::string_view ID_BYTES =
    "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-.";

// The caller that asks: the user "u" and the group "g" alone have its IDs.
static constexpr guint32 UID = 701;
static constexpr guint32 GID = 750;

struct plain_role {
    std::string name;
    std::string users, groups, actions;
};

// The roles by the simplest means, of a text that was taken.
static std::vector<plain_role> roles_of(std::string_view text) {
    std::vector<plain_role> roles;
    for (const std::string_view line : lines_of(text)) {
        const std::size_t equals = line.find('=');
        if (has_only(line, " ") || line.starts_with('#'))
            continue;
        if (line.starts_with('[')) {
            roles.push_back({std::string(line.substr(6, line.size() - 7)), "", "", ""});
            continue;
        }
        hold(!roles.empty() && equals != std::string_view::npos, "a key stands in a role", line);
        const std::string_view key = line.substr(0, equals);
        plain_role &role = roles.back();
        std::string &list = key == "users"    ? role.users
                            : key == "groups" ? role.groups
                                              : role.actions;
        hold(key == "users" || key == "groups" || key == "actions", "a key is known", line);
        hold(list.empty(), "a key stands once in a role", line);
        list = line.substr(equals + 1);
    }
    return roles;
}

static bool contains(const std::string &list, std::string_view element) {
    const views elements = split(list, ';');
    return std::find(elements.begin(), elements.end(), element) != elements.end();
}

static bool is_granted(const plain_role &role, std::string_view action) {
    for (const std::string_view pattern : split(role.actions, ';')) {
        const bool is_open = pattern.ends_with(".*");
        const std::string_view beginning = pattern.substr(0, pattern.size() - 1);
        if (is_open ? action.size() > beginning.size() && action.starts_with(beginning)
                    : action == pattern)
            return true;
    }
    return false;
}

static void check_list(const std::string &list, std::string_view bytes, const std::string &text) {
    for (const std::string_view element : split(list, ';'))
        hold(!element.empty() && has_only(element, bytes), "an element has the bytes of its kind",
             text);
}

static void check_roles(const std::vector<plain_role> &roles, const std::string &text) {
    for (auto role = roles.begin(); role != roles.end(); ++role) {
        hold(!role->actions.empty() && !(role->users + role->groups).empty(),
             "a role has actions, and users or groups", text);
        hold(std::none_of(roles.begin(), role,
                          [&](const plain_role &other) { return other.name == role->name; }),
             "no name of a role is repeated", role->name);
        check_list(role->name, NAME_BYTES, text);
        if (!role->users.empty())
            check_list(role->users, NAME_BYTES, text);
        if (!role->groups.empty())
            check_list(role->groups, NAME_BYTES, text);
        check_list(role->actions, std::string(ID_BYTES) + "*", text);
    }
}

static void check_refusal(const GError *error, const std::string &text) {
    g_autofree char *number = g_strdup_printf("%d", std::atoi(error->message));
    const auto lines = static_cast<int>(std::count(text.begin(), text.end(), '\n'));
    const std::string message = error->message;

    hold(message.starts_with(std::string(number) + ": "), "a refusal names a line", message);
    hold(std::atoi(number) >= 1 && std::atoi(number) <= lines + 1, "the line is one of the file's",
         message);
    hold(g_utf8_validate(error->message, -1, nullptr) != FALSE, "a refusal is UTF-8", message);
    hold(message.size() < 400 &&
             std::none_of(message.begin(), message.end(),
                          [](char byte) { return static_cast<unsigned char>(byte) < ' '; }),
         "a refusal is one short line", message);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    const std::vector<std::string> parts = parts_of(data, size);
    const std::string &text = parts[0];
    g_autoptr(GError) error = nullptr;
    g_autoptr(policy) rules = policy_parse(text, &error);

    hold((rules == nullptr) == (error != nullptr), "there is a policy or an error", text);
    if (rules == nullptr) {
        check_refusal(error, text);
        return 0;
    }
    hold(!text.empty() && text.back() == '\n', "the last line has an end", text);
    hold(text.find("\xe2\x80\xae") == std::string::npos, "nothing is shown backwards", text);
    const std::vector<plain_role> roles = roles_of(text);
    check_roles(roles, text);
    hold(rules->roles->len == roles.size() && !roles.empty(), "each role is there", text);

    g_autoptr(GHashTable) users = g_hash_table_new(g_str_hash, g_str_equal);
    g_autoptr(GHashTable) groups = g_hash_table_new(g_str_hash, g_str_equal);
    char user[] = "u";
    char group[] = "g";
    (void)g_hash_table_insert(users, user, GUINT_TO_POINTER(UID));
    (void)g_hash_table_insert(groups, group, GUINT_TO_POINTER(GID));
    for (const std::string_view line : lines_of(parts.size() > 1 ? parts[1] : std::string_view())) {
        const std::string action(line.substr(0, line.find('\0')));
        const bool is_wanted = std::any_of(roles.begin(), roles.end(), [&](const plain_role &role) {
            return (contains(role.users, "u") || contains(role.groups, "g")) &&
                   is_granted(role, action);
        });
        hold(policy_allows(rules, {users, groups}, {UID, &GID, 1}, action.c_str()) == is_wanted,
             "allowed is what a role of the caller grants", action);
        hold(!policy_allows(rules, {users, groups}, {UID + 1, &UID, 1}, action.c_str()),
             "nobody else is allowed anything", action);
    }
    return 0;
}
