// tests/long/faults/account_oracle.cpp: what an account operation has to answer and to log when one
// of its calls fails, worked out from the calls that were made.
#include "tests/long/faults/account_oracle.h"

#include <algorithm>
#include <cstring>
#include <iterator>

#include "tests/long/faults/account_cases.h"

static constexpr const char *actions[] = {
    "add user", "modify user", "delete user", "disable password for ", "add group", "delete group"};
static constexpr const char *RANDOM_DEVICE = "/dev/urandom";

static int row_of(const std::string &path) {
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (path.starts_with(core_file_table[row].path))
            return row;
    return -1;
}

// Which of the calls with its line it is, from 1.
static int turn_of(const call_trace &trace, int index) {
    const std::string line = line_of(trace.calls[index]);
    int turn = 0;
    for (int i = 0; i <= index; i++)
        turn += line_of(trace.calls[i]) == line ? 1 : 0;
    return turn;
}

// The file that was renamed last before a call.
static int row_renamed_before(const call_trace &trace, int index) {
    int row = -1;
    for (int i = 0; i < index; i++)
        if (std::strcmp(trace.calls[i].name, "rename") == 0)
            row = row_of(trace.calls[i].path);
    return row;
}

static std::string beginning(const operation &what, int failed) {
    return std::string("Failed to ") + actions[static_cast<int>(what.kind)] + " '" +
           what.account.value_or("") + "', unable to sync core files, failed to write " +
           std::to_string(failed) + "/3 core file(s) ";
}

struct failing_step {
    const char *call;
    int turn;
    const char *text;
};
// On a temporary file, whose name follows.
static constexpr failing_step steps[] = {
    {"unlink", 1, "could not fopen/fileno temporary file"},
    {"open",   1, "could not fopen/fileno temporary file"},
    {"fcntl",  1, "could not fopen/fileno temporary file"},
    {"fchmod", 1, "could not chmod() temporary file"     },
    {"write",  0, "could not fflush() file"              },
    {"fchmod", 2, "could not fchmod() file"              },
    {"fsync",  1, "could not fsync() file"               },
    {"close",  1, "could not fclose() file"              },
};

static account_outcome failed_write(const operation &what, int row, const std::string &step) {
    account_outcome outcome;
    outcome.error = "corefile 101: " + beginning(what, 1) + core_file_table[row].name + ": " + step;
    return outcome;
}

static account_outcome of_temporary(const operation &what, const trapped_call &call, int turn,
                                    const std::string &cause, bool is_short) {
    account_outcome outcome;
    const int row = row_of(call.path);
    const std::string path = call.path;
    if (std::strcmp(call.name, "rename") == 0) {
        outcome =
            failed_write(what, row,
                         std::string(core_file_table[row].name) + ": could not rename file '" +
                             path + "' -> '" + core_file_table[row].path + "', " + cause);
        outcome.replaced = row;
        return outcome;
    }
    if (is_short && cause.empty())
        return outcome;  // The C library writes the rest.
    for (const failing_step &step : steps) {
        if (std::strcmp(step.call, call.name) != 0 || (step.turn != 0 && step.turn != turn))
            continue;
        outcome = failed_write(what, row, std::string(step.text) + " '" + path + "': " + cause);
        if (std::strcmp(call.name, "write") == 0)
            outcome.other =
                failed_write(what, row, "could not write entry #* to " + path + ": " + cause).error;
        return outcome;
    }
    outcome.unforeseen = line_of(call);
    return outcome;
}

// Looked at before the write, for it, and behind it.
static account_outcome of_live(const operation &what, const trapped_call &call, int turn,
                               const std::string &cause, bool for_ever) {
    account_outcome outcome;
    const int row = row_of(call.path);
    const std::string path = call.path;
    const std::string strangers =
        "4 " + path + " was changed by another program; its changes are lost";
    if (std::strcmp(call.name, "stat") != 0) {
        outcome.unforeseen = line_of(call);
        return outcome;
    }
    if (turn == 2 || (turn == 1 && for_ever))
        outcome = failed_write(what, row, "could not stat() core file at '" + path + "': " + cause);
    if (turn == 1)
        outcome.log.push_back(strangers);
    if (turn == 3)
        outcome.next_log.push_back(strangers);
    return outcome;
}

