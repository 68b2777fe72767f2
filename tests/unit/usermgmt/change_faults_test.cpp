// tests/unit/usermgmt/change_faults_test.cpp: every change with every step of its write failing.
#include <algorithm>
#include <cerrno>

#include "tests/unit/usermgmt/changed_accounts.h"

// What a failed write leaves in memory: the database as it was at open, or the change, still to be
// written.
enum class left { as_at_open, changed };

struct account_change {
    const char *name;
    std::string (*run)(usermgmt_ctx *ctx, GError **error);
    const char *action;
    bool writes_users;
    bool writes_groups;
    left users;
    left groups;
};

static std::string text_of(GError **error) {
    return *error != nullptr ? (*error)->message : "";
}

static std::string add_user(usermgmt_ctx *ctx, GError **error) {
    const filled_entry entry(
        {.type = USER_TYPE_DYNAMIC_SYSTEM, .name = "svc", .group = "users", .groups = {{"video"}}});
    (void)usermgmt_add_user(ctx, "svc", entry.get(), error);
    return text_of(error);
}

static std::string modify(usermgmt_ctx *ctx, const entry_fields &fields, GError **error) {
    const filled_entry entry(fields);
    (void)usermgmt_modify_user(ctx, "camd", entry.get(), error);
    return text_of(error);
}

static std::string modify_comment(usermgmt_ctx *ctx, GError **error) {
    return modify(ctx, {.gecos = "New", .shell = "/bin/sh"}, error);
}

static std::string modify_password(usermgmt_ctx *ctx, GError **error) {
    return modify(ctx, {.password = "new"}, error);
}

static std::string modify_secondary(usermgmt_ctx *ctx, GError **error) {
    return modify(ctx, {.groups = {{"audio", "nvr"}}}, error);
}

static std::string modify_primary(usermgmt_ctx *ctx, GError **error) {
    return modify(ctx, {.group = "users", .groups = {{"audio"}}, .gecos = "New"}, error);
}

static std::string delete_user(usermgmt_ctx *ctx, GError **error) {
    (void)usermgmt_delete_user(ctx, "alice", error);
    return text_of(error);
}

static std::string disable_password(usermgmt_ctx *ctx, GError **error) {
    (void)usermgmt_disable_password(ctx, "camd", error);
    return text_of(error);
}

static std::string add_group(usermgmt_ctx *ctx, GError **error) {
    static constexpr const char *members[] = {"alice", nullptr};
    (void)usermgmt_add_group(ctx, "sound", members, error);
    return text_of(error);
}

static std::string delete_group(usermgmt_ctx *ctx, GError **error) {
    (void)usermgmt_delete_group(ctx, "nvr", error);
    return text_of(error);
}

static constexpr auto OLD = left::as_at_open;
static constexpr auto NEW = left::changed;
static constexpr account_change changes[] = {
    {"AddUser",         add_user,         "add user 'svc'",               true,  true,  OLD, NEW},
    {"ModifyComment",   modify_comment,   "modify user 'camd'",           true,  false, NEW, OLD},
    {"ModifyPassword",  modify_password,  "modify user 'camd'",           true,  false, NEW, OLD},
    {"ModifySecondary", modify_secondary, "modify user 'camd'",           false, true,  OLD, NEW},
    {"ModifyPrimary",   modify_primary,   "modify user 'camd'",           true,  true,  OLD, OLD},
    {"DeleteUser",      delete_user,      "delete user 'alice'",          true,  true,  OLD, OLD},
    {"DisablePassword", disable_password, "disable password for  'camd'", true,  false, OLD, OLD},
    {"AddGroup",        add_group,        "add group 'sound'",            false, true,  OLD, OLD},
    {"DeleteGroup",     delete_group,     "delete group 'nvr'",           false, true,  OLD, OLD},
};

// NAME, TMP and LIVE of the text stand for the file's own; the cause follows.
struct failing_step {
    const char *name;
    const char *call;
    const char *path;
    int nth;
    const char *text;
};

