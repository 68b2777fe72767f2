// methods/system/diagnostics.cpp: fixed diagnostic tools, run with whitelisted words.
#include "methods/system/diagnostics.h"

#include <cstring>

#include <sys/wait.h>

#include "methods/system/text_answer.h"
#include "methods/tool_runner.h"
#include "service/method.h"

static constexpr const char *LLDPCLI = "/usr/sbin/lldpcli";
static constexpr const char *SMARTCTL = "/usr/sbin/smartctl";
static constexpr const char *ETHTOOL = "/usr/sbin/ethtool";
static constexpr const char *NETSTAT = "/usr/bin/netstat";

static constexpr const char *NAME_CHARACTERS = "abcdefghijklmnopqrstuvwxyz0123456789";
static constexpr char SUBSTITUTE = '!';

// Each word stands for a whole command; the unused slot of argv is the terminator.
struct tool_command {
    const char *word;
    const char *argv[5];
};

static constexpr tool_command lldpcli_commands[] = {
    {"show-neighbors",  {LLDPCLI, "show", "neighbors", "details"} },
    {"show-interfaces", {LLDPCLI, "show", "interfaces", "details"}},
};

static constexpr tool_command netstat_modes[] = {
    {"all",     {NETSTAT, "-Wnap"} },
    {"tcp-udp", {NETSTAT, "-Wnutp"}},
};

template <std::size_t size>
static const tool_command *find_command(const tool_command (&commands)[size], const char *word) {
    for (const tool_command &command : commands)
        if (g_str_equal(command.word, word))
            return &command;
    return nullptr;
}

static bool has_only_name_characters(const char *text) {
    g_autofree char *checked = g_strcanon(g_strdup(text), NAME_CHARACTERS, SUBSTITUTE);
    return std::strchr(checked, SUBSTITUTE) == nullptr;
}

// A tool that fails answers with its own error text; that is no error of the method.
static const char *answer_of(const tool_result &result) {
    return tool_succeeded(result) ? result.output : result.error_output;
}

bool handle_execute_lldpcli(method_call &call, const char *command) {
    const tool_command *found = find_command(lldpcli_commands, command);
    if (found == nullptr)
        return fail(call, PRIVANE_ERROR_EXECUTE_LLDPCLI, "Command not supported by Privane: %s",
                    command);

    g_auto(tool_result) result = {};
    if (!run_tool(found->argv, tool_capture::BOTH, &result, &call.error))
        return pass_on(call, "Failed to execute lldpcli: ");

    return answer_with_text(call, answer_of(result), privane_system__complete_execute_lldpcli);
}

static bool is_disk(const char *device) {
    static constexpr const char *prefix = "/dev/sd";
    static constexpr std::size_t max_length = 10;
    return std::strlen(device) <= max_length && g_str_has_prefix(device, prefix) &&
           has_only_name_characters(device + std::strlen(prefix));
}

bool handle_execute_smartctl(method_call &call, const char *flag, const char *device) {
    if (!g_str_equal(flag, "all"))
        return fail(call, PRIVANE_ERROR_EXECUTE_SMARTCTL, "Flag not supported by Privane: %s",
                    flag);
    if (!is_disk(device))
        return fail(call, PRIVANE_ERROR_EXECUTE_SMARTCTL, "Device not supported by Privane: %s",
                    device);

    const char *const argv[] = {SMARTCTL, "--all", device, nullptr};
    g_auto(tool_result) result = {};
    if (!run_tool(argv, tool_capture::OUTPUT_WITHOUT_ERRORS, &result, &call.error))
        return pass_on(call, "Failed to execute smartctl: ");

    // Its exit status is a set of findings, so any of them is an answer.
    return answer_with_text(call, result.output, privane_system__complete_execute_smartctl);
}

static bool is_network_interface(const char *interface) {
    static constexpr std::size_t max_length = 6;
    const bool is_known = g_str_has_prefix(interface, "eth") || g_str_has_prefix(interface, "br") ||
                          g_str_has_prefix(interface, "wlan");
    return is_known && std::strlen(interface) <= max_length && has_only_name_characters(interface);
}

bool handle_execute_ethtool(method_call &call, const char *flag, const char *interface) {
    if (!g_str_equal(flag, "d"))
        return fail(call, PRIVANE_ERROR_EXECUTE_ETHTOOL, "Flag not supported by Privane: %s", flag);
    if (!is_network_interface(interface))
        return fail(call, PRIVANE_ERROR_EXECUTE_ETHTOOL, "Interface not supported by Privane: %s",
                    interface);

    const char *const argv[] = {ETHTOOL, "-d", interface, nullptr};
    g_auto(tool_result) result = {};
    if (!run_tool(argv, tool_capture::BOTH, &result, &call.error))
        return pass_on(call, "Failed to execute ethtool: ");

    return answer_with_text(call, answer_of(result), privane_system__complete_execute_ethtool);
}

char *network_info_action(method_call &call, const char *mode) {
    if (find_command(netstat_modes, mode) == nullptr) {
        (void)fail(call, PRIVANE_ERROR_NETWORK_INFO, "Invalid mode: %s", mode);  // null says so
        return nullptr;
    }
    return g_strdup_printf("%sgetactivenetworkinfo.%s", ACTION_PREFIX.text, mode);
}

bool handle_get_active_network_info(method_call &call, const char *mode) {
    const tool_command *command = find_command(netstat_modes, mode);
    g_auto(tool_result) result = {};
    if (!run_tool(command->argv, tool_capture::OUTPUT_WITHOUT_ERRORS, &result, &call.error))
        return pass_on(call, "Failed to spawn netstat: ");
    if (!tool_succeeded(result))
        return fail(call, PRIVANE_ERROR_NETWORK_INFO, "netstat call failed with code: %d",
                    WEXITSTATUS(result.wait_status));

    return answer_with_text(call, result.output, privane_system__complete_get_active_network_info);
}
