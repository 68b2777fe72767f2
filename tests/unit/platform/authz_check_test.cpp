// tests/unit/platform/authz_check_test.cpp: verdicts and errors of a check, by a polkit that obeys.
#include <string>

#include <unistd.h>

#include <gio/gio.h>
#include <gtest/gtest.h>

#include "platform/authz/authz.h"
#include "platform/authz/polkit/polkit_client.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/outcome.h"
#include "tests/unit/platform/private_bus.h"

// The unique name of this process, which asks about itself; its connection stays.
static std::string own_name() {
    static GDBusConnection *bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
    return bus != nullptr ? g_dbus_connection_get_unique_name(bus) : "no bus";
}

static std::string check(const std::string &sender, const char *action) {
    g_autoptr(GError) error = nullptr;
    const int result = authz_check(sender.c_str(), action, &error);
    return describe_outcome(result, error);
}

static std::string check_within(int deadline_ms, const char *action) {
    const std::string sender = own_name();
    g_autoptr(GError) error = nullptr;
    const gint64 start = g_get_monotonic_time();
    const bool allowed = polkit_client_check(sender.c_str(), action, deadline_ms, &error);
    const gint64 taken_ms = (g_get_monotonic_time() - start) / 1000;

    return describe_outcome(allowed ? 1 : 0, error) +
           (taken_ms > deadline_ms + 5000 ? ", after ms: " + std::to_string(taken_ms) : "");
}

class AuthzCheck : public testing::Test {
  protected:
    AuthzCheck() : bus_(private_bus::polkit::UNKNOWN) {}

    void SetUp() override { ASSERT_TRUE(bus_.ready()); }

    private_bus bus_;
};

static std::string verdict(const char *action) {
    return text_from_child([&] { say(check(own_name(), action)); });
}

TEST_F(AuthzCheck, AllowedIsNonZeroWithoutError) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(verdict("test.allowed"), "1");
}

TEST_F(AuthzCheck, RefusalNamesActionAndUid) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());
    const std::string uid = std::to_string(geteuid());

    EXPECT_EQ(verdict("test.refused"), "0 authz 1 action test.refused is refused to uid " + uid);
    EXPECT_EQ(verdict("test.password"), "0 authz 1 action test.password is refused to uid " + uid +
                                            " without a password, which cannot be given");
}

TEST_F(AuthzCheck, RefusalOfACallerWhoIsGoneSaysSo) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] { say(check(":1.99999", "test.refused")); }),
              "0 authz 1 action test.refused is refused to :1.99999, whose uid is not known");
}

TEST_F(AuthzCheck, ErrorOfPolkitComesWithoutItsBusName) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(verdict("test.undeclared"),
              "0 authz 2 cannot check action test.undeclared: "
              "Action test.undeclared is not registered");
}

// Criticals are fatal here: nothing may be read out of such an answer.
TEST_F(AuthzCheck, AnswerOfAnotherFormIsAnError) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    for (int form = 0; form < 8; form++) {
        const std::string action = "test.form." + std::to_string(form);
        EXPECT_EQ(verdict(action.c_str()),
                  "0 authz 2 cannot check action " + action + ": the answer has no valid form");
    }
}

TEST_F(AuthzCheck, AsksForTheBusNameWithoutDetailsAndInteraction) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] { say(check(":1.4711", "test.question")); }),
              "0 authz 2 cannot check action test.question: "
              "system-bus-name :1.4711, 0 details, flags 0");
}

TEST_F(AuthzCheck, CallerWithoutUniqueNameIsRefusedUnasked) {
    EXPECT_EQ(text_from_child([] {
                  g_autoptr(GError) error = nullptr;
                  const int result = authz_check(nullptr, "test.allowed", &error);
                  say(describe_outcome(result, error));
              }),
              "0 authz 5 cannot check action test.allowed: the caller has no unique bus name");
    for (const char *sender : {"", "com.zintor.PrivaneSystem", "1.5", ":1.5\xff"}) {
        EXPECT_EQ(text_from_child([&] { say(check(sender, "test.allowed")); }),
                  "0 authz 5 cannot check action test.allowed: the caller has no unique bus name");
    }
}

