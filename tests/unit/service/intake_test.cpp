// tests/unit/service/intake_test.cpp: which calls get a place, and when they give it back.
//
// The service's end of a connection of two ends in this process. Calls wait for as long as the test
// does not run the main loop, since GDBus reads them in its own thread.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <map>
#include <string>
#include <vector>

#include <gio/gio.h>

#include "service/intake.h"

static constexpr const char *PATH = "/test";
static constexpr const char *INTERFACE_XML =
    "<node><interface name='test.Interface'>"
    "<method name='Take'><arg type='s' direction='in'/></method>"
    "<method name='TakeList'><arg type='as' direction='in'/></method>"
    "</interface></node>";
static constexpr const char *LIMITS_EXCEEDED = "org.freedesktop.DBus.Error.LimitsExceeded: ";
static constexpr const char *TOO_MANY =
    "org.freedesktop.DBus.Error.LimitsExceeded: Too many calls are waiting";

static void on_connected(GObject *, GAsyncResult *result, gpointer slot) {
    *static_cast<GDBusConnection **>(slot) = g_dbus_connection_new_finish(result, nullptr);
}

static void start_end(int fd, GDBusConnectionFlags flags, const char *guid,
                      GDBusConnection **slot) {
    g_autoptr(GSocket) socket = g_socket_new_from_fd(fd, nullptr);
    g_autoptr(GSocketConnection) stream = g_socket_connection_factory_create_connection(socket);
    g_dbus_connection_new(G_IO_STREAM(stream), guid, flags, nullptr, nullptr, on_connected, slot);
}

class Intake : public ::testing::Test {
  protected:
    void SetUp() override {
        int ends[2] = {-1, -1};
        ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        g_autofree char *guid = g_dbus_generate_guid();
        start_end(ends[0], G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_SERVER, guid, &server_);
        start_end(ends[1], G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT, nullptr, &client_);
        while (server_ == nullptr || client_ == nullptr)
            (void)g_main_context_iteration(nullptr, TRUE);

        info_ = g_dbus_node_info_new_for_xml(INTERFACE_XML, nullptr);
        intake_guard(server_, PATH, info_->interfaces[0]);
        static constexpr GDBusInterfaceVTable vtable = {serve, nullptr, nullptr, {}};
        ASSERT_NE(g_dbus_connection_register_object(server_, PATH, info_->interfaces[0], &vtable,
                                                    this, nullptr, nullptr),
                  0U);
        g_dbus_connection_add_filter(client_, listen, this, nullptr);
    }

    void TearDown() override {
        for (GDBusMessage *message : kept_)
            g_object_unref(message);
        (void)g_dbus_connection_close_sync(client_, nullptr, nullptr);
        (void)g_dbus_connection_close_sync(server_, nullptr, nullptr);
        g_object_unref(client_);
        g_object_unref(server_);
        g_dbus_node_info_unref(info_);
    }

    // Sends a call of Take, or of TakeList for a list, under a sender's name; returns its number.
    guint32 send(const char *sender, GVariant *arguments, bool silent = false,
                 const char *path = PATH) {
        const bool is_list = g_variant_is_of_type(arguments, G_VARIANT_TYPE("(as)")) != FALSE;
        g_autoptr(GDBusMessage) message = g_dbus_message_new_method_call(
            nullptr, path, "test.Interface", is_list ? "TakeList" : "Take");
        g_dbus_message_set_sender(message, sender);
        g_dbus_message_set_body(message, arguments);
        if (silent)
            g_dbus_message_set_flags(message, G_DBUS_MESSAGE_FLAGS_NO_REPLY_EXPECTED);
        volatile guint32 serial = 0;
        EXPECT_TRUE(g_dbus_connection_send_message(client_, message, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                                   &serial, nullptr));
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
            client_, ping, G_DBUS_SEND_MESSAGE_FLAGS_NONE, -1, nullptr, nullptr, nullptr);
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
    GDBusConnection *server_ = nullptr;
    GDBusConnection *client_ = nullptr;

