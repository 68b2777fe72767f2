// platform/authz/polkit/service_probe.h: whether the authorization service is there; internal.
#pragma once

#include <glib.h>

// False with *error set unless polkit is on the system bus, or could be started by it. The caller
// keeps its one thread and gets no bus connection.
bool service_probe_run(int deadline_ms, GError **error);
