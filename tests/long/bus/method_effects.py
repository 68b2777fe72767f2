"""tests/long/bus/method_effects.py: by what the work of each method shows."""
import re
from dataclasses import dataclass

from harness.bus import BusError
from harness.device import (ETHTOOL, LLDPCLI, NETSTAT, PINSRV, SMARTCTL, SYSFLASH,
                            TIME_SYNC_HOOK)
from harness.interface import Method
from harness.monitor import SIGNAL, Seen
from pipeline import Answer

SYSTEMD = "org.freedesktop.systemd1"


@dataclass
class Evidence:
    """What one cell left behind."""

    answer: Answer | BusError
    trace: list[str]
    messages: list[Seen]
    calls: list[tuple[str, ...]]


# Where a method would not do its work with the arguments of the table: other ones are used up.
OTHER_ARGUMENTS = {
    "AddUser": ("web", "secret", "clerk", "viewer", ""),
    "AddUidUser": ("website", "secret", "clerk", "viewer", "", 1234),
    "ModifyUser": ("clerk", "another", "", [], "", ""),
    "ChpasswdUser": ("viewer", "another"),
    "RemoveUser": ("stranger",),
}

# What each method does, as the tracer, a fake or the bus sees it.
RUNS = {"Reboot": SYSFLASH, "NotifyTimeSync": TIME_SYNC_HOOK, "Pinsrv": PINSRV,
        "ExecuteLldpcli": LLDPCLI, "ExecuteSmartctl": SMARTCTL, "ExecuteEthtool": ETHTOOL,
        "GetActiveNetworkInfo": NETSTAT}
TRACED = {
    "GetNetworkSpeedDuplex": r"ioctl\(\d+, SIOCETHTOOL",
    "ReadLogFile": r'openat\(AT_FDCWD, "/var/log/messages", O_RDONLY',
    "SetTimeOfDay": r"(settimeofday|clock_settime)\(",
    "AdjTime": r"(adjtimex|clock_adjtime)\(",
    "AuthUserBasic": r'openat\(AT_FDCWD, "/etc/passwd", O_RDONLY',
    "GetDigestList": r'openat\(AT_FDCWD, "/etc/apache2/digest_auth_passwd", O_RDONLY',
    "GetSlabinfo": r'openat\(AT_FDCWD, "/proc/slabinfo", O_RDONLY',
    **{member: fr'execve\("{path}"' for member, path in RUNS.items()},
    **{member: r'rename\("/etc/passwd.tmp", "/etc/passwd"[) ]'
       for member in ("AddSystemUser", "AddUser", "AddUidUser", "RemoveUser")},
    **{member: r'rename\("/etc/shadow.tmp", "/etc/shadow"[) ]'
       for member in ("ModifyUser", "ClearUserFields", "ChpasswdUser")},
    **{member: r'rename\("/etc/group.tmp", "/etc/group"[) ]'
       for member in ("AddGroup", "RemoveGroup")},
}
LIBRARY_CALLS = {"Digest": "digest_entry_set_list", "ReadBootblockParam": "bootparam_read",
                 "AddBootblockParam": "bootparam_write", "ReadSerno": "bootparam_read",
                 "SetTimeOfDay": "rtc_write_time"}
UNIT_CALLS = {"StartNtp": "StartUnit", "RestartNtp": "RestartUnit", "StopNtp": "StopUnit",
              "StartLensd": "StartUnit", "StopLensd": "StopUnit", "StartService": "StartUnit",
              "StopService": "StopUnit", "RestartService": "RestartUnit",
              "ReloadService": "ReloadUnit", "SetDefaultTarget": "SetDefaultTarget"}
TOLD = {"CheckUser", "CheckGroup", "GetUser", "GetGroup", "GetGroupList", "GetGroupListFull",
        "GetUserList"}


def require_effect(method: Method, seen: Evidence) -> None:
    """The method's work is visible to what looks for it in the other columns."""
    member = method.member
    shown = []
    if member in TRACED:
        shown.append(any(re.match(TRACED[member], call) for call in seen.trace))
    if member in LIBRARY_CALLS:
        shown.append(any(words[0] == LIBRARY_CALLS[member] for words in seen.calls))
    if member in UNIT_CALLS:
        shown.append(any(said.destination == SYSTEMD and said.member == UNIT_CALLS[member]
                         for said in seen.messages))
    if member == "RtspreadConfig":
        shown.append(any(said.type == SIGNAL and said.member == "UserDatabaseUpdated"
                         for said in seen.messages))
    if member in TOLD | {"UpdateReleaseFile"}:
        shown.append(isinstance(seen.answer, Answer) and seen.answer.error is None)
    assert shown and all(shown), (member, seen)
