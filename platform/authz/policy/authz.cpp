// platform/authz/policy/authz.cpp: the authorization library's three functions, answered by a file.
#include "platform/authz/authz.h"

#include "platform/authz/authz_error.h"
#include "platform/authz/authz_form.h"
#include "platform/authz/policy/callers.h"
#include "platform/authz/policy/policy_store.h"

// AUTHZ_POLICY_FILE and AUTHZ_DEADLINE_MS are the build's to choose.
static constexpr policy_places PLACES = {AUTHZ_POLICY_FILE, "/etc/passwd", "/etc/group", 0};

static policy_store *kept_policy;

// Exported, though no header has it and no other libauthz needs it: who has loaded a library, such
// as privanectl, tells by it that this one decides, and by which file.
extern "C" {
[[gnu::visibility("default")]] extern const char authz_policy_path[];
const char authz_policy_path[] = AUTHZ_POLICY_FILE;
}

// There is no service to be reached. A file that is missing or broken may be mended while the
// program runs, and refuses everything until then.
int authz_init(GError **) {
    return 1;
}

static bool refresh_policy(const char *action_id, GError **error) {
    if (kept_policy == nullptr)
        kept_policy = policy_store_new(PLACES);
    if (policy_store_refresh(kept_policy, error))
        return true;
    g_prefix_error(error, "cannot check action %s: ", action_id);
    return false;
}

int authz_check(const char *sender, const char *action_id, GError **error) {
    policy_caller caller = {};

    // The file comes last, so that it decides as it is after all waiting.
    if (!authz_check_form(sender, action_id, error) ||
        !callers_find(sender, action_id, AUTHZ_DEADLINE_MS, &caller, error) ||
        !refresh_policy(action_id, error))
        return 0;
    if (policy_store_allows(kept_policy, caller, action_id))
        return 1;
    g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_REFUSED,
                "action %s is refused to uid %" G_GUINT32_FORMAT, action_id, caller.uid);
    return 0;
}

void authz_release(void) {
    callers_release();
    g_clear_pointer(&kept_policy, policy_store_free);
}
