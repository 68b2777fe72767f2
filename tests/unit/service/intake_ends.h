// tests/unit/service/intake_ends.h: a guarded connection whose two ends are in this process.
//
// Calls wait for as long as the test does not run the main loop, since GDBus reads them in its own
// thread.
#pragma once

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include <gio/gio.h>

#include "service/intake.h"
#include "tests/unit/service/bus_pair.h"

inline constexpr const char *PATH = "/test";
inline constexpr const char *INTERFACE_XML =
    "<node><interface name='test.Interface'>"
    "<method name='Take'><arg type='s' direction='in'/></method>"
    "<method name='TakeList'><arg type='as' direction='in'/></method>"
    "</interface></node>";
inline constexpr const char *LIMITS_EXCEEDED = "org.freedesktop.DBus.Error.LimitsExceeded: ";
inline constexpr const char *TOO_MANY =
    "org.freedesktop.DBus.Error.LimitsExceeded: Too many calls are waiting";

class Intake : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(ends_.is_connected());
        info_ = g_dbus_node_info_new_for_xml(INTERFACE_XML, nullptr);
        intake_guard(ends_.server(), PATH, info_->interfaces[0]);
        static constexpr GDBusInterfaceVTable vtable = {serve, nullptr, nullptr, {}};
        ASSERT_NE(g_dbus_connection_register_object(ends_.server(), PATH, info_->interfaces[0],
                                                    &vtable, this, nullptr, nullptr),
                  0U);
        g_dbus_connection_add_filter(ends_.client(), listen, this, nullptr);
    }

    void TearDown() override {
        for (GDBusMethodInvocation *call : held_)
            g_dbus_method_invocation_return_value(call, nullptr);
        for (GDBusMessage *message : kept_)
            g_object_unref(message);
        ends_.close();
        g_dbus_node_info_unref(info_);
    }

    // Sends a call of Take, or of TakeList for a list, under a sender's name; returns its number.
    guint32 send(const char *sender, GVariant *arguments, bool silent = false) {
        const bool is_list = g_variant_is_of_type(arguments, G_VARIANT_TYPE("(as)")) != FALSE;
        return send_to(PATH, "test.Interface", is_list ? "TakeList" : "Take", sender, arguments,
                       silent);
    }

    guint32 send_to(const char *path, const char *interface, const char *member, const char *sender,
                    GVariant *arguments, bool silent) {
        g_autoptr(GDBusMessage) message =
            g_dbus_message_new_method_call(nullptr, path, interface, member);
        g_dbus_message_set_sender(message, sender);
        g_dbus_message_set_body(message, arguments);
        if (silent)
            g_dbus_message_set_flags(message, G_DBUS_MESSAGE_FLAGS_NO_REPLY_EXPECTED);
        volatile guint32 serial = 0;
        EXPECT_TRUE(g_dbus_connection_send_message(
            ends_.client(), message, G_DBUS_SEND_MESSAGE_FLAGS_NONE, &serial, nullptr));
        return serial;
    }

    guint32 send_small(const char *sender, bool silent = false) {
        return send(sender, g_variant_new("(s)", "x"), silent);
    }

    // A text that makes the arguments as costly as that.
    static GVariant *text_of_cost(gsize cost) {
        return g_variant_new("(s)", std::string(cost - 1, 'x').c_str());
    }

    static GVariant *list_of(gsize elements) {
        std::vector<const char *> list(elements, "");
        list.push_back(nullptr);
        return g_variant_new("(^as)", list.data());
    }

    // Everything sent has passed the filter, since this has; it is answered by GDBus's thread.
    void settle() {
        g_autoptr(GDBusMessage) ping =
            g_dbus_message_new_method_call(nullptr, PATH, "org.freedesktop.DBus.Peer", "Ping");
        g_dbus_message_set_sender(ping, (":settler." + std::to_string(settled_++)).c_str());
        g_autoptr(GDBusMessage) answer = g_dbus_connection_send_message_with_reply_sync(
            ends_.client(), ping, G_DBUS_SEND_MESSAGE_FLAGS_NONE, -1, nullptr, nullptr, nullptr);
        ASSERT_NE(answer, nullptr);
    }

    // What the call was answered until now: "", "done", or the error and its text.
    std::string answer_to(guint32 serial) {
        settle();
        g_mutex_lock(&lock_);
        const std::string answer = answers_[serial];
        g_mutex_unlock(&lock_);
        return answer;
    }

    // The main loop comes to all that waits.
    void serve_all() {
        settle();
        while (g_main_context_iteration(nullptr, FALSE) != FALSE) {
        }
        settle();
    }

    // Fills the shared places with calls of so many senders.
    void fill_shared_places() {
        for (guint i = 0; i < INTAKE_SHARED_CALLS; i++)
            (void)send_small((":flooder." + std::to_string(i / INTAKE_SENDER_CALLS)).c_str());
        settle();
    }

    guint served_ = 0;
    bool keeps_messages_ = false;
    bool holds_calls_ = false;
    bus_pair ends_;

  private:
    static void serve(GDBusConnection *, const char *, const char *, const char *, const char *,
                      GVariant *, GDBusMethodInvocation *call, gpointer self) {
        auto *test = static_cast<Intake *>(self);
        test->served_++;
        if (test->holds_calls_) {
            test->held_.push_back(call);
            return;
        }
        if (test->keeps_messages_)
            test->kept_.push_back(
                G_DBUS_MESSAGE(g_object_ref(g_dbus_method_invocation_get_message(call))));
        g_dbus_method_invocation_return_value(call, nullptr);
    }

    // Runs in GDBus's thread.
    static GDBusMessage *listen(GDBusConnection *, GDBusMessage *message, gboolean incoming,
                                gpointer data) {
        auto *self = static_cast<Intake *>(data);
        if (incoming == FALSE)
            return message;
        std::string answer = "done";
        if (g_dbus_message_get_message_type(message) == G_DBUS_MESSAGE_TYPE_ERROR) {
            const char *text = nullptr;
            g_variant_get(g_dbus_message_get_body(message), "(&s)", &text);
            answer = std::string(g_dbus_message_get_error_name(message)) + ": " + text;
        }
        g_mutex_lock(&self->lock_);
        self->answers_[g_dbus_message_get_reply_serial(message)] = answer;
        g_mutex_unlock(&self->lock_);
        return message;
    }

    std::vector<GDBusMessage *> kept_;
    std::vector<GDBusMethodInvocation *> held_;
    GDBusNodeInfo *info_ = nullptr;
    GMutex lock_ = {};
    std::map<guint32, std::string> answers_;
    guint settled_ = 0;
};
