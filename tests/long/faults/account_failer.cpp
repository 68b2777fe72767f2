// tests/long/faults/account_failer.cpp: the judgement on an account operation of which a call
// failed.
#include "tests/long/faults/account_failer.h"

#include <algorithm>

#include "tests/long/faults/judgement.h"

static bool are_expected(const lines &expected, const lines &logged) {
    if (expected.size() != logged.size())
        return false;
    for (std::size_t i = 0; i < expected.size(); i++)
        if (!is_expected(expected[i], logged[i]))
            return false;
    return true;
}

std::string joined(const lines &texts) {
    std::string all;
    for (const std::string &text : texts)
        all += "\n    " + text;
    return all.empty() ? " nothing" : all;
}

std::string first_of(std::initializer_list<std::string> wrongs) {
    for (const std::string &wrong : wrongs)
        if (!wrong.empty())
            return wrong;
    return "";
}

lines shadowless_lines(const account_lines &files) {
    lines texts;
    for (const passwd_line &user : files.passwd) {
        const bool has_shadow =
            std::any_of(files.shadow.begin(), files.shadow.end(),
                        [&user](const shadow_line &line) { return line.name == user.name; });
        if (user.password == "x" && !has_shadow)
            texts.push_back("4 Failed to parse user '" + user.name +
                            "': no corresponding shadow entry was found for '" + user.name + "'");
    }
    return texts;
}

// Once for each call that lacks them.
void account_failer::require_errors(const call_trace &trace) {
    for (int i = 0; i < trace.count; i++)
        if (!has_errors(trace.calls[i]))
            report_->fail(from_.name +
                          ": nobody listed how a call fails: " + line_of(trace.calls[i]));
}

std::string account_failer::compare(const account_outcome &expected, const operation_result &result,
                                    const lines &log) const {
    if (!expected.unforeseen.empty())
        return "nobody thought of the call " + expected.unforeseen;
    if (!is_expected(expected.error, result.error) &&
        (expected.other.empty() || !is_expected(expected.other, result.error)))
        return "the error is\n    " + result.error + "\ninstead of\n    " + expected.error;
    if (result.succeeded != result.error.empty())
        return "the result and the error do not agree: " + result.error;
    return are_expected(expected.log, log)
               ? ""
               : "logged is" + joined(log) + "\ninstead of" + joined(expected.log);
}

// Tells the model, and compares memory and files with it.
std::string account_failer::follow(usermgmt_ctx *ctx, operation what,
                                   const account_outcome &expected, operation_result *result) {
    what.fault = planned_fault{"", "", 0, expected.replaced};
    result->fault_struck = !result->succeeded && expected.is_written;
    result->groups_unread = expected.groups_unread;
    result->users_unread = expected.users_unread;
    model_->follow(what, *result);
    return first_of(
        {model_->objection(), model_->difference_from(ctx), difference_from_disk(*model_)});
}

// The next change works, whatever is left in memory, and writes it all.
std::string account_failer::go_on(usermgmt_ctx *ctx, const lines &expected_log) {
    const operation_result later = runner_.run(ctx, later_operation());
    const lines log = take_syslog();
    model_->follow(later_operation(), later);
    report_->count("operations");
    if (!later.succeeded)
        return "the next change fails: " + later.error;
    if (!are_expected(expected_log, log))
        return "the next change logs" + joined(log) + "\ninstead of" + joined(expected_log);
    const folder_state now = look_at_folder(ACCOUNT_FOLDER);
    for (const auto &[name, file] : now)
        if (from_.files.count(name) == 0 || file.mode != from_.files.at(name).mode)
            return "the next change leaves " + name + " like that";
    return first_of({model_->objection(), model_->difference_from(ctx),
                     difference_from_disk(*model_), judge_root(from_.files, now, now)});
}
