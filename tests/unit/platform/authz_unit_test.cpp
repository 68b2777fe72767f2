// tests/unit/platform/authz_unit_test.cpp: an action on a unit, by itself or by its parent.
#include <string>

#include <unistd.h>

#include <gio/gio.h>
#include <gtest/gtest.h>

#include "platform/authz/authz.h"
#include "platform/authz/polkit/polkit_client.h"
#include "platform/authz/polkit/unit_action.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/outcome.h"
#include "tests/unit/platform/private_bus.h"

static const std::string PREFIX = "com.zintor.privane-system.";

// "PARENT UNIT" without the prefix; "none" for an action that is no unit's.
static std::string parse(const std::string &action) {
    g_auto(unit_action) parsed = {};

    if (!unit_action_parse(action.c_str(), &parsed))
        return parsed.parent == nullptr && parsed.unit == nullptr ? "none" : "something to clear";
    const std::string parent = parsed.parent;
    return (parent.rfind(PREFIX, 0) == 0 ? parent.substr(PREFIX.size()) : parent) + " " +
           parsed.unit;
}

TEST(UnitAction, IsTheFiveActionsWithAUnit) {
    EXPECT_EQ(parse(PREFIX + "startservice.sshd"), "startservice sshd");
    EXPECT_EQ(parse(PREFIX + "stopservice.sshd"), "stopservice sshd");
    EXPECT_EQ(parse(PREFIX + "restartservice.sshd"), "restartservice sshd");
    EXPECT_EQ(parse(PREFIX + "reloadservice.sshd"), "reloadservice sshd");
    EXPECT_EQ(parse(PREFIX + "setdefaulttarget.multi-user"), "setdefaulttarget multi-user");
}

TEST(UnitAction, TemplateEndsInAt) {
    EXPECT_EQ(parse(PREFIX + "startservice.getty.any"), "startservice getty@");
    EXPECT_EQ(parse(PREFIX + "setdefaulttarget.a.any"), "setdefaulttarget a@");
    EXPECT_EQ(parse(PREFIX + "startservice.any"), "startservice any");
    EXPECT_EQ(parse(PREFIX + "startservice.any.any"), "startservice any@");
}

// Systemd refuses such units; that is not for the authorization to say.
TEST(UnitAction, NameMayBeEmpty) {
    EXPECT_EQ(parse(PREFIX + "startservice."), "startservice ");
    EXPECT_EQ(parse(PREFIX + "startservice..any"), "startservice @");
}

TEST(UnitAction, OtherActionsAreNone) {
    for (const char *action :
         {"", "startservice", "getuser", "getactivenetworkinfo.all", "startntp",
          "startservices.sshd", "Startservice.sshd", "startservice.a.b", "startservice.a.any.any",
          "startservice.a.anyone", "startservice.a.", "startservice.a..any",
          "startservice.a.Any"}) {
        EXPECT_EQ(parse(PREFIX + action), "none") << action;
    }
    EXPECT_EQ(parse("com.zintor.privane-systems.startservice.sshd"), "none");
    EXPECT_EQ(parse("org.zintor.privane-system.startservice.sshd"), "none");
    EXPECT_EQ(parse("startservice.sshd"), "none");
    EXPECT_EQ(parse(""), "none");
}

class AuthzUnit : public testing::Test {
  protected:
    AuthzUnit() : bus_(private_bus::polkit::UNKNOWN) {}

    void SetUp() override { ASSERT_TRUE(bus_.ready() && polkit_.ready()); }

    private_bus bus_;
    const fake_polkit polkit_;
};

static std::string check_within(int deadline_ms, const std::string &action) {
    return text_from_child([&] {
        // The caller's name is this process's, which has a uid.
        g_autoptr(GDBusConnection) bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
        const std::string sender = g_dbus_connection_get_unique_name(bus);
        g_autoptr(GError) error = nullptr;
        const bool allowed =
            polkit_client_check(sender.c_str(), (PREFIX + action).c_str(), deadline_ms, &error);
        say(describe_outcome(allowed ? 1 : 0, error));
    });
}

static std::string check(const std::string &action) {
    return check_within(20000, action);
}

