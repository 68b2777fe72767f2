// service/service_state.h: the one state block of the process.
#pragma once

#include <type_traits>

#include <gio/gio.h>

#include "privane_system_binding.h"

struct usermgmt_ctx;

// Allocated zero-filled by main and handed to every method.
struct ServiceState {
    GDBusConnection *connection;  // borrowed; null until the bus is acquired
    PrivaneSystem *skeleton;      // owned
    guint owner_id;
    usermgmt_ctx *usermgmt_context;  // owned
    GMutex auth_lock;                // of the password check; valid because it is zero-filled
    gboolean rtc_present;            // /dev/rtc could be opened at start-up
};

static_assert(std::is_trivial_v<ServiceState>);
