// tests/long/faults/fail_stores.cpp: operations of the libraries that keep files, whose file-system
// calls fail.
#include "tests/long/faults/fail_stores.h"

#include <cerrno>
#include <cstring>

#include "platform/digest_entry/digest_entry.h"
#include "platform/paramcli/paramcli.h"
#include "tests/long/faults/call_errors.h"
#include "tests/long/faults/store_cases.h"
#include "tests/unit/usermgmt/account_files.h"

// The two libraries that keep a file of lines share their numbers.
static_assert(DIGEST_ENTRY_ERROR_FOLDER == int{PARAMCLI_ERROR_FOLDER});
static_assert(DIGEST_ENTRY_ERROR_LOCK == int{PARAMCLI_ERROR_LOCK});
static_assert(DIGEST_ENTRY_ERROR_READ == int{PARAMCLI_ERROR_READ});
static_assert(DIGEST_ENTRY_ERROR_WRITE == int{PARAMCLI_ERROR_WRITE});
static_assert(DIGEST_ENTRY_ERROR_SYNC == int{PARAMCLI_ERROR_SYNC});

static constexpr int ANSWERS_OK = 0;
static constexpr int UNFORESEEN = -1;

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

template <std::size_t count>
static int find_answer(const answer_of_call (&rows)[count], const trapped_call &call,
                       const std::string &path) {
    for (const answer_of_call &row : rows)
        if (std::strcmp(row.call, call.name) == 0 && path + row.suffix == call.path)
            return row.answer;
    return UNFORESEEN;
}

class store_failer {
  public:
    store_failer(proof_report *report, std::string folder)
        : report_(report), folder_(std::move(folder)) {}
    void strike_all(const store_case &one, guint64 amount);

  private:
    bool rehearse();
    int expected_answer(const trapped_call &call, const call_fault &fault) const;
    std::string strike(int index, const call_fault &fault);
    std::string judge_file(const trapped_call &call, const call_fault &fault, int answer);
    std::string judge_boot(const trapped_call &call, const call_fault &fault, int answer);

    proof_report *report_;
    std::string folder_;
    call_trace *rehearsal_ = make_shared_trace();
    call_trace *last_ = make_shared_trace();
    store_case one_;
    folder_state after_;
    std::string boot_before_;
    std::string boot_after_;
};

bool store_failer::rehearse() {
    put_back_store(one_, one_.files);
    (void)one_.run();  // The C library reads some of its own files only once.
    put_back_store(one_, one_.files);
    boot_before_ = one_.file.empty() ? read_boot_block() : "";
    begin_trap(rehearsal_, {}, folder_);
    const int answer = one_.run();
    end_trap();
    after_ = look_at_store(one_);
    boot_after_ = one_.file.empty() ? read_boot_block() : "";
    if (answer != 0 || rehearsal_->count == 0)
        report_->fail(one_.name + " answers " + std::to_string(answer));
    return answer == 0;
}

// An interrupted call, and a short one, is made again.
int store_failer::expected_answer(const trapped_call &call, const call_fault &fault) const {
    const std::string folder = one_.folder.substr(folder_.size() + 1);
    const bool is_repeated = std::strcmp(call.name, "read") == 0 ||
                             std::strcmp(call.name, "write") == 0 ||
                             std::strcmp(call.name, "flock") == 0;
    if ((fault.error == EINTR && is_repeated) || (fault.error == 0 && fault.error_after_short == 0))
        return ANSWERS_OK;
    for (const int answer :
         {find_answer(file_answers, call, folder + "/" + one_.file),
          find_answer(folder_answers, call, folder), find_answer(parent_answers, call, folder_)})
        if (answer != UNFORESEEN)
            return answer;
    // Where the group of the web server is looked up, a failure means that there is none.
    return call.path[0] == '/' ? ANSWERS_OK : UNFORESEEN;
}

static std::string text_of(const folder_state &state, const std::string &name) {
    const auto found = state.find(name);
    return found != state.end() ? found->second.text : "(no file)";
}

