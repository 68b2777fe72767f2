// tests/long/faults/store_oracle.cpp: what an operation on the web server's passwords, the
// parameters or the boot block has to answer, to log and to leave when one of its calls fails.
#include "tests/long/faults/store_oracle.h"

#include <cerrno>
#include <cstring>

#include <glib.h>

#include "platform/digest_entry/digest_entry.h"
#include "platform/paramcli/paramcli.h"

// The two libraries that keep a file of lines share their numbers.
static_assert(DIGEST_ENTRY_ERROR_FOLDER == int{PARAMCLI_ERROR_FOLDER});
static_assert(DIGEST_ENTRY_ERROR_LOCK == int{PARAMCLI_ERROR_LOCK});
static_assert(DIGEST_ENTRY_ERROR_READ == int{PARAMCLI_ERROR_READ});
static_assert(DIGEST_ENTRY_ERROR_WRITE == int{PARAMCLI_ERROR_WRITE});
static_assert(DIGEST_ENTRY_ERROR_SYNC == int{PARAMCLI_ERROR_SYNC});

static constexpr int ANSWERS_OK = 0;

struct answer_of_call {
    const char *call;
    const char *suffix;  // of the path behind the file's or the folder's
    int answer;
};

// On what begins with the file's name.
static constexpr answer_of_call file_answers[] = {
    {"open",   ".lock", DIGEST_ENTRY_ERROR_LOCK },
    {"fstat",  ".lock", DIGEST_ENTRY_ERROR_LOCK },
    {"flock",  ".lock", DIGEST_ENTRY_ERROR_LOCK },
    {"open",   "",      DIGEST_ENTRY_ERROR_READ },
    {"fstat",  "",      DIGEST_ENTRY_ERROR_READ },
    {"read",   "",      DIGEST_ENTRY_ERROR_READ },
    {"access", "",      ANSWERS_OK              },
    {"unlink", ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"open",   ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"write",  ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"fchown", ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"fchmod", ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"fsync",  ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"close",  ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"rename", ".tmp",  DIGEST_ENTRY_ERROR_WRITE},
    {"close",  ".lock", ANSWERS_OK              },
    {"close",  "",      ANSWERS_OK              },
};
// On the folder, then on the one above.
static constexpr answer_of_call folder_answers[] = {
    {"mkdir", "", DIGEST_ENTRY_ERROR_FOLDER},
    {"open",  "", DIGEST_ENTRY_ERROR_FOLDER},
    {"fstat", "", DIGEST_ENTRY_ERROR_FOLDER},
    {"fsync", "", DIGEST_ENTRY_ERROR_SYNC  },
    {"close", "", ANSWERS_OK               },
};
static constexpr answer_of_call parent_answers[] = {
    {"open",  "", DIGEST_ENTRY_ERROR_FOLDER},
    {"fsync", "", DIGEST_ENTRY_ERROR_FOLDER},
    {"close", "", ANSWERS_OK               },
};
// Where the group of the web server is looked up, a failure means that there is none.
static constexpr const char *GROUP_FILES[] = {"/etc/nsswitch.conf", "/etc/group"};

// Which error number the failure of a call on the boot block is told by.
enum class boot_cause {
    NONE,            // it does no harm
    ITS_OWN,         //
    NO_DESCRIPTION,  // EINVAL, as libubootenv has it, whatever the cause
    NOT_READ,        // EIO, likewise
};

enum class boot_file { CONFIG, LOCK, COPY };

struct boot_row {
    boot_file file;
    const char *call;
    int turn;  // of the calls with that path since the boot block was described; 0: any
    boot_cause cause;
};

