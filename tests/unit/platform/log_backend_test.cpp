// tests/unit/platform/log_backend_test.cpp: the lines and priorities of both log back-ends.
#include "platform/log_backend/log_backend.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string>
#include <vector>

#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <glib.h>
#include <gtest/gtest.h>

#include "tests/unit/platform/child.h"

// Levels of a program's own are no enumerators of GLib's type.
static constexpr int LEVEL_FATAL_START = 1 << G_LOG_LEVEL_USER_SHIFT;
static constexpr int LEVEL_OTHER = 1 << (G_LOG_LEVEL_USER_SHIFT + 3);

using lines = std::vector<std::string>;

// What standard output gets for one record; the record passes GLib's formatter as "%s".
static std::string stdout_line(const char *domain, GLogLevelFlags level, const std::string &text) {
    return text_from_child([&] {
        log_backend_stdout();
        g_log(domain, level, "%s", text.c_str());
    });
}

static lines syslog_calls(const char *domain, GLogLevelFlags level, const std::string &text) {
    return run_in_child([&] {
               log_backend_syslog();
               g_log(domain, level, "%s", text.c_str());
           })
        .writes;
}

static void ask_for_all_levels() {
    g_setenv("G_MESSAGES_DEBUG", "all", TRUE);
}

struct level_case {
    int level;
    const char *name;
    int priority;
};

static constexpr level_case level_cases[] = {
    {G_LOG_LEVEL_CRITICAL, "critical", 4},
    {G_LOG_LEVEL_WARNING,  "warning",  4},
    {G_LOG_LEVEL_MESSAGE,  "message",  5},
    {G_LOG_LEVEL_INFO,     "info",     6},
    {G_LOG_LEVEL_DEBUG,    "debug",    7},
    {LEVEL_FATAL_START,    "error",    3},
    {LEVEL_OTHER,          "message",  5},
};

TEST(LogBackendStdout, LevelInWords) {
    for (const level_case &row : level_cases) {
        const std::string line = text_from_child([&] {
            ask_for_all_levels();
            log_backend_stdout();
            g_log(nullptr, static_cast<GLogLevelFlags>(row.level), "some %s", "text");
        });
        EXPECT_EQ(line, std::string(row.name) + ": some text\n");
    }
}

TEST(LogBackendStdout, DomainComesBetweenLevelAndText) {
    EXPECT_EQ(stdout_line("GLib-GIO", G_LOG_LEVEL_WARNING, "text"), "warning: GLib-GIO: text\n");
    EXPECT_EQ(stdout_line("", G_LOG_LEVEL_WARNING, "text"), "warning: text\n");
}

TEST(LogBackendStdout, EachRecordIsOneWrite) {
    const child_result result = run_in_child([] {
        log_backend_stdout();
        g_log("one", G_LOG_LEVEL_MESSAGE, "first");
        g_log("two", G_LOG_LEVEL_WARNING, "second");
    });
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.writes, (lines{"message: one: first\n", "warning: two: second\n"}));
}

// GLib sets the fatal bit for its error level, and aborts once the record is out.
TEST(LogBackendStdout, FatalRecordIsWrittenBeforeTheAbort) {
    const child_result result = run_in_child([] {
        log_backend_stdout();
        g_log(nullptr, G_LOG_LEVEL_ERROR, "the end");
    });
    EXPECT_TRUE(WIFSIGNALED(result.status));
    EXPECT_EQ(result.writes, lines{"error: the end\n"});
}

TEST(LogBackendStdout, FatalMaskDoesNotChangeTheLevel) {
    const child_result result = run_in_child([] {
        log_backend_stdout();
        (void)g_log_set_always_fatal(G_LOG_LEVEL_WARNING);
        g_log(nullptr, G_LOG_LEVEL_WARNING, "text");
    });
    EXPECT_TRUE(WIFSIGNALED(result.status));
    EXPECT_EQ(result.writes, lines{"warning: text\n"});
}

struct escape_case {
    const char *text;
    const char *shown;
};

