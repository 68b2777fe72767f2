// tests/unit/service/intake_refusals_test.cpp: how many refusals wait, and what stays of a caller.
//
// The other end is a bare socket, so that the test decides when anything is read from it.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <vector>

#include <gio/gio.h>
#include <malloc.h>

#include "service/intake.h"
#include "tests/unit/service/bus_pair.h"

static constexpr const char *PATH = "/test";
static constexpr const char *INTERFACE_XML =
    "<node><interface name='test.Interface'><method name='Take'/></interface></node>";
static constexpr const char *MARKER = ":marker.0";
static constexpr gsize HEADER_SIZE = 16;

class IntakeRefusals : public ::testing::Test {
  protected:
    void SetUp() override {
        int ends[2] = {-1, -1};
        ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        server_fd_ = ends[0];
        peer_fd_ = ends[1];
        // An answer that does not come is a failure, not a hang.
        const struct timeval patience = {30, 0};
        ASSERT_EQ(setsockopt(peer_fd_, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience), 0);

        server_ = connect_bus_end(server_fd_);
        ASSERT_NE(server_, nullptr);
        info_ = g_dbus_node_info_new_for_xml(INTERFACE_XML, nullptr);
        intake_guard(server_, PATH, info_->interfaces[0]);
        static constexpr GDBusInterfaceVTable vtable = {serve, nullptr, nullptr, {}};
        ASSERT_NE(g_dbus_connection_register_object(server_, PATH, info_->interfaces[0], &vtable,
                                                    this, nullptr, nullptr),
                  0U);
        g_dbus_connection_add_filter(server_, note_taken, this, nullptr);
    }

    void TearDown() override {
        (void)close(peer_fd_);
        (void)g_dbus_connection_close_sync(server_, nullptr, nullptr);
        // What a failed test has left waiting would come to an object that is gone.
        while (g_main_context_iteration(nullptr, FALSE) != FALSE) {
        }
        g_object_unref(server_);
        g_dbus_node_info_unref(info_);
    }

    // Returns the call's number.
    guint32 send(const std::string &sender, bool silent = false,
                 const char *interface = "test.Interface", const char *member = "Take") {
        g_autoptr(GDBusMessage) call =
            g_dbus_message_new_method_call(nullptr, PATH, interface, member);
        g_dbus_message_set_sender(call, sender.c_str());
        g_dbus_message_set_serial(call, ++last_serial_);
        if (silent)
            g_dbus_message_set_flags(call, G_DBUS_MESSAGE_FLAGS_NO_REPLY_EXPECTED);
        gsize size = 0;
        g_autofree guchar *bytes =
            g_dbus_message_to_blob(call, &size, G_DBUS_CAPABILITY_FLAGS_NONE, nullptr);
        EXPECT_EQ(write(peer_fd_, bytes, size), static_cast<gssize>(size));
        return last_serial_;
    }

    guint32 send_ping(const std::string &sender) {
        return send(sender, false, "org.freedesktop.DBus.Peer", "Ping");
    }

    // Takes all places of the sender; the calls wait until the main loop runs, and go unanswered.
    void fill_places(const std::string &sender) {
        for (guint i = 0; i < INTAKE_SENDER_CALLS; i++)
            (void)send(sender, true);
    }

    void fill_shared_places() {
        for (guint i = 0; i < INTAKE_SHARED_CALLS / INTAKE_SENDER_CALLS; i++)
            fill_places(":flooder." + std::to_string(i));
    }

    // The main loop comes to all that waits, once everything sent has passed the filter: earlier it
    // would give back places that are to stay taken.
    void serve_all() {
        (void)send(MARKER, true);
        sent_markers_++;
        while (g_atomic_int_get(&taken_markers_) < sent_markers_)
            g_usleep(100);
        while (served_markers_ < sent_markers_)
            (void)g_main_context_iteration(nullptr, TRUE);
    }

    // From here on nothing the service sends goes out, until let_through.
    void hold_up() {
        static constexpr char filling[4096] = {};
        gssize sent = 0;
        while ((sent = ::send(server_fd_, filling, sizeof filling, MSG_DONTWAIT | MSG_NOSIGNAL)) >
               0)
            filled_ += static_cast<gsize>(sent);
        ASSERT_EQ(errno, EAGAIN);
        ASSERT_GT(filled_, 0U);
    }

    void let_through() {
        std::vector<guchar> filling(filled_);
        read_whole(filling.data(), filled_);
        filled_ = 0;
    }

    // Which call the next message answers; and whether that is a refusal for want of a place.
    guint32 next_answer(bool *out_refused) {
        std::vector<guchar> bytes(HEADER_SIZE);
        read_whole(bytes.data(), HEADER_SIZE);
        const gssize size = g_dbus_message_bytes_needed(bytes.data(), HEADER_SIZE, nullptr);
        EXPECT_GE(size, static_cast<gssize>(HEADER_SIZE));
        bytes.resize(std::max(static_cast<gsize>(size), HEADER_SIZE));
        read_whole(bytes.data() + HEADER_SIZE, bytes.size() - HEADER_SIZE);
        g_autoptr(GDBusMessage) message = g_dbus_message_new_from_blob(
            bytes.data(), bytes.size(), G_DBUS_CAPABILITY_FLAGS_NONE, nullptr);
        if (message == nullptr)
            return 0;
        *out_refused = g_strcmp0(g_dbus_message_get_error_name(message),
                                 "org.freedesktop.DBus.Error.LimitsExceeded") == 0;
        return g_dbus_message_get_reply_serial(message);
    }

