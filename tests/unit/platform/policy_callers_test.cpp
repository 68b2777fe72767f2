// tests/unit/platform/policy_callers_test.cpp: what the bus is asked about a caller, and how often.
#include "platform/authz/policy/callers.h"

#include <functional>
#include <string>

#include <unistd.h>

#include <gio/gio.h>
#include <gtest/gtest.h>

#include "tests/unit/platform/child.h"
#include "tests/unit/platform/fake_bus.h"
#include "tests/unit/platform/outcome.h"
#include "tests/unit/platform/private_bus.h"

// "UID:GID,GID", or the error.
static std::string find(const std::string &name, int deadline_ms = 20000) {
    policy_caller caller = {};
    g_autoptr(GError) error = nullptr;

    if (!callers_find(name.c_str(), "x.y", deadline_ms, &caller, &error))
        return describe_outcome(0, error);
    std::string text = std::to_string(caller.uid) + ":";
    for (gsize i = 0; i < caller.gid_count; i++)
        text += (i > 0 ? "," : "") + std::to_string(caller.gids[i]);
    return text;
}

static gboolean stop(void *data) {
    *static_cast<bool *>(data) = true;
    return G_SOURCE_CONTINUE;
}

// What the bus was asked by then.
static std::string find_and_count(fake_bus &bus, const std::string &name) {
    const std::string found = find(name);
    return found + " " + std::to_string(bus.questions);
}

// The main loop, until the condition holds or for the time, which is then told.
static std::string run_until(const std::function<bool()> &condition, guint ms = 5000) {
    bool is_over = false;
    const guint source = g_timeout_add(ms, stop, &is_over);
    const guint tick = g_timeout_add(
        1, [](void *) -> gboolean { return G_SOURCE_CONTINUE; }, nullptr);

    while (!condition() && !is_over)
        g_main_context_iteration(nullptr, TRUE);
    g_source_remove(source);
    g_source_remove(tick);
    return is_over ? " (not in time)" : "";
}

// Runs the work in a child that has a fake bus; what it returns is told.
static std::string with_bus(const std::function<std::string(fake_bus &)> &work) {
    return text_from_child([&] {
        std::string outcome = "no bus";
        {
            fake_bus bus;
            if (bus.ready())
                outcome = work(bus);
            callers_release();
        }
        say(outcome);
    });
}

TEST(PolicyCallers, CredentialsAreThoseThatTheBusTells) {
    EXPECT_EQ(with_bus([](fake_bus &) { return find(":1.701"); }), "701:7,750");
}

TEST(PolicyCallers, WithoutGroupsOnlyTheUidCounts) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bus.told = fake_bus::credentials::WITHOUT_GROUPS;
                  return find(":1.701");
              }),
              "701:");
}

TEST(PolicyCallers, WhoHasNoUidIsRefused) {
    for (const auto told :
         {fake_bus::credentials::WITHOUT_UID, fake_bus::credentials::UID_OF_ANOTHER_TYPE}) {
        EXPECT_EQ(with_bus([&](fake_bus &bus) {
                      bus.told = told;
                      return find(":1.701");
                  }),
                  "0 authz 1 action x.y is refused to :1.701, whose uid is not known");
    }
}

TEST(PolicyCallers, AnswerOfAnotherFormIsAnError) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bus.told = fake_bus::credentials::OF_ANOTHER_TYPE;
                  return find(":1.701");
              }),
              "0 authz 2 cannot check action x.y: the answer has no valid form");
}

TEST(PolicyCallers, OtherErrorComesWithoutItsBusName) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bus.told = fake_bus::credentials::REFUSED;
                  return find(":1.701");
              }),
              "0 authz 3 cannot check action x.y: too much of it");
}

TEST(PolicyCallers, BusIsAskedOnceForEachName) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  std::string outcome;
                  for (int i = 0; i < 3; i++)
                      outcome += find(":1.701") + " " + find(":1.702") + " ";
                  return outcome + std::to_string(bus.questions);
              }),
              "701:7,750 702:7,750 701:7,750 702:7,750 701:7,750 702:7,750 2");
}

TEST(PolicyCallers, FailureIsNotRemembered) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bus.told = fake_bus::credentials::WITHOUT_UID;
                  (void)find(":1.701");
                  const std::string outcome = run_until([&] { return bus.watches == 0; });
                  bus.told = fake_bus::credentials::WHOLE;
                  return find_and_count(bus, ":1.701") + outcome;
              }),
              "701:7,750 2");
}

TEST(PolicyCallers, NameThatVanishedIsForgotten) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  std::string outcome = find(":1.701") + " " + find(":1.702");
                  outcome += run_until([&] { return bus.watches == 2; });
                  bus.end(":1.701");
                  outcome += run_until([&] { return bus.watches == 1; });
                  outcome += " " + find_and_count(bus, ":1.702");
                  outcome += " " + find_and_count(bus, ":1.701");
                  return outcome;
              }),
              "701:7,750 702:7,750 702:7,750 2 701:7,750 3");
}

