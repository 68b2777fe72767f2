// client/verb_table.cpp: the rows of the table, in the order in which the help lists them.
#include "client/account_verbs.h"
#include "client/completion.h"
#include "client/explain.h"
#include "client/monitor.h"
#include "client/system_verbs.h"
#include "client/verb_list.h"
#include "client/verbs.h"

static constexpr argument word(const char *name, value_kind kind = value_kind::TEXT) {
    return {source::WORD, name, kind, nullptr, OPTION_NONE};
}

static constexpr argument choice(const char *name, const char *choices) {
    return {source::WORD, name, value_kind::CHOICE, choices, OPTION_NONE};
}

static constexpr argument first_choice(const char *name, const char *choices) {
    return {source::OPTIONAL_WORD, name, value_kind::CHOICE, choices, OPTION_NONE};
}

static constexpr argument optional_word(const char *name, value_kind kind = value_kind::TEXT) {
    return {source::OPTIONAL_WORD, name, kind, nullptr, OPTION_NONE};
}

static constexpr argument words(const char *name, value_kind kind = value_kind::TEXT) {
    return {source::WORDS, name, kind, nullptr, OPTION_NONE};
}

static constexpr argument chosen(const char *name) {
    return {source::CHOSEN, name, value_kind::CHOICE, name, OPTION_NONE};
}

static constexpr argument option(option_id id) {
    return {source::OPTION, nullptr, value_kind::TEXT, nullptr, id};
}

static constexpr argument required(option_id id) {
    return {source::REQUIRED_OPTION, nullptr, value_kind::TEXT, nullptr, id};
}

static constexpr argument password(source from) {
    return {from, nullptr, value_kind::TEXT, nullptr, OPTION_NONE};
}

static constexpr argument fixed(const char *value) {
    return {source::FIXED, value, value_kind::TEXT, nullptr, OPTION_NONE};
}

static constexpr argument NO_ARGUMENT = {};
static constexpr argument USER_NAME = word("NAME", value_kind::USER);
static constexpr argument GROUP_NAME = word("NAME", value_kind::GROUP);
static constexpr argument UNIT_NAME = word("UNIT", value_kind::UNIT);
static constexpr argument ASKED_TWICE = password(source::NEW_PASSWORD);
static constexpr argument ASKED_ONCE = password(source::CURRENT_PASSWORD);
static constexpr argument ASKED_ON_DEMAND = password(source::OPTIONAL_PASSWORD);

// Without arguments and an answer.
static constexpr command plain(const char *noun, const char *verb, const char *method,
                               const char *help) {
    return {.noun = noun, .verb = verb, .method = method, .help = help};
}

// What scripts of ours call, the help says nothing of.
static constexpr command untold(const char *noun, argument taken,
                                bool (*run)(const session &run, GError **error)) {
    return {.noun = noun, .arguments = {taken}, .run = run};
}