static constexpr escape_case escape_cases[] = {
    {"",                                                                 ""                                            },
    {"plain \\ 100%s \"text\"",                                          "plain \\ 100%s \"text\""                     },
    {"a\nb\r\nc",                                                        "a\\x0Ab\\x0D\\x0Ac"                          },
    {"tab\tbell\a",                                                      "tab\\x09bell\\x07"                           },
    {"\x1b[31mred",                                                      "\\x1B[31mred"                                },
    {"\x01\x1f \x7f",                                                    "\\x01\\x1F \\x7F"                            },
    {"Ångström €  𝄞",                                             "Ångström €  𝄞"                        },
    {"c1 \xc2\x80 \xc2\x9f \xc2\xa0",                                    "c1 \\xC2\\x80 \\xC2\\x9F \xc2\xa0"           },
    {"\xe2\x80\xa7 \xe2\x80\xa8 \xe2\x80\xa9",                           "\xe2\x80\xa7 \\xE2\\x80\\xA8 \\xE2\\x80\\xA9"},
    {"\xe2\x80\xae \xe2\x80\xaf \xe2\x81\xa6 \xe2\x81\xa9 \xe2\x81\xaa",
     "\\xE2\\x80\\xAE \xe2\x80\xaf \\xE2\\x81\\xA6 \\xE2\\x81\\xA9 \xe2\x81\xaa"                                       },
    {"\xd8\x9c \xe2\x80\x8e \xe2\x80\x8f",                               "\\xD8\\x9C \\xE2\\x80\\x8E \\xE2\\x80\\x8F"  },
    {"latin \xe9t\xe9",                                                  "latin \\xE9t\\xE9"                           },
    {"cut \xe2\x82",                                                     "cut \\xE2\\x82"                              },
    {"overlong \xc0\x8a",                                                "overlong \\xC0\\x8A"                         },
    {"surrogate \xed\xa0\x80",                                           "surrogate \\xED\\xA0\\x80"                   },
    {"\xff\xfe",                                                         "\\xFF\\xFE"                                  },
};

TEST(LogBackend, WhatIsNotPrintableIsEscapedInBoth) {
    for (const escape_case &row : escape_cases) {
        EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, row.text),
                  std::string("warning: ") + row.shown + "\n");
        EXPECT_EQ(syslog_calls(nullptr, G_LOG_LEVEL_WARNING, row.text).back(),
                  std::string("syslog 28 %s warning: ") + row.shown);
    }
}

TEST(LogBackendStdout, EscapesInTheDomain) {
    EXPECT_EQ(stdout_line("two\nlines", G_LOG_LEVEL_WARNING, "text"),
              "warning: two\\x0Alines: text\n");
}

TEST(LogBackendStdout, TextOfTheLongestLengthIsWhole) {
    const std::string longest(4096, 'a');
    EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, longest), "warning: " + longest + "\n");
}

TEST(LogBackendStdout, LongerTextIsCutAndCounted) {
    const std::string text = std::string(4096, 'a') + "0123456789";
    EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, text),
              "warning: " + std::string(4096, 'a') + " [10 more bytes]\n");
}

TEST(LogBackendStdout, CutSplitsNeitherEscapeNorCharacter) {
    const std::string before(4094, 'a');
    EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, before + "\n!"),
              "warning: " + before + " [2 more bytes]\n");
    EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, before + "€"),
              "warning: " + before + " [3 more bytes]\n");
    EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, before + "éb"),
              "warning: " + before + "é [1 more bytes]\n");
}

// The limit is on what is written: 4096 bytes hold 1024 escapes.
TEST(LogBackendStdout, EscapesCountWithTheirOwnLength) {
    std::string shown;
    for (int i = 0; i < 1024; i++)
        shown += "\\x0A";
    EXPECT_EQ(stdout_line(nullptr, G_LOG_LEVEL_WARNING, std::string(4096, '\n')),
              "warning: " + shown + " [3072 more bytes]\n");
}

TEST(LogBackendStdout, JournalGetsThePriorityInFront) {
    for (const level_case &row : level_cases) {
        const std::string line = text_from_child([&] {
            struct stat status = {};
            (void)fstat(STDOUT_FILENO, &status);
            const std::string stream =
                std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
            g_setenv("JOURNAL_STREAM", stream.c_str(), TRUE);
            ask_for_all_levels();
            log_backend_stdout();
            g_log(nullptr, static_cast<GLogLevelFlags>(row.level), "text");
        });
        EXPECT_EQ(line,
                  "<" + std::to_string(row.priority) + ">" + std::string(row.name) + ": text\n");
    }
}

// The variable is inherited by programs whose output went elsewhere.
TEST(LogBackendStdout, AnotherJournalStreamChangesNothing) {
    for (const bool same_device : {true, false}) {
        const std::string line = text_from_child([&] {
            struct stat status = {};
            (void)fstat(STDOUT_FILENO, &status);
            const std::string stream = std::to_string(status.st_dev + (same_device ? 0 : 1)) + ":" +
                                       std::to_string(status.st_ino + (same_device ? 1 : 0));
            g_setenv("JOURNAL_STREAM", stream.c_str(), TRUE);
            log_backend_stdout();
            g_log(nullptr, G_LOG_LEVEL_WARNING, "text");
        });
        EXPECT_EQ(line, "warning: text\n");
    }
}

