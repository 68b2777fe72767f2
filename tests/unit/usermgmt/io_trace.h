// tests/unit/usermgmt/io_trace.h: the file calls of the code under test, seen and made to fail.
#pragma once

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "tests/unit/usermgmt/log_capture.h"

// Records stat, unlink, open, fopen, fdopen, fchmod, fflush, fsync, fclose, rename, putpwent,
// putspent and putgrent while it lives, each with the path it works on, also where the call is only
// given a descriptor or a stream.
class io_trace {
  public:
    io_trace();
    ~io_trace();
    io_trace(const io_trace &) = delete;
    io_trace &operator=(const io_trace &) = delete;

    // Makes the nth call of that name on that path fail with the error number, or with errno left
    // as it was for 0. The call is not made, but fclose, which closes the stream however it ends.
    void fail(const std::string &call, const std::string &path, int nth, int error);
    // Whether a call was made to fail.
    bool has_struck() const { return has_struck_; }

    // "<call> <path>", followed by what else matters: mode and flags.
    const lines &calls() const { return calls_; }

    // Called before each call of the code under test is made, with its line.
    std::function<void(const std::string &line)> before;

    // For the wrapped calls. enter returns false, with errno set, where the call has to fail.
    bool enter(const char *call, const std::string &path, const std::string &details = "");
    void opened(int fd, const char *path) { paths_[fd] = path; }
    const std::string *path_of(int fd) const;

  private:
    struct fault {
        std::string call;
        int countdown;
        int error;
    };
    std::vector<fault> faults_;
    bool has_struck_ = false;
    std::map<int, std::string> paths_;
    lines calls_;
};
