// tests/unit/usermgmt/account_files.h: a folder of account files for one test, and records to
// write.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/unit/usermgmt/log_capture.h"
#include "usermgmt/account_records.h"
#include "usermgmt/core_file.h"
#include "usermgmt/usermgmt.h"

// An error slot that frees what it holds. Passed as error.out().
class error_slot {
  public:
    ~error_slot() { g_clear_error(&error_); }
    error_slot() = default;
    error_slot(const error_slot &) = delete;
    error_slot &operator=(const error_slot &) = delete;

    GError **out() {
        g_clear_error(&error_);
        return &error_;
    }
    bool is_set() const { return error_ != nullptr; }
    // "<domain> <code>: <text>", or "" without an error.
    std::string text() const;

  private:
    GError *error_ = nullptr;
};

struct context_close {
    void operator()(usermgmt_ctx *ctx) const { (void)usermgmt_close(ctx); }
};
using open_context = std::unique_ptr<usermgmt_ctx, context_close>;

// Records as literals. The strings are copied; null stays absent.
struct user_fields {
    const char *name = "someone";
    bool shadowed = false;
    const char *password = nullptr;
    guint32 uid = 1000;
    guint32 gid = 100;
    const char *gecos = nullptr;
    const char *home = nullptr;
    const char *shell = nullptr;
    gint64 last_change = 0;
};
internal_user *new_user(const user_fields &fields);

struct group_fields {
    const char *name = "some";
    const char *password = nullptr;
    guint32 gid = 100;
    std::vector<const char *> members = {};
};
internal_group *new_group(const group_fields &fields);

// Texts of an array of strings, which is freed; of one that is not there, none.
lines take_strings(char **strings);

// The line, with the members of a group line sorted, since a set of members has no order.
std::string with_members_sorted(const std::string &group_file);

int count_open_descriptors();

// Runs each test in a folder of its own that holds an empty folder "etc". A test that leaves
// unexpected lines in syslog fails.
class AccountFiles : public testing::Test {
  protected:
    void SetUp() override;
    void TearDown() override;

    // Files by their name in etc.
    static void write(const std::string &name, const std::string &text);
    static std::string read(const std::string &name);
    static bool exists(const std::string &name);
    static void remove(const std::string &name);
    static void write_all(const std::map<std::string, std::string> &files);

    // Some files in the form in which they would be written again: root and daemon, alice with uid
    // 1000 in users and video, and nobody, whose password is in the passwd file.
    static void write_typical();

    // What is in etc, sorted.
    static lines files();

    // Opens the files of etc, which must succeed and log nothing.
    static open_context opened(guint32 flags = 0);

    // The text of the error of an open that fails.
    static std::string error_of_open(guint32 flags = 0);

  private:
    std::string folder_;
};
