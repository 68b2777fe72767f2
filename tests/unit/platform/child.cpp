// tests/unit/platform/child.cpp: runs a piece of a test in a child process and collects what it
// writes.
#include "tests/unit/platform/child.h"

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstdio>
#include <cstdlib>

#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

// Longer than any record or report.
static constexpr std::size_t MAX_WRITE = 65536;

[[noreturn]] static void run(int output, const std::function<void()> &work) {
    (void)prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (dup2(output, STDOUT_FILENO) < 0)
        std::_Exit(99);
    (void)close(output);
    work();
    (void)std::fflush(stdout);
    std::exit(0);  // Runs the leak check of an instrumented build.
}

// A socket of this type keeps the limits of each write.
child_result run_in_child(const std::function<void()> &work) {
    int ends[2] = {-1, -1};
    child_result result = {-1, {}};

    if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0)
        return result;
    (void)std::fflush(stdout);
    const pid_t child = fork();
    if (child == 0) {
        (void)close(ends[0]);
        run(ends[1], work);
    }
    (void)close(ends[1]);

    std::vector<char> bytes(MAX_WRITE);
    while (true) {
        const ssize_t count = read(ends[0], bytes.data(), bytes.size());
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            break;
        result.writes.emplace_back(bytes.data(), static_cast<std::size_t>(count));
    }
    (void)close(ends[0]);
    while (child > 0 && waitpid(child, &result.status, 0) < 0 && errno == EINTR) {
    }
    return result;
}

std::string text_from_child(const std::function<void()> &work) {
    const child_result result = run_in_child(work);

    if (result.status == 0 && result.writes.size() == 1)
        return result.writes[0];

    std::string text = "[wait status " + std::to_string(result.status) + ", " +
                       std::to_string(result.writes.size()) + " writes]";
    for (const std::string &write : result.writes)
        text += "\n" + write;
    return text;
}
