// methods/accounts/digest.cpp: the methods on the web server's HTTP digest file.
#include "methods/accounts/digest.h"

#include <string_view>

#include "methods/text_file.h"
#include "platform/digest_entry/digest_entry.h"
#include "service/method.h"
#include "service/reply.h"

static constexpr const char *DIGEST_FILE = "/etc/apache2/digest_auth_passwd";
static constexpr int DIGEST_LIST_FLAGS = 1;

struct digest_action {
    const char *word;
    int (*apply)(const char *user_list, int flags);
};

static constexpr digest_action digest_actions[] = {
    {"set",    digest_entry_set_list   },
    {"create", digest_entry_set_list   },
    {"delete", digest_entry_delete_list},
};

bool handle_digest(method_call &call, const char *const *arguments) {
    if (arguments == nullptr || arguments[0] == nullptr || arguments[1] == nullptr)
        return fail(call, PRIVANE_ERROR_DIGEST, "Invalid parameters digest management");

    const char *user_list = arguments[1];
    for (const digest_action &action : digest_actions) {
        if (!g_str_equal(arguments[0], action.word))
            continue;
        (void)action.apply(user_list, DIGEST_LIST_FLAGS);  // Deliberate: no failure is reported

        privane_system__complete_digest(call.skeleton, call.invocation);
        return true;
    }
    // Deliberate: the text names the user list and not the action.
    return fail(call, PRIVANE_ERROR_DIGEST, "Invalid action '%s' to digest management", user_list);
}

// The text before the first ":" of each complete line that has one.
static char **user_names_of(std::string_view text) {
    g_autoptr(GPtrArray) names = g_ptr_array_new_with_free_func(g_free);
    for (std::size_t end; (end = text.find('\n')) != std::string_view::npos;
         text.remove_prefix(end + 1)) {
        const std::size_t colon = text.substr(0, end).find(':');
        if (colon != std::string_view::npos)
            g_ptr_array_add(names, g_strndup(text.data(), colon));
    }
    g_ptr_array_add(names, nullptr);
    return reinterpret_cast<char **>(g_ptr_array_steal(names, nullptr));
}

bool handle_get_digest_list(method_call &call) {
    g_autofree char *text = nullptr;
    if (!read_text_file(DIGEST_FILE, &text, &call.error))
        // Deliberate: no separator between the two texts.
        return pass_on(call, "Could not open HTTP digest file");

    g_auto(GStrv) users = user_names_of(text);
    make_sendable(users);
    if (!check_reply_size(wire_size(users), &call.error))
        return pass_on(call, "");

    privane_system__complete_get_digest_list(call.skeleton, call.invocation, users);
    return true;
}
