// tests/unit/methods/tool_runner_test.cpp: running a tool.
#include "methods/tool_runner.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string>

#include <fcntl.h>
#include <pthread.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

class ToolRunner : public testing::Test {
  protected:
    ~ToolRunner() override {
        tool_result_clear(&result_);
        g_clear_error(&error_);
    }
    // Whether /bin/sh could be started with the script.
    bool run_script(const char *script, tool_capture capture) {
        tool_result_clear(&result_);
        const char *const argv[] = {"/bin/sh", "-c", script, "sh", "a b", "$(c)", "", nullptr};
        return run_tool(argv, capture, &result_, &error_);
    }
    bool run_script_without_fork(const char *script) {
        tool_result_clear(&result_);
        const char *const argv[] = {"/bin/sh", "-c", script, "sh", "a b", "$(c)", "", nullptr};
        return run_tool_without_fork(argv, &result_, &error_);
    }
    static std::string text(const char *captured) {
        return captured != nullptr ? captured : "none";
    }
    std::string output() const { return text(result_.output); }
    std::string error_output() const { return text(result_.error_output); }

    tool_result result_ = {};
    GError *error_ = nullptr;
};

TEST_F(ToolRunner, ArgumentsArriveAsTheyAre) {
    EXPECT_TRUE(run_script("printf '<%s>' \"$@\"", tool_capture::OUTPUT));
    EXPECT_EQ(output(), "<a b><$(c)><>");
    EXPECT_TRUE(tool_succeeded(result_));
}

TEST_F(ToolRunner, OnlyWhatWasAskedForIsCaptured) {
    static constexpr const char *script = "echo out; echo err >&2";
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();

    EXPECT_TRUE(run_script(script, tool_capture::BOTH));
    EXPECT_EQ(output() + error_output(), "out\nerr\n");
    EXPECT_TRUE(run_script(script, tool_capture::OUTPUT_WITHOUT_ERRORS));
    EXPECT_EQ(output() + error_output(), "out\nnone");
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
}

TEST_F(ToolRunner, WhatIsNotCapturedGoesWhereOursGoes) {
    static constexpr const char *script = "echo out; echo err >&2";
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();

    EXPECT_TRUE(run_script(script, tool_capture::NOTHING));
    EXPECT_EQ(output() + error_output(), "nonenone");
    EXPECT_TRUE(run_script(script, tool_capture::OUTPUT));
    EXPECT_EQ(output() + error_output(), "out\nnone");
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "out\n");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "err\nerr\n");
}

TEST_F(ToolRunner, StatusTellsHowItEnded) {
    EXPECT_TRUE(run_script("exit 3", tool_capture::NOTHING));
    EXPECT_EQ(result_.wait_status, 3 << 8);
    EXPECT_FALSE(tool_succeeded(result_));

    EXPECT_TRUE(run_script("kill -9 $$", tool_capture::NOTHING));
    EXPECT_EQ(WTERMSIG(result_.wait_status), SIGKILL);
    EXPECT_FALSE(tool_succeeded(result_));

    EXPECT_TRUE(run_script("exit 0", tool_capture::NOTHING));
    EXPECT_TRUE(tool_succeeded(result_));
}

TEST_F(ToolRunner, WhatCannotBeStartedIsAnErrorWithoutStatus) {
    for (const char *program : {"/nonexistent/tool", "/etc/passwd"}) {
        tool_result_clear(&result_);
        g_clear_error(&error_);
        const char *const argv[] = {program, nullptr};

        EXPECT_FALSE(run_tool(argv, tool_capture::BOTH, &result_, &error_)) << program;
        ASSERT_NE(error_, nullptr) << program;
        EXPECT_EQ(error_->domain, G_SPAWN_ERROR) << program;
        EXPECT_EQ(result_.wait_status, -1) << program;
        EXPECT_FALSE(tool_succeeded(result_)) << program;
    }
}

TEST_F(ToolRunner, PathIsNotSearched) {
    const char *const argv[] = {"sh", "-c", "true", nullptr};

    EXPECT_FALSE(run_tool(argv, tool_capture::NOTHING, &result_, &error_));
    EXPECT_TRUE(g_error_matches(error_, G_SPAWN_ERROR, G_SPAWN_ERROR_NOENT));
}

static int forks;

static void count_fork() {
    forks++;
}

// The handlers of pthread_atfork run for fork alone.
TEST_F(ToolRunner, WithoutForkThereIsNone) {
    ASSERT_EQ(pthread_atfork(count_fork, nullptr, nullptr), 0);
    forks = 0;
    EXPECT_TRUE(run_script("echo forked", tool_capture::OUTPUT));
    EXPECT_EQ(forks, 1);
    EXPECT_TRUE(run_script_without_fork("echo spawned"));
    EXPECT_EQ(forks, 1);
    EXPECT_EQ(output(), "spawned\n");
}