static constexpr failing_step steps[] = {
    {"Stat",          "stat",   "LIVE", 2, "could not stat() core file at 'LIVE':"       },
    {"Unlink",        "unlink", "TMP",  1, "could not fopen/fileno temporary file 'TMP':"},
    {"Open",          "open",   "TMP",  1, "could not fopen/fileno temporary file 'TMP':"},
    {"Fdopen",        "fdopen", "TMP",  1, "could not fopen/fileno temporary file 'TMP':"},
    {"PrivateMode",   "fchmod", "TMP",  1, "could not chmod() temporary file 'TMP':"     },
    {"FirstEntry",    "put",    "TMP",  1, "could not write entry #0 to TMP:"            },
    {"FifthEntry",    "put",    "TMP",  5, "could not write entry #4 to TMP:"            },
    {"Flush",         "fflush", "TMP",  1, "could not fflush() file 'TMP':"              },
    {"FinalMode",     "fchmod", "TMP",  2, "could not fchmod() file 'TMP':"              },
    {"Fsync",         "fsync",  "TMP",  1, "could not fsync() file 'TMP':"               },
    {"Close",         "fclose", "TMP",  1, "could not fclose() file 'TMP':"              },
    {"Rename",        "rename", "TMP",  1, "NAME: could not rename file 'TMP' -> 'LIVE',"},
    {"OpenDirectory", "open",   "etc",  0, "NAME: could not open/sync directory 'etc/'," },
    {"Directory",     "fsync",  "etc",  0, "NAME: could not open/sync directory 'etc/'," },
};

static std::string filled_in(const char *text, const core_file &cf) {
    g_autoptr(GString) filled = g_string_new(text);
    const std::string tmp = std::string(cf.path) + ".tmp";
    (void)g_string_replace(filled, "NAME", cf.name, 0);
    (void)g_string_replace(filled, "LIVE", cf.path, 0);
    (void)g_string_replace(filled, "TMP", tmp.c_str(), 0);
    return filled->str;
}

// By name: the bytes of a record, which would be printed otherwise, include its gaps.
static void PrintTo(const account_change &what, std::ostream *out) {
    *out << what.name;
}
static void PrintTo(const failing_step &failing, std::ostream *out) {
    *out << failing.name;
}

using change_fault = std::tuple<account_change, failing_step>;

class ChangeFaults : public ChangedAccounts, public testing::WithParamInterface<change_fault> {
  protected:
    static constexpr const char *PUTS[] = {"putpwent", "putspent", "putgrent"};

    static bool writes(const account_change &what, int row) {
        return row == CORE_FILE_ROW_GROUP ? what.writes_groups : what.writes_users;
    }
    // How often the directory was synced when the file of a row has been renamed.
    static int syncs_up_to(const account_change &what, int row) {
        int count = 0;
        for (int before = 0; before <= row; before++)
            count += writes(what, before) ? 1 : 0;
        return count;
    }
    static void arm(io_trace *trace, const account_change &what, const failing_step &failing,
                    int row) {
        const core_file &cf = core_file_table[row];
        const std::string call = failing.call == std::string("put") ? PUTS[row] : failing.call;
        const int nth = failing.nth != 0 ? failing.nth : syncs_up_to(what, row);
        trace->fail(call, filled_in(failing.path, cf), nth, EIO);
    }
    void start_over() {
        write("passwd", PASSWD);
        write("shadow", SHADOW);
        write("group", GROUP);
        sources_.stand_in = [](const char *, const char *) { return "$5$abcdefghijkl$same"; };
        reopen();
    }
    // What the mask of the change leaves of these records, and of the files beside them.
    void expect_left(const account_change &what, const lines &users, const lines &groups);
    void expect_next_change_works();
    // What memory holds when the change is made and written.
    databases memory_when_changed(const account_change &what) {
        error_slot error;
        start_over();
        EXPECT_EQ(what.run(ctx_.get(), error.out()), "");
        return memory();
    }
};

// Without the last line, which tells whether the database counts as changed.
static lines records_of(lines database) {
    database.pop_back();
    return database;
}

void ChangeFaults::expect_left(const account_change &what, const lines &users,
                               const lines &groups) {
    EXPECT_EQ(records_of(memory().users), users);
    EXPECT_EQ(records_of(memory().groups), groups);
    EXPECT_EQ(ctx_->user_db.dirty != FALSE, what.users == NEW);
    EXPECT_EQ(ctx_->group_db.dirty != FALSE, what.groups == NEW);
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
}

void ChangeFaults::expect_next_change_works() {
    EXPECT_EQ(add({.type = 3, .name = "later", .group = "root"}), "");
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_FALSE(ctx_->group_db.dirty);
    const databases now = memory_as_written(ctx_.get());
    ctx_.reset();
    ctx_.reset(usermgmt_open(USERMGMT_OPEN_TRYLOCK, nullptr));
    EXPECT_EQ(memory_as_written(ctx_.get()).users, now.users);
    EXPECT_EQ(memory_as_written(ctx_.get()).groups, now.groups);
    (void)take_syslog();  // a user that could not be added may still be a member
}

static std::string fault_name(const testing::TestParamInfo<change_fault> &info) {
    return std::string(std::get<0>(info.param).name) + "_" + std::get<1>(info.param).name;
}

INSTANTIATE_TEST_SUITE_P(EachStep, ChangeFaults,
                         testing::Combine(testing::ValuesIn(changes), testing::ValuesIn(steps)),
                         fault_name);

