// tests/long/faults/kill_accounts.cpp: account operations that end at any call with the process.
#include "tests/long/faults/kill_accounts.h"

#include <algorithm>
#include <csignal>
#include <cstring>
#include <optional>

#include <sys/wait.h>
#include <unistd.h>

#include "tests/long/faults/account_cases.h"
#include "tests/long/faults/half_done.h"
#include "tests/long/faults/judgement.h"

// Refusals that a repeated operation may meet: it was done before it could say so.
static constexpr const char *done_before[] = {"usermgmt 3: ", "usermgmt 6: ", "usermgmt 7: "};

struct death {
    int before;  // the call; behind the last one there is none
    bool torn;   // half of what it was to write is written
};

class account_killer {
  public:
    explicit account_killer(proof_report *report) : report_(report) {}

    // An operation and the files it starts from.
    struct start {
        std::string name;  // to tell failures by
        folder_state files;
        guint32 flags;
        operation what;
        const char *answer = nullptr;  // as a case has it; null where chance decides
        bool is_typical = false;       // its half-done states are on the list
    };

    // Runs it to its end. False where that already is not as it has to be.
    bool rehearse(const start &from);
    // All points of the operation that was rehearsed.
    std::vector<death> deaths() const;
    void strike(const death &when);

    // The states that deaths left, but for those without a trace.
    const std::vector<folder_state> &states() const { return states_; }
    half_done_list *half_done_states() { return &half_done_; }
    account_runner *runner() { return &runner_; }

  private:
    folder_state die(const death &when);
    std::string judge(const death &when, const folder_state &now) const;
    std::string recover(const folder_state &now);
    std::string repeat(usermgmt_ctx *ctx, account_model *model, std::string *out_answer);
    std::string check_half_done(const folder_state &now, const std::string &log,
                                const std::string &answer);
    std::string replaced_in(const folder_state &now, bool *out_none, bool *out_all) const;
    void fail(const std::string &what);

    proof_report *report_;
    account_runner runner_;
    call_trace *rehearsal_ = make_shared_trace();
    call_trace *last_ = make_shared_trace();
    start from_;
    folder_state after_;
    std::vector<folder_state> states_;
    half_done_list half_done_;
    account_lines texts_after_;
};

void account_killer::fail(const std::string &what) {
    report_->fail(from_.name + " (" + described(from_.what) + "): " + what);
}

// A replaced file has the mode and the owner of the old one.
static std::string difference_in_access(const folder_state &before, const folder_state &after) {
    for (const std::string &name : account_file_names()) {
        if (before.count(name) == 0 || after.count(name) == 0)
            continue;
        const lying_file &old = before.at(name);
        const lying_file &made = after.at(name);
        if (old.mode != made.mode || old.owner != made.owner || old.group != made.group)
            return name + " has another mode or owner";
    }
    return "";
}

bool account_killer::rehearse(const start &from) {
    from_ = from;
    states_.clear();
    put_back_folder(ACCOUNT_FOLDER, from.files);
    account_model model(read_account_files(), from.flags);
    context_slot slot = open_accounts(from.flags);
    if (slot.ctx == nullptr) {
        fail("the database does not open: " + slot.error);
        return false;
    }
    const operation_result result = runner_.run(slot.ctx.get(), from.what, rehearsal_);
    model.follow(from.what, result);
    after_ = look_at_folder(ACCOUNT_FOLDER);
    texts_after_ = read_account_files();
    report_->count("operations");

    std::string wrong = judge_order_of_calls(*rehearsal_);
    if (wrong.empty() && from_.answer != nullptr && !is_answer(from_.answer, result))
        wrong = "it was to succeed, or to be refused otherwise";
    for (const std::string &next :
         {difference_in_access(from_.files, after_), model.objection(),
          model.difference_from(slot.ctx.get()), difference_from_disk(model),
          judge_root(from.files, after_, after_)})
        wrong = wrong.empty() ? next : wrong;
    if (!wrong.empty())
        fail("not stopped: " + wrong + "\nits error: " + result.error);
    return wrong.empty();
}

std::vector<death> account_killer::deaths() const {
    std::vector<death> all;
    for (int i = 0; i < rehearsal_->count; i++) {
        all.push_back({i, false});
        if (rehearsal_->calls[i].size > 1)
            all.push_back({i, true});
    }
    all.push_back({rehearsal_->count, false});
    return all;
}

