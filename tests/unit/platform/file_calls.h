// tests/unit/platform/file_calls.h: the file calls of the code under test, seen and made to fail.
#pragma once

#include <cstddef>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include <sys/types.h>

// Records the calls of file_calls_wrapped (tests/unit/platform/meson.build) while it lives: the
// name of the call, the last part of the path it works on, also where it is only given a
// descriptor, and what else matters of its arguments.
class file_calls {
  public:
    file_calls();
    ~file_calls();
    file_calls(const file_calls &) = delete;
    file_calls &operator=(const file_calls &) = delete;

    // Makes the call of that index, from 0, fail. It is not made, but close, which closes anyway.
    void fail(std::size_t index, int error) { faults_[index] = error; }
    // Makes every call with that line fail, as many times.
    void fail(const std::string &line, int error, int times = 1) {
        lines_to_fail_[line] = {error, times};
    }
    // Each write takes no more than that many bytes.
    void limit_writes(std::size_t bytes) { write_limit_ = bytes; }

    // The group that getgrnam finds, by any name.
    enum class groups { REAL, NONE, OWN };
    void answer_getgrnam(groups answer) { groups_ = answer; }

    const std::vector<std::string> &lines() const { return lines_; }
    // Called before each call is made, with its line.
    std::function<void(const std::string &line)> before;

    // For the wrapped calls. enter returns false, with errno set, where the call has to fail.
    bool enter(const std::string &line);
    void opened(int fd, const std::string &label) { labels_[fd] = label; }
    const std::string *label_of(int fd) const;
    void closed(int fd) { labels_.erase(fd); }
    std::size_t write_limit() const { return write_limit_; }
    groups group_answer() const { return groups_; }

  private:
    struct fault {
        int error;
        int times;
    };
    std::vector<std::string> lines_;
    std::map<std::size_t, int> faults_;
    std::map<std::string, fault> lines_to_fail_;
    std::map<int, std::string> labels_;
    std::size_t write_limit_ = static_cast<std::size_t>(-1);
    groups groups_ = groups::REAL;
};
