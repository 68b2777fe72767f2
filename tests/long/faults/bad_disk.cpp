// tests/long/faults/bad_disk.cpp: a disk that goes bad in the middle of an account operation, stays
// so for the next change, and is mended.
#include <cerrno>
#include <cstring>

#include "tests/long/faults/account_failer.h"
#include "tests/long/faults/fail_accounts.h"
#include "tests/long/faults/judgement.h"

static constexpr int disk_errors[] = {EIO, ENOSPC, EDQUOT, EROFS};

// The temporary files that were made and neither renamed nor removed.
static void follow_temporaries(const call_trace &trace, folder_state *left) {
    for (int i = 0; i < trace.count; i++) {
        const trapped_call &call = trace.calls[i];
        const std::string path = call.path;
        const std::string name = path.substr(path.rfind('/') + 1);
        if (call.result < 0 || !is_temporary(name))
            continue;
        if (std::strcmp(call.name, "open") == 0)
            (*left)[name].mode = 0600;
        else if (std::strcmp(call.name, "fchmod") == 0)
            (*left)[name].mode = call.mode;
        else if (std::strcmp(call.name, "rename") == 0 || std::strcmp(call.name, "unlink") == 0)
            left->erase(name);
    }
}

static constexpr mode_t MODE_BITS = 07777;

static std::string judge_names(const folder_state &files, const folder_state &left,
                               const folder_state &now) {
    for (const auto &[name, file] : left)
        if (now.count(name) == 0 || (now.at(name).mode & MODE_BITS) != file.mode)
            return name + " is not left as it has to be";
    for (const auto &[name, file] : now)
        if (left.count(name) == 0 && (files.count(name) == 0 || file.mode != files.at(name).mode))
            return name + " is left like that";
    return "";
}

// Reads of the files work: memory is what a reload makes of them, or of what the start read.
std::string account_failer::change_on_bad_disk(usermgmt_ctx *ctx, const operation &what, int from,
                                               int error) {
    trap_plan plan;
    plan.disk_fails_at = from;
    plan.disk_error = error;
    operation_result result = runner_.run(ctx, what, last_, plan);
    lines log = take_syslog();
    if (!last_->struck)
        return "no call that writes was made";
    const account_outcome expected = outcome_on_bad_disk(what, *last_, last_->struck_at, error);
    const std::string wrong = follow(ctx, what, expected, &result);
    if ((from_.flags & USERMGMT_OPEN_NO_CACHE) != 0)
        for (const std::string &line : shadowless_lines(model_->disk()))
            std::erase(log, line);
    return first_of({compare(expected, result, log), wrong});
}

std::string account_failer::outlive_bad_disk(usermgmt_ctx *ctx, int index, int error) {
    folder_state left;
    std::string wrong = change_on_bad_disk(ctx, from_.what, index, error);
    if (wrong.empty() && (last_->struck_at != index || !is_struck(index)))
        wrong = "another call was made";
    follow_temporaries(*last_, &left);
    if (wrong.empty())
        wrong = judge_names(from_.files, left, look_at_folder(ACCOUNT_FOLDER));
    if (!wrong.empty())
        return wrong;
    if (wrong = change_on_bad_disk(ctx, later_operation(), 0, error); !wrong.empty())
        return "the next change, on the bad disk: " + wrong;
    follow_temporaries(*last_, &left);
    const folder_state now = look_at_folder(ACCOUNT_FOLDER);
    if (wrong = first_of({judge_names(from_.files, left, now), judge_root(from_.files, now, now)});
        !wrong.empty())
        return "after the next change, on the bad disk: " + wrong;
    // Lines without a partner that the mended disk still has are written over unread.
    if (wrong = go_on(ctx, {}); !wrong.empty())
        return "on the mended disk: " + wrong;
    return "";
}

void account_failer::spoil_disk(const start &from) {
    from_ = from;
    if (!rehearse())
        return;
    for (int index = 0; index < rehearsal_->count; index++) {
        for (const int error : disk_errors) {
            const bool fails = rehearsal_->calls[index].writes ||
                               (error == EROFS && rehearsal_->calls[index].may_write);
            if (!fails || report_->is_hopeless())
                continue;
            put_back_folder(ACCOUNT_FOLDER, from_.files);
            model_.emplace(read_account_files(), from_.flags);
            const int descriptors = count_open_descriptors();
            context_slot slot = open_accounts(from_.flags);
            std::string wrong =
                slot.ctx != nullptr ? outlive_bad_disk(slot.ctx.get(), index, error) : slot.error;
            slot.ctx.reset();
            if (wrong.empty() && count_open_descriptors() != descriptors)
                wrong = "a descriptor is left open";
            report_->count("faults");
            report_->count("bad_disks");
            report_->count("operations", 2);
            report_->tell_progress("faults");
            if (!wrong.empty())
                fail(index, {error, 0, true}, "the whole disk: " + wrong);
        }
    }
}

void fail_accounts_on_bad_disk(proof_report *report) {
    account_failer failer(report);
    for (const account_case &one : account_cases())
        if (*one.answer == '\0')  // what is refused writes nothing
            for (const guint32 flags : {guint32{0}, guint32{USERMGMT_OPEN_NO_CACHE}})
                failer.spoil_disk({one.name, typical_accounts(), flags, one.what, -1, one.answer});
}