// A copy is opened twice with each of the two readings of the description, by libubootenv, then by
// the library, by libubootenv for reading, and for writing.
static constexpr boot_row boot_rows[] = {
    {boot_file::CONFIG, "open",     0, boot_cause::ITS_OWN       },
    {boot_file::CONFIG, "read",     0, boot_cause::NO_DESCRIPTION},
    {boot_file::CONFIG, "fstat",    0, boot_cause::NONE          }, // only for the buffer's size
    {boot_file::CONFIG, "close",    0, boot_cause::NONE          }, // it was only read
    {boot_file::LOCK,   "open",     1, boot_cause::ITS_OWN       },
    {boot_file::LOCK,   "flock",    1, boot_cause::ITS_OWN       },
 // libubootenv takes the lock once more. It goes on without one, which cannot be told.
    {boot_file::LOCK,   "open",     2, boot_cause::NONE          },
    {boot_file::LOCK,   "flock",    2, boot_cause::NONE          },
    {boot_file::LOCK,   "flock",    3, boot_cause::NONE          }, // the close gives it back, too
    {boot_file::LOCK,   "close",    0, boot_cause::NONE          }, // it has closed
    {boot_file::COPY,   "stat",     0, boot_cause::NO_DESCRIPTION},
    {boot_file::COPY,   "readlink", 0, boot_cause::NO_DESCRIPTION},
    {boot_file::COPY,   "fstat",    0, boot_cause::ITS_OWN       },
    {boot_file::COPY,   "open",     1, boot_cause::NO_DESCRIPTION},
    {boot_file::COPY,   "open",     2, boot_cause::NO_DESCRIPTION},
    {boot_file::COPY,   "open",     3, boot_cause::ITS_OWN       },
    {boot_file::COPY,   "open",     4, boot_cause::NOT_READ      },
    {boot_file::COPY,   "open",     5, boot_cause::ITS_OWN       },
    {boot_file::COPY,   "read",     0, boot_cause::NOT_READ      },
    {boot_file::COPY,   "write",    1, boot_cause::ITS_OWN       },
    {boot_file::COPY,   "fsync",    0, boot_cause::ITS_OWN       },
    {boot_file::COPY,   "close",    0, boot_cause::NONE          }, // what counts was synced before
};

template <std::size_t count>
static const answer_of_call *find_answer(const answer_of_call (&rows)[count],
                                         const trapped_call &call, const std::string &path) {
    for (const answer_of_call &row : rows)
        if (std::strcmp(row.call, call.name) == 0 && path + row.suffix == call.path)
            return &row;
    return nullptr;
}

// An interrupted call, and a short one, is made again.
static bool is_made_again(const trapped_call &call, const call_fault &fault, bool with_interrupts) {
    static constexpr const char *repeated[] = {"read", "write", "flock"};
    if (fault.error == 0)
        return fault.error_after_short == 0;
    for (const char *name : repeated)
        if (with_interrupts && fault.error == EINTR && std::strcmp(call.name, name) == 0)
            return true;
    return false;
}

// How the path of a folder is recorded.
static std::string recorded(const std::string &path, const std::string &folder) {
    return path.starts_with(folder + "/") ? path.substr(folder.size() + 1) : path;
}

bool is_folder_synced(const store_case &one, const std::string &folder, const call_trace &trace) {
    const std::string own = recorded(one.folder, folder);
    bool synced = one.kind == store_kind::BOOT_BLOCK;
    for (int i = 0; i < trace.count; i++)
        synced = synced || (std::strcmp(trace.calls[i].name, "fsync") == 0 &&
                            own == trace.calls[i].path && trace.calls[i].result == 0);
    return synced;
}

store_answer answer_of_success(const store_case &one) {
    store_answer answer;
    if (one.kind == store_kind::ROOT_FLAG)
        answer.log = {"message Updating root user!"};
    return answer;
}

static store_answer answer_with(const store_case &one, int number) {
    store_answer answer = answer_of_success(one);
    if (number == ANSWERS_OK)
        return answer;
    answer.number = number;
    if (one.kind == store_kind::ROOT_FLAG)
        answer.log = {"warning Updating root user failed to sync param! Error: " +
                      std::to_string(number)};
    return answer;
}

static bool is_of_group(const trapped_call &call) {
    for (const char *path : GROUP_FILES)
        if (std::strcmp(path, call.path) == 0)
            return true;
    return false;
}

