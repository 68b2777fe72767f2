// tests/unit/platform/policy_check_test.cpp: the library that a policy file answers, as a whole.
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>

#include <sys/stat.h>
#include <unistd.h>

#include <gio/gio.h>
#include <gtest/gtest.h>

#include "platform/authz/authz.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/outcome.h"
#include "tests/unit/platform/private_bus.h"
#include "tests/unit/platform/private_etc.h"
#include "tests/unit/platform/process_state.h"

namespace fs = std::filesystem;

static void write_file(const std::string &path, const std::string &text) {
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream(path) << text;
}

static void grant(const std::string &whom) {
    write_file(AUTHZ_POLICY_FILE, "[role a]\n" + whom + "\nactions=x.y;x.z.*\n");
    (void)chmod(AUTHZ_POLICY_FILE, 0644);
}

// The unique name of this process, which asks about itself; its connection stays.
static std::string own_name() {
    static GDBusConnection *bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
    return bus != nullptr ? g_dbus_connection_get_unique_name(bus) : "no bus";
}

static std::string check(const char *sender, const char *action) {
    g_autoptr(GError) error = nullptr;
    const int result = authz_check(sender, action, &error);
    return describe_outcome(result, error);
}

static std::string check_own(const char *action) {
    return check(own_name().c_str(), action);
}

class PolicyCheck : public testing::Test {
  protected:
    PolicyCheck() : bus_(private_bus::polkit::UNKNOWN) {}

    void SetUp() override { ASSERT_TRUE(bus_.ready()); }

    // In a child with a /etc of its own, in which "me" and "us" are the user and the group of this
    // process, and "you" and "them" are not.
    static std::string in_etc(const std::function<std::string()> &work) {
        const uid_t uid = geteuid();
        const gid_t gid = getegid();
        return text_from_child([&] {
            if (!enter_private_etc()) {
                say("no private /etc");
                return;
            }
            write_file("/etc/passwd", "me:x:" + std::to_string(uid) +
                                          ":0:::\nyou:x:" + std::to_string(uid + 1) + ":0:::\n");
            write_file("/etc/group", "us:x:" + std::to_string(gid) +
                                         ":\nthem:x:" + std::to_string(gid + 12345) + ":me\n");
            const std::string outcome = work();
            authz_release();
            say(outcome);
        });
    }

    static std::string refusal(const std::string &action) {
        return "0 authz 1 action " + action + " is refused to uid " + std::to_string(geteuid());
    }

    static std::string broken(const std::string &why) {
        return std::string("0 authz 2 cannot check action x.y: ") + AUTHZ_POLICY_FILE + why;
    }

    private_bus bus_;
};

TEST_F(PolicyCheck, UserOfARoleIsAllowed) {
    EXPECT_EQ(in_etc([] {
                  grant("users=you;me");
                  return check_own("x.y") + " " + check_own("x.z.a") + " " + check_own("x.y");
              }),
              "1 1 1");
}

TEST_F(PolicyCheck, MemberOfAGroupIsAllowed) {
    EXPECT_EQ(in_etc([] {
                  grant("groups=us");
                  return check_own("x.y");
              }),
              "1");
}

TEST_F(PolicyCheck, RefusalNamesActionAndUid) {
    EXPECT_EQ(in_etc([] {
                  grant("users=me");
                  return check_own("x.a");
              }),
              refusal("x.a"));
    EXPECT_EQ(in_etc([] {
                  grant("users=you\ngroups=them");
                  return check_own("x.y");
              }),
              refusal("x.y"));
}

TEST_F(PolicyCheck, RefusalOfACallerWhoIsGoneSaysSo) {
    EXPECT_EQ(in_etc([] {
                  grant("users=me");
                  return check(":1.99999", "x.y");
              }),
              "0 authz 1 action x.y is refused to :1.99999, whose uid is not known");
}

