// tests/fuzz/tool_arguments_fuzz.cpp: the words that callers give the diagnostic methods, and what
// the tools print. The parts of the input: the first word, the second one, the output, the errors.
#include <cstring>
#include <optional>

#include <sys/wait.h>

#include "methods/system/diagnostics.h"
#include "methods/tool_runner.h"
#include "tests/fuzz/bus_call.h"
#include "tests/fuzz/fuzz.h"

static constexpr std::string_view LETTERS = "abcdefghijklmnopqrstuvwxyz0123456789";

using words = std::vector<std::string>;
using optional_words = std::optional<words>;

static words run_words;
static int runs;
static std::string output;
static std::string errors;
static int wait_status;

// In place of the real one: no tool is run.
bool run_tool(const char *const *argv, tool_capture capture, tool_result *result, GError **) {
    runs++;
    run_words.clear();
    for (; *argv != nullptr; argv++)
        run_words.emplace_back(*argv);
    result->output = g_strdup(output.c_str());
    if (capture == tool_capture::BOTH)
        result->error_output = g_strdup(errors.c_str());
    result->wait_status = wait_status;
    return true;
}

bool tool_succeeded(const tool_result &result) {
    return WIFEXITED(result.wait_status) && WEXITSTATUS(result.wait_status) == 0;
}

void tool_result_clear(tool_result *result) {
    g_clear_pointer(&result->output, g_free);
    g_clear_pointer(&result->error_output, g_free);
}

static optional_words lldpcli_words(const std::string &command, const std::string &) {
    if (command == "show-neighbors")
        return words{"/usr/sbin/lldpcli", "show", "neighbors", "details"};
    if (command == "show-interfaces")
        return words{"/usr/sbin/lldpcli", "show", "interfaces", "details"};
    return std::nullopt;
}

static optional_words smartctl_words(const std::string &flag, const std::string &device) {
    const bool is_disk =
        device.starts_with("/dev/sd") && device.size() < 11 && has_only(device.substr(7), LETTERS);
    return flag == "all" && is_disk ? optional_words(words{"/usr/sbin/smartctl", "--all", device})
                                    : std::nullopt;
}

static optional_words ethtool_words(const std::string &flag, const std::string &interface) {
    const bool is_interface = (interface.starts_with("eth") || interface.starts_with("br") ||
                               interface.starts_with("wlan")) &&
                              interface.size() < 7 && has_only(interface, LETTERS);
    return flag == "d" && is_interface ? optional_words(words{"/usr/sbin/ethtool", "-d", interface})
                                       : std::nullopt;
}

static optional_words netstat_words(const std::string &mode, const std::string &) {
    if (mode != "all" && mode != "tcp-udp")
        return std::nullopt;
    return words{"/usr/bin/netstat", mode == "all" ? "-Wnap" : "-Wnutp"};
}

static bool call_lldpcli(method_call &call, const char *command, const char *) {
    return handle_execute_lldpcli(call, command);
}

static bool call_netstat(method_call &call, const char *mode, const char *) {
    g_autofree char *action = network_info_action(call, mode);
    if (action == nullptr)
        return false;
    hold(action == std::string("com.zintor.privane-system.getactivenetworkinfo.") + mode,
         "each mode has its action", action);
    return handle_get_active_network_info(call, mode);
}

// A method, what it may run, and how it takes a tool that fails.
struct diagnostic {
    bool (*handle)(method_call &call, const char *first, const char *second);
    optional_words (*expected)(const std::string &first, const std::string &second);
    int code;
    bool answers_with_errors;
    bool fails_with_tool;
};

static constexpr diagnostic diagnostics[] = {
    {call_lldpcli,            lldpcli_words,  37, true,  false},
    {handle_execute_smartctl, smartctl_words, 36, false, false},
    {handle_execute_ethtool,  ethtool_words,  35, true,  false},
    {call_netstat,            netstat_words,  28, false, true },
};

static void check(const diagnostic &row, const std::string &first, const std::string &second) {
    bus_call bus;
    runs = 0;
    const bool done = bus.serve(row.handle, first.c_str(), second.c_str());
    const optional_words expected = row.expected(first, second);
    const bool tool_failed = wait_status != 0;
    const auto both = [&] { return first + " " + second; };

    hold(runs == (expected ? 1 : 0), "a tool is run for the words of the list, and only then",
         both);
    hold(!expected || run_words == *expected, "the tool gets the words that belong to it", both);
    hold(done == (expected && !(row.fails_with_tool && tool_failed)),
         "a method fails for other words and for nothing else", both);
    hold(done || bus.code == row.code, "a refusal has the method's code", bus.text);
    if (!done)
        return;
    const std::string &raw = row.answers_with_errors && tool_failed ? errors : output;
    g_autofree char *sendable = g_utf8_make_valid(raw.c_str(), -1);
    hold(bus.first_string == sendable, "what the tool printed is the answer", raw);
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::vector<std::string> parts = parts_of(data, size);
    parts.resize(5);
    // A line end behind a word belongs to the file that the input stands in.
    for (std::string &part : {std::ref(parts[0]), std::ref(parts[1])})
        if (part.ends_with('\n'))
            part.pop_back();
    const std::string first = parts[0].c_str();
    const std::string second = parts[1].c_str();
    output = parts[2].c_str();
    errors = parts[3].c_str();
    wait_status = parts[4].empty() ? 0 : static_cast<unsigned char>(parts[4][0]) << 8;

    for (const diagnostic &row : diagnostics)
        check(row, first, second);
    return 0;
}
