// tests/unit/platform/bootparam_test.cpp: parameters of a boot block, written and read.
#include "platform/bootparam/bootparam.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "tests/unit/platform/boot_block.h"
#include "tests/unit/platform/process_state.h"

TEST_F(BootParam, BlankBlockHasNoParameters) {
    EXPECT_EQ(set_chip(), "ok");
    EXPECT_EQ(read("SERNO"), BLANK);
}

// The second would wait for a lock that the first kept.
TEST_F(BootParam, BlankBlockMayBeReadAgain) {
    EXPECT_EQ(from_child([] {
                  (void)read("SERNO");
                  return read("SERNO");
              }),
              BLANK);
    EXPECT_EQ(from_child([] {
                  (void)write("SERNO", "1");
                  return read("SERNO");
              }),
              "=1");
}

TEST_F(BootParam, WrittenValueIsRead) {
    EXPECT_EQ(write("SERNO", "ACCC8E012345"), "ok");
    EXPECT_EQ(read("SERNO"), "=ACCC8E012345");
    EXPECT_EQ(read("serno"), ABSENT);
    EXPECT_EQ(read("SERN"), ABSENT);
    EXPECT_EQ(read("SERNO2"), ABSENT);
}

TEST_F(BootParam, WriteReplacesAndLeavesTheOthers) {
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(write("b", "2"), "ok");
    EXPECT_EQ(write("c", "3"), "ok");
    EXPECT_EQ(write("b", "a longer one"), "ok");
    EXPECT_EQ(read("a") + read("b") + read("c"), "=1=a longer one=3");
    EXPECT_EQ(write("b", "2"), "ok");
    EXPECT_EQ(read("a") + read("b") + read("c"), "=1=2=3");
}

TEST_F(BootParam, ToolsOfUBootAgree) {
    const std::string values[] = {
        "plain",      "two words", " blanks around ",       "a=b=c",       "=",
        "$HOME;${x}", "\"quoted'", "back\\slash",           "#no comment", "\xc3\xa4",
        "latin \xe4", "\xff\xfe",  std::string(10000, 'x'),
    };
    for (const std::string &value : values) {
        EXPECT_EQ(write("color", value), "ok") << value;
        EXPECT_EQ(read("color"), "=" + value);
        EXPECT_EQ(printed("color"), value + "\n");
    }
    EXPECT_EQ(write("two words", "1"), "ok");
    EXPECT_EQ(printed("two words"), "1\n");
    EXPECT_EQ(write("\xe4", "2"), "ok");
    EXPECT_EQ(read("\xe4"), "=2");
}

TEST_F(BootParam, NameThatNoBlockTakesIsRefused) {
    EXPECT_EQ(write("a", "1"), "ok");
    const std::string before = read_file(copy(0)) + read_file(copy(1));

    for (const char *name :
         {"", "=", "a=", "a=b", "a\nb", "\n", "a\tb", "a\r", "\x01", "a\x7f", ".flags"}) {
        EXPECT_EQ(write(name, "2"), INVALID) << name;
        EXPECT_EQ(read(name), INVALID) << name;
    }
    EXPECT_EQ(read_file(copy(0)) + read_file(copy(1)), before);
}

TEST_F(BootParam, ValueThatNoBlockTakesIsRefused) {
    EXPECT_EQ(write("a", "1"), "ok");
    const std::string before = read_file(copy(0)) + read_file(copy(1));

    for (const char *value : {"", "\n", "a\nb=2", "a\n", "\t", "a\rb", "\x1b[1m", "\x7f"})
        EXPECT_EQ(write("a", value), INVALID) << value;
    EXPECT_EQ(read_file(copy(0)) + read_file(copy(1)), before);
}

