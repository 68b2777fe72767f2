// tests/unit/service/reply_test.cpp: what may go out on the bus.
#include "service/reply.h"

#include <cstring>
#include <string>
#include <vector>

#include <gio/gio.h>
#include <gtest/gtest.h>

// A critical record ends the test program.
static const GLogLevelFlags levels_before = g_log_set_always_fatal(
    static_cast<GLogLevelFlags>(G_LOG_FATAL_MASK | G_LOG_LEVEL_CRITICAL | G_LOG_LEVEL_WARNING));

struct text_case {
    const char *raw;
    const char *sendable;
};

static constexpr text_case texts[] = {
    {nullptr,         ""                                    },
    {"",              ""                                    },
    {"plain",         "plain"                               },
    {"line\nend\x01", "line\nend\x01"                       },
    {"J\xc3\xb6rg",   "J\xc3\xb6rg"                         },
    {"\xe2\x82\xac",  "\xe2\x82\xac"                        },
    {"J\xf6rg",       "J\xef\xbf\xbdrg"                     },
    {"\xff\xfe",      "\xef\xbf\xbd\xef\xbf\xbd"            },
    {"end\xc3",       "end\xef\xbf\xbd"                     },
    {"\xed\xa0\x80",  "\xef\xbf\xbd\xef\xbf\xbd\xef\xbf\xbd"}, // a surrogate
    {"\xc0\x80",      "\xef\xbf\xbd\xef\xbf\xbd"            }, // an overlong NUL
};

TEST(Reply, InvalidBytesAreReplacedOneByOne) {
    for (const text_case &row : texts) {
        g_autofree char *sendable = sendable_text(row.raw);
        EXPECT_STREQ(sendable, row.sendable);
        EXPECT_NE(sendable, row.raw);
        EXPECT_TRUE(g_utf8_validate(sendable, -1, nullptr));
    }
}

TEST(Reply, ListIsMadeSendableElementByElement) {
    static constexpr const char *raw[] = {"plain", "J\xf6rg", "", "\xff", nullptr};
    g_auto(GStrv) list = g_strdupv(const_cast<char **>(raw));
    const char *const plain = list[0];
    make_sendable(list);
    ASSERT_EQ(g_strv_length(list), 4U);
    EXPECT_STREQ(list[0], "plain");
    EXPECT_EQ(list[0], plain);
    EXPECT_STREQ(list[1], "J\xef\xbf\xbdrg");
    EXPECT_STREQ(list[2], "");
    EXPECT_STREQ(list[3], "\xef\xbf\xbd");
}

TEST(Reply, EmptyListStaysAnEmptyList) {
    char *none[] = {nullptr};
    make_sendable(none);
    EXPECT_EQ(none[0], nullptr);
}

// Bytes of the body that GDBus makes of a value: the message says so itself.
static gsize body_size(GVariant *body) {
    g_autoptr(GDBusMessage) message = g_dbus_message_new();
    g_dbus_message_set_message_type(message, G_DBUS_MESSAGE_TYPE_METHOD_RETURN);
    g_dbus_message_set_byte_order(message, G_DBUS_MESSAGE_BYTE_ORDER_LITTLE_ENDIAN);
    g_dbus_message_set_serial(message, 1);
    g_dbus_message_set_reply_serial(message, 1);
    g_dbus_message_set_body(message, body);
    gsize size = 0;
    g_autoptr(GError) error = nullptr;
    g_autofree guchar *blob =
        g_dbus_message_to_blob(message, &size, G_DBUS_CAPABILITY_FLAGS_NONE, &error);
    EXPECT_NE(blob, nullptr) << (error != nullptr ? error->message : "");
    guint32 length = 0;
    if (blob != nullptr)
        std::memcpy(&length, blob + 4, sizeof length);
    return GUINT32_FROM_LE(length);
}

TEST(Reply, WireSizeOfTextIsAnUpperBound) {
    for (std::size_t length = 0; length < 20; length++) {
        const std::string text(length, 'a');
        EXPECT_EQ(wire_size(text.c_str()), length + 8);
        EXPECT_GE(wire_size(text.c_str()), body_size(g_variant_new("(s)", text.c_str())));
    }
}

TEST(Reply, WireSizeOfListIsAnUpperBound) {
    std::vector<std::string> texts_of_list;
    for (std::size_t length = 0; length < 20; length++) {
        std::vector<const char *> list;
        gsize expected = 4;
        for (const std::string &text : texts_of_list) {
            list.push_back(text.c_str());
            expected += text.size() + 8;
        }
        list.push_back(nullptr);
        EXPECT_EQ(wire_size(list.data()), expected);
        EXPECT_GE(expected, body_size(g_variant_new("(^as)", list.data())));
        texts_of_list.push_back(std::string(length, 'a'));
    }
}

// Lists behind each other need padding between them: the sum still covers it.
TEST(Reply, WireSizesOfSeveralValuesAddUp) {
    for (std::size_t length = 0; length < 9; length++) {
        const std::string text(length, 'a');
        const char *list[] = {text.c_str(), "b", text.c_str(), nullptr};
        EXPECT_GE(2 * wire_size(text.c_str()) + 2 * wire_size(list),
                  body_size(g_variant_new("(s^ass^as)", text.c_str(), list, text.c_str(), list)));
    }
}

TEST(Reply, SizeUpToTheLimitPasses) {
    for (const gsize size : {gsize{0}, gsize{1}, gsize{33488896}}) {
        g_autoptr(GError) error = nullptr;
        EXPECT_TRUE(check_reply_size(size, &error));
        EXPECT_EQ(error, nullptr);
    }
}

TEST(Reply, SizeAboveTheLimitIsAFileError) {
    g_autoptr(GError) error = nullptr;
    EXPECT_FALSE(check_reply_size(33488897, &error));
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->domain, G_FILE_ERROR);
    EXPECT_EQ(error->code, int{G_FILE_ERROR_FAILED});
    EXPECT_STREQ(error->message, "The reply of 33488897 bytes is larger than a bus message may be");
    EXPECT_FALSE(check_reply_size(G_MAXSIZE, nullptr));
}

// The limit leaves room for the header below what dbus-daemon takes by default.
TEST(Reply, LimitIsBelowTheBusDaemons) {
    const gsize limit = gsize{32} * 1024 * 1024;
    EXPECT_FALSE(check_reply_size(limit, nullptr));
    EXPECT_TRUE(check_reply_size(limit - 65536, nullptr));
}
