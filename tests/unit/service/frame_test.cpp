// tests/unit/service/frame_test.cpp: what a caller is answered when a method's work fails.
//
// The methods run behind a real skeleton on a connection of two ends in this process. Authorization
// and the database are the test's own.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include <gio/gio.h>

#include "methods/accounts/queries.h"
#include "platform/authz/authz.h"
#include "service/method.h"
#include "tests/unit/service/bus_pair.h"
#include "usermgmt/usermgmt.h"

static constexpr const char *OBJECT_PATH = "/com/zintor/PrivaneSystem";
static constexpr const char *INTERFACE = "com.zintor.PrivaneSystem";

static bool authz_allows;
static std::vector<std::string> asked_actions;
static int failing_group;

int authz_check(const char *, const char *action_id, GError **) {
    asked_actions.emplace_back(action_id);
    return authz_allows ? 1 : 0;
}

// The database: groups g0, g1 and g2.
gboolean usermgmt_get_all_groups(const usermgmt_ctx *, char ***out_groupnames, GError **) {
    *out_groupnames = g_strsplit("g0:g1:g2", ":", -1);
    return TRUE;
}

gboolean usermgmt_get_group(const usermgmt_ctx *, const char *groupname, guint32 *out_gid,
                            char ***out_members, GError **error) {
    const int number = groupname[1] - '0';
    if (number == failing_group) {
        g_set_error(error, g_quark_from_static_string("usermgmt"), USERMGMT_ERROR_GROUP,
                    "Group '%s' does not exist", groupname);
        return FALSE;
    }
    *out_gid = static_cast<guint32>(number);
    *out_members = g_new0(char *, 1);
    return TRUE;
}

gboolean usermgmt_get_all_users(const usermgmt_ctx *, char ***, GList **, GError **) {
    return FALSE;
}
gboolean usermgmt_get_user(const usermgmt_ctx *, const char *, user_entry *, GError **) {
    return FALSE;
}
gboolean usermgmt_user_exists(const usermgmt_ctx *, const char *) {
    return FALSE;
}
gboolean usermgmt_group_exists(const usermgmt_ctx *, const char *) {
    return FALSE;
}
void usermgmt_free_user_entry(user_entry *) {}

// Works that fail, each in one of the ways a work may.
static bool work_without_error(method_call &, const char *) {
    return false;
}

static bool work_with_own_error(method_call &call, const char *user) {
    return fail(call, PRIVANE_ERROR_CHIP, "Failed for '%s', error=%d", user, -7);
}

static bool work_with_lower_error(method_call &call, const char *user) {
    call.error = g_error_new(g_quark_from_static_string("usermgmt"), 3, "no user %s", user);
    return pass_on(call, "Failed to look: ");
}

// Larger than a message of the bus may be.
static bool work_with_huge_error(method_call &call, const char *) {
    call.error = g_error_new_literal(g_quark_from_static_string("usermgmt"), 3,
                                     std::string(std::size_t{32} << 20, 'x').c_str());
    return false;
}

static bool work_without_lower_error(method_call &call, const char *) {
    return pass_on(call, "Failed to look: ");
}

class Frame : public ::testing::Test {
  protected:
    void SetUp() override {
        authz_allows = true;
        asked_actions.clear();
        failing_group = -1;
        g_log_set_default_handler(record, this);

        ASSERT_TRUE(ends_.is_connected());
        state_.skeleton = privane_system__skeleton_new();
        ASSERT_TRUE(g_dbus_interface_skeleton_export(G_DBUS_INTERFACE_SKELETON(state_.skeleton),
                                                     ends_.server(), OBJECT_PATH, nullptr));
    }

    void TearDown() override {
        g_dbus_interface_skeleton_unexport(G_DBUS_INTERFACE_SKELETON(state_.skeleton));
        g_object_unref(state_.skeleton);
        ends_.close();
        g_log_set_default_handler(g_log_default_handler, nullptr);
    }

    void serve(const method_row &row) { row.connect(row.signal, &state_); }

    // The D-Bus error and its text, or the printed reply.
    std::string answer_of(const char *method, GVariant *arguments) {
        std::string answer;
        g_dbus_connection_call(ends_.client(), nullptr, OBJECT_PATH, INTERFACE, method, arguments,
                               nullptr, G_DBUS_CALL_FLAGS_NONE, -1, nullptr, on_answer, &answer);
        while (answer.empty())
            (void)g_main_context_iteration(nullptr, TRUE);
        return answer;
    }

