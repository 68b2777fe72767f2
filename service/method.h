// service/method.h: the frame that every bus method runs in: authorize, work, answer.
#pragma once

#include <algorithm>
#include <cstddef>

#include <gio/gio.h>

#include "privane_system_binding.h"
#include "service/request.h"
#include "service/service_state.h"

// One authorized request. Only the frame makes one, so work that holds it has been allowed.
struct method_call {
    PrivaneSystem *skeleton;
    GDBusMethodInvocation *invocation;
    ServiceState *state;
    GError *error;  // why the work failed; the frame answers with it and frees it
};

// Sets call.error in the service's own domain and logs the same text once. Always false.
bool fail(method_call &call, int code, const char *format, ...) G_GNUC_PRINTF(3, 4);

// Puts a prefix before call.error, which a lower layer set, and logs it once. Always false.
bool pass_on(method_call &call, const char *prefix);

// Connects a function that serves a whole method.
void connect_method(const char *signal, GCallback serve, ServiceState *state);

// Text known at compile time that can be a template argument.
template <std::size_t size>
struct literal {
    char text[size];

    consteval literal(const char (&source)[size]) { std::copy_n(source, size, text); }
};

template <std::size_t prefix_size, std::size_t size>
consteval auto operator+(const literal<prefix_size> &prefix, const literal<size> &rest) {
    char joined[prefix_size - 1 + size] = {};
    std::copy_n(prefix.text, prefix_size - 1, joined);
    std::copy_n(rest.text, size, joined + prefix_size - 1);
    return literal(joined);
}

inline constexpr literal ACTION_PREFIX = "com.zintor.privane-system.";

// The authorization of a method that has one fixed action.
template <literal action>
struct fixed_action {
    static constexpr auto id = ACTION_PREFIX + action;

    static bool allows(method_call &call, auto...) {
        return privane_check_auth(call.invocation, id.text, &call.error);
    }
};

// The authorization of a method whose action depends on its arguments. The function checks them
// first; it returns the action ID, or null with call.error set.
template <auto action_id_of>
struct derived_action {
    static bool allows(method_call &call, auto... in) {
        g_autofree char *action_id = action_id_of(call, in...);
        return action_id != nullptr && privane_check_auth(call.invocation, action_id, &call.error);
    }
};

template <typename authorization, auto work>
struct served_method;

// The work takes the method's in-arguments in their order. It completes the call and returns true,
// or returns false and leaves call.error as the answer.
template <typename authorization, typename... in_args, bool (*work)(method_call &, in_args...)>
struct served_method<authorization, work> {
    static gboolean serve(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation, in_args... in,
                          ServiceState *state) {
        method_call call = {skeleton, invocation, state, nullptr};

        if (!authorization::allows(call, in...) || !work(call, in...))
            privane_return_error(invocation, g_steal_pointer(&call.error));
        return TRUE;
    }

    static void connect(const char *signal, ServiceState *state) {
        connect_method(signal, G_CALLBACK(serve), state);
    }
};

// A row of the method table.
struct method_row {
    const char *signal;
    void (*connect)(const char *signal, ServiceState *state);
};

// The row of a method that is guarded by "com.zintor.privane-system." and the action.
template <literal action, auto work>
consteval method_row method(const char *signal) {
    return {signal, served_method<fixed_action<action>, work>::connect};
}

// The row of a method whose action depends on its arguments.
template <auto action_id_of, auto work>
consteval method_row method_with_derived_action(const char *signal) {
    return {signal, served_method<derived_action<action_id_of>, work>::connect};
}
