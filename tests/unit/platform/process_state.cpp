// tests/unit/platform/process_state.cpp: what a process holds, read from /proc.
#include "tests/unit/platform/process_state.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <iterator>
#include <system_error>

#include <sys/wait.h>

namespace fs = std::filesystem;

std::size_t count_threads() {
    return static_cast<std::size_t>(
        std::distance(fs::directory_iterator("/proc/self/task"), fs::directory_iterator()));
}

std::vector<std::string> list_descriptors() {
    std::vector<std::string> descriptors;

    for (const fs::directory_entry &entry : fs::directory_iterator("/proc/self/fd")) {
        std::error_code problem;
        const fs::path target = fs::read_symlink(entry.path(), problem);
        // The descriptor of this very listing is gone afterwards.
        if (!problem && target.string().rfind("/proc/", 0) != 0)
            descriptors.push_back(entry.path().filename().string() + " " + target.string());
    }
    std::sort(descriptors.begin(), descriptors.end());
    return descriptors;
}

bool has_children() {
    return waitpid(-1, nullptr, WNOHANG) >= 0 || errno != ECHILD;
}
