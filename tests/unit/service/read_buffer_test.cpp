// tests/unit/service/read_buffer_test.cpp: zeros that the bus drops.
//
// The other end of the connection is the test, which gives none back unless it wants to.
#include <gtest/gtest.h>

#include <gio/gio.h>

#include "service/read_buffer.h"
#include "tests/unit/service/bus_pair.h"

static constexpr const char *INTERFACE_XML =
    "<node><interface name='test.Interface'><method name='Take'/></interface></node>";

class ReadBuffer : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(ends_.is_connected());
        info_ = g_dbus_node_info_new_for_xml(INTERFACE_XML, nullptr);
        read_buffer_guard(ends_.server(), info_->interfaces[0]);
        g_dbus_connection_add_filter(ends_.client(), count_zeros, this, nullptr);
    }

    void TearDown() override {
        ends_.close();
        g_clear_object(&first_);
        g_dbus_node_info_unref(info_);
    }

    // Returns when it has been answered, and what came before the answer has been counted.
    void call(const char *interface, const char *member) {
        g_autoptr(GDBusMessage) call =
            g_dbus_message_new_method_call(nullptr, "/", interface, member);
        g_autoptr(GDBusMessage) answer = g_dbus_connection_send_message_with_reply_sync(
            ends_.client(), call, G_DBUS_SEND_MESSAGE_FLAGS_NONE, -1, nullptr, nullptr, nullptr);
        ASSERT_NE(answer, nullptr);
    }

    void call_with_secret() { call("com.zintor.PrivaneSystem", "AddUser"); }
    void ping() { call("org.freedesktop.DBus.Peer", "Ping"); }
    int zeros() { return g_atomic_int_get(&zeros_); }

    // Of the zeros that come, the first are given back when the test says so, the others never.
    void keep_first() { g_atomic_int_set(&keeps_first_, 1); }
    void give_back_first() { give_back(ends_.client(), g_atomic_pointer_get(&first_)); }

    gint gives_back_ = 0;

  private:
    // Runs in GDBus's thread.
    static GDBusMessage *count_zeros(GDBusConnection *connection, GDBusMessage *message,
                                     gboolean incoming, gpointer data) {
        auto *self = static_cast<ReadBuffer *>(data);
        if (incoming == FALSE || g_strcmp0(g_dbus_message_get_member(message), "Zeros") != 0)
            return message;
        if (g_atomic_int_get(&self->keeps_first_) != 0 &&
            g_atomic_pointer_get(&self->first_) == nullptr)
            g_atomic_pointer_set(&self->first_, g_object_ref(message));
        if (g_atomic_int_get(&self->gives_back_) != 0)
            give_back(connection, message);
        g_atomic_int_inc(&self->zeros_);
        return message;
    }

    static void give_back(GDBusConnection *connection, GDBusMessage *zeros) {
        g_autoptr(GDBusMessage) copy = g_dbus_message_copy(zeros, nullptr);
        (void)g_dbus_connection_send_message(connection, copy, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                             nullptr, nullptr);
    }

    bus_pair ends_;
    GDBusNodeInfo *info_ = nullptr;
    gint zeros_ = 0;
    gint keeps_first_ = 0;
    GDBusMessage *first_ = nullptr;
};

TEST_F(ReadBuffer, OneMessageOfZerosIsUnderWayAtATime) {
    for (int i = 0; i < 5; i++)
        call_with_secret();

    EXPECT_EQ(zeros(), 1);
}

TEST_F(ReadBuffer, ZerosThatCameBackAreFollowedByThoseOfTheNextCall) {
    g_atomic_int_set(&gives_back_, 1);
    call_with_secret();
    ping();
    ASSERT_EQ(zeros(), 1);

    call_with_secret();
    ping();
    EXPECT_EQ(zeros(), 2);
}

// Whoever fills the queue must not keep passwords in the buffer for good, also where nothing
// follows.
TEST_F(ReadBuffer, LostZerosAreSentAgain) {
    call_with_secret();
    ASSERT_EQ(zeros(), 1);

    for (int i = 0; i < 100 && zeros() < 2; i++)
        g_usleep(100 * 1000);
    EXPECT_EQ(zeros(), 2);
}

TEST_F(ReadBuffer, LateZerosAreNotTakenForThoseThatWereSentAfterThem) {
    keep_first();
    call_with_secret();
    while (zeros() < 2)
        g_usleep(1000);

    give_back_first();
    call_with_secret();
    EXPECT_EQ(zeros(), 2);
}