// The one that was asked first goes, and with it the watch for its end.
TEST(PolicyCallers, AsManyAreRememberedAsThereIsRoom) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  const auto name = [](guint i) { return ":1." + std::to_string(i); };
                  for (guint i = 0; i < CALLERS_REMEMBERED; i++)
                      (void)find(name(i));
                  std::string outcome = std::to_string(bus.questions);
                  (void)find(name(0));
                  outcome += " " + std::to_string(bus.questions);
                  (void)find(name(CALLERS_REMEMBERED));
                  (void)find(name(1));
                  (void)find(name(CALLERS_REMEMBERED));
                  outcome += " " + std::to_string(bus.questions);
                  (void)find(name(0));
                  outcome += " " + std::to_string(bus.questions);
                  outcome += run_until([&] { return bus.watches == int{CALLERS_REMEMBERED}; });
                  return outcome;
              }),
              "256 256 257 258");
}

TEST(PolicyCallers, LostAnswerIsAskedForAgain) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bus.lost = 2;
                  const gint64 start = g_get_monotonic_time();
                  std::string outcome = find_and_count(bus, ":1.701");
                  if (g_get_monotonic_time() - start > 10 * G_USEC_PER_SEC)
                      outcome += ", late";
                  return outcome + " " + find_and_count(bus, ":1.702");
              }),
              "701:7,750 3 702:7,750 4");
}

TEST(PolicyCallers, SilentBusIsLeftAtTheDeadline) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bus.lost = 1000;
                  const gint64 start = g_get_monotonic_time();
                  std::string outcome = find(":1.701", 300);
                  if (g_get_monotonic_time() - start > 5 * G_USEC_PER_SEC)
                      outcome += ", late";
                  bus.lost = 0;
                  return outcome + "; " + find(":1.701");
              }),
              "0 authz 4 cannot check action x.y: no answer in time; 701:7,750");
}

static gboolean mark(void *data) {
    *static_cast<bool *>(data) = true;
    return G_SOURCE_REMOVE;
}

TEST(PolicyCallers, NoSourceOfTheProgramRunsMeanwhile) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  bool ran = false;
                  (void)find(":1.700");
                  (void)run_until([&] { return bus.watches == 1; });
                  bus.end(":1.700");  // A signal waits for the main loop.
                  bus.lost = 1;
                  g_idle_add(mark, &ran);
                  std::string outcome = find(":1.701");
                  outcome += ran ? ", the idle source ran" : "";
                  if (g_main_context_get_thread_default() != nullptr)
                      outcome += ", another context is left in place";
                  return outcome + run_until([&] { return ran && bus.watches == 1; });
              }),
              "701:7,750");
}

TEST(PolicyCallers, ReleaseForgetsAndALaterSearchAsksAnew) {
    EXPECT_EQ(with_bus([](fake_bus &bus) {
                  std::string outcome = find(":1.701");
                  callers_release();
                  callers_release();
                  return outcome + " " + find_and_count(bus, ":1.701");
              }),
              "701:7,750 701:7,750 2");
}

// On the next bus the name may be somebody else's.
TEST(PolicyCallers, LostConnectionTakesItsNamesAlong) {
    EXPECT_EQ(text_from_child([] {
                  std::string outcome;
                  {
                      fake_bus bus;
                      // Else it ends the process when the bus goes.
                      g_autoptr(GDBusConnection) shared =
                          g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
                      g_dbus_connection_set_exit_on_close(shared, FALSE);
                      outcome = find(":1.701");
                  }
                  g_usleep(200000);
                  outcome += "; " + find(":1.701");
                  callers_release();
                  say(outcome);
              }),
              "701:7,750; 0 authz 3 cannot check action x.y: the connection is closed");
}

TEST(PolicyCallers, WithoutABusIsAnError) {
    EXPECT_EQ(text_from_child([] {
                  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/bus", TRUE);
                  const std::string outcome = find(":1.1") + "; " + find(":1.1");
                  callers_release();
                  say(outcome);
              }),
              "0 authz 3 cannot check action x.y: Could not connect: No such file or directory; "
              "0 authz 3 cannot check action x.y: Could not connect: No such file or directory");
}

// A real bus: the credentials of this process, and the end of a name that somebody had.
TEST(PolicyCallers, RealBusTellsAndForgets) {
    const private_bus bus(private_bus::polkit::UNKNOWN);
    ASSERT_TRUE(bus.ready());

    const std::string outcome = text_from_child([] {
        const auto flags =
            static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                              G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION);
        GDBusConnection *other = g_dbus_connection_new_for_address_sync(
            g_getenv("DBUS_SYSTEM_BUS_ADDRESS"), flags, nullptr, nullptr, nullptr);
        const std::string name = g_dbus_connection_get_unique_name(other);
        const std::string own = std::to_string(geteuid()) + ":";

        std::string told = find(name).substr(0, own.size()) == own ? "known" : find(name);
        const bool has_group =
            ("," + find(name).substr(own.size()) + ",")
                .find("," + std::to_string(getegid()) + ",") != std::string::npos;
        told += has_group ? ", a member" : ", no member";
        (void)g_dbus_connection_close_sync(other, nullptr, nullptr);
        g_object_unref(other);
        told += run_until([&] { return find(name).starts_with("0 authz 1"); });
        told += ", " + find(name).substr(0, 32);
        callers_release();
        say(told);
    });
    EXPECT_EQ(outcome, "known, a member, 0 authz 1 action x.y is refused ");
}
