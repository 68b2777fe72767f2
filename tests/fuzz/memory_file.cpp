// tests/fuzz/memory_file.cpp: a file that is only in memory, with a path to open it by.
#include "tests/fuzz/memory_file.h"

#include <sys/mman.h>
#include <unistd.h>

#include "tests/fuzz/fuzz.h"

memory_file::memory_file() : fd_(memfd_create("fuzz", MFD_CLOEXEC)) {
    hold(fd_ >= 0, "a file in memory can be made");
    path_ = "/proc/self/fd/" + std::to_string(fd_);
}

memory_file::~memory_file() {
    (void)close(fd_);
}

void memory_file::fill(std::string_view text) const {
    const auto size = static_cast<ssize_t>(text.size());
    hold(ftruncate(fd_, 0) == 0 && pwrite(fd_, text.data(), text.size(), 0) == size,
         "a file in memory can be written");
}