TEST_F(AuthzCheck, ActionWithoutTheFormOfOneIsRefusedUnasked) {
    for (const char *action :
         {static_cast<const char *>(nullptr), "", "a b", "a/b", "a\n", "\xff"}) {
        EXPECT_EQ(text_from_child([&] { say(check(":1.1", action)); }),
                  "0 authz 5 cannot check an action whose ID has no valid form");
    }
}

TEST_F(AuthzCheck, ErrorMayBeNull) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  const std::string name = own_name();
                  const int refused = authz_check(name.c_str(), "test.refused", nullptr);
                  const int failed = authz_check(name.c_str(), "test.undeclared", nullptr);
                  const int invalid = authz_check(nullptr, nullptr, nullptr);
                  const int allowed = authz_check(name.c_str(), "test.allowed", nullptr);
                  say(std::to_string(refused + failed + invalid) + " " + std::to_string(allowed));
              }),
              "0 1");
}

TEST_F(AuthzCheck, NoPolkitIsAnError) {
    EXPECT_EQ(verdict("test.allowed"),
              "0 authz 3 cannot check action test.allowed: The name org.freedesktop.PolicyKit1 was "
              "not provided by any .service files");
}

TEST(AuthzCheckWithoutBus, IsAnError) {
    const std::string outcome = text_from_child([] {
        g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/bus", TRUE);
        say(check(":1.1", "test.allowed"));
    });
    EXPECT_EQ(outcome,
              "0 authz 3 cannot check action test.allowed: "
              "Could not connect: No such file or directory");
}

TEST_F(AuthzCheck, SilentPolkitIsLeftAtTheDeadline) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  std::string outcome = check_within(300, "test.silent");
                  outcome += "; " + check_within(5000, "test.allowed");
                  say(outcome);
              }),
              "0 authz 4 cannot check action test.silent: no answer in time; 1");
}

// What the bus drops because others fill the queue must not hold everybody up until the deadline.
TEST_F(AuthzCheck, QuestionIsAskedAgainWhenItsAnswerIsLost) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  const gint64 start = g_get_monotonic_time();
                  std::string outcome = check(own_name(), "test.lost-answers");
                  if (g_get_monotonic_time() - start > 10 * G_USEC_PER_SEC)
                      outcome += ", late";
                  // Later questions are asked as usual.
                  outcome += " " + check(own_name(), "test.allowed");
                  authz_release();
                  say(outcome);
              }),
              "1 1");
}

// It would work on every repetition, and be late for the next question.
TEST_F(AuthzCheck, SlowPolkitIsAskedOnce) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  std::string outcome = check(own_name(), "test.late");
                  outcome += " " + check(own_name(), "test.late");
                  outcome += " " + check(own_name(), "test.questions");
                  say(outcome);
              }),
              "1 1 0 authz 2 cannot check action test.questions: 3 questions");
}

TEST_F(AuthzCheck, SilentPolkitIsNotAskedMoreOftenThanItIsProbed) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  std::string outcome = check_within(600, "test.silent");
                  outcome += " " + check(own_name(), "test.questions");
                  say(outcome);
              }),
              "0 authz 4 cannot check action test.silent: no answer in time "
              "0 authz 2 cannot check action test.questions: 3 questions");
}

// Several probes wait behind the question, and the answer of each tells of the same loss.
TEST_F(AuthzCheck, LostAnswerOfASlowPolkitIsAskedForOnce) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  std::string outcome = check(own_name(), "test.late-in-vain");
                  outcome += " " + check(own_name(), "test.questions");
                  say(outcome);
              }),
              "1 0 authz 2 cannot check action test.questions: 3 questions");
}

TEST_F(AuthzCheck, FrozenPolkitIsLeftAtTheDeadline) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());
    polkit.freeze();

    EXPECT_EQ(text_from_child([] { say(check_within(300, "test.allowed")); }),
              "0 authz 4 cannot check action test.allowed: no answer in time");
}

static gboolean mark(void *data) {
    *static_cast<bool *>(data) = true;
    return G_SOURCE_REMOVE;
}