folder_state account_killer::die(const death &when) {
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    const pid_t child = fork();
    if (child == 0) {
        const context_slot slot = open_accounts(from_.flags);
        if (slot.ctx == nullptr)
            _exit(1);
        trap_plan plan;
        plan.die_before = when.before;
        plan.torn = when.torn;
        (void)runner_.run(slot.ctx.get(), from_.what, last_, plan);
        (void)raise(SIGKILL);
    }
    int status = 0;
    if (child < 0 || waitpid(child, &status, 0) != child || !WIFSIGNALED(status) ||
        WTERMSIG(status) != SIGKILL || last_->count != when.before)
        fail("did not die before call " + std::to_string(when.before) + " but after " +
             std::to_string(last_->count) + " with wait status " + std::to_string(status) +
             ", the last one rehearsed being " +
             line_of(rehearsal_->calls[std::max(rehearsal_->count - 1, 0)]));
    return look_at_folder(ACCOUNT_FOLDER);
}

std::string account_killer::judge(const death &when, const folder_state &now) const {
    stopped_replacement stopped = {&from_.files, &after_, rehearsal_, when.before,
                                   account_file_names()};
    std::string wrong = judge_files(stopped, now);
    return wrong.empty() ? judge_root(from_.files, after_, now) : wrong;
}

void account_killer::strike(const death &when) {
    const folder_state now = die(when);
    report_->count("points");
    report_->count("torn_writes", when.torn ? 1 : 0);
    report_->tell_progress("points");
    std::string wrong = judge(when, now);
    if (wrong.empty() && std::find(states_.begin(), states_.end(), now) == states_.end()) {
        states_.push_back(now);
        report_->count("states");
        wrong = recover(now);
    }
    if (wrong.empty())
        return;
    const std::string call = when.before < std::min(rehearsal_->count, call_trace::MAX_CALLS)
                                 ? line_of(rehearsal_->calls[when.before])
                                 : "its return";
    fail("killed before call " + std::to_string(when.before) + ", " + call +
         (when.torn ? ", half written" : "") + ": " + wrong);
}

std::string account_killer::replaced_in(const folder_state &now, bool *out_none,
                                        bool *out_all) const {
    std::string names;
    *out_none = *out_all = true;
    for (const std::string &name : account_file_names()) {
        const std::string &old = from_.files.at(name).text;
        const std::string &made = after_.at(name).text;
        if (old == made)
            continue;
        const bool is_new = now.at(name).text == made;
        names += is_new ? (names.empty() ? "" : " ") + name : "";
        (is_new ? *out_none : *out_all) = false;
    }
    return names;
}

std::string account_killer::check_half_done(const folder_state &now, const std::string &log,
                                            const std::string &answer) {
    bool none = false;
    bool all = false;
    const std::string replaced = replaced_in(now, &none, &all);
    const std::string left_names[] = {"passwd", "shadow", "group"};
    std::string left;
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        left += line_difference(texts_after_.texts[row], read_account_text(row));
    if (!none && !all)
        return half_done_.check({from_.name, replaced, log, answer, left});
    if (!log.empty())
        return "logged when opened:" + log;
    return left.empty() ? "" : "the files do not become what they should:" + left;
}

std::string account_killer::repeat(usermgmt_ctx *ctx, account_model *model,
                                   std::string *out_answer) {
    const operation_result again = runner_.run(ctx, from_.what);
    model->follow(from_.what, again);
    report_->count("operations");
    *out_answer = again.succeeded ? "done" : again.error;
    const bool known = again.succeeded ||
                       std::any_of(std::begin(done_before), std::end(done_before),
                                   [&](const char *code) { return again.error.starts_with(code); });
    // What is refused before the death is refused after it.
    if (from_.answer != nullptr && !known && !is_answer(from_.answer, again))
        return "repeated, it fails: " + again.error;
    return model->objection().empty() ? difference_from_disk(*model) : model->objection();
}

