// methods/accounts/notify.cpp: who learns of a change of the accounts.
#include "methods/accounts/notify.h"

#include <cerrno>
#include <climits>
#include <csignal>

#include <sys/types.h>
#include <syslog.h>

#include "methods/tool_runner.h"
#include "platform/paramcli/paramcli.h"
#include "usermgmt/usermgmt.h"

static constexpr const char *PIDOF = "/bin/pidof";
static constexpr const char *CFGSTORE = "cfgstore";

static constexpr const char *ROOT_PASSWORD_PARAMETER = "root.System.RootPwdSet";

struct notification_rule {
    guint32 user_type;
    bool bus_signal;
    bool cfgstore;
};

// Deliberate: changes of any other type are announced to nobody.
static constexpr notification_rule notification_rules[] = {
    {USER_TYPE_ROOT,           true,  true},
    {USER_TYPE_DYNAMIC_SYSTEM, false, true},
    {USER_TYPE_ORNET,          true,  true},
    {NOTIFY_EVERYBODY,         true,  true},
};

void notify_user_db_updated(PrivaneSystem *skeleton, guint32 user_type) {
    for (const notification_rule &rule : notification_rules) {
        if (rule.user_type != user_type)
            continue;
        if (rule.bus_signal) {
            privane_system__emit_user_database_updated(skeleton);
            g_message("Emitted DBus signal to inform the user DB was updated.");
        }
        if (rule.cfgstore)
            signal_cfgstore();
    }
}

// The process ID that pidof printed first; 0, and the reason in syslog, when there is none.
static pid_t find_cfgstore() {
    const char *const argv[] = {PIDOF, CFGSTORE, nullptr};
    g_auto(tool_result) result = {};
    g_autoptr(GError) error = nullptr;
    if (!run_tool_without_fork(argv, &result, &error)) {
        syslog(LOG_ERR, "Could not get PID for '%s': %s", CFGSTORE,
               error != nullptr ? error->message : "Unknown error");
        return 0;
    }
    if (result.output == nullptr)
        return 0;
    const gint64 pid = g_ascii_strtoll(result.output, nullptr, 10);
    if (pid <= 0 || pid > INT_MAX) {
        syslog(LOG_WARNING, "Could not parse PID for '%s'", CFGSTORE);
        return 0;
    }
    return static_cast<pid_t>(pid);
}

void signal_cfgstore() {
    const pid_t pid = find_cfgstore();
    if (pid == 0) {
        syslog(LOG_WARNING, "Could not send signal to %s: %s", CFGSTORE, "Unable to retrieve PID");
        return;
    }
    // Deliberate: the quote after the number.
    g_message("Got PID for process '%s': %d'", CFGSTORE, pid);
    errno = 0;
    if (kill(pid, SIGUSR1) == 0)
        g_message("Sent SIGUSR1 to %s (%d)", CFGSTORE, pid);
    else
        syslog(LOG_WARNING, "Could not send signal to %s: %s", CFGSTORE,
               errno != 0 ? g_strerror(errno) : "Unknown error");
}

void set_root_password_flag() {
    struct paramcli_options options;
    int error = 0;
    paramcli_reset_options(&options);
    paramcli_set_custom_param(ROOT_PASSWORD_PARAMETER, "yes", &options, &error);
    if (error != 0) {
        g_warning("Updating root user failed to set param! Error: %d", error);
        return;
    }
    paramcli_sync(&options, &error);
    if (error != 0)
        g_warning("Updating root user failed to sync param! Error: %d", error);
    else
        g_message("Updating root user!");
}