static lines written_with_debug(const char *wanted, void (*select)()) {
    return run_in_child([&] {
               if (wanted != nullptr)
                   g_setenv("G_MESSAGES_DEBUG", wanted, TRUE);
               select();
               g_log("mine", G_LOG_LEVEL_INFO, "i");
               g_log("mine", G_LOG_LEVEL_DEBUG, "d");
               g_log("other", G_LOG_LEVEL_DEBUG, "d");
               g_log(nullptr, G_LOG_LEVEL_DEBUG, "d");
           })
        .writes;
}

TEST(LogBackendStdout, InfoAndDebugOnlyWhereAskedFor) {
    EXPECT_EQ(written_with_debug(nullptr, log_backend_stdout), lines{});
    EXPECT_EQ(written_with_debug("mine", log_backend_stdout),
              (lines{"info: mine: i\n", "debug: mine: d\n"}));
    EXPECT_EQ(written_with_debug("all", log_backend_stdout).size(), 4U);
}

TEST(LogBackendSyslog, InfoAndDebugOnlyWhereAskedFor) {
    EXPECT_EQ(written_with_debug(nullptr, log_backend_syslog).size(), 1U);  // openlog
    EXPECT_EQ(written_with_debug("other", log_backend_syslog).back(),
              "syslog 31 %s debug: other: d");
}

TEST(LogBackendSyslog, OpensAsPrivaneSystemDaemon) {
    EXPECT_EQ(
        syslog_calls(nullptr, G_LOG_LEVEL_WARNING, "text").front(),
        "openlog privane_system " + std::to_string(LOG_PID) + " " + std::to_string(LOG_DAEMON));
}

TEST(LogBackendSyslog, PriorityByLevelAndTextAsAnArgument) {
    for (const level_case &row : level_cases) {
        const child_result result = run_in_child([&] {
            ask_for_all_levels();
            log_backend_syslog();
            g_log("some", static_cast<GLogLevelFlags>(row.level), "100%% %s", "%n");
        });
        EXPECT_EQ(result.status, 0);
        ASSERT_EQ(result.writes.size(), 2U);
        EXPECT_EQ(result.writes[1], "syslog " + std::to_string(LOG_DAEMON | row.priority) + " %s " +
                                        row.name + ": some: 100% %n");
    }
}

TEST(LogBackendSyslog, FatalRecordIsLoggedBeforeTheAbort) {
    const child_result result = run_in_child([] {
        log_backend_syslog();
        g_log(nullptr, G_LOG_LEVEL_ERROR, "the end");
    });
    EXPECT_TRUE(WIFSIGNALED(result.status));
    EXPECT_EQ(result.writes.back(), "syslog 27 %s error: the end");
}

TEST(LogBackend, TheLastSelectionCounts) {
    const child_result result = run_in_child([] {
        log_backend_stdout();
        log_backend_syslog();
        log_backend_syslog();
        g_log(nullptr, G_LOG_LEVEL_WARNING, "first");
        log_backend_stdout();
        g_log(nullptr, G_LOG_LEVEL_WARNING, "second");
    });
    EXPECT_EQ(result.status, 0);
    ASSERT_EQ(result.writes.size(), 4U);
    EXPECT_EQ(result.writes[2], "syslog 28 %s warning: first");
    EXPECT_EQ(result.writes[3], "warning: second\n");
}

// A record between a failing call and "%m" must not change what it says.
TEST(LogBackend, ErrnoSurvivesARecord) {
    for (void (*select)() : {log_backend_stdout, log_backend_syslog}) {
        const child_result result = run_in_child([&] {
            select();
            (void)close(STDOUT_FILENO);
            errno = ENOTTY;
            g_log(nullptr, G_LOG_LEVEL_WARNING, "text");
            if (errno != ENOTTY)
                std::abort();
        });
        EXPECT_EQ(result.status, 0);
    }
}

TEST(LogBackendStdout, RecordsThatNobodyReadsAreDropped) {
    const child_result result = run_in_child([] {
        int ends[2] = {-1, -1};
        if (pipe(ends) != 0 || dup2(ends[1], STDOUT_FILENO) < 0 || close(ends[0]) != 0)
            std::abort();
        (void)std::signal(SIGPIPE, SIG_IGN);
        log_backend_stdout();
        g_log(nullptr, G_LOG_LEVEL_WARNING, "nobody reads this");
    });
    EXPECT_EQ(result.status, 0);
}