static std::string refusal(const std::string &action, const std::string &reason = "") {
    return "0 authz 1 action " + PREFIX + action + " is refused to uid " +
           std::to_string(geteuid()) + reason;
}

static const std::string NO_PASSWORD = " without a password, which cannot be given";

TEST_F(AuthzUnit, DeclaredActionDecidesByItself) {
    EXPECT_EQ(check("startservice.declared-allowed"), "1");
    EXPECT_EQ(check("startservice.declared-refused"), refusal("startservice.declared-refused"));
    EXPECT_EQ(check("startservice.declared-password"),
              refusal("startservice.declared-password", NO_PASSWORD));
}

TEST_F(AuthzUnit, ParentDecidesWhereTheActionIsNotDeclared) {
    for (const char *action : {"startservice", "stopservice", "restartservice", "reloadservice"}) {
        const std::string parent = action;
        EXPECT_EQ(check(parent + ".allowed"), "1");
        EXPECT_EQ(check(parent + ".refused"), refusal(parent + ".refused"));
        EXPECT_EQ(check(parent + ".password"), refusal(parent + ".password", NO_PASSWORD));
    }
}

TEST_F(AuthzUnit, ParentIsToldTheActionAndTheUnit) {
    const auto question = [](const std::string &action) {
        return text_from_child([&] {
            g_autoptr(GError) error = nullptr;
            const int result = authz_check(":1.4711", (PREFIX + action).c_str(), &error);
            say(describe_outcome(result, error));
        });
    };
    const std::string asked = "system-bus-name :1.4711, 2 details, flags 0";

    EXPECT_EQ(question("stopservice.sshd"), "0 authz 2 cannot check action " + PREFIX +
                                                "stopservice.sshd: " + asked + ", action " +
                                                PREFIX + "stopservice.sshd, unit sshd");
    EXPECT_EQ(question("startservice.getty.any"),
              "0 authz 2 cannot check action " + PREFIX + "startservice.getty.any: " + asked +
                  ", action " + PREFIX + "startservice.getty.any, unit getty@");
}

TEST_F(AuthzUnit, ParentThatIsNotDeclaredIsAnError) {
    EXPECT_EQ(check("setdefaulttarget.allowed"), "0 authz 2 cannot check action " + PREFIX +
                                                     "setdefaulttarget.allowed: Action " + PREFIX +
                                                     "setdefaulttarget is not registered");
}

TEST_F(AuthzUnit, OtherActionsHaveNoParent) {
    for (const char *action : {"getuser.allowed", "startservice.allowed.b", "nosuchaction.x.any"}) {
        const std::string id = PREFIX + action;
        EXPECT_EQ(check(action),
                  "0 authz 2 cannot check action " + id + ": Action " + id + " is not registered");
    }
}

TEST_F(AuthzUnit, OtherErrorAsksNoParent) {
    const std::string id = PREFIX + "startservice.broken";

    EXPECT_EQ(check("startservice.broken"),
              "0 authz 2 cannot check action " + id + ": Action " + id + " is broken");
}

TEST_F(AuthzUnit, OneDeadlineHoldsForBothQuestions) {
    const gint64 start = g_get_monotonic_time();

    EXPECT_EQ(check_within(300, "startservice.silent"),
              "0 authz 4 cannot check action " + PREFIX + "startservice.silent: no answer in time");
    EXPECT_LT(g_get_monotonic_time() - start, 5 * G_USEC_PER_SEC);
}

TEST_F(AuthzUnit, ParentHasOnlyWhatIsLeftOfTheDeadline) {
    const gint64 start = g_get_monotonic_time();

    EXPECT_EQ(check_within(1500, "startservice.slow"),
              "0 authz 4 cannot check action " + PREFIX + "startservice.slow: no answer in time");
    EXPECT_LT(g_get_monotonic_time() - start, 2300 * 1000);
}

TEST_F(AuthzUnit, FrozenPolkitAsksNoParent) {
    polkit_.freeze();

    EXPECT_EQ(
        check_within(300, "startservice.allowed"),
        "0 authz 4 cannot check action " + PREFIX + "startservice.allowed: no answer in time");
}
