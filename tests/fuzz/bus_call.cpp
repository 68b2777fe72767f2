// tests/fuzz/bus_call.cpp: a method call without a bus.
#include "tests/fuzz/bus_call.h"

#include <cstdarg>

#include "platform/authz/authz.h"
#include "tests/fuzz/fuzz.h"

static constexpr gsize MAX_MESSAGE = gsize{32} * 1024 * 1024;

static bus_call *active;
static char invocation_place;

// A critical tells of a text that GDBus would not have sent.
static void drop_record(const char *, GLogLevelFlags level, const char *text, gpointer) {
    hold((level & G_LOG_LEVEL_CRITICAL) == 0, "GLib objects to nothing", text);
}

// A warning, as every failing method logs one, is no reason to end.
static void take_over_log() {
    (void)g_log_set_always_fatal(
        static_cast<GLogLevelFlags>(G_LOG_FATAL_MASK | G_LOG_LEVEL_CRITICAL));
    (void)g_log_set_default_handler(drop_record, nullptr);
}

bus_call::bus_call()
    : call{nullptr, reinterpret_cast<GDBusMethodInvocation *>(&invocation_place), &state, nullptr} {
    active = this;
    take_over_log();
}

bus_call::~bus_call() {
    active = nullptr;
}

bool bus_call::end(bool done) {
    if (!done)
        privane_return_error(call.invocation, g_steal_pointer(&call.error));
    hold(call.error == nullptr, "no error is left of a call that was answered", text);
    hold(answers == 1, "a call is answered once", [this] { return std::to_string(answers); });
    hold(is_error == !done, "a method that failed answers with an error, and only that", text);
    return done;
}

// The body's strings, all the way down.
static void check_strings(GVariant *value) {
    if (g_variant_is_of_type(value, G_VARIANT_TYPE_STRING)) {
        const char *text = g_variant_get_string(value, nullptr);
        hold(g_utf8_validate(text, -1, nullptr), "every string that goes out is UTF-8", text);
        return;
    }
    if (!g_variant_is_container(value))
        return;
    for (gsize i = 0; i < g_variant_n_children(value); i++) {
        g_autoptr(GVariant) child = g_variant_get_child_value(value, i);
        check_strings(child);
    }
}

void bus_call::answer(GVariant *body) {
    answers++;
    is_error = false;
    if (body == nullptr)
        return;
    g_autoptr(GVariant) owned = g_variant_ref_sink(body);
    hold(g_variant_get_size(owned) < MAX_MESSAGE, "an answer fits into a message");
    check_strings(owned);
    if (g_variant_n_children(owned) == 0)
        return;
    g_autoptr(GVariant) first = g_variant_get_child_value(owned, 0);
    if (g_variant_is_of_type(first, G_VARIANT_TYPE_STRING))
        first_string = g_variant_get_string(first, nullptr);
}

void bus_call::answer_error(GQuark error_domain, int error_code, const char *message) {
    answers++;
    is_error = true;
    domain = g_quark_to_string(error_domain);
    code = error_code;
    text = message;
    hold(g_utf8_validate(message, -1, nullptr), "the text of an error is UTF-8", message);
}

int authz_check(const char *, const char *action_id, GError **error) {
    active->actions.emplace_back(action_id);
    if (active->is_allowed)
        return 1;
    g_set_error_literal(error, g_quark_from_static_string("fuzz-authz"), 7, "no");
    return 0;
}

// The linker sends the calls here (--wrap).

const char *wrap_get_sender(GDBusMethodInvocation *) asm(
    "__wrap_g_dbus_method_invocation_get_sender");
const char *wrap_get_sender(GDBusMethodInvocation *) {
    return ":1.1";
}

void wrap_return_value(GDBusMethodInvocation *,
                       GVariant *) asm("__wrap_g_dbus_method_invocation_return_value");
void wrap_return_value(GDBusMethodInvocation *, GVariant *body) {
    active->answer(body);
}

void wrap_return_error(GDBusMethodInvocation *, GQuark, int, const char *,
                       ...) asm("__wrap_g_dbus_method_invocation_return_error") G_GNUC_PRINTF(4, 5);
void wrap_return_error(GDBusMethodInvocation *, GQuark domain, int code, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    g_autofree char *text = g_strdup_vprintf(format, arguments);
    va_end(arguments);
    active->answer_error(domain, code, text);
}

void wrap_return_gerror(GDBusMethodInvocation *,
                        const GError *) asm("__wrap_g_dbus_method_invocation_return_gerror");
void wrap_return_gerror(GDBusMethodInvocation *, const GError *error) {
    active->answer_error(error->domain, error->code, error->message);
}
