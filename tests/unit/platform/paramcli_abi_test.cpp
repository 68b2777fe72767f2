// tests/unit/platform/paramcli_abi_test.cpp: what callers of the parameter library may rely on.
#include <cstdio>
#include <cstring>
#include <map>
#include <random>
#include <string>

#include <sys/stat.h>

#include <glib.h>
#include <gtest/gtest.h>

#include "platform/paramcli/param_file.h"
#include "platform/paramcli/paramcli.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/private_etc.h"
#include "tests/unit/platform/scratch_folder.h"

static_assert(sizeof(paramcli_options) == 4096);

static constexpr int UNTOUCHED = 4711;

TEST(ParamcliAbi, SuccessLeavesTheErrorSlot) {
    paramcli_options options;
    int error = UNTOUCHED;

    paramcli_reset_options(&options);
    paramcli_set_custom_param("a", "1", &options, &error);
    EXPECT_EQ(error, UNTOUCHED);
    paramcli_reset_options(&options);
    paramcli_sync(&options, &error);
    EXPECT_EQ(error, UNTOUCHED);
}

TEST(ParamcliAbi, NullIsRefused) {
    paramcli_options options;
    int error = 0;

    paramcli_reset_options(&options);
    paramcli_set_custom_param(nullptr, "1", &options, &error);
    EXPECT_EQ(error, PARAMCLI_ERROR_INVALID);
    error = 0;
    paramcli_set_custom_param("a", nullptr, &options, &error);
    EXPECT_EQ(error, PARAMCLI_ERROR_INVALID);
    error = 0;
    paramcli_set_custom_param("a", "1", nullptr, &error);
    EXPECT_EQ(error, PARAMCLI_ERROR_INVALID);
    error = 0;
    paramcli_sync(nullptr, &error);
    EXPECT_EQ(error, PARAMCLI_ERROR_INVALID);

    paramcli_set_custom_param("", "1", &options, nullptr);
    paramcli_sync(nullptr, nullptr);
}

TEST(ParamcliAbi, BlockThatWasNeverResetIsRefused) {
    for (const int garbage : {0x00, 0x01, 0x7f, 0xff}) {
        paramcli_options options;
        std::memset(&options, garbage, sizeof options);
        int error = 0;
        paramcli_set_custom_param("a", "1", &options, &error);
        EXPECT_EQ(error, PARAMCLI_ERROR_INVALID);
        error = 0;
        paramcli_sync(&options, &error);
        EXPECT_EQ(error, PARAMCLI_ERROR_INVALID);
    }
}

TEST(ParamcliAbi, DamagedBlockIsRefused) {
    paramcli_options options;

    for (const unsigned length : {1U, 4088U, 4089U, ~0U}) {
        int error = 0;
        paramcli_reset_options(&options);
        options.length = length;
        paramcli_set_custom_param("a", "1", &options, &error);
        EXPECT_EQ(error, PARAMCLI_ERROR_INVALID) << length;
        error = 0;
        paramcli_sync(&options, &error);
        EXPECT_EQ(error, PARAMCLI_ERROR_INVALID) << length;
    }
}

TEST(ParamcliAbi, BlockCanBeCopied) {
    const scratch_folder folder;
    paramcli_options options;
    int error = 0;

    paramcli_reset_options(&options);
    paramcli_set_custom_param("a", "1", &options, &error);
    paramcli_options copy = options;
    paramcli_reset_options(&options);
    EXPECT_EQ(error, 0);
    EXPECT_EQ(param_file_sync(folder.path("parameters").c_str(), &copy), 0);
    EXPECT_EQ(folder.read("parameters"), "a=1\n");
}

// In a /etc that no other process sees.
TEST(ParamcliAbi, WorksOnTheDevicesFile) {
    const std::string outcome = text_from_child([] {
        g_autofree char *text = nullptr;
        paramcli_options options;
        int error = 0;

        if (!enter_private_etc())
            return;
        paramcli_reset_options(&options);
        paramcli_set_custom_param("root.System.RootPwdSet", "yes", &options, &error);
        paramcli_sync(&options, &error);
        if (!g_file_get_contents("/etc/privane/parameters.conf", &text, nullptr, nullptr))
            (void)std::printf("%d, no file", error);
        else
            (void)std::printf("%d, %s", error, text);
    });
    EXPECT_EQ(outcome, "0, root.System.RootPwdSet=yes\n");
}

TEST(ParamcliAbi, FailedSyncSetsTheErrorSlot) {
    const std::string outcome = text_from_child([] {
        paramcli_options options;
        int error = 0;

        if (!enter_private_etc() || mkdir("/etc/privane", 0755) != 0 ||
            mkdir("/etc/privane/parameters.conf", 0755) != 0)
            return;
        paramcli_reset_options(&options);
        paramcli_set_custom_param("a", "1", &options, &error);
        paramcli_sync(&options, &error);
        (void)std::printf("%d", error);
    });
    EXPECT_EQ(outcome, std::to_string(PARAMCLI_ERROR_NOT_REGULAR));
}

// A reader of the file as its description has it.
static std::map<std::string, std::string> parse(const std::string &text) {
    std::map<std::string, std::string> values;
    std::size_t begin = 0;

    while (begin < text.size()) {
        const std::size_t end = text.find('\n', begin);
        const std::string line = text.substr(begin, end - begin);
        const std::size_t equals = line.find('=');
        if (equals != line.npos && line[0] != '#')
            values.emplace(line.substr(0, equals), line.substr(equals + 1));
        begin = end == text.npos ? text.size() : end + 1;
    }
    return values;
}

static std::string random_text(std::mt19937 *random, const std::string &alphabet,
                               std::size_t max_length) {
    std::string text;

    for (std::size_t length = (*random)() % (max_length + 1); length > 0; length--)
        text += alphabet[(*random)() % alphabet.size()];
    return text;
}

// Whatever the file held, what was set is read, and every other parameter is as before.
TEST(ParamcliAbi, WhatIsSetIsRead) {
    const scratch_folder folder;
    const std::string path = folder.path("parameters");
    std::mt19937 random(20200714);

    for (int i = 0; i < 150; i++) {
        const std::string before = random_text(&random, "ab=#\n\r \\x", 60);
        folder.write("parameters", before);
        auto expected = parse(before);
        paramcli_options options;
        paramcli_reset_options(&options);
        for (int j = 0; j < 3; j++) {
            const std::string name = random_text(&random, "ab=#\n x", 2);
            const std::string value = random_text(&random, "ab=#\n\r \\x", 6);
            int error = 0;
            paramcli_set_custom_param(name.c_str(), value.c_str(), &options, &error);
            if (error == 0)
                expected[name] = value;
        }
        ASSERT_EQ(param_file_sync(path.c_str(), &options), 0);
        EXPECT_EQ(parse(folder.read("parameters")), expected) << testing::PrintToString(before);
        if (testing::Test::HasFailure())
            break;
    }
}