    void expect_refusal_of(guint32 call) {
        bool refused = false;
        ASSERT_EQ(next_answer(&refused), call);
        ASSERT_TRUE(refused);
    }

    // Nothing comes before the answer, which is given after everything that was sent.
    void expect_nothing_more() {
        const guint32 ping = send_ping(":settler.0");
        bool refused = true;
        ASSERT_EQ(next_answer(&refused), ping);
        ASSERT_FALSE(refused);
    }

  private:
    // Runs in GDBus's thread, for what the filter before it has let through.
    static GDBusMessage *note_taken(GDBusConnection *, GDBusMessage *message, gboolean incoming,
                                    gpointer self) {
        if (incoming != FALSE && g_strcmp0(g_dbus_message_get_sender(message), MARKER) == 0)
            g_atomic_int_inc(&static_cast<IntakeRefusals *>(self)->taken_markers_);
        return message;
    }

    static void serve(GDBusConnection *, const char *sender, const char *, const char *,
                      const char *, GVariant *, GDBusMethodInvocation *call, gpointer self) {
        if (g_strcmp0(sender, MARKER) == 0)
            static_cast<IntakeRefusals *>(self)->served_markers_++;
        g_dbus_method_invocation_return_value(call, nullptr);
    }

    void read_whole(guchar *out, gsize size) const {
        while (size > 0) {
            const gssize got = read(peer_fd_, out, size);
            if (got <= 0) {
                ADD_FAILURE() << "nothing to read";
                return;
            }
            out += got;
            size -= static_cast<gsize>(got);
        }
    }

    GDBusConnection *server_ = nullptr;
    GDBusNodeInfo *info_ = nullptr;
    int server_fd_ = -1;
    int peer_fd_ = -1;
    guint32 last_serial_ = 0;
    int sent_markers_ = 0;
    int taken_markers_ = 0;  // also of GDBus's thread
    int served_markers_ = 0;
    gsize filled_ = 0;
};

TEST_F(IntakeRefusals, OnesThatWaitAreBoundedForEachSender) {
    for (int round = 0; round < 3; round++) {
        hold_up();
        fill_places(":1.1");
        std::vector<guint32> calls;
        for (guint i = 0; i < 2 * INTAKE_SENDER_REFUSALS; i++)
            calls.push_back(send(":1.1"));
        fill_places(":1.2");
        const guint32 other = send(":1.2");
        serve_all();
        let_through();
        for (guint i = 0; i < INTAKE_SENDER_REFUSALS; i++)
            ASSERT_NO_FATAL_FAILURE(expect_refusal_of(calls[i]));
        ASSERT_NO_FATAL_FAILURE(expect_refusal_of(other));
        ASSERT_NO_FATAL_FAILURE(expect_nothing_more());
    }
}

TEST_F(IntakeRefusals, OnesThatWaitAreBoundedForAllSenders) {
    static constexpr guint senders = INTAKE_REFUSALS / INTAKE_SENDER_REFUSALS;
    for (int round = 0; round < 3; round++) {
        hold_up();
        fill_shared_places();
        std::vector<guint32> calls;
        for (guint i = 0; i <= senders; i++) {
            const std::string sender = ":1." + std::to_string(i);
            (void)send(sender, true);
            for (guint j = 0; j < INTAKE_SENDER_REFUSALS; j++)
                calls.push_back(send(sender));
        }
        serve_all();
        let_through();
        for (guint i = 0; i < INTAKE_REFUSALS; i++)
            ASSERT_NO_FATAL_FAILURE(expect_refusal_of(calls[i]));
        ASSERT_NO_FATAL_FAILURE(expect_nothing_more());
    }
}

TEST_F(IntakeRefusals, OneAfterAnotherIsAnswered) {
    fill_places(":1.1");
    for (guint i = 0; i < 2 * INTAKE_REFUSALS; i++)
        ASSERT_NO_FATAL_FAILURE(expect_refusal_of(send(":1.1")));
    serve_all();
}

// What is in use, where the C library's own allocator tells.
static gsize bytes_in_use() {
    const struct mallinfo2 info = mallinfo2();
    return info.uordblks + info.hblkhd;
}

TEST_F(IntakeRefusals, SendersWhoHoldNothingAreForgotten) {
    const auto call_of_many = [this](int first, int count) {
        for (int i = first; i < first + count; i++) {
            const guint32 ping = send_ping(":1." + std::to_string(i));
            bool refused = true;
            ASSERT_EQ(next_answer(&refused), ping);
        }
    };
    ASSERT_NO_FATAL_FAILURE(call_of_many(0, 100));
    const gsize before = bytes_in_use();
    ASSERT_NO_FATAL_FAILURE(call_of_many(100, 2000));
    EXPECT_LT(bytes_in_use(), before + 30000);
}
