// tests/unit/service/intake_test.cpp: which calls get a place, and when they give it back.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include <gio/gio.h>

#include "tests/unit/service/intake_ends.h"

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

// The call that is held keeps the sender's share from being forgotten.
TEST_F(Intake, AnsweredCallsGiveTheirSendersCostBack) {
    holds_calls_ = true;
    const guint32 held = send(":1.1", text_of_cost(1));
    serve_all();
    holds_calls_ = false;
    for (int round = 0; round < 5; round++) {
        const guint32 large = send(":1.1", text_of_cost(INTAKE_SENDER_COST - 1));
        serve_all();
        EXPECT_EQ(answer_to(large), "done");
    }
    EXPECT_EQ(answer_to(held), "");
}

TEST_F(Intake, AnsweredCallsGiveTheSharedCostBack) {
    for (int round = 0; round < 5; round++) {
        std::vector<guint32> taken;
        for (gsize i = 0; i < INTAKE_SHARED_COST / INTAKE_CALL_COST; i++)
            taken.push_back(
                send((":1." + std::to_string(i)).c_str(), text_of_cost(INTAKE_CALL_COST)));
        serve_all();
        for (const guint32 call : taken)
            EXPECT_EQ(answer_to(call), "done");
    }
}

TEST_F(Intake, WhoWantsNoAnswerGetsNone) {
    const guint32 large = send(":1.1", text_of_cost(INTAKE_CALL_COST + 1), true);
    for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
        (void)send_small(":1.1", true);
    const guint32 too_many = send_small(":1.1", true);
    serve_all();
    for (const guint32 call : {large, too_many})
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
            ends_.client(), message, G_DBUS_SEND_MESSAGE_FLAGS_PRESERVE_SERIAL, nullptr, nullptr);
    }
    serve_all();
    EXPECT_EQ(served_, 2U);
}

// Calls that GDBus answers without the service; the answer is how it begins.
struct foreign_call {
    const char *name;
    const char *path;
    const char *interface;
    const char *member;
    const char *arguments;
    const char *answer;
};

static constexpr const char *UNKNOWN_METHOD = "org.freedesktop.DBus.Error.UnknownMethod: ";
static constexpr const char *INVALID_ARGUMENTS = "org.freedesktop.DBus.Error.InvalidArgs: ";
static constexpr const char *OURS = "test.Interface";
static constexpr const char *PROPERTIES = "org.freedesktop.DBus.Properties";
static constexpr const char *INTROSPECTABLE = "org.freedesktop.DBus.Introspectable";
static constexpr const char *PEER = "org.freedesktop.DBus.Peer";

static constexpr foreign_call foreign_calls[] = {
    {"path",          "/elsewhere", OURS,           "Take",       "('x',)",                  UNKNOWN_METHOD   },
    {"interface",     PATH,         "test.Other",   "Take",       "('x',)",                  UNKNOWN_METHOD   },
    {"method",        PATH,         OURS,           "Give",       "('x',)",                  UNKNOWN_METHOD   },
    {"signature",     PATH,         OURS,           "Take",       "(1,)",                    INVALID_ARGUMENTS},
    {"no interface",  PATH,         nullptr,        "Take",       "('x',)",                  UNKNOWN_METHOD   },
    {"property",      PATH,         PROPERTIES,     "Get",        "('test.Interface', 'X')", INVALID_ARGUMENTS},
    {"properties",    PATH,         PROPERTIES,     "GetAll",     "('test.Interface',)",     "done"           },
    {"introspection", PATH,         INTROSPECTABLE, "Introspect", "()",                      "done"           },
    {"ping",          PATH,         PEER,           "Ping",       "()",                      "done"           },
};

TEST_F(Intake, CallsThatGdbusAnswersGiveTheirPlacesBack) {
    for (const foreign_call &one : foreign_calls) {
        SCOPED_TRACE(one.name);
        for (guint i = 0; i < 3 * INTAKE_SENDER_CALLS; i++) {
            const guint32 call = send_to(one.path, one.interface, one.member, ":1.1",
                                         g_variant_new_parsed(one.arguments), false);
            serve_all();
            ASSERT_EQ(answer_to(call).rfind(one.answer, 0), 0U) << answer_to(call);
        }
    }
}

// The last call has the place that any of them would have held.
TEST_F(Intake, CallsThatGdbusAnswersAreDroppedWhenTheyWantNoAnswer) {
    for (const foreign_call &one : foreign_calls) {
        SCOPED_TRACE(one.name);
        std::vector<guint32> calls;
        for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
            calls.push_back(send_to(one.path, one.interface, one.member, ":1.1",
                                    g_variant_new_parsed(one.arguments), true));
        const guint32 last = send_small(":1.1");
        serve_all();
        for (const guint32 call : calls)
            EXPECT_EQ(answer_to(call), "");
        EXPECT_EQ(answer_to(last), "done");
    }
}

TEST_F(Intake, SignalsToThisConnectionAloneAreDropped) {
    guint heard = 0;
    const guint id = g_dbus_connection_signal_subscribe(
        ends_.server(), nullptr, "test.Other", "Told", nullptr, nullptr, G_DBUS_SIGNAL_FLAGS_NONE,
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
        (void)g_dbus_connection_send_message(ends_.client(), message,
                                             G_DBUS_SEND_MESSAGE_FLAGS_NONE, nullptr, nullptr);
    }
    serve_all();
    EXPECT_EQ(heard, 2U);
    g_dbus_connection_signal_unsubscribe(ends_.server(), id);
}