TEST_F(PolicyCheck, BrokenFileIsNamedWithLineAndReason) {
    EXPECT_EQ(in_etc([] {
                  grant("user=me");
                  return check_own("x.y");
              }),
              broken(":2: unknown key 'user'"));
    EXPECT_EQ(
        in_etc([] { return check_own("x.y"); }),
        "0 authz 2 cannot check action x.y: " + fs::path(AUTHZ_POLICY_FILE).parent_path().string() +
            ": No such file or directory");
    EXPECT_EQ(in_etc([] {
                  fs::create_directories(fs::path(AUTHZ_POLICY_FILE).parent_path());
                  return check_own("x.y");
              }),
              broken(": No such file or directory"));
    EXPECT_EQ(in_etc([] {
                  grant("users=me");
                  (void)chmod(AUTHZ_POLICY_FILE, 0666);
                  return check_own("x.y");
              }),
              broken(": others than root may write it"));
}

TEST_F(PolicyCheck, FileThatIsMendedCountsWithoutARestart) {
    EXPECT_EQ(in_etc([] {
                  std::string outcome = std::to_string(authz_init(nullptr));
                  outcome += " " + check_own("x.y").substr(0, 9);
                  grant("users=me");
                  outcome += " " + check_own("x.y");
                  grant("users=you");
                  outcome += " " + check_own("x.y").substr(0, 9);
                  grant("users=me");
                  return outcome + " " + check_own("x.y");
              }),
              "1 0 authz 2 1 0 authz 1 1");
}

TEST_F(PolicyCheck, CallerWithoutUniqueNameIsRefusedUnasked) {
    for (const char *sender :
         {static_cast<const char *>(nullptr), "", "com.zintor.PrivaneSystem", "1.5", ":1.5\xff"}) {
        EXPECT_EQ(text_from_child([&] { say(check(sender, "x.y")); }),
                  "0 authz 5 cannot check action x.y: the caller has no unique bus name");
    }
}

TEST_F(PolicyCheck, ActionWithoutTheFormOfOneIsRefusedUnasked) {
    for (const char *action :
         {static_cast<const char *>(nullptr), "", "a b", "a/b", "a\n", "\xff", "x.*"}) {
        EXPECT_EQ(text_from_child([&] { say(check(":1.1", action)); }),
                  "0 authz 5 cannot check an action whose ID has no valid form");
    }
}

TEST_F(PolicyCheck, ErrorMayBeNull) {
    EXPECT_EQ(in_etc([] {
                  std::string outcome;
                  for (const char *whom : {"users=me", "users=you", "broken"}) {
                      grant(whom);
                      outcome += std::to_string(authz_check(own_name().c_str(), "x.y", nullptr));
                  }
                  outcome += std::to_string(authz_check(":1.99999", "x.y", nullptr));
                  return outcome + std::to_string(authz_check(nullptr, nullptr, nullptr));
              }),
              "10000");
}

// What was allowed a moment ago is not when the file of accounts says otherwise.
TEST_F(PolicyCheck, AccountsCountAsTheyAre) {
    EXPECT_EQ(in_etc([] {
                  grant("users=me");
                  std::string outcome = check_own("x.y");
                  write_file("/etc/passwd", "me:x:99:0:::\n");
                  return outcome + " " + check_own("x.y").substr(0, 9);
              }),
              "1 0 authz 1");
}

TEST(PolicyInit, SucceedsAndLeavesNothing) {
    EXPECT_EQ(text_from_child([] {
                  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/bus", TRUE);
                  const auto descriptors = list_descriptors();
                  g_autoptr(GError) error = nullptr;
                  const int result = authz_init(&error);
                  std::string outcome = describe_outcome(result, error);
                  outcome += count_threads() != 1 ? ", threads" : "";
                  outcome += list_descriptors() != descriptors ? ", descriptors" : "";
                  outcome += has_children() ? ", children" : "";
                  say(outcome);
              }),
              "1");
}

TEST(PolicyRelease, WithoutACheckIsHarmless) {
    EXPECT_EQ(text_from_child([] {
                  authz_release();
                  authz_release();
                  say("released");
              }),
              "released");
}

TEST_F(PolicyCheck, LaterCheckConnectsAnew) {
    EXPECT_EQ(in_etc([] {
                  grant("users=me");
                  std::string outcome = check_own("x.y");
                  authz_release();
                  return outcome + " " + check_own("x.y");
              }),
              "1 1");
}