static constexpr command COMMANDS[] = {
    {.noun = "user",
     .verb = "list",
     .method = "GetUserList",
     .answer = shape::LIST,
     .columns = "name",
     .help = "List the accounts"},
    {.noun = "user",
     .verb = "show",
     .method = "GetUser",
     .arguments = {USER_NAME},
     .answer = shape::SUBJECT,
     .help = "Describe an account"},
    {.noun = "user",
     .verb = "check",
     .method = "CheckUser",
     .arguments = {USER_NAME},
     .answer = shape::ANSWER,
     .help = "Tell whether an account exists"},
    {.noun = "user",
     .verb = "authenticate",
     .method = "AuthUserBasic",
     .arguments = {USER_NAME, ASKED_ONCE},
     .help = "Check the password of an account"},
    {.noun = "user",
     .verb = "add",
     .selector = OPTION_SYSTEM,
     .method = "AddSystemUser",
     .arguments = {word("NAME"), ASKED_ON_DEMAND, required(OPTION_GROUP), option(OPTION_GROUPS),
                   option(OPTION_SHELL), option(OPTION_COMMENT)},
     .help = "Add an account for a program"},
    {.noun = "user",
     .verb = "add",
     .selector = OPTION_UID,
     .method = "AddUidUser",
     .arguments = {word("NAME"), ASKED_TWICE, required(OPTION_GROUP), option(OPTION_GROUPS),
                   option(OPTION_COMMENT), required(OPTION_UID)},
     .help = "Add an account that logs in over the web, with a UID of your choice"},
    {.noun = "user",
     .verb = "add",
     .method = "AddUser",
     .arguments = {word("NAME"), ASKED_TWICE, required(OPTION_GROUP), option(OPTION_GROUPS),
                   option(OPTION_COMMENT)},
     .help = "Add an account that logs in over the web"},
    {.noun = "user",
     .verb = "modify",
     .method = "ModifyUser",
     .arguments = {USER_NAME, ASKED_ON_DEMAND, option(OPTION_GROUP), option(OPTION_GROUPS),
                   option(OPTION_SHELL), option(OPTION_COMMENT)},
     .help = "Change an account",
     .needs_change = true},
    {.noun = "user",
     .verb = "clear",
     .method = "ClearUserFields",
     .arguments = {USER_NAME, chosen("password"), chosen("groups"), chosen("comment")},
     .help = "Empty attributes of an account",
     .needs_change = true},
    {.noun = "user",
     .verb = "passwd",
     .method = "ChpasswdUser",
     .arguments = {USER_NAME, ASKED_TWICE},
     .help = "Set the password of an account, and not that of its web login"},
    {.noun = "user",
     .verb = "remove",
     .method = "RemoveUser",
     .arguments = {USER_NAME},
     .help = "Remove an account"},
    {.noun = "user",
     .verb = "announce",
     .method = "RtspreadConfig",
     .help = "Let all clients read the accounts again"                           },

    {.noun = "group",
     .verb = "list",
     .selector = OPTION_NAMES,
     .method = "GetGroupList",
     .answer = shape::LIST,
     .columns = "name",
     .help = "List the names of the groups"},
    {.noun = "group",
     .verb = "list",
     .method = "GetGroupListFull",
     .answer = shape::LIST,
     .columns = "name gid members",
     .help = "List the groups with their members"},
    {.noun = "group",
     .verb = "show",
     .method = "GetGroup",
     .arguments = {GROUP_NAME},
     .answer = shape::SUBJECT,
     .help = "Describe a group"},
    {.noun = "group",
     .verb = "check",
     .method = "CheckGroup",
     .arguments = {GROUP_NAME},
     .answer = shape::ANSWER,
     .help = "Tell whether a group exists"},
    {.noun = "group",
     .verb = "add",
     .method = "AddGroup",
     .arguments = {word("NAME")},
     .help = "Add a group"},
    {.noun = "group",
     .verb = "remove",
     .method = "RemoveGroup",
     .arguments = {GROUP_NAME},
     .help = "Remove a group"},

    {.noun = "digest",
     .verb = "list",
     .method = "GetDigestList",
     .answer = shape::LIST,
     .columns = "name",
     .help = "List who can log in over the web"},
    {.noun = "digest",
     .verb = "set",
     .method = "Digest",
     .arguments = {USER_NAME, ASKED_TWICE},
     .help = "Set the password of a web login",
     .build = build_digest_set},
    {.noun = "digest",
     .verb = "import",
     .method = "Digest",
     .help = "Set web logins, NAME:PRIVANE:HASH a line, from standard input",
     .build = build_digest_import},
    {.noun = "digest",
     .verb = "delete",
     .method = "Digest",
     .arguments = {USER_NAME, words("NAME", value_kind::USER)},
     .help = "Delete web logins",
     .build = build_digest_delete},

    {.noun = "unit",
     .verb = "start",
     .method = "StartService",
     .arguments = {UNIT_NAME},
     .help = "Start a service"},
    {.noun = "unit",
     .verb = "stop",
     .method = "StopService",
     .arguments = {UNIT_NAME},
     .help = "Stop a service"},
    {.noun = "unit",
     .verb = "restart",
     .method = "RestartService",
     .arguments = {UNIT_NAME},
     .help = "Restart a service"},
    {.noun = "unit",
     .verb = "reload",
     .method = "ReloadService",
     .arguments = {UNIT_NAME},
     .help = "Let a service read its configuration again"},
    {.noun = "default-target",
     .method = "SetDefaultTarget",
     .arguments = {word("TARGET", value_kind::TARGET)},
     .help = "Choose what the device boots into"                       },
    plain("ntp", "start", "StartNtp", "Start the time service"),
    plain("ntp", "stop", "StopNtp", "Stop the time service"),
    plain("ntp", "restart", "RestartNtp", "Restart the time service"),
    plain("lensd", "start", "StartLensd", "Start the lens service"),
    plain("lensd", "stop", "StopLensd", "Stop the lens service"),

    {.noun = "clock",
     .verb = "set",
     .method = "SetTimeOfDay",
     .arguments = {word("TIME")},
     .help = "Set the clocks: \"2026-01-31 23:59:59\", or @SECONDS since the epoch",
     .build = build_clock_set,
     .judge = judge_clock},
    {.noun = "clock",
     .verb = "adjust",
     .method = "AdjTime",
     .arguments = {word("SECONDS")},
     .help = "Let the clock gain or, below 0, lose SECONDS",
     .build = build_clock_adjust},
    {.noun = "clock",
     .verb = "synced",
     .method = "NotifyTimeSync",
     .help = "Tell that the clock was set right"                                           },

    {.noun = "net",
     .verb = "info",
     .method = "GetActiveNetworkInfo",
     .arguments = {first_choice("MODE", "all tcp-udp")},
     .answer = shape::TEXT,
     .help = "List the connections: all or tcp-udp"},
    {.noun = "net",
     .verb = "speed",
     .method = "GetNetworkSpeedDuplex",
     .answer = shape::RECORD,
     .help = "Describe the link of eth0"},
    {.noun = "ethtool",
     .method = "ExecuteEthtool",
     .arguments = {fixed("d"), word("INTERFACE", value_kind::INTERFACE)},
     .answer = shape::TEXT,
     .help = "Dump the registers of a network interface"},
    {.noun = "smart",
     .method = "ExecuteSmartctl",
     .arguments = {fixed("all"), word("DEVICE", value_kind::DISK)},
     .answer = shape::TEXT,
     .help = "Print the SMART data of a disk"},
    {.noun = "lldp",
     .verb = "neighbors",
     .method = "ExecuteLldpcli",
     .arguments = {fixed("show-neighbors")},
     .answer = shape::TEXT,
     .help = "List the neighbours on the network"},
    {.noun = "lldp",
     .verb = "interfaces",
     .method = "ExecuteLldpcli",
     .arguments = {fixed("show-interfaces")},
     .answer = shape::TEXT,
     .help = "List the interfaces as neighbours see them"},

    {.noun = "boot",
     .verb = "get",
     .method = "ReadBootblockParam",
     .arguments = {word("PARAMETER")},
     .answer = shape::LINE,
     .help = "Read a parameter of the boot block"},
    {.noun = "boot",
     .verb = "set",
     .method = "AddBootblockParam",
     .arguments = {word("PARAMETER"), word("VALUE")},
     .help = "Set a parameter of the boot block"},
    {.noun = "serial",
     .method = "ReadSerno",
     .answer = shape::LINE,
     .help = "Print the serial number"                        },
    {.noun = "slabinfo",
     .method = "GetSlabinfo",
     .answer = shape::TEXT,
     .help = "Print the kernel's slab statistics"                 },
    {.noun = "log",
     .method = "ReadLogFile",
     .arguments = {word("PATH", value_kind::FILE_PATH)},
     .answer = shape::TEXT,
     .help = "Print a file of the device"},
    {.noun = "pinsrv",
     .method = "Pinsrv",
     .arguments = {words("ARGUMENT")},
     .answer = shape::RECORD,
     .help = "Start the PIN server",
     .build = build_pinsrv,
     .judge = judge_pinsrv},
    {.noun = "reboot",
     .method = "Reboot",
     .help = "Restart the device, or perform the reset that is armed",
     .judge = judge_reboot              },
    {.noun = "reset",
     .verb = "arm",
     .method = "UpdateReleaseFile",
     .arguments = {choice("KIND", "hard soft")},
     .help = "Make the next reboot a factory reset: hard or soft",
     .build = build_reset},

    {.noun = "monitor",
     .help = "Print each announcement of changed accounts as it comes",
     .run = run_monitor                                                              },
    {.noun = "explain",
     .arguments = {word("METHOD", value_kind::METHOD),
                   optional_word("UNIT|TARGET|MODE", value_kind::UNIT)},
     .help = "Tell a method's action, whether you may, and what would grant it",
     .run = run_explain                             },
    untold("verbs", NO_ARGUMENT, run_verbs),
    untold("complete", words("WORD"), run_complete),
};

std::span<const command> commands() {
    return COMMANDS;
}
