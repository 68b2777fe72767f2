// tests/fakes/clock/fake_clock.cpp: a system clock that keeps a record and goes on as it was.
//
// Preloaded. FAKE_CLOCK_DIRECTORY names the folder (tests/fakes/folder). A call's words are the
// function's name, the seconds and the microseconds. A further file:
//   errno  where it is not 0, the calls fail with that number
#include <sys/time.h>

#include <array>
#include <cerrno>
#include <string>

#include "tests/fakes/folder/fake_folder.h"

static int record(const char *name, const struct timeval *time) {
    const char *folder = fake_folder("FAKE_CLOCK_DIRECTORY");
    const std::string seconds = std::to_string(time->tv_sec);
    const std::string microseconds = std::to_string(time->tv_usec);
    fake_record(folder, std::array{name, seconds.c_str(), microseconds.c_str()});
    const int failure = fake_number(folder, "errno");
    errno = failure;
    return failure == 0 ? 0 : -1;
}

int settimeofday(const struct timeval *time, const struct timezone *) noexcept {
    return record("settimeofday", time);
}

int adjtime(const struct timeval *delta, struct timeval *) noexcept {
    return record("adjtime", delta);
}
