// tests/long/faults/fail_stores.cpp: operations of the libraries that keep files, whose file-system
// calls fail.
#include "tests/long/faults/fail_stores.h"

#include <cerrno>

#include "platform/digest_entry/digest_entry.h"
#include "tests/long/faults/boot_files.h"
#include "tests/long/faults/judgement.h"
#include "tests/long/faults/store_cases.h"
#include "tests/long/faults/store_oracle.h"
#include "tests/unit/usermgmt/account_files.h"

class store_failer {
  public:
    store_failer(proof_report *report, std::string folder)
        : report_(report), folder_(std::move(folder)) {}
    void strike_all(const store_case &one);
    // The disk goes bad at each call that writes, stays so for the next try, and is mended.
    void spoil_disk(const store_case &one);

  private:
    bool rehearse();
    std::string strike(int index, const call_fault &fault);
    std::string try_on_bad_disk(int from, int error, store_bytes *out_bytes);
    std::string outlive_bad_disk(int index, int error);
    std::string judge_file(const store_outcome &expected);
    std::string judge_boot(const store_outcome &expected);

    proof_report *report_;
    std::string folder_;
    call_trace *rehearsal_ = make_shared_trace();
    call_trace *last_ = make_shared_trace();
    store_case one_;
};

static constexpr const char *NOT_LASTING = "succeeded before the folder was synced";

static std::string shown(const store_answer &answer) {
    std::string text = std::to_string(answer.number) + " '" + answer.error + "', logging";
    for (const std::string &line : answer.log)
        text += " '" + line + "'";
    return text;
}

static std::string difference_of_answers(const store_answer &expected, const store_answer &answer) {
    if (answer.number == expected.number && answer.error == expected.error &&
        answer.log == expected.log)
        return answer.wrong;
    return "answers " + shown(answer) + " instead of " + shown(expected);
}

bool store_failer::rehearse() {
    put_back_store(one_, one_.files);
    (void)one_.run();  // The C library reads some of its own files only once.
    put_back_store(one_, one_.files);
    begin_trap(rehearsal_, {}, folder_);
    const store_answer answer = one_.run();
    end_trap();
    std::string wrong = difference_of_answers(answer_of_success(one_), answer);
    if (wrong.empty())
        wrong = state_difference(one_.after, look_at_store(one_), true);
    if (wrong.empty())
        wrong = judge_order_of_calls(*rehearsal_);
    if (wrong.empty() && rehearsal_->count == 0)
        wrong = "it makes no call";
    if (!wrong.empty())
        report_->fail(one_.name + ", which nothing happened to: " + wrong);
    return wrong.empty();
}

static std::string text_of(const folder_state &state, const std::string &name) {
    const auto found = state.find(name);
    return found != state.end() ? found->second.text : "(no file)";
}

std::string store_failer::judge_file(const store_outcome &expected) {
    const folder_state now = look_at_store(one_);
    const folder_state &right = expected.bytes == store_bytes::NEW ? one_.after : one_.files;
    folder_state wanted;
    if (right.count(one_.file) != 0)
        wanted[one_.file] = right.at(one_.file);
    for (const auto &[name, file] : now) {
        // One that was there before and could not be removed, or was not to be, stays.
        const auto before = one_.files.find(name);
        if (is_temporary(name) && (before == one_.files.end() || before->second != file))
            return name + " is left";
        if (is_temporary(name) || name == one_.file + ".lock")
            wanted[name] = is_temporary(name) ? file : one_.after.at(name);
    }
    if (const std::string wrong = state_difference(wanted, now, true); !wrong.empty())
        return "its files are not what they have to be:" + wrong;
    if (const std::string wrong = difference_of_answers(answer_of_success(one_), one_.run());
        !wrong.empty())
        return "the next try " + wrong;
    return text_of(look_at_store(one_), one_.file) == text_of(one_.after, one_.file)
               ? ""
               : "the next try ends in another file";
}

std::string store_failer::judge_boot(const store_outcome &expected) {
    const boot_write done = expected.bytes == store_bytes::NEW    ? boot_write::ALL
                            : expected.bytes == store_bytes::HALF ? boot_write::HALF
                                                                  : boot_write::NOTHING;
    const std::string wrong = judge_boot_block(boot_files_after(one_.files, "a", "new", done));
    return wrong.empty() ? write_on_boot_block() : wrong;
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
    const store_answer answer = one_.run();
    end_trap();
    if (!last_->struck || line_of(last_->calls[index]) != line_of(rehearsal_->calls[index]))
        return "another call was made";
    const store_outcome expected = outcome_of_store(one_, folder_, *rehearsal_, index, fault);
    if (expected.unforeseen)
        return "nobody thought of that call";
    std::string wrong = difference_of_answers(expected.answer, answer);
    if (wrong.empty() && answer.number == 0 && !is_folder_synced(one_, folder_, *last_))
        wrong = NOT_LASTING;
    if (wrong.empty())
        wrong = one_.kind == store_kind::BOOT_BLOCK ? judge_boot(expected) : judge_file(expected);
    if (answer.number == 0 && one_.kind == store_kind::BOOT_BLOCK)
        report_->count("boot_block_faults_without_harm");
    return wrong.empty() && count_open_descriptors() != descriptors ? "a descriptor is left open"
                                                                    : wrong;
}

