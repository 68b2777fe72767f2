// tests/unit/platform/bootparam_end_test.cpp: copies of others, whose parameters may have no end.
#include <cerrno>
#include <string>
#include <vector>

#include "tests/unit/platform/boot_block.h"
#include "tests/unit/platform/process_state.h"

class BootParamEnd : public BootParam {
  protected:
    // The parameters of the only copy, and of one of two.
    static constexpr std::size_t LONE = COPY_SIZE - 4;
    static constexpr std::size_t PAIRED = COPY_SIZE - 5;

    // The end is in the text, or there is none.
    static std::string filled(const std::string &text, std::size_t length, char filler) {
        return text + std::string(length - text.size(), filler);
    }

    static void lay_one(const std::string &parameters) {
        write_file(CONFIG, copy(0) + " 0x0 0x4000\n");
        write_file(copy(0), image(parameters));
    }

    static std::string both() { return read_file(copy(0)) + read_file(copy(1)); }

    // Neither a read nor a write gets further, or leaves something behind.
    static void expect_refused() {
        const std::string before = both();
        const std::vector<std::string> descriptors = list_descriptors();
        for (int i = 0; i < 2; i++) {
            EXPECT_EQ(read("a"), failed(EBADMSG));
            EXPECT_EQ(write("a", "2"), failed(EBADMSG));
        }
        EXPECT_EQ(set_chip(), "ok");
        EXPECT_EQ(both(), before);
        EXPECT_EQ(list_descriptors(), descriptors);
    }
};

static const std::string ENDED("a=1\0b=2\0\0", 9);

TEST_F(BootParamEnd, OnlyCopyWithoutOneIsRefused) {
    std::string many;
    while (many.size() < LONE)
        many += std::string("a=1\0", 4);
    const std::string endless[] = {
        filled("a=1", LONE, 'x'),
        filled("a=1", LONE - 1, 'x') + '\0',
        std::string(LONE, 'x'),
        std::string(LONE, '\xff'),
        filled(std::string("a=1\0b=2\0", 8), LONE, 'x'),
        many.substr(0, LONE),
    };
    for (const std::string &parameters : endless) {
        SCOPED_TRACE(parameters.substr(0, 20));
        lay_one(parameters);
        expect_refused();
    }
}

TEST_F(BootParamEnd, WhatStandsBehindTheCopyIsNone) {
    const std::string rest(COPY_SIZE, '\0');
    for (const std::string &parameters :
         {filled("a=1", LONE, 'x'), filled("a=1", LONE - 1, 'x') + '\0'}) {
        write_file(CONFIG, copy(0) + " 0x4000 0x4000\n");
        write_file(copy(0), rest + image(parameters) + rest);
        expect_refused();
    }
}

TEST_F(BootParamEnd, WrongCrcCountsFirst) {
    lay_one(filled("a=1", LONE, 'x'));
    break_copy(0);
    EXPECT_EQ(read("a"), BLANK);
    EXPECT_EQ(write("b", "2"), "ok");
    EXPECT_EQ(read("a") + " " + read("b"), ABSENT + " =2");

    write_file(CONFIG, config_of_two());
    write_file(copy(0), image(filled("a=1", PAIRED, 'x'), "\x02"));
    write_file(copy(1), image(filled(ENDED, PAIRED, '\0'), "\x01"));
    break_copy(0);
    EXPECT_EQ(read("a") + read("b"), "=1=2");
    EXPECT_EQ(write("a", "3"), "ok");
    EXPECT_EQ(read("a") + read("b"), "=3=2");
}

// The older copy, too: the next one to break may be the newer.
TEST_F(BootParamEnd, EitherOfTwoCopiesWithoutOneIsRefused) {
    const std::string ended = filled(ENDED, PAIRED, '\0');
    for (const std::string &endless :
         {filled("a=1", PAIRED, 'x'), filled("a=1", PAIRED - 1, 'x') + '\0'}) {
        for (const char *counters : {"\x01\x02", "\x02\x01"}) {
            const std::string first(1, counters[0]);
            const std::string second(1, counters[1]);
            write_file(copy(0), image(endless, first));
            write_file(copy(1), image(ended, second));
            expect_refused();
            write_file(copy(0), image(ended, first));
            write_file(copy(1), image(endless, second));
            expect_refused();
            write_file(copy(0), image(endless, first));
            expect_refused();
            write_file(copy(1), std::string(COPY_SIZE, '\xff'));
            expect_refused();
        }
    }
}

TEST_F(BootParamEnd, ErasedCopyTakesThePlaceOfARefusedOne) {
    write_file(copy(0), image(filled("a=1", PAIRED, 'x'), "\x02"));
    write_file(copy(1), image(filled(ENDED, PAIRED, '\0'), "\x01"));
    expect_refused();

    write_file(copy(0), std::string(COPY_SIZE, '\xff'));
    EXPECT_EQ(read("a") + read("b"), "=1=2");
    EXPECT_EQ(write("a", "3"), "ok");
    EXPECT_EQ(read("a") + read("b"), "=3=2");
}

TEST_F(BootParamEnd, LastTwoBytesAreEnough) {
    const std::string longest(LONE - 4, 'x');
    lay_one("a=" + longest + std::string(2, '\0'));
    EXPECT_EQ(read("a"), "=" + longest);
    EXPECT_EQ(printed("a"), longest + "\n");
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(read("a"), "=1");

    write_file(CONFIG, config_of_two());
    const std::string shorter = longest.substr(1);
    write_file(copy(0), image("a=" + shorter + std::string(2, '\0'), "\x01"));
    write_file(copy(1), image("a=" + shorter + std::string(2, '\0'), "\x02"));
    EXPECT_EQ(read("a"), "=" + shorter);
    EXPECT_EQ(write("b", "1"), FULL);
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(read("a"), "=1");
}

// Nobody clears what stands there.
TEST_F(BootParamEnd, WhatStandsBehindItIsPassedOver) {
    lay_one(filled(ENDED, LONE, 'x'));
    EXPECT_EQ(read("a") + read("b"), "=1=2");
    lay_one(filled(std::string("\0a=1", 4), LONE, 'x'));
    EXPECT_EQ(read("a"), ABSENT);
    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(read("a"), "=1");
}