static store_outcome outcome_of_file(const store_case &one, const std::string &folder,
                                     const trapped_call &call, const call_fault &fault) {
    store_outcome outcome;
    const std::string own = recorded(one.folder, folder);
    const std::string parent = one.folder.substr(0, one.folder.rfind('/'));
    const answer_of_call *row = nullptr;
    for (const answer_of_call *found :
         {find_answer(parent_answers, call, parent), find_answer(folder_answers, call, own),
          find_answer(file_answers, call, own + "/" + one.file)})
        row = found != nullptr ? found : row;
    if (row == nullptr && !is_of_group(call)) {
        outcome.unforeseen = true;
        return outcome;
    }
    const int number =
        row == nullptr || is_made_again(call, fault, true) ? ANSWERS_OK : row->answer;
    outcome.answer = answer_with(one, number);
    // Also where the folder could not be synced: the old file has then been brought back.
    if (number != ANSWERS_OK)
        outcome.bytes = store_bytes::OLD;
    return outcome;
}

static boot_file boot_file_of(const std::string &path) {
    return path.ends_with(".config") ? boot_file::CONFIG
           : path.ends_with(".lock") ? boot_file::LOCK
                                     : boot_file::COPY;
}

static int turn_of(const call_trace &trace, int index) {
    int turn = 0;
    for (int i = 0; i <= index; i++)
        turn += line_of(trace.calls[i]) == line_of(trace.calls[index]) ? 1 : 0;
    return turn;
}

static int index_of_write(const call_trace &trace) {
    int index = 0;
    while (index < trace.count && std::strcmp(trace.calls[index].name, "write") != 0)
        index++;
    return index;
}

static const boot_row *find_boot_row(const call_trace &trace, int index) {
    for (const boot_row &row : boot_rows)
        if (row.file == boot_file_of(trace.calls[index].path) &&
            std::strcmp(row.call, trace.calls[index].name) == 0 &&
            (row.turn == 0 || row.turn == turn_of(trace, index)))
            return &row;
    return nullptr;
}

// libubootenv does not look at its own fsync. The library's, through a descriptor that was open
// before, is told of what failed by then: an error that comes once here was of that one alone.
static bool is_unheeded_sync(const call_trace &trace, int index, const call_fault &fault) {
    return std::strcmp(trace.calls[index].name, "fsync") == 0 &&
           index == index_of_write(trace) + 1 && !fault.for_ever;
}

// It is read twice only to see whether there is one.
static bool is_described(const call_trace &trace, int index) {
    int readings = 0;
    for (int i = 0; i <= index; i++)
        readings += std::strcmp(trace.calls[i].name, "open") == 0 &&
                            boot_file_of(trace.calls[i].path) == boot_file::CONFIG
                        ? 1
                        : 0;
    return readings > 2;
}

static store_answer failed_write(bool was_described, int error) {
    const std::string text = std::string(was_described ? "Failed to write bootblock parameter "
                                                       : "Failed to set chip parameters ") +
                             std::to_string(error) + " " + g_strerror(error);
    store_answer answer;
    answer.number = was_described ? 17 : 15;
    answer.error = "privaneSystemError: " + text;
    answer.log = {"warning " + text};
    return answer;
}

static store_outcome outcome_of_boot(const call_trace &trace, int index, const call_fault &fault) {
    store_outcome outcome;
    const trapped_call &call = trace.calls[index];
    const boot_row *row = find_boot_row(trace, index);
    outcome.unforeseen = row == nullptr;
    // Only the lock is taken again.
    const bool is_lock = boot_file_of(call.path) == boot_file::LOCK;
    if (row == nullptr || row->cause == boot_cause::NONE || is_made_again(call, fault, is_lock) ||
        is_unheeded_sync(trace, index, fault))
        return outcome;

    const int own = fault.error != 0 ? fault.error : fault.error_after_short;
    const int error = row->cause == boot_cause::NO_DESCRIPTION ? EINVAL
                      : row->cause == boot_cause::NOT_READ     ? EIO
                                                               : own;
    outcome.answer = failed_write(is_described(trace, index), error);
    const int write = index_of_write(trace);
    // What was written and could not be synced stays: nobody can say what the disk has of it.
    outcome.bytes = index < write      ? store_bytes::OLD
                    : index > write    ? store_bytes::NEW
                    : fault.error == 0 ? store_bytes::HALF
                                       : store_bytes::OLD;
    return outcome;
}

store_outcome outcome_of_store(const store_case &one, const std::string &folder,
                               const call_trace &trace, int index, const call_fault &fault) {
    return one.kind == store_kind::BOOT_BLOCK
               ? outcome_of_boot(trace, index, fault)
               : outcome_of_file(one, folder, trace.calls[index], fault);
}
