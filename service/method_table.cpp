// service/method_table.cpp: the methods that the service answers, in the order of the interface.
#include "service/method_table.h"

#include <iterator>

#include "methods/accounts/digest.h"
#include "methods/accounts/group_changes.h"
#include "methods/accounts/password_check.h"
#include "methods/accounts/queries.h"
#include "methods/accounts/user_changes.h"
#include "methods/system/bootblock.h"
#include "methods/system/clock.h"
#include "methods/system/diagnostics.h"
#include "methods/system/readers.h"
#include "methods/system/reboot.h"
#include "methods/system/unit_control.h"
#include "service/method.h"

// AddSystemUser is guarded by the action of AddUser.
static constexpr method_row method_table[] = {
    method<"getnetworkspeedduplex", handle_get_network_speed_duplex>(
        "handle-get-network-speed-duplex"),
    method<"readlogfile", handle_read_log_file>("handle-read-log-file"),
    method<"settimeofday", handle_set_time_of_day>("handle-set-time-of-day"),
    method<"updatereleasefile", handle_update_release_file>("handle-update-release-file"),
    method<"reboot", handle_reboot>("handle-reboot"),
    method<"rtspreadconfig", handle_rtspread_config>("handle-rtspread-config"),
    method<"pinsrv", handle_pinsrv>("handle-pinsrv"),
    method<"digest", handle_digest>("handle-digest"),
    method<"authuserbasic", handle_auth_user_basic>("handle-auth-user-basic"),
    method<"adjtime", handle_adj_time>("handle-adj-time"),
    method<"notifytimesync", handle_notify_time_sync>("handle-notify-time-sync"),
    method<"checkuser", handle_check_user>("handle-check-user"),
    method<"checkgroup", handle_check_group>("handle-check-group"),
    method<"adduser", handle_add_system_user>("handle-add-system-user"),
    method<"modifyuser", handle_modify_user>("handle-modify-user"),
    method<"clearuserfields", handle_clear_user_fields>("handle-clear-user-fields"),
    method<"adduser", handle_add_user>("handle-add-user"),
    method<"adduiduser", handle_add_uid_user>("handle-add-uid-user"),
    method<"removeuser", handle_remove_user>("handle-remove-user"),
    method<"getuser", handle_get_user>("handle-get-user"),
    method<"chpasswduser", handle_chpasswd_user>("handle-chpasswd-user"),
    method<"addgroup", handle_add_group>("handle-add-group"),
    method<"removegroup", handle_remove_group>("handle-remove-group"),
    method<"getgroup", handle_get_group>("handle-get-group"),
    method<"getgrouplist", handle_get_group_list>("handle-get-group-list"),
    method<"getdigestlist", handle_get_digest_list>("handle-get-digest-list"),
    method<"getgrouplistfull", handle_get_group_list_full>("handle-get-group-list-full"),
    method<"getuserlist", handle_get_user_list>("handle-get-user-list"),
    method<"readbootblockparam", handle_read_bootblock_param>("handle-read-bootblock-param"),
    method<"addbootblockparam", handle_add_bootblock_param>("handle-add-bootblock-param"),
    method<"readserno", handle_read_serno>("handle-read-serno"),
    method<"startntp", handle_fixed_unit<start_ntp>>("handle-start-ntp"),
    method<"restartntp", handle_fixed_unit<restart_ntp>>("handle-restart-ntp"),
    method<"stopntp", handle_fixed_unit<stop_ntp>>("handle-stop-ntp"),
    method<"startlensd", handle_fixed_unit<start_lensd>>("handle-start-lensd"),
    method<"stoplensd", handle_fixed_unit<stop_lensd>>("handle-stop-lensd"),
    method_with_derived_action<network_info_action, handle_get_active_network_info>(
        "handle-get-active-network-info"),
    unit_method<start_service>("handle-start-service"),
    unit_method<stop_service>("handle-stop-service"),
    unit_method<restart_service>("handle-restart-service"),
    unit_method<reload_service>("handle-reload-service"),
    unit_method<default_target>("handle-set-default-target"),
    method<"getslabinfo", handle_get_slabinfo>("handle-get-slabinfo"),
    method<"executeethtool", handle_execute_ethtool>("handle-execute-ethtool"),
    method<"executesmartctl", handle_execute_smartctl>("handle-execute-smartctl"),
    method<"executelldpcli", handle_execute_lldpcli>("handle-execute-lldpcli"),
};

static constexpr std::size_t IMPLEMENTED_METHODS = 46;
static_assert(std::size(method_table) == IMPLEMENTED_METHODS);

void connect_methods(ServiceState *state) {
    for (const method_row &row : method_table)
        row.connect(row.signal, state);
}
