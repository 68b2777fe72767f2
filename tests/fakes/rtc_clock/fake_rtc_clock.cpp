// tests/fakes/rtc_clock/fake_rtc_clock.cpp: a hardware clock that keeps a record.
//
// FAKE_RTC_CLOCK_DIRECTORY names the folder (tests/fakes/folder). A call's words are the function's
// name, the seconds and the microseconds. A further file:
//   result  what rtc_write_time returns
#include "platform/rtc_clock/rtc_clock.h"

#include <array>
#include <string>

#include "tests/fakes/folder/fake_folder.h"

int rtc_write_time(const struct timeval *time) {
    const char *folder = fake_folder("FAKE_RTC_CLOCK_DIRECTORY");
    const std::string seconds = std::to_string(time->tv_sec);
    const std::string microseconds = std::to_string(time->tv_usec);
    fake_record(folder, std::array{__func__, seconds.c_str(), microseconds.c_str()});
    return fake_number(folder, "result");
}