// A folder that cannot be synced stops nothing: every file whose turn it is fails by itself.
static account_outcome of_folder(const operation &what, const call_trace &trace, int index,
                                 const std::string &cause, bool for_ever) {
    account_outcome outcome;
    if (std::strcmp(trace.calls[index].name, "close") == 0)
        return outcome;
    const int first = row_renamed_before(trace, index);
    std::string errors;
    int failed = 0;
    for (int row = first; row < CORE_FILE_COUNT; row++) {
        const bool renamed =
            std::any_of(trace.calls, trace.calls + trace.count, [row](const trapped_call &call) {
                return std::strcmp(call.name, "rename") == 0 && row_of(call.path) == row;
            });
        if (!renamed || (row != first && !for_ever))
            continue;
        const std::string name = core_file_table[row].name;
        errors = name + ": " + name + ": could not open/sync directory 'etc/', " + cause +
                 (errors.empty() ? "" : "\n") + errors;
        failed++;
    }
    outcome.error = std::string("corefile ") + (failed > 1 ? "103: " : "101: ") +
                    beginning(what, failed) + errors;
    outcome.replaced = CORE_FILE_COUNT;
    return outcome;
}

static account_outcome of_random_device(const operation &what, const trapped_call &call,
                                        const std::string &cause) {
    account_outcome outcome;
    if (std::strcmp(call.name, "close") == 0)
        return outcome;
    outcome.is_written = false;
    outcome.error = std::string("usermgmt 16: Failed to ") + actions[static_cast<int>(what.kind)] +
                    " '" + what.account.value_or("") + "', could not create password salt";
    outcome.log = {std::strcmp(call.name, "open") == 0
                       ? "3 Failed to open /dev/urandom: " + cause
                       : "3 Failed to read from /dev/urandom: " + cause,
                   "3 Failed to generate salt. Expect 10 bytes, got -1"};
    return outcome;
}

static std::string cause_of(const call_fault &fault) {
    const int error = fault.error != 0 ? fault.error : fault.error_after_short;
    return error != 0 ? g_strerror(error) : "";
}

account_outcome outcome_of(const operation &what, const call_trace &trace, int index,
                           const call_fault &fault) {
    const trapped_call &call = trace.calls[index];
    const std::string path = call.path;
    const std::string cause = cause_of(fault);
    if (path == RANDOM_DEVICE)
        return of_random_device(what, call, cause);
    if (path == ACCOUNT_FOLDER)
        return of_folder(what, trace, index, cause, fault.for_ever);
    if (row_of(path) >= 0 && path.ends_with(".tmp"))
        return of_temporary(what, call, turn_of(trace, index), cause, fault.error == 0);
    if (row_of(path) >= 0)
        return of_live(what, call, turn_of(trace, index), cause, fault.for_ever);
    account_outcome outcome;
    outcome.unforeseen = line_of(call);
    return outcome;
}

account_outcome outcome_on_bad_disk(const operation &what, const call_trace &trace, int index,
                                    int error) {
    account_outcome outcome = outcome_of(what, trace, index, {error, 0, false});
    if (std::strcmp(trace.calls[index].path, ACCOUNT_FOLDER) != 0)
        return outcome;
    // The folder could not be synced, which stops nothing, and then the next file not be renamed.
    for (int i = index + 1; i < trace.count; i++) {
        const trapped_call &call = trace.calls[i];
        if (std::strcmp(call.name, "rename") != 0)
            continue;
        const account_outcome renaming =
            of_temporary(what, call, 1, cause_of({error, 0, false}), false);
        const std::string one = "corefile 101: " + beginning(what, 1);
        outcome.error = "corefile 103: " + beginning(what, 2) + renaming.error.substr(one.size()) +
                        "\n" + outcome.error.substr(one.size());
        outcome.replaced = renaming.replaced;
        return outcome;
    }
    return outcome;
}