// The service starts, the operation is repeated, and another one finds nothing in its way.
std::string account_killer::recover(const folder_state &now) {
    account_model model(read_account_files(), from_.flags);
    context_slot slot = open_accounts(from_.flags);
    if (slot.ctx == nullptr)
        return "the database does not open again: " + slot.error;
    std::string log;
    for (const std::string &line : slot.log)
        log += "\n" + line;
    std::string wrong = model.difference_from(slot.ctx.get());
    std::string answer;
    if (wrong.empty())
        wrong = repeat(slot.ctx.get(), &model, &answer);
    if (wrong.empty() && from_.is_typical)
        wrong = check_half_done(now, log, answer);
    if (!wrong.empty())
        return wrong;

    const operation_result later = runner_.run(slot.ctx.get(), later_operation());
    model.follow(later_operation(), later);
    report_->count("operations");
    if (!later.succeeded && (from_.answer != nullptr || !later.error.starts_with("usermgmt ")))
        return "the next operation fails: " + later.error;
    for (const std::string &next :
         {model.objection(), model.difference_from(slot.ctx.get()), difference_from_disk(model)})
        if (!next.empty())
            return "after the next operation: " + next;
    const folder_state end = look_at_folder(ACCOUNT_FOLDER);
    if (later.succeeded && end.size() != account_file_names().size())
        return "the next operation left" + state_difference(now, end, true);
    slot.ctx.reset();
    slot = open_accounts(from_.flags);
    return slot.ctx != nullptr ? judge_root(from_.files, after_, end)
                               : "the database does not open at last: " + slot.error;
}

// All that a start offers.
static void strike_all(account_killer *killer, proof_report *report,
                       const account_killer::start &from) {
    if (!killer->rehearse(from))
        return;
    for (const death &when : killer->deaths()) {
        if (report->is_hopeless())
            return;
        killer->strike(when);
    }
}

// What differs from the start, so that the next round has something else to start from.
static std::vector<folder_state> new_starts(const account_killer &killer,
                                            const folder_state &start) {
    std::vector<folder_state> starts;
    for (const folder_state &state : killer.states())
        if (state != start)
            starts.push_back(state);
    return starts;
}

void kill_every_account_operation(proof_report *report) {
    account_killer killer(report);
    const folder_state accounts = typical_accounts();
    std::vector<std::pair<const account_case *, folder_state>> crashed;
    for (const account_case &one : account_cases()) {
        strike_all(&killer, report, {one.name, accounts, 0, one.what, one.answer, true});
        for (const folder_state &state : new_starts(killer, accounts))
            crashed.emplace_back(&one, state);
    }
    const bool all_met = !report->is_hopeless();

    for (const account_case &one : account_cases()) {
        strike_all(&killer, report,
                   {std::string(one.name) + ", untidy files, no cache", untidy_accounts(),
                    USERMGMT_OPEN_NO_CACHE, one.what});
        for (const leftover &left : leftovers()) {
            folder_state files = accounts;
            files.insert(left.files.begin(), left.files.end());
            strike_all(&killer, report,
                       {std::string(one.name) + ", " + left.name, files, 0, one.what, one.answer});
        }
    }
    for (const auto &[one, state] : crashed)
        strike_all(&killer, report,
                   {std::string(one->name) + ", after a crash", state, 0, one->what});
    if (all_met)
        killer.half_done_states()->finish(report);
}

// Of one operation, each at another call; the next operation tells more.
static constexpr unsigned MOST_STRIKES = 6;

void kill_random_account_operations(proof_report *report, guint64 amount, guint64 seed) {
    account_killer killer(report);
    random_operations chance(seed);
    while (report->figure("points") < amount && !report->is_hopeless()) {
        starting_files files = chance.next_files();
        files.has_shadow = true;
        folder_state state = random_accounts(files);
        for (unsigned left = 2 + chance.below(3); left > 0; left--) {
            const operation what = chance.next_operation(false);
            if (what.kind == operation_kind::reopen)
                continue;
            killer.runner()->set_time(killer.runner()->now() + what.seconds_later);
            if (!killer.rehearse({"by chance", state, files.open_flags, what}))
                break;
            std::vector<death> deaths = killer.deaths();
            if (deaths.size() == 1)
                continue;  // it makes no call
            for (unsigned strikes = 0; strikes < MOST_STRIKES && !deaths.empty(); strikes++) {
                const auto which =
                    deaths.begin() + chance.below(static_cast<unsigned>(deaths.size()));
                killer.strike(*which);
                deaths.erase(which);
            }
            // There is none where every death left files that must not be.
            if (chance.once_in(2) && !killer.states().empty())
                state = killer.states().back();  // the next one starts from there
        }
    }
}
