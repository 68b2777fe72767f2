// tests/unit/usermgmt/reread_lines.h: account lines on their way through memory, altered and
// watched.
#pragma once

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include <functional>

#include "tests/unit/usermgmt/log_capture.h"

// While it lives, records that the C library reads pass its functions, and its flags make the
// opening of a stream in memory fail.
class reread_lines {
  public:
    reread_lines();
    ~reread_lines();
    reread_lines(const reread_lines &) = delete;
    reread_lines &operator=(const reread_lines &) = delete;

    std::function<void(struct passwd *)> on_passwd;
    std::function<void(struct spwd *)> on_shadow;
    std::function<void(struct group *)> on_group;

    // The last record of a file comes twice.
    bool repeat_last = false;

    // How often the C library was asked for a line.
    int calls = 0;

    // Error numbers; 0 lets the call through.
    int write_stream_error = 0;
    int read_stream_error = 0;

    // For the wrapped calls: what to answer, given the C library's answer.
    template <typename record>
    int pass_on(int error, record *line, record **result, record *last,
                const std::function<void(record *)> &alter);

  private:
    bool has_last_ = false;
};