// A failure to read one file, as its error says it; "" for a call whose failure does not matter.
static std::string failed_read(const trapped_call &call) {
    const std::string name = core_file_table[row_of(call.path)].name;
    const std::string cause = g_strerror(static_cast<int>(-call.result));
    if (std::strcmp(call.name, "open") == 0)
        return "could not open " + name + " file '" + call.path + "', " + cause;
    return std::strcmp(call.name, "read") == 0 ? "could not read '" + name + "' entry *: " + cause
                                               : "";
}

static std::string parse_log(const trapped_call &call) {
    return std::string("3 Unable to parse ") + core_file_table[row_of(call.path)].name + " file (" +
           call.path + ")";
}

account_outcome outcome_of_open(const call_trace &trace, int index, const call_fault &fault) {
    account_outcome outcome;
    const trapped_call &call = trace.calls[index];
    const int row = row_of(call.path);
    if (row < 0) {
        outcome.unforeseen = line_of(call);
        return outcome;
    }
    // The first look at the shadow file only asks whether it is there.
    const bool only_asks = row == CORE_FILE_ROW_SHADOW && turn_of(trace, index) == 1;
    if (std::strcmp(call.name, "stat") == 0 && (!only_asks || fault.for_ever))
        outcome.next_log = {std::string("4 ") + call.path +
                            " was changed by another program; its changes are lost"};
    const std::string failed = failed_read(call);
    if (failed.empty() || fault.error == 0)
        return outcome;
    outcome.error = "corefile 100: Could not initialise user management: Could not init " +
                    std::string(row == CORE_FILE_ROW_GROUP ? "group" : "user") + " database, " +
                    failed;
    outcome.log = {parse_log(call)};
    return outcome;
}

// A file that could not be looked at counts as another program's, once it was read.
struct row_looks {
    bool last_failed = false;
    bool counts_as_strange = false;
};

void add_reload(const call_trace &trace, int index, account_outcome *outcome) {
    row_looks looks[CORE_FILE_COUNT];
    bool of_users = false;
    bool was_opened[CORE_FILE_COUNT] = {};
    for (int i = index + 1; i < trace.count; i++) {
        const trapped_call &call = trace.calls[i];
        const int row = row_of(call.path);
        const bool is_open = std::strcmp(call.name, "open") == 0;
        if (row < 0 || std::string(call.path).ends_with(".tmp"))
            continue;
        of_users = of_users || (is_open && row != CORE_FILE_ROW_GROUP);
        was_opened[row] = was_opened[row] || is_open;
        if (std::strcmp(call.name, "stat") == 0) {
            looks[row].last_failed = call.result < 0;
            // Looked at again without being read: it was replaced just now.
            looks[row].counts_as_strange |= call.result < 0 && !was_opened[row];
        }
        const std::string failed = call.result < 0 ? failed_read(call) : "";
        if (std::strcmp(call.name, "close") == 0)
            looks[row].counts_as_strange = looks[row].last_failed;
        if (failed.empty())
            continue;
        const std::string kind = of_users ? "user" : "group";
        outcome->log.push_back(parse_log(call));
        outcome->log.push_back("3 Could not re-read " + kind + " data!! Could not init " + kind +
                               " database, " + failed);
        (of_users ? outcome->users_unread : outcome->groups_unread) = true;
    }
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (looks[row].counts_as_strange)
            outcome->next_log.push_back(std::string("4 ") + core_file_table[row].path +
                                        " was changed by another program; its changes are lost");
}

bool is_expected(const std::string &expected, const std::string &text) {
    const std::size_t star = expected.find('*');
    if (star == expected.npos || expected == text)
        return expected == text;
    const std::string head = expected.substr(0, star);
    const std::string tail = expected.substr(star + 1);
    if (text.size() <= head.size() + tail.size() || !text.starts_with(head) ||
        !text.ends_with(tail))
        return false;
    const std::string number = text.substr(head.size(), text.size() - head.size() - tail.size());
    return std::all_of(number.begin(), number.end(), [](char c) { return g_ascii_isdigit(c); });
}
