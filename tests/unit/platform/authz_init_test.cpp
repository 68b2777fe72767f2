// tests/unit/platform/authz_init_test.cpp: the look for the authorization service, and what it
// leaves.
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <string>

#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <gio/gio.h>
#include <gtest/gtest.h>

#include "platform/authz/authz.h"
#include "platform/authz/polkit/service_probe.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/outcome.h"
#include "tests/unit/platform/private_bus.h"
#include "tests/unit/platform/process_state.h"

static constexpr const char *NOT_THERE =
    "0 authz 3 org.freedesktop.PolicyKit1 is neither running on the system bus nor can be started";

static std::string init_in_child() {
    return text_from_child([] {
        g_autoptr(GError) error = nullptr;
        const int result = authz_init(&error);
        say(describe_outcome(result, error));
    });
}

TEST(AuthzInit, SucceedsWherePolkitRuns) {
    const private_bus bus(private_bus::polkit::UNKNOWN);
    const fake_polkit polkit;
    ASSERT_TRUE(bus.ready() && polkit.ready());

    EXPECT_EQ(init_in_child(), "1");
}

// The start of polkit, which fails on this bus, is not waited for.
TEST(AuthzInit, SucceedsWherePolkitCanBeStarted) {
    const private_bus bus(private_bus::polkit::STARTABLE);
    ASSERT_TRUE(bus.ready());

    EXPECT_EQ(init_in_child(), "1");
}

TEST(AuthzInit, NamesPolkitWhereItIsNotKnown) {
    const private_bus bus(private_bus::polkit::UNKNOWN);
    ASSERT_TRUE(bus.ready());

    EXPECT_EQ(init_in_child(), NOT_THERE);
}

TEST(AuthzInit, FailsWithoutABus) {
    for (const char *address : {"unix:path=/nonexistent/bus", "no address", ""}) {
        const std::string outcome = text_from_child([&] {
            g_setenv("DBUS_SYSTEM_BUS_ADDRESS", address, TRUE);
            g_autoptr(GError) error = nullptr;
            const int result = authz_init(&error);
            say(describe_outcome(result, error));
        });
        EXPECT_EQ(outcome.rfind("0 authz 3 ", 0), 0U) << outcome;
        EXPECT_GT(outcome.size(), std::strlen("0 authz 3 ")) << outcome;
    }
}

TEST(AuthzInit, ErrorMayBeNull) {
    const private_bus bus(private_bus::polkit::UNKNOWN);
    ASSERT_TRUE(bus.ready());

    EXPECT_EQ(text_from_child([] { say(std::to_string(authz_init(nullptr))); }), "0");
}

// Runs the initialisation and says what the process has more than before.
static std::string leftovers_of_init() {
    return text_from_child([] {
        const auto descriptors = list_descriptors();
        const std::size_t threads = count_threads();
        const int result = authz_init(nullptr);
        std::string outcome = std::to_string(result);

        if (threads != 1 || count_threads() != 1)
            outcome += ", threads";
        if (list_descriptors() != descriptors)
            outcome += ", descriptors";
        if (has_children())
            outcome += ", children";
        say(outcome);
    });
}

TEST(AuthzInit, LeavesNothingAfterSuccess) {
    const private_bus bus(private_bus::polkit::STARTABLE);
    ASSERT_TRUE(bus.ready());

    EXPECT_EQ(leftovers_of_init(), "1");
}

TEST(AuthzInit, LeavesNothingAfterFailure) {
    const private_bus bus(private_bus::polkit::UNKNOWN);
    ASSERT_TRUE(bus.ready());

    EXPECT_EQ(leftovers_of_init(), "0");
}

// The reason for all this: a process that detaches afterwards can use the bus.
TEST(AuthzInit, ProcessThatForksAfterwardsCanUseTheBus) {
    const private_bus bus(private_bus::polkit::STARTABLE);
    ASSERT_TRUE(bus.ready());

    const std::string outcome = text_from_child([] {
        const int result = authz_init(nullptr);
        say(result == 0 ? "no polkit" : text_from_child([] {
            g_autoptr(GError) error = nullptr;
            g_autoptr(GDBusConnection) shared = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, &error);
            say(shared != nullptr ? "connected" : error->message);
        }));
    });
    EXPECT_EQ(outcome, "connected");
}

TEST(AuthzInit, SucceedsWhereChildrenAreNotWaitedFor) {
    const private_bus bus(private_bus::polkit::STARTABLE);
    ASSERT_TRUE(bus.ready());

    const std::string outcome = text_from_child([] {
        (void)std::signal(SIGCHLD, SIG_IGN);
        say(std::to_string(authz_init(nullptr)));
    });
    EXPECT_EQ(outcome, "1");
}

static volatile sig_atomic_t alarms;

static void on_alarm(int) {
    alarms = alarms + 1;
}

// Each wait of the parent is interrupted many times; only the deadline ends it.
TEST(AuthzInit, SignalsDoNotEndTheWait) {
    const int listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;  // Bound to no path, it gets a name of the kernel's choice.
    socklen_t length = sizeof address;
    ASSERT_EQ(bind(listener, reinterpret_cast<struct sockaddr *>(&address), sizeof(sa_family_t)),
              0);
    ASSERT_EQ(listen(listener, 4), 0);
    ASSERT_EQ(getsockname(listener, reinterpret_cast<struct sockaddr *>(&address), &length), 0);
    const std::string name(address.sun_path + 1, length - sizeof(sa_family_t) - 1);

    const std::string outcome = text_from_child([&] {
        g_setenv("DBUS_SYSTEM_BUS_ADDRESS", ("unix:abstract=" + name).c_str(), TRUE);
        struct sigaction action = {};
        action.sa_handler = on_alarm;
        (void)sigaction(SIGALRM, &action, nullptr);
        const struct itimerval often = {
            {0, 5000},
            {0, 5000}
        };
        (void)setitimer(ITIMER_REAL, &often, nullptr);

        g_autoptr(GError) error = nullptr;
        const gint64 start = g_get_monotonic_time();
        const bool found = service_probe_run(300, &error);
        const gint64 taken_ms = (g_get_monotonic_time() - start) / 1000;
        std::string text = describe_outcome(found ? 1 : 0, error);
        if (taken_ms < 300 || taken_ms > 5000)
            text += ", after ms: " + std::to_string(taken_ms);
        if (alarms < 10)
            text += ", alarms: " + std::to_string(alarms);
        if (has_children())
            text += ", children";
        say(text);
    });
    (void)close(listener);
    EXPECT_EQ(outcome, "0 authz 4 the system bus gave no answer in time");
}

TEST(AuthzInit, SaysWhenDescriptorsRunOut) {
    const std::string outcome = text_from_child([] {
        struct rlimit usual = {};
        (void)getrlimit(RLIMIT_NOFILE, &usual);
        const struct rlimit none_left = {3, usual.rlim_max};
        (void)setrlimit(RLIMIT_NOFILE, &none_left);
        g_autoptr(GError) error = nullptr;
        const int result = authz_init(&error);
        (void)setrlimit(RLIMIT_NOFILE, &usual);  // The leak check at the exit needs some.
        say(describe_outcome(result, error));
    });
    EXPECT_EQ(outcome, "0 authz 3 cannot make a pipe: Too many open files");
}
