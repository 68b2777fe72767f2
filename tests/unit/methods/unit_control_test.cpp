// tests/unit/methods/unit_control_test.cpp: what no call over the bus can hand to the unit methods.
#include "methods/system/unit_control.h"

#include <gtest/gtest.h>

// The critical that comes next, which the test's environment would make fatal.
static void expect_critical(const char *expression) {
    g_autofree char *pattern = g_strdup_printf("*assertion '%s' failed", expression);
    g_test_expect_message(G_LOG_DOMAIN, G_LOG_LEVEL_CRITICAL, pattern);
}

TEST(UnitControl, SystemdNeedsAConnectionAndArguments) {
    g_autoptr(GDBusConnection) connection =
        G_DBUS_CONNECTION(g_object_new(G_TYPE_DBUS_CONNECTION, nullptr));
    g_autoptr(GVariant) arguments = g_variant_ref_sink(g_variant_new("(ss)", "a.service", "b"));
    g_autoptr(GError) error = nullptr;

    expect_critical("conn != NULL");
    EXPECT_FALSE(privane_call_systemd(nullptr, "StartUnit", arguments, &error));
    g_test_assert_expected_messages();
    EXPECT_EQ(error, nullptr);

    expect_critical("args != NULL");
    EXPECT_FALSE(privane_call_systemd(connection, "StartUnit", nullptr, &error));
    g_test_assert_expected_messages();
    EXPECT_EQ(error, nullptr);
}

// Nothing but the unit is looked at, so nothing else is needed.
TEST(UnitControl, AbsentUnitIsNotAnswered) {
    expect_critical("unit != NULL");
    EXPECT_FALSE(privane_handle_unit_action(nullptr, nullptr, "startservice", nullptr, ".service",
                                            start_unit, privane_system__complete_start_service,
                                            PRIVANE_ERROR_START_SERVICE, nullptr));
    g_test_assert_expected_messages();
}

static bool refuse_without_error(GDBusConnection *, const char *, GError **) {
    return false;
}

TEST(UnitControl, FailureWithoutAnErrorHasAText) {
    static constexpr fixed_unit row = {"ntp.service", refuse_without_error,
                                       privane_system__complete_start_ntp, PRIVANE_ERROR_START_NTP,
                                       "Failed to start ntp service"};
    ServiceState state = {};
    method_call call = {nullptr, nullptr, &state, nullptr};

    EXPECT_FALSE(act_on_fixed_unit(call, row));
    ASSERT_TRUE(g_error_matches(call.error, PRIVANE_ERROR, PRIVANE_ERROR_START_NTP));
    EXPECT_STREQ(call.error->message, "Failed to start ntp service: unknown error");
    g_clear_error(&call.error);
}
