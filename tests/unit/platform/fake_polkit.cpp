// tests/unit/platform/fake_polkit.cpp: a polkit in a child process that answers by the action ID.
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <string>

#include <fcntl.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <gio/gio.h>

#include "tests/unit/platform/private_bus.h"

static constexpr const char *INTERFACE_XML =
    "<node><interface name='org.freedesktop.PolicyKit1.Authority'>"
    "<method name='CheckAuthorization'>"
    "<arg type='(sa{sv})' name='subject' direction='in'/>"
    "<arg type='s' name='action_id' direction='in'/>"
    "<arg type='a{ss}' name='details' direction='in'/>"
    "<arg type='u' name='flags' direction='in'/>"
    "<arg type='s' name='cancellation_id' direction='in'/>"
    "<arg type='(bba{ss})' name='result' direction='out'/>"
    "</method>"
    "<property type='s' name='BackendVersion' access='read'/>"
    "</interface></node>";

static const std::string UNIT_PREFIX = "com.zintor.privane-system.";
static const std::string FORM_PREFIX = "test.form.";

struct service {
    int ready_fd;
    bool mortal;
    int questions;
    int lost_answers;
};

static void answer(GDBusMethodInvocation *call, bool allowed, bool challenge) {
    GVariantBuilder details;

    g_variant_builder_init(&details, G_VARIANT_TYPE("a{ss}"));
    g_dbus_method_invocation_return_value(
        call, g_variant_new("((bba{ss}))", gboolean{allowed}, gboolean{challenge}, &details));
}

static void answer_with_error(GDBusMethodInvocation *call, const std::string &text) {
    g_dbus_method_invocation_return_dbus_error(call, "org.freedesktop.PolicyKit1.Error.Failed",
                                               text.c_str());
}

// As if the bus had lost the first answers.
static void answer_third(service *self, GDBusMethodInvocation *call) {
    if (self->lost_answers == 2)
        answer(call, true, false);
    else
        self->lost_answers++;
}

// A rule that takes its time: meanwhile nothing else is answered.
static void be_slow() {
    g_usleep(1300 * 1000);
}

static void answer_late(GDBusMethodInvocation *call) {
    be_slow();
    answer(call, true, false);
}

// As if the bus had lost the first answer of a slow polkit.
static void answer_late_in_vain(service *self, GDBusMethodInvocation *call) {
    be_slow();
    if (self->lost_answers > 0)
        answer(call, true, false);
    self->lost_answers++;
}

static void answer_last(GDBusConnection *bus, GDBusMethodInvocation *call) {
    answer(call, true, false);
    (void)g_dbus_connection_flush_sync(bus, nullptr, nullptr);
    std::_Exit(0);
}

// Who asks for whom, and with what: "KIND NAME, N details, flags F, cancellable".
static std::string describe(GVariant *question) {
    const char *kind = nullptr;
    const char *action = nullptr;
    const char *cancellation = nullptr;
    guint32 flags = 0;
    g_autoptr(GVariant) identity = nullptr;
    g_autoptr(GVariant) details = nullptr;
    g_autofree char *name = nullptr;

    g_variant_get(question, "((&s@a{sv})&s@a{ss}u&s)", &kind, &identity, &action, &details, &flags,
                  &cancellation);
    if (g_variant_lookup(identity, "name", "s", &name) == FALSE)
        name = g_strdup("without a name");
    return std::string(kind) + " " + name + ", " + std::to_string(g_variant_n_children(details)) +
           " details, flags " + std::to_string(flags) +
           (*cancellation != '\0' ? ", cancellable" : "");
}

static void answer_undeclared(GDBusMethodInvocation *call, const std::string &action) {
    answer_with_error(call, "Action " + action + " is not registered");
}

static void answer_late(GDBusMethodInvocation *call, const std::string &action) {
    g_usleep(1200 * 1000);
    answer_undeclared(call, action);
}

// Yes, no, or only with a password, as the word says; false for another word.
static bool answer_word(GDBusMethodInvocation *call, const std::string &word) {
    if (word != "allowed" && word != "refused" && word != "password")
        return false;
    answer(call, word == "allowed", word == "password");
    return true;
}

// A parent is asked with details, of which the unit decides.
static void on_parent(GVariant *question, GDBusMethodInvocation *call) {
    g_autoptr(GVariant) details = g_variant_get_child_value(question, 2);
    const char *action = "none";
    const char *unit = "none";
    (void)g_variant_lookup(details, "action", "&s", &action);  // Shown as missing otherwise.
    (void)g_variant_lookup(details, "unit", "&s", &unit);

    const std::string name = unit;
    if (!answer_word(call, name) && name != "silent" && name != "slow")
        answer_with_error(call, describe(question) + ", action " + action + ", unit " + unit);
}

static void on_unit_question(const std::string &action, GVariant *question,
                             GDBusMethodInvocation *call) {
    const std::string rest = action.substr(UNIT_PREFIX.size());
    const std::size_t dot = rest.find('.');
    const std::string unit = dot != std::string::npos ? rest.substr(dot + 1) : "";

    if (dot == std::string::npos && rest != "setdefaulttarget")
        on_parent(question, call);
    else if (unit == "broken")
        answer_with_error(call, "Action " + action + " is broken");
    else if (unit == "slow")
        answer_late(call, action);
    else if (unit.rfind("declared-", 0) != 0 ||
             !answer_word(call, unit.substr(std::strlen("declared-"))))
        answer_undeclared(call, action);
}