std::string store_failer::judge_file(const trapped_call &call, const call_fault &fault,
                                     int answer) {
    const int expected = expected_answer(call, fault);
    if (expected == UNFORESEEN)
        return "nobody thought of that call";
    if (answer != expected)
        return "answers " + std::to_string(answer) + " instead of " + std::to_string(expected);

    const folder_state now = look_at_store(one_);
    const std::string text = text_of(now, one_.file);
    const bool may_be_new =
        answer == ANSWERS_OK || (answer == DIGEST_ENTRY_ERROR_SYNC && fault.for_ever);
    const bool may_be_old = answer != ANSWERS_OK;
    if (!(may_be_new && text == text_of(after_, one_.file)) &&
        !(may_be_old && text == text_of(one_.files, one_.file)))
        return "the file is" + line_difference(text_of(after_, one_.file), text);
    // One that was there before and could not be removed, or was not to be, stays.
    for (const auto &[name, file] : now) {
        const auto before = one_.files.find(name);
        if (is_temporary(name) && (before == one_.files.end() || before->second != file))
            return name + " is left";
        if (name == one_.file && (before != one_.files.end() ? file.mode != before->second.mode
                                                             : file.mode != after_.at(name).mode))
            return name + " has another mode";
    }
    if (const int again = one_.run(); again != 0)
        return "the next try answers " + std::to_string(again);
    return text_of(look_at_store(one_), one_.file) == text_of(after_, one_.file)
               ? ""
               : "the next try ends in another file";
}

std::string store_failer::judge_boot(const trapped_call &call, const call_fault &fault,
                                     int answer) {
    const std::string now = read_boot_block();
    // A copy may be whole although its writing was not, and on the disk although it was not synced.
    const bool may_be_new =
        fault.error == EIO || fault.error_after_short != 0 || std::strcmp(call.name, "fsync") == 0;
    if (answer == 0 && now != boot_after_)
        return "succeeds and leaves " + now;
    if (answer != 0 && now != boot_before_ && !(may_be_new && now == boot_after_))
        return "fails and leaves " + now;
    if (answer == 0)
        report_->count("boot_block_faults_without_harm");
    return write_on_boot_block();
}

std::string store_failer::strike(int index, const call_fault &fault) {
    put_back_store(one_, one_.files);
    const int descriptors = count_open_descriptors();
    trap_plan plan;
    plan.fail_at = index;
    plan.error = fault.error;
    plan.error_after_short = fault.error_after_short;
    plan.for_ever = fault.for_ever;
    begin_trap(last_, plan, folder_);
    const int answer = one_.run();
    end_trap();
    const trapped_call &call = rehearsal_->calls[index];
    if (!last_->struck || line_of(last_->calls[index]) != line_of(call))
        return "another call was made";
    const std::string wrong =
        one_.file.empty() ? judge_boot(call, fault, answer) : judge_file(call, fault, answer);
    return wrong.empty() && count_open_descriptors() != descriptors ? "a descriptor is left open"
                                                                    : wrong;
}

void store_failer::strike_all(const store_case &one, guint64 amount) {
    one_ = one;
    if (!rehearse())
        return;
    for (int index = 0; index < rehearsal_->count; index++) {
        for (const call_fault &fault : faults_of(rehearsal_->calls[index])) {
            if (report_->figure("faults") >= amount || report_->is_hopeless())
                return;
            const std::string wrong = strike(index, fault);
            report_->count("faults");
            report_->count("operations");
            report_->tell_progress("faults");
            if (!wrong.empty())
                report_->fail(one_.name + ", call " + std::to_string(index) + ", " +
                              line_of(rehearsal_->calls[index]) + ": " + shown(fault) + ": " +
                              wrong);
        }
    }
}

void fail_every_store_call(proof_report *report, const std::string &folder, guint64 amount) {
    store_failer failer(report, folder);
    for (const store_case &one : store_cases(folder))
        failer.strike_all(one, amount);
}
