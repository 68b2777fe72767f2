// tests/unit/usermgmt/operation_sequences_test.cpp: after any operations in any order, memory and
// files hold what they have to hold.
#include <valgrind/valgrind.h>

#include "tests/unit/usermgmt/operation_runner.h"

// Where each step costs ten to fifty times as much, a tenth has to do.
#if defined(__SANITIZE_ADDRESS__)
static constexpr bool INSTRUMENTED = true;
#else
static constexpr bool INSTRUMENTED = false;
#endif
static constexpr guint64 PLAIN_SEQUENCES = 20000;
static constexpr guint64 SLOW_SEQUENCES = 2000;

static guint64 sequence_count() {
    return INSTRUMENTED || RUNNING_ON_VALGRIND ? SLOW_SEQUENCES : PLAIN_SEQUENCES;
}

class OperationSequences : public AccountFiles {
  protected:
    void TearDown() override {
        runner_.close();
        AccountFiles::TearDown();
    }

    // What is wrong, "" when nothing is.
    std::string run_sequence(guint64 seed);

    operation_runner runner_;
};

std::string OperationSequences::run_sequence(guint64 seed) {
    random_operations chance(seed);
    const starting_files files = chance.next_files();
    const auto salt_letter = static_cast<char>('A' + chance.below(26));
    std::string done =
        "The seed " + std::to_string(seed) + ", open flags " + std::to_string(files.open_flags);
    std::string fault = runner_.start(files, salt_letter);
    for (unsigned left = 3 + chance.below(6); fault.empty() && left > 0; left--) {
        const operation what = chance.next_operation(files.has_shadow);
        fault = runner_.run(what);
        done += "\n" + described(what);
    }
    return fault.empty() ? "" : done + "\n" + fault;
}

TEST_F(OperationSequences, LeaveMemoryAndFilesAsTheyHaveToBe) {
    const guint64 sequences = sequence_count();
    for (guint64 seed = 1; seed <= sequences; seed++) {
        const std::string fault = run_sequence(seed);
        if (!fault.empty())
            FAIL() << fault;
    }
    EXPECT_EQ(files().size(), exists("shadow") ? 3U : 2U);

    // Every kind ended in every way often enough to tell something.
    for (int kind = 0; kind < OPERATION_KINDS; kind++) {
        SCOPED_TRACE(kind);
        EXPECT_GT(runner_.succeeded(kind), sequences / 50);
        if (kind == static_cast<int>(operation_kind::reopen))
            continue;
        EXPECT_GT(runner_.refused(kind), sequences / 50);
        EXPECT_GT(runner_.struck(kind), sequences / 200);
    }
    RecordProperty("sequences", std::to_string(sequences));
}