TEST_P(ChangeFaults, LeaveWhatTheirMaskSaysAndTheNextChangeWorks) {
    const auto &[what, failing] = GetParam();
    const databases when_changed = memory_when_changed(what);
    start_over();
    const databases at_open = memory();
    const lines users = records_of(what.users == NEW ? when_changed.users : at_open.users);
    const lines groups = records_of(what.groups == NEW ? when_changed.groups : at_open.groups);

    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        if (!writes(what, row))
            continue;
        SCOPED_TRACE(core_file_table[row].name);
        start_over();
        error_slot error;
        {
            io_trace trace;
            arm(&trace, what, failing, row);
            (void)what.run(ctx_.get(), error.out());
        }
        EXPECT_EQ(error.text(), "corefile 101: Failed to " + std::string(what.action) +
                                    ", unable to sync core files, failed to write 1/3 core "
                                    "file(s) " +
                                    core_file_table[row].name + ": " +
                                    filled_in(failing.text, core_file_table[row]) +
                                    " Input/output error");
        expect_left(what, users, groups);
        expect_next_change_works();
    }
}

// Only a failed rename leaves some of the files replaced, and a failed sync of the directory all.
TEST_P(ChangeFaults, LeaveTheFilesThatWereNotRenamed) {
    const auto &[what, failing] = GetParam();
    const bool renaming = failing.call == std::string("rename");
    const bool syncing_directory = failing.path == std::string("etc");
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        if (!writes(what, row))
            continue;
        SCOPED_TRACE(core_file_table[row].name);
        start_over();
        error_slot error;
        io_trace trace;
        arm(&trace, what, failing, row);
        EXPECT_NE(what.run(ctx_.get(), error.out()), "");
        lines expected;
        for (int i = 0; i < CORE_FILE_COUNT; i++)
            if (writes(what, i) && (syncing_directory || (renaming && i < row)))
                expected.emplace_back(core_file_table[i].name);
        std::sort(expected.begin(), expected.end());
        EXPECT_EQ(replaced(), expected);
    }
}

class ChangeFaultsAnywhere : public ChangeFaults {};

static std::string change_name(const testing::TestParamInfo<change_fault> &info) {
    return std::get<0>(info.param).name;
}

INSTANTIATE_TEST_SUITE_P(EachCall, ChangeFaultsAnywhere,
                         testing::Combine(testing::ValuesIn(changes),
                                          testing::Values(failing_step{"Any", "", "", 0, ""})),
                         change_name);

// "<call> <path>", without the details.
static std::string call_and_path(const std::string &line) {
    return line.substr(0, line.find(' ', line.find(' ') + 1));
}

// Not the steps that are known, but every call that a write makes, in its turn.
TEST_P(ChangeFaultsAnywhere, LeaveWhatTheirMaskSays) {
    const account_change &what = std::get<0>(GetParam());
    const databases when_changed = memory_when_changed(what);
    lines calls;
    {
        start_over();
        io_trace trace;
        error_slot error;
        ASSERT_EQ(what.run(ctx_.get(), error.out()), "");
        for (const std::string &line : trace.calls())
            if (line.find(" etc") != std::string::npos)  // not the source of salts
                calls.push_back(line);
    }
    start_over();
    const databases at_open = memory();
    const lines users = records_of(what.users == NEW ? when_changed.users : at_open.users);
    const lines groups = records_of(what.groups == NEW ? when_changed.groups : at_open.groups);

    std::map<std::string, int> seen;
    int failed = 0;
    for (const std::string &line : calls) {
        const std::string call = call_and_path(line);
        SCOPED_TRACE(line + ", time " + std::to_string(++seen[call]));
        start_over();
        error_slot error;
        io_trace trace;
        trace.fail(call.substr(0, call.find(' ')), call.substr(call.find(' ') + 1), seen[call],
                   EIO);
        (void)what.run(ctx_.get(), error.out());
        EXPECT_TRUE(trace.has_struck());
        // Before and after a write the file is only looked at for what others do to it.
        if (call.starts_with("stat ") && seen[call] != 2) {
            EXPECT_EQ(error.text(), "");
            EXPECT_EQ(memory().users, when_changed.users);
            EXPECT_EQ(memory().groups, when_changed.groups);
            (void)take_syslog();
            continue;
        }
        failed++;
        EXPECT_TRUE(error.text().starts_with("corefile 101: Failed to " + std::string(what.action) +
                                             ", unable to sync core files, failed to write 1/3 "))
            << error.text();
        expect_left(what, users, groups);
    }
    // Of each file: 11 calls beside one for every record.
    EXPECT_GT(failed, 11 * ((what.writes_users ? 2 : 0) + (what.writes_groups ? 1 : 0)));
}
