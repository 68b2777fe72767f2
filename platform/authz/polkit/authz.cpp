// platform/authz/polkit/authz.cpp: the authorization library's three functions, answered by polkit.
#include "platform/authz/authz.h"

#include "platform/authz/authz_form.h"
#include "platform/authz/polkit/polkit_client.h"
#include "platform/authz/polkit/service_probe.h"

// That of a check, AUTHZ_DEADLINE_MS, is the build's to choose.
static constexpr int INIT_DEADLINE_MS = 10 * 1000;

int authz_init(GError **error) {
    return service_probe_run(INIT_DEADLINE_MS, error) ? 1 : 0;
}

int authz_check(const char *sender, const char *action_id, GError **error) {
    return authz_check_form(sender, action_id, error) &&
                   polkit_client_check(sender, action_id, AUTHZ_DEADLINE_MS, error)
               ? 1
               : 0;
}

void authz_release(void) {
    polkit_client_release();
}
