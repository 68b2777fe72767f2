// tests/unit/client/error_text_test.cpp: the line that tells an error.
#include "client/error_text.h"

#include <string>

#include <gio/gio.h>
#include <gtest/gtest.h>

#include "client/client_error.h"
#include "docs/examples/callers/service_error.hpp"

namespace {

std::string line_of(GError *error) {
    g_autoptr(GError) owned = error;
    g_autofree char *line = error_text_line(owned);
    return line;
}

std::string sent(const char *name, const char *text) {
    return line_of(g_dbus_error_new_for_dbus_error(name, text));
}

// What GDBus makes of a domain and a code is split again, by the client and by the example of the
// callers' guide.
TEST(ErrorName, IsSplitAsGDBusWroteIt) {
    static constexpr const char *DOMAINS[] = {"usermgmt", "g-file-error-quark", "a_b.c d"};
    for (const char *name : DOMAINS) {
        g_autoptr(GError) made = g_error_new(g_quark_from_string(name), 101, "text");
        g_autofree char *encoded = g_dbus_error_encode_gerror(made);
        g_autofree char *domain = nullptr;
        int code = 0;

        ASSERT_TRUE(error_name_split(encoded, &domain, &code)) << encoded;
        EXPECT_STREQ(domain, name);
        EXPECT_EQ(code, 101);
        const auto decoded = decode_error(encoded);
        ASSERT_TRUE(decoded) << encoded;
        EXPECT_EQ(decoded->domain, name);
        EXPECT_EQ(decoded->code, 101);
    }
}

TEST(ErrorName, OfAnotherKindIsLeft) {
    static constexpr const char *NAMES[] = {
        "org.freedesktop.DBus.Error.AccessDenied",
        "org.gtk.GDBus.UnmappedGError.Quark._",
        "org.gtk.GDBus.UnmappedGError.Quark._usermgmt",
        "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code",
        "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code6x",
        "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code99999999999",
        "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code-99999999999",
        "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code 6",
        "org.gtk.GDBus.UnmappedGError.Quark._.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_2.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_",
        "org.gtk.GDBus.UnmappedGError.Quark._a_.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_zz.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_2z.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_-1.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_+1.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a_00.Code6",
        "org.gtk.GDBus.UnmappedGError.Quark._a-b.Code6",
        "",
    };
    for (const char *name : NAMES) {
        g_autofree char *domain = nullptr;
        int code = 77;

        EXPECT_FALSE(error_name_split(name, &domain, &code)) << name;
        EXPECT_EQ(domain, nullptr);
        EXPECT_EQ(code, 77);
        EXPECT_FALSE(decode_error(name)) << name;
    }
}

TEST(ErrorLine, HasTextDomainAndCode) {
    EXPECT_EQ(sent("org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code6", "user already exists"),
              "user already exists (usermgmt 6)");
    EXPECT_EQ(sent("org.gtk.GDBus.UnmappedGError.Quark._g_2dfile_2derror_2dquark.Code4", "no file"),
              "no file (g-file-error-quark 4)");
}

TEST(ErrorLine, HasTheNameOfAnErrorOfTheBus) {
    EXPECT_EQ(sent("org.freedesktop.DBus.Error.AccessDenied", "Rejected"),
              "Rejected (org.freedesktop.DBus.Error.AccessDenied)");
    EXPECT_EQ(sent("com.example.Odd", "text"), "text (com.example.Odd)");
}

TEST(ErrorLine, KeepsToOneLine) {
    EXPECT_EQ(
        sent("org.gtk.GDBus.UnmappedGError.Quark._privaneSystemError.Code2", "Unknown! (3)\n"),
        "Unknown! (3) (privaneSystemError 2)");
    EXPECT_EQ(sent("org.gtk.GDBus.UnmappedGError.Quark._a_0ab.Code2", "x\ny\x1b"),
              "x\\x0ay\\x1b (a\\x0ab 2)");
}

TEST(ErrorLine, OfTheClientHasItsTextAlone) {
    GError *error = nullptr;
    EXPECT_FALSE(fail_usage(&error, "no '%s'\xff", "x"));
    EXPECT_EQ(line_of(error), "no 'x'\ufffd");
}

TEST(ErrorLine, OfTheLibraryHasDomainAndCode) {
    EXPECT_EQ(line_of(g_error_new(G_IO_ERROR, G_IO_ERROR_TIMED_OUT, "Timeout was reached")),
              "Timeout was reached (g-io-error-quark 24)");
}

}  // namespace