// An answer that says yes in another form than polkit's: its type, and a body of that type.
static void answer_in_form(GDBusConnection *bus, GDBusMethodInvocation *call,
                           const std::string &body) {
    g_autoptr(GDBusMessage) reply =
        g_dbus_message_new_method_reply(g_dbus_method_invocation_get_message(call));

    g_dbus_message_set_body(reply, g_variant_new_parsed(body.c_str()));
    (void)g_dbus_connection_send_message(bus, reply, G_DBUS_SEND_MESSAGE_FLAGS_NONE, nullptr,
                                         nullptr);
    g_object_unref(call);
}

// The bodies of "test.form.0" and those that follow.
static constexpr const char *FORMS[] = {
    "()",
    "(true,)",
    "(1,)",
    "('yes',)",
    "(true, true, @a{ss} {})",
    "((true, true),)",
    "((true, true, @a{sv} {}),)",
    "((true, true, @a{ss} {}), 'more')",
};

static void on_question(GDBusConnection *bus, service *self, GVariant *question,
                        GDBusMethodInvocation *call) {
    const char *action = nullptr;
    g_variant_get_child(question, 1, "&s", &action);
    const std::string name = action;

    self->questions++;
    if (name == "test.allowed" || (name == "test.last-question" && !self->mortal))
        answer(call, true, false);
    else if (name == "test.refused")
        answer(call, false, false);
    else if (name == "test.password")
        answer(call, false, true);
    else if (name.rfind(UNIT_PREFIX, 0) == 0)
        on_unit_question(name, question, call);
    else if (name == "test.undeclared")
        answer_undeclared(call, name);
    else if (name == "test.question")
        answer_with_error(call, describe(question));
    else if (name.rfind(FORM_PREFIX, 0) == 0)
        answer_in_form(bus, call, FORMS[std::stoul(name.substr(FORM_PREFIX.size()))]);
    else if (name == "test.lost-answers")
        answer_third(self, call);
    else if (name == "test.late")
        answer_late(call);
    else if (name == "test.late-in-vain")
        answer_late_in_vain(self, call);
    else if (name == "test.questions")
        answer_with_error(call, std::to_string(self->questions) + " questions");
    else if (name == "test.last-answer")
        answer_last(bus, call);
    else if (name == "test.last-question")
        std::_Exit(0);
    else if (name != "test.silent")
        answer_with_error(call, "no such test action: " + name);
}

static void on_call(GDBusConnection *bus, const char *, const char *, const char *, const char *,
                    GVariant *arguments, GDBusMethodInvocation *call, void *data) {
    on_question(bus, static_cast<service *>(data), arguments, call);
}

static GVariant *on_property(GDBusConnection *, const char *, const char *, const char *,
                             const char *, GError **, void *) {
    return g_variant_new_string("1");
}

static bool request_name(GDBusConnection *bus, GError **error) {
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", "RequestName",
        g_variant_new("(su)", "org.freedesktop.PolicyKit1", guint32{0}), G_VARIANT_TYPE("(u)"),
        G_DBUS_CALL_FLAGS_NONE, -1, nullptr, error);
    return reply != nullptr;
}

static bool serve(service *self, GError **error) {
    static const GDBusInterfaceVTable functions = {on_call, on_property, nullptr, {}};
    const auto flags =
        static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                          G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION);
    g_autoptr(GDBusNodeInfo) node = g_dbus_node_info_new_for_xml(INTERFACE_XML, error);
    g_autoptr(GDBusConnection) bus = g_dbus_connection_new_for_address_sync(
        g_getenv("DBUS_SYSTEM_BUS_ADDRESS"), flags, nullptr, nullptr, error);
    g_autoptr(GMainLoop) loop = g_main_loop_new(nullptr, FALSE);

    if (node == nullptr || bus == nullptr ||
        g_dbus_connection_register_object(bus, "/org/freedesktop/PolicyKit1/Authority",
                                          node->interfaces[0], &functions, self, nullptr,
                                          error) == 0 ||
        !request_name(bus, error) || write(self->ready_fd, "+", 1) != 1)
        return false;
    g_main_loop_run(loop);
    return true;
}

fake_polkit::fake_polkit(end its_end) {
    int ends[2] = {-1, -1};
    if (pipe2(ends, O_CLOEXEC) != 0)
        return;

    process_ = fork();
    if (process_ == 0) {
        (void)prctl(PR_SET_PDEATHSIG, SIGKILL);
        service self = {ends[1], its_end == end::MORTAL, 0, 0};
        g_autoptr(GError) error = nullptr;
        if (!serve(&self, &error))
            g_printerr("fake polkit: %s\n", error != nullptr ? error->message : "not ready");
        std::_Exit(1);
    }
    (void)close(ends[1]);
    char byte = '\0';
    ready_ = read(ends[0], &byte, 1) == 1;
    (void)close(ends[0]);
}