TEST_F(AuthzCheck, NoSourceOfTheProgramRunsMeanwhile) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  bool ran = false;
                  const std::string name = own_name();
                  g_idle_add(mark, &ran);
                  std::string outcome = check(name, "test.allowed");
                  if (ran)
                      outcome += ", the idle source ran";
                  if (g_main_context_get_thread_default() != nullptr)
                      outcome += ", another context is left in place";
                  while (!ran)
                      g_main_context_iteration(nullptr, TRUE);
                  say(outcome);
              }),
              "1");
}

// The second in line takes over polkit's name; a question to the first would go nowhere.
TEST_F(AuthzCheck, NextPolkitIsAskedWhenOneEnded) {
    const fake_polkit first;
    const fake_polkit second;
    ASSERT_TRUE(first.ready() && second.ready());

    EXPECT_EQ(text_from_child([] {
                  const std::string name = own_name();
                  std::string outcome = check(name, "test.last-answer");
                  for (int i = 0; i < 20; i++)
                      outcome += " " + check(name, "test.allowed");
                  say(outcome);
              }),
              "1 1 1 1 1 1 1 1 1 1 1 1 1 1 1 1 1 1 1 1 1");
}

TEST_F(AuthzCheck, QuestionIsAskedAgainWhenPolkitEndsOverIt) {
    const fake_polkit first(fake_polkit::end::MORTAL);
    const fake_polkit second;
    ASSERT_TRUE(first.ready() && second.ready());

    EXPECT_EQ(verdict("test.last-question"), "1");
}

TEST_F(AuthzCheck, QuestionThatEndsEveryPolkitIsAnError) {
    const fake_polkit first(fake_polkit::end::MORTAL);
    const fake_polkit second(fake_polkit::end::MORTAL);
    ASSERT_TRUE(first.ready() && second.ready());

    EXPECT_EQ(verdict("test.last-question"),
              "0 authz 3 cannot check action test.last-question: "
              "Message recipient disconnected from message bus without replying");
}

TEST(AuthzRelease, WithoutACheckIsHarmless) {
    EXPECT_EQ(text_from_child([] {
                  authz_release();
                  authz_release();
                  say("released");
              }),
              "released");
}

// GDBus's own thread may hold the connection a moment longer.
static bool is_gone_soon(GDBusConnection *const *watched) {
    for (int i = 0; i < 5000 && *watched != nullptr; i++)
        g_usleep(1000);
    return *watched == nullptr;
}

TEST_F(AuthzCheck, ReleaseClosesTheBusAndALaterCheckOpensIt) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([] {
                  // The caller's name may be anyone's, which saves a connection of the test's own.
                  std::string outcome = check(":1.1", "test.allowed");
                  GDBusConnection *watched = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
                  g_object_add_weak_pointer(G_OBJECT(watched), reinterpret_cast<void **>(&watched));
                  g_object_unref(watched);
                  outcome += watched != nullptr ? ", held" : ", not held";
                  authz_release();
                  authz_release();
                  outcome += is_gone_soon(&watched) ? ", gone" : ", held";
                  outcome += ", " + check(":1.1", "test.allowed");
                  authz_release();
                  say(outcome);
              }),
              "1, held, gone, 1");
}

static bool has_owner(const char *name) {
    g_autoptr(GDBusConnection) bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
        "NameHasOwner", g_variant_new("(s)", name), G_VARIANT_TYPE("(b)"), G_DBUS_CALL_FLAGS_NONE,
        -1, nullptr, nullptr);
    gboolean owned = FALSE;

    g_variant_get(reply, "(b)", &owned);
    return owned != FALSE;
}

TEST_F(AuthzCheck, QuestionThatWasLeftIsNoDangerToTheRelease) {
    const fake_polkit polkit;
    ASSERT_TRUE(polkit.ready());

    EXPECT_EQ(text_from_child([&] {
                  std::string outcome = check_within(5000, "test.allowed");
                  polkit.freeze();
                  outcome += ", " + check_within(300, "test.allowed").substr(0, 9);
                  polkit.kill();
                  while (has_owner("org.freedesktop.PolicyKit1"))
                      g_usleep(1000);
                  g_usleep(50000);  // The signal has come, and is waiting.
                  polkit_client_release();
                  say(outcome + ", released");
              }),
              "1, 0 authz 4, released");
}
