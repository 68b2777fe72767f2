// tests/fuzz/unit_names_fuzz.cpp: the unit methods on any name, and the actions that libauthz finds
// in their IDs. The first byte chooses the method and whether the caller is allowed; the rest is
// the name, and once more an action ID.
#include <cstring>

#include "methods/system/unit_control.h"
#include "platform/authz/polkit/unit_action.h"
#include "tests/fuzz/bus_call.h"
#include "tests/fuzz/fuzz.h"

static constexpr std::size_t MAX_LENGTH = 64;
static constexpr std::string_view LETTERS = "abcdefghijklmnopqrstuvwxyz0123456789-@";
static constexpr const unit_job *jobs[] = {&start_service, &stop_service, &restart_service,
                                           &reload_service, &default_target};
static constexpr std::string_view PREFIX = "com.zintor.privane-system.";

static std::string acted_on;
static int actions_done;
static bool manager_fails;

static bool act(GDBusConnection *, const char *unit, GError **error) {
    actions_done++;
    acted_on = unit;
    if (manager_fails)
        g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_FAILED, "StartUnit failed, \xff");
    return !manager_fails;
}

static void check_method(const unit_job &job, const std::string &unit, bool is_allowed) {
    bus_call bus;
    const bool is_valid = unit.size() <= MAX_LENGTH && has_only(unit, LETTERS);
    const std::size_t at = unit.find('@');
    const bool is_template = at != std::string::npos;
    const std::string action = std::string(PREFIX) + job.action;
    const std::string id = action + "." + unit.substr(0, at) + (is_template ? ".any" : "");

    bus.is_allowed = is_allowed;
    actions_done = 0;
    hold(privane_handle_unit_action(nullptr, bus.call.invocation, job.action, unit.c_str(),
                                    job.suffix, act, job.complete, job.code, &bus.state),
         "a call with a name is served", unit);
    const bool succeeds = is_valid && is_allowed && !manager_fails;
    hold(bus.answers == 1 && bus.is_error == !succeeds, "a call is answered once, as it went",
         unit);
    hold(bus.actions == (is_valid ? std::vector<std::string>{id} : std::vector<std::string>()),
         "a valid name is authorized, once, and no other",
         bus.actions.empty() ? unit : bus.actions[0]);
    hold(actions_done == (is_valid && is_allowed ? 1 : 0),
         "only who is allowed gets a unit acted on", unit);
    hold(actions_done == 0 || acted_on == unit + job.suffix, "the unit is the one that was named",
         acted_on);
    hold(is_valid ? is_allowed || bus.code == 7 : bus.code == job.code,
         "a refusal has its own code", unit);
    if (!is_valid)
        return;

    g_auto(unit_action) parsed = {};
    hold(unit_action_parse(id.c_str(), &parsed), "the action of a valid name is a unit's", id);
    hold(parsed.parent == action, "its parent is the method's action", parsed.parent);
    hold(parsed.unit == unit.substr(0, is_template ? at + 1 : at), "it names the unit or template",
         parsed.unit);
}

// Any ID that is taken can be put together again from what was found in it.
static void check_action(const std::string &id) {
    g_auto(unit_action) parsed = {};
    if (!unit_action_parse(id.c_str(), &parsed))
        return;
    std::string unit = parsed.unit;
    bool is_known = false;
    for (const unit_job *job : jobs)
        is_known = is_known || parsed.parent == std::string(PREFIX) + job->action;
    hold(is_known, "a parent is one of the five", parsed.parent);
    const std::string direct = std::string(parsed.parent) + "." + unit;
    const bool is_template = unit.ends_with('@');
    hold(unit.find('.') == std::string::npos, "a unit has no dot", unit);
    if (direct == id)
        return;
    hold(is_template, "only a template's ID differs from its name", id);
    unit.pop_back();
    hold(std::string(parsed.parent) + "." + unit + ".any" == id, "a template's ID ends in .any",
         id);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    chosen_bytes input(data, size);
    const unsigned choice = input.next();
    const std::string rest(input.rest());
    const std::string unit = rest.c_str();
    const unit_job &job = *jobs[choice % std::size(jobs)];

    manager_fails = choice / 32 % 2 == 1;
    check_method(job, unit, choice / 16 % 2 == 0);
    check_action(unit);
    check_action(std::string(PREFIX) + job.action + "." + unit);
    return 0;
}