void store_failer::strike_all(const store_case &one) {
    one_ = one;
    if (!rehearse())
        return;
    for (int index = 0; index < rehearsal_->count; index++)
        if (!has_errors(rehearsal_->calls[index]))
            report_->fail(one_.name +
                          ": nobody listed how a call fails: " + line_of(rehearsal_->calls[index]));
    for (int index = 0; index < rehearsal_->count; index++) {
        for (const call_fault &fault : faults_of(rehearsal_->calls[index])) {
            if (report_->is_hopeless())
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

// With the disk bad from a call on. What has to be there, of what was there before.
std::string store_failer::try_on_bad_disk(int from, int error, store_bytes *out_bytes) {
    trap_plan plan;
    plan.disk_fails_at = from;
    plan.disk_error = error;
    begin_trap(last_, plan, folder_);
    const store_answer answer = one_.run();
    end_trap();
    store_outcome expected = {false, answer_of_success(one_), store_bytes::NEW};
    // The first call that fails with harm decides.
    for (int i = 0; i < last_->count && expected.answer.number == 0; i++) {
        if (!last_->struck || i < last_->struck_at || last_->calls[i].result != -error)
            continue;
        expected = outcome_of_store(one_, folder_, *last_, i, {error, 0, true});
        // Nothing can be brought back to a bad disk.
        if (one_.kind != store_kind::BOOT_BLOCK &&
            expected.answer.number == DIGEST_ENTRY_ERROR_SYNC)
            expected.bytes = store_bytes::NEW;
        if (expected.unforeseen)
            break;
    }
    *out_bytes = expected.bytes;
    if (expected.unforeseen)
        return "nobody thought of that call";
    if (answer.number == 0 && !is_folder_synced(one_, folder_, *last_))
        return NOT_LASTING;
    return difference_of_answers(expected.answer, answer);
}

std::string store_failer::outlive_bad_disk(int index, int error) {
    put_back_store(one_, one_.files);
    const bool is_boot_block = one_.kind == store_kind::BOOT_BLOCK;
    folder_state files = one_.files;
    for (const char *turn : {"on the bad disk ", "the next try on the bad disk "}) {
        store_bytes bytes = store_bytes::OLD;
        std::string wrong = try_on_bad_disk(index, error, &bytes);
        if (wrong.empty() && index > 0 && last_->struck_at != index)
            wrong = "makes another call";
        index = 0;
        if (is_boot_block && bytes == store_bytes::NEW)
            files = boot_files_after(files, "a", "new");
        else if (!is_boot_block && bytes == store_bytes::NEW)
            files = one_.after;
        if (wrong.empty() && is_boot_block)
            wrong = judge_boot_block(files);
        else if (wrong.empty() &&
                 text_of(look_at_store(one_), one_.file) != text_of(files, one_.file))
            wrong = "leaves another file";
        if (!wrong.empty())
            return turn + wrong;
    }
    if (const std::string wrong = difference_of_answers(answer_of_success(one_), one_.run());
        !wrong.empty())
        return "on the mended disk " + wrong;
    if (is_boot_block)
        return judge_boot_block(boot_files_after(files, "a", "new"));
    const folder_state now = look_at_store(one_);
    return text_of(now, one_.file) == text_of(one_.after, one_.file)
               ? ""
               : "on the mended disk it ends in another file";
}

void store_failer::spoil_disk(const store_case &one) {
    static constexpr int errors[] = {EIO, ENOSPC, EDQUOT, EROFS};
    one_ = one;
    if (!rehearse())
        return;
    for (int index = 0; index < rehearsal_->count; index++) {
        const trapped_call &call = rehearsal_->calls[index];
        for (const int error : errors) {
            if (!(call.writes || (error == EROFS && call.may_write)) || report_->is_hopeless())
                continue;
            const std::string wrong = outlive_bad_disk(index, error);
            report_->count("faults");
            report_->count("bad_disks");
            report_->count("operations", 3);
            if (!wrong.empty())
                report_->fail(one.name + ", the disk bad from call " + std::to_string(index) +
                              ", " + line_of(call) + ": " + shown({error, 0, true}) + ": " + wrong);
        }
    }
}

void fail_every_store_call(proof_report *report, const std::string &folder) {
    store_failer failer(report, folder);
    const std::vector<store_case> cases = store_cases(folder);
    for (const store_case &one : cases)
        failer.spoil_disk(one);
    for (const store_case &one : cases)
        failer.strike_all(one);
}