  private:
    static void serve(GDBusConnection *, const char *, const char *, const char *, const char *,
                      GVariant *, GDBusMethodInvocation *call, gpointer self) {
        auto *test = static_cast<Intake *>(self);
        test->served_++;
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
    GDBusNodeInfo *info_ = nullptr;
    GMutex lock_ = {};
    std::map<guint32, std::string> answers_;
    guint settled_ = 0;
};

TEST_F(Intake, CallIsServedAndAnswered) {
    const guint32 call = send_small(":1.1");
    EXPECT_EQ(answer_to(call), "");
    serve_all();
    EXPECT_EQ(answer_to(call), "done");
}

TEST_F(Intake, LargestTextIsTaken) {
    const guint32 call = send(":1.1", text_of_cost(INTAKE_CALL_COST));
    serve_all();
    EXPECT_EQ(answer_to(call), "done");
}

TEST_F(Intake, LargerTextIsRefused) {
    const guint32 call = send(":1.1", text_of_cost(INTAKE_CALL_COST + 1));
    EXPECT_EQ(answer_to(call),
              std::string(LIMITS_EXCEEDED) + "The arguments of the call are too large");
    serve_all();
    EXPECT_EQ(served_, 0U);
}

// An empty text takes a byte, and one of the list's offsets of four bytes.
TEST_F(Intake, LongestListIsTakenAndALongerOneRefused) {
    static constexpr gsize elements = INTAKE_CALL_COST / (INTAKE_ELEMENT_COST + 1 + 4);
    const guint32 fits = send(":1.1", list_of(elements - 1));
    const guint32 larger = send(":1.2", list_of(elements + 1));
    EXPECT_EQ(answer_to(larger),
              std::string(LIMITS_EXCEEDED) + "The arguments of the call are too large");
    serve_all();
    EXPECT_EQ(answer_to(fits), "done");
}

TEST_F(Intake, SenderHasItsShareAndNoMore) {
    std::vector<guint32> taken;
    for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
        taken.push_back(send_small(":1.1"));
    const guint32 refused = send_small(":1.1");
    const guint32 other = send_small(":1.2");
    EXPECT_EQ(answer_to(refused), TOO_MANY);
    EXPECT_EQ(answer_to(other), "");
    serve_all();
    for (const guint32 call : taken)
        EXPECT_EQ(answer_to(call), "done");
    EXPECT_EQ(answer_to(other), "done");
}

TEST_F(Intake, AnsweredCallsGiveTheirPlacesBack) {
    for (int round = 0; round < 5; round++) {
        for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
            (void)send_small(":1.1", i % 2 == 0);
        EXPECT_EQ(answer_to(send_small(":1.1")), TOO_MANY);
        serve_all();
    }
    EXPECT_EQ(served_, 5 * INTAKE_SENDER_CALLS);
}

// A caller who has its answer may call again before the service has cleared away.
TEST_F(Intake, PlaceIsBackWhenTheAnswerHasGoneOut) {
    keeps_messages_ = true;
    for (int round = 0; round < 2; round++) {
        std::vector<guint32> taken;
        for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
            taken.push_back(send_small(":1.1"));
        serve_all();
        for (const guint32 call : taken)
            EXPECT_EQ(answer_to(call), "done");
    }
}

TEST_F(Intake, BeyondTheSharedPlacesOnlyOneCallOfEachHasRoom) {
    fill_shared_places();
    const guint32 first = send_small(":1.1");
    const guint32 second = send_small(":1.1");
    EXPECT_EQ(answer_to(second), TOO_MANY);
    EXPECT_EQ(answer_to(first), "");
    serve_all();
    EXPECT_EQ(answer_to(first), "done");
}

TEST_F(Intake, AllPlacesTakenLeaveNoneForAnybody) {
    fill_shared_places();
    std::vector<guint32> taken;
    for (guint i = INTAKE_SHARED_CALLS; i < INTAKE_CALLS - 1; i++)
        taken.push_back(send_small((":1." + std::to_string(i)).c_str()));
    // The place that is left for what settles.
    for (const guint32 call : taken)
        ASSERT_EQ(answer_to(call), "");
    const guint32 last = send_small(":1.9998");
    const guint32 refused = send_small(":1.9999");
    serve_all();
    EXPECT_EQ(answer_to(last), "done");
    EXPECT_EQ(answer_to(refused), TOO_MANY);
}

TEST_F(Intake, LargeCallsHaveAShareOfTheirOwn) {
    const guint32 first = send(":1.1", text_of_cost(INTAKE_SENDER_COST - 2));
    const guint32 second = send(":1.1", text_of_cost(2));
    const guint32 third = send(":1.1", text_of_cost(2));
    EXPECT_EQ(answer_to(third), TOO_MANY);
    serve_all();
    EXPECT_EQ(answer_to(first), "done");
    EXPECT_EQ(answer_to(second), "done");
}

TEST_F(Intake, LargeCallsOfManyLeaveRoomForSmallOnes) {
    for (gsize i = 0; i < INTAKE_SHARED_COST / INTAKE_CALL_COST; i++)
        (void)send((":1." + std::to_string(i)).c_str(), text_of_cost(INTAKE_CALL_COST));
    const guint32 large = send(":1.99", text_of_cost(INTAKE_SMALL_COST + 1));
    const guint32 small = send(":1.99", text_of_cost(INTAKE_SMALL_COST));
    EXPECT_EQ(answer_to(large), TOO_MANY);
    serve_all();
    EXPECT_EQ(answer_to(small), "done");
}

TEST_F(Intake, WhoWantsNoAnswerGetsNone) {
    const guint32 large = send(":1.1", text_of_cost(INTAKE_CALL_COST + 1), true);
    const guint32 elsewhere = send(":1.1", g_variant_new("(s)", "x"), true, "/elsewhere");
    const guint32 wrong = send(":1.1", g_variant_new("(u)", 1), true);
    for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
        (void)send_small(":1.1", true);
    const guint32 too_many = send_small(":1.1", true);
    serve_all();
    for (const guint32 call : {large, elsewhere, wrong, too_many})
        EXPECT_EQ(answer_to(call), "");
    EXPECT_EQ(served_, INTAKE_SENDER_CALLS);
}

TEST_F(Intake, CallUnderTheNumberOfOneThatWaitsIsDropped) {
    for (const char *sender : {":1.1", ":1.1", ":1.2"}) {
        g_autoptr(GDBusMessage) message =
            g_dbus_message_new_method_call(nullptr, PATH, "test.Interface", "Take");
        g_dbus_message_set_sender(message, sender);
        g_dbus_message_set_body(message, g_variant_new("(s)", "x"));
        g_dbus_message_set_serial(message, 4000);
        (void)g_dbus_connection_send_message(
            client_, message, G_DBUS_SEND_MESSAGE_FLAGS_PRESERVE_SERIAL, nullptr, nullptr);
    }
    serve_all();
    EXPECT_EQ(served_, 2U);
}

TEST_F(Intake, CallsThatGdbusAnswersGiveTheirPlacesBack) {
    for (guint i = 0; i < 3 * INTAKE_CALLS; i++) {
        const guint32 call = send(":1.1", g_variant_new("(s)", "x"), false, "/elsewhere");
        ASSERT_EQ(answer_to(call).rfind("org.freedesktop.DBus.Error.UnknownMethod: ", 0), 0U);
    }
}

TEST_F(Intake, SignalsToThisConnectionAloneAreDropped) {
    guint heard = 0;
    const guint id = g_dbus_connection_signal_subscribe(
        server_, nullptr, "test.Other", "Told", nullptr, nullptr, G_DBUS_SIGNAL_FLAGS_NONE,
        [](GDBusConnection *, const char *, const char *, const char *, const char *, GVariant *,
           gpointer counter) { ++*static_cast<guint *>(counter); },
        &heard, nullptr);
    struct signal_case {
        const char *sender;
        const char *destination;
    };
    static constexpr signal_case cases[] = {
        {":1.1",                 ":1.2" },
        {":1.1",                 nullptr},
        {"org.freedesktop.DBus", ":1.2" }
    };
    for (const signal_case &one : cases) {
        g_autoptr(GDBusMessage) message = g_dbus_message_new_signal("/other", "test.Other", "Told");
        g_dbus_message_set_sender(message, one.sender);
        g_dbus_message_set_destination(message, one.destination);
        (void)g_dbus_connection_send_message(client_, message, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                             nullptr, nullptr);
    }
    serve_all();
    EXPECT_EQ(heard, 2U);
    g_dbus_connection_signal_unsubscribe(server_, id);
}