TEST_F(BootParam, NullAndOtherUnitsAndFlagsAreRefused) {
    bootparam_chip chip;
    char *value = nullptr;
    int error = 0;
    bootparam_default_chip(&chip);
    EXPECT_EQ(write("a", "1"), "ok");

    const auto expect_invalid = [&error](int result) {
        EXPECT_EQ(result, BOOTPARAM_INVALID);
        EXPECT_EQ(error, EINVAL);
        EXPECT_EQ(errno, EINVAL);
        error = errno = 0;
    };
    expect_invalid(bootparam_set_chip(1, &error, &chip));
    expect_invalid(bootparam_set_chip(-1, &error, &chip));
    expect_invalid(bootparam_set_chip(0, &error, nullptr));
    expect_invalid(bootparam_read(nullptr, &value, 0, &error, &chip));
    expect_invalid(bootparam_read("a", nullptr, 0, &error, &chip));
    expect_invalid(bootparam_read("a", &value, 1, &error, &chip));
    expect_invalid(bootparam_read("a", &value, 0, &error, nullptr));
    expect_invalid(bootparam_write(nullptr, "1", &error, &chip));
    expect_invalid(bootparam_write("a", nullptr, &error, &chip));
    expect_invalid(bootparam_write("a", "1", &error, nullptr));
    EXPECT_EQ(value, nullptr);

    EXPECT_EQ(bootparam_read("b", &value, 0, nullptr, &chip), BOOTPARAM_ABSENT);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(BootParam, ChipThatWasNeverFilledIsRefused) {
    for (const int garbage : {0x00, 0x41, 0xff}) {
        bootparam_chip chip;
        char *value = nullptr;
        int error = 0;
        std::memset(&chip, garbage, sizeof chip);

        EXPECT_EQ(bootparam_set_chip(0, &error, &chip), BOOTPARAM_INVALID);
        EXPECT_EQ(bootparam_read("a", &value, 0, &error, &chip), BOOTPARAM_INVALID);
        EXPECT_EQ(bootparam_write("a", "1", &error, &chip), BOOTPARAM_INVALID);
        EXPECT_EQ(value, nullptr);
    }
}

TEST_F(BootParam, SuccessLeavesTheErrorSlot) {
    bootparam_chip chip;
    char *value = nullptr;
    int error = 4711;

    bootparam_default_chip(&chip);
    EXPECT_EQ(bootparam_set_chip(0, &error, &chip), BOOTPARAM_OK);
    EXPECT_EQ(bootparam_write("a", "1", &error, &chip), BOOTPARAM_OK);
    EXPECT_EQ(bootparam_read("a", &value, 0, &error, &chip), BOOTPARAM_OK);
    EXPECT_STREQ(value, "1");
    std::free(value);
    EXPECT_EQ(error, 4711);
}

// libubootenv itself takes one byte more, and cannot read the block afterwards.
TEST_F(BootParam, BlockIsFilledToTheLastByteAndNoFurther) {
    // Of a copy 5 bytes come first, and a NUL ends the list: here of "a=VALUE" and its NUL.
    const std::string longest(COPY_SIZE - 5 - 1 - 3, 'v');

    EXPECT_EQ(write("a", longest + "v"), FULL);
    EXPECT_EQ(read("a"), BLANK);
    for (int i = 0; i < 3; i++) {
        EXPECT_EQ(write("a", longest), "ok");
        EXPECT_EQ(read("a"), "=" + longest);
        EXPECT_EQ(read("b"), ABSENT);
    }
    EXPECT_EQ(printed("a"), longest + "\n");
    EXPECT_EQ(write("a", longest + "v"), FULL);
    EXPECT_EQ(write("b", "1"), FULL);
    EXPECT_EQ(write("b", std::string(COPY_SIZE * 3, 'w')), FULL);
    EXPECT_EQ(read("a"), "=" + longest);
    EXPECT_EQ(read("b"), ABSENT);
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(write("b", std::string(longest.size() - 4, 'w')), "ok");
    EXPECT_EQ(read("a"), "=1");
}

// libubootenv adds the flags to what it was given, where there is room or not.
TEST_F(BootParam, FlagsOfUBootCountWhenTheBlockIsFilled) {
    const std::string flagged(200, 'f');
    EXPECT_EQ(write(flagged, "1"), "ok");
    ASSERT_EQ(set_by_tool(".flags", flagged + ":so"), "");

    std::size_t length = COPY_SIZE - 5;
    std::string outcome;
    do
        outcome = write("a", std::string(--length, 'v'));
    while (outcome == FULL);
    EXPECT_EQ(outcome, "ok");
    // The list is the flagged name and a few bytes, once more.
    EXPECT_GT(length, COPY_SIZE - 2 * flagged.size() - 64);
    EXPECT_LT(length, COPY_SIZE - 2 * flagged.size() - 16);
    EXPECT_EQ(read("a"), "=" + std::string(length, 'v'));
    EXPECT_EQ(read(flagged), "=1");
    EXPECT_EQ(printed("a"), std::string(length, 'v') + "\n");
}

TEST_F(BootParam, EitherCopyMayBreak) {
    for (int broken = 0; broken < 2; broken++) {
        make_blank();
        EXPECT_EQ(write("a", "1"), "ok");
        EXPECT_EQ(write("a", "2"), "ok");
        // The older of the two has to hold the value as well.
        EXPECT_EQ(write("b", "3"), "ok");
        break_copy(broken);
        EXPECT_EQ(read("a"), "=2") << broken;
        EXPECT_EQ(printed("a"), "2\n");

        EXPECT_EQ(write("a", "4"), "ok");
        break_copy(1 - broken);
        EXPECT_EQ(read("a"), "=4") << "the broken one was written";
    }
}

TEST_F(BootParam, OlderCopyHoldsTheOldValue) {
    EXPECT_EQ(write("a", "1"), "ok");
    const std::string first = read_file(copy(0));
    EXPECT_EQ(write("a", "2"), "ok");
    const int newer = read_file(copy(0)) != first ? 0 : 1;

    break_copy(newer);
    EXPECT_EQ(read("a"), "=1");
}

TEST_F(BootParam, BothCopiesBrokenIsABlankBlock) {
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(write("a", "2"), "ok");
    break_copy(0);
    break_copy(1);

    EXPECT_EQ(read("a"), BLANK);
    EXPECT_EQ(write("b", "3"), "ok");
    EXPECT_EQ(read("a"), ABSENT);
    EXPECT_EQ(read("b"), "=3");
}

TEST_F(BootParam, WritesTakeTurns) {
    EXPECT_EQ(write("a", "0"), "ok");
    // The counter of a copy has a byte, which wraps.
    for (int i = 1; i < 600; i++) {
        const std::string before[] = {read_file(copy(0)), read_file(copy(1))};
        ASSERT_EQ(write("a", std::to_string(i)), "ok");
        ASSERT_EQ(read("a"), "=" + std::to_string(i));
        const int changed =
            int{read_file(copy(0)) != before[0]} + int{read_file(copy(1)) != before[1]};
        ASSERT_EQ(changed, 1) << i;
    }
}

TEST_F(BootParam, OneCopyWillDo) {
    write_file(CONFIG, copy(0) + " 0x0 0x4000\n");

    EXPECT_EQ(read("a"), BLANK);
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(write("a", "2"), "ok");
    EXPECT_EQ(read("a"), "=2");
    EXPECT_EQ(printed("a"), "2\n");
    EXPECT_EQ(read_file(copy(1)), std::string(COPY_SIZE, '\xff'));
    break_copy(0);
    EXPECT_EQ(read("a"), BLANK);
}

TEST_F(BootParam, NothingStaysOpen) {
    const std::vector<std::string> before = list_descriptors();

    EXPECT_EQ(read("a"), BLANK);
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(read("a"), "=1");
    EXPECT_EQ(read("b"), ABSENT);
    EXPECT_EQ(write("a", std::string(COPY_SIZE, 'x')), FULL);
    write_file(copy(1), "short");
    EXPECT_EQ(read("a"), failed(EIO));
    write_file(CONFIG, "");
    EXPECT_EQ(set_chip(), failed(EINVAL));
    EXPECT_EQ(read("a"), failed(EINVAL));
    EXPECT_EQ(list_descriptors(), before);
}