    std::string check_user() { return answer_of("CheckUser", g_variant_new("(s)", "bob")); }

    const std::vector<std::string> &log() const { return log_; }

  private:
    static void on_answer(GObject *client, GAsyncResult *result, gpointer user_data) {
        g_autoptr(GError) error = nullptr;
        g_autoptr(GVariant) reply =
            g_dbus_connection_call_finish(G_DBUS_CONNECTION(client), result, &error);
        auto *answer = static_cast<std::string *>(user_data);
        if (reply != nullptr) {
            g_autofree char *printed = g_variant_print(reply, FALSE);
            *answer = printed;
        } else {
            g_autofree char *name = g_dbus_error_get_remote_error(error);
            (void)g_dbus_error_strip_remote_error(error);
            *answer = std::string(name) + ": " + error->message;
        }
    }

    static void record(const char *, GLogLevelFlags level, const char *message, gpointer self) {
        static_cast<Frame *>(self)->log_.push_back(std::to_string(level) + " " + message);
    }

    bus_pair ends_;
    ServiceState state_ = {};
    std::vector<std::string> log_;
};

using records_of_log = std::vector<std::string>;

#define PRIVANE_ERROR_NAME "org.gtk.GDBus.UnmappedGError.Quark._privaneSystemError.Code"
#define USERMGMT_ERROR_NAME "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code"

TEST_F(Frame, FailureWithoutAnErrorIsUnknown) {
    serve(method<"checkuser", work_without_error>("handle-check-user"));
    EXPECT_EQ(check_user(), PRIVANE_ERROR_NAME "25: Unknown");
    EXPECT_EQ(log(), records_of_log{});
}

TEST_F(Frame, OwnErrorIsAnsweredAndLoggedOnce) {
    serve(method<"checkuser", work_with_own_error>("handle-check-user"));
    EXPECT_EQ(check_user(), PRIVANE_ERROR_NAME "15: Failed for 'bob', error=-7");
    EXPECT_EQ(log(), records_of_log{"16 Failed for 'bob', error=-7"});
}

TEST_F(Frame, LowerErrorKeepsDomainAndCodeBehindThePrefix) {
    serve(method<"checkuser", work_with_lower_error>("handle-check-user"));
    EXPECT_EQ(check_user(), USERMGMT_ERROR_NAME "3: Failed to look: no user bob");
    EXPECT_EQ(log(), records_of_log{"16 Failed to look: no user bob"});
}

TEST_F(Frame, ErrorTextThatIsTooLargeIsReplaced) {
    static constexpr const char *text =
        "The reply of 33554440 bytes is larger than a bus message may be";
    serve(method<"checkuser", work_with_huge_error>("handle-check-user"));
    EXPECT_EQ(check_user(),
              std::string("org.gtk.GDBus.UnmappedGError.Quark._g_2dfile_2derror_2dquark.Code24: ") +
                  text);
    EXPECT_EQ(log(), records_of_log{std::string("16 ") + text});
}

TEST_F(Frame, MissingLowerErrorIsUnknown) {
    serve(method<"checkuser", work_without_lower_error>("handle-check-user"));
    EXPECT_EQ(check_user(), PRIVANE_ERROR_NAME "25: Unknown");
    EXPECT_EQ(log(), records_of_log{});
}

TEST_F(Frame, RefusedCallerIsNotServed) {
    authz_allows = false;
    serve(method<"checkuser", work_with_own_error>("handle-check-user"));
    EXPECT_EQ(check_user(), PRIVANE_ERROR_NAME "25: Unknown");
    EXPECT_EQ(log(), records_of_log{});
    EXPECT_EQ(asked_actions, records_of_log{"com.zintor.privane-system.checkuser"});
}

TEST_F(Frame, FullGroupListNamesTheEntryThatFails) {
    serve(method<"getgrouplistfull", handle_get_group_list_full>("handle-get-group-list-full"));
    failing_group = 1;
    EXPECT_EQ(answer_of("GetGroupListFull", nullptr),
              USERMGMT_ERROR_NAME "4: Unable to get group entry #1: Group 'g1' does not exist");
    EXPECT_EQ(log(), records_of_log{"16 Unable to get group entry #1: Group 'g1' does not exist"});
}

TEST_F(Frame, FullGroupListIsAlignedByIndex) {
    serve(method<"getgrouplistfull", handle_get_group_list_full>("handle-get-group-list-full"));
    EXPECT_EQ(answer_of("GetGroupListFull", nullptr),
              "(['g0', 'g1', 'g2'], [0, 1, 2], [[], [], []])");
}