TEST_F(ToolRunner, WithoutForkTheOutcomeIsTheSame) {
    testing::internal::CaptureStderr();
    EXPECT_TRUE(run_script_without_fork("printf '<%s>' \"$@\"; echo err >&2; exit 3"));
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "err\n");
    EXPECT_EQ(output() + error_output(), "<a b><$(c)><>none");
    EXPECT_EQ(result_.wait_status, 3 << 8);
}

// The child tells its error through memory that it shares with us, as vfork(2) has it; valgrind,
// for which ./test leaves this out, makes a fork of that.
class ToolRunnerSharingMemory : public ToolRunner {};

TEST_F(ToolRunnerSharingMemory, WithoutForkTheErrorIsTheSame) {
    for (const char *program : {"/nonexistent/tool", "/etc/passwd", "sh"}) {
        const char *const argv[] = {program, nullptr};
        g_autoptr(GError) forked = nullptr;
        EXPECT_FALSE(run_tool(argv, tool_capture::OUTPUT, &result_, &forked)) << program;
        g_autoptr(GError) spawned = nullptr;
        EXPECT_FALSE(run_tool_without_fork(argv, &result_, &spawned)) << program;

        ASSERT_NE(spawned, nullptr) << program;
        EXPECT_TRUE(g_error_matches(spawned, forked->domain, forked->code)) << program;
        EXPECT_STREQ(spawned->message, forked->message);
        EXPECT_EQ(output(), "none") << program;
        EXPECT_EQ(result_.wait_status, -1) << program;
    }
}

TEST_F(ToolRunner, EnvironmentIsInheritedAndDescriptorsAreNot) {
    const int open_here = open("/dev/null", O_RDONLY);
    ASSERT_GT(open_here, 2);
    ASSERT_EQ(setenv("TOOL_RUNNER_TEST", "inherited", 1), 0);

    static constexpr const char *script =
        "echo $TOOL_RUNNER_TEST; readlink /proc/self/fd/0; cd /proc/$$/fd; "
        "for fd in *; do [ $fd -gt 2 ] && [ -e $fd ] && readlink $fd; done";
    EXPECT_TRUE(run_script(script, tool_capture::OUTPUT));
    EXPECT_EQ(output(), "inherited\n/dev/null\n");
    // The second time it would not be open for the tool any more.
    EXPECT_EQ(fcntl(open_here, F_GETFD), 0);
    EXPECT_TRUE(run_script_without_fork(script));
    EXPECT_EQ(output(), "inherited\n/dev/null\n");
    (void)unsetenv("TOOL_RUNNER_TEST");
    (void)close(open_here);
}

static bool has_close_range = true;

// The linker sends the runner's calls here (--wrap).
int real_close_range(unsigned first, unsigned last, int flags) asm("__real_close_range");
int wrap_close_range(unsigned first, unsigned last, int flags) asm("__wrap_close_range");
int wrap_close_range(unsigned first, unsigned last, int flags) {
    if (has_close_range)
        return real_close_range(first, last, flags);
    errno = ENOSYS;
    return -1;
}

// As on a kernel that does not know the call.
class ToolRunnerOnAnOldKernel : public ToolRunner {
  protected:
    ToolRunnerOnAnOldKernel() { has_close_range = false; }
    ~ToolRunnerOnAnOldKernel() override { has_close_range = true; }
};

TEST_F(ToolRunnerOnAnOldKernel, ItForksAndTheOutcomeIsTheSame) {
    const int open_here = open("/dev/null", O_RDONLY);
    ASSERT_GT(open_here, 2);
    ASSERT_EQ(pthread_atfork(count_fork, nullptr, nullptr), 0);
    forks = 0;

    EXPECT_TRUE(run_script_without_fork(
        "printf '<%s>' \"$@\"; cd /proc/$$/fd; "
        "for fd in *; do [ $fd -gt 2 ] && [ -e $fd ] && readlink $fd; done; exit 3"));
    EXPECT_GT(forks, 0);
    EXPECT_EQ(output() + error_output(), "<a b><$(c)><>none");
    EXPECT_EQ(result_.wait_status, 3 << 8);
    EXPECT_EQ(fcntl(open_here, F_GETFD), 0);
    (void)close(open_here);
}

TEST_F(ToolRunnerOnAnOldKernel, TheErrorIsTheSame) {
    const char *const argv[] = {"/nonexistent/tool", nullptr};
    g_autoptr(GError) forked = nullptr;
    EXPECT_FALSE(run_tool(argv, tool_capture::OUTPUT, &result_, &forked));
    g_autoptr(GError) other = nullptr;
    EXPECT_FALSE(run_tool_without_fork(argv, &result_, &other));

    EXPECT_TRUE(g_error_matches(other, forked->domain, forked->code));
    EXPECT_STREQ(other->message, forked->message);
    EXPECT_EQ(result_.wait_status, -1);
}
