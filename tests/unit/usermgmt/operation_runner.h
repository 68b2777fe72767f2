// tests/unit/usermgmt/operation_runner.h: runs operations and checks after each that memory and
// files hold what they have to hold.
#pragma once

#include "tests/unit/usermgmt/account_model.h"
#include "tests/unit/usermgmt/changed_accounts.h"

// One file as it lies there.
struct lying_file {
    guint64 inode = 0;
    unsigned mode = 0;
    gint64 size = 0;
    gint64 changed = 0;  // nanoseconds
    std::string text;
};

// Works on the account files below the working folder. There is one at a time.
class operation_runner {
  public:
    operation_runner();

    // Each returns what is wrong, "" when nothing is. start comes first, as often as wanted.
    std::string start(const starting_files &files, char salt_letter);
    std::string run(const operation &what);

    void close() { ctx_.reset(); }

    // How often what was reached.
    guint64 succeeded(int kind) const { return succeeded_[kind]; }
    guint64 refused(int kind) const { return refused_[kind]; }
    guint64 struck(int kind) const { return struck_[kind]; }

  private:
    std::string check_logs(const operation_result &result);
    std::string reopen();
    std::string check_files();
    std::string check_lines(int row);
    std::string check_root() const;

    void count(const operation &what, const operation_result &result);

    hashing_sources sources_;
    open_context ctx_;
    std::optional<account_model> model_;
    guint32 open_flags_ = 0;
    lying_file files_[CORE_FILE_COUNT];
    std::vector<std::string> roots_hashes_;  // each that root may have in the file
    std::size_t glib_warnings_ = 0;
    guint64 succeeded_[OPERATION_KINDS] = {};
    guint64 refused_[OPERATION_KINDS] = {};
    guint64 struck_[OPERATION_KINDS] = {};
};
