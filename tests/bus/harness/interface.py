"""tests/bus/harness/interface.py: the bus interface as callers rely on it.

Written out by hand: neither the interface document nor the binding is read here.
"""
from dataclasses import dataclass
from typing import Any

ACTION_PREFIX = "com.zintor.privane-system."

SIGNAL = "UserDatabaseUpdated"


@dataclass(frozen=True)
class Method:
    """A member with the signatures of its arguments in their order, the last part of its action,
    and arguments that it accepts. Where the action depends on them, it is the one for these."""

    member: str
    inputs: tuple[str, ...]
    outputs: tuple[str, ...]
    action: str
    arguments: tuple[Any, ...] = ()

    @property
    def signature(self) -> str:
        return "".join(self.inputs)

    @property
    def action_id(self) -> str:
        return ACTION_PREFIX + self.action


METHODS = (
    Method("GetNetworkSpeedDuplex", (), ("u", "b", "u"), "getnetworkspeedduplex"),
    Method("ReadLogFile", ("s",), ("s",), "readlogfile", ("/var/log/messages",)),
    Method("SetTimeOfDay", ("i", "i"), ("i",), "settimeofday", (1_700_000_000, 0)),
    Method("UpdateReleaseFile", ("s",), (), "updatereleasefile", ("SOFT_RESET",)),
    Method("Reboot", (), ("i",), "reboot"),
    Method("RtspreadConfig", (), (), "rtspreadconfig"),
    Method("Pinsrv", ("as",), ("i",), "pinsrv", (["pinsrv"],)),
    Method("Digest", ("as",), (), "digest", (["create", "clerk:secret"],)),
    Method("AuthUserBasic", ("s", "s"), (), "authuserbasic", ("clerk", "secret")),
    Method("AdjTime", ("i", "i"), (), "adjtime", (1, 0)),
    Method("NotifyTimeSync", (), (), "notifytimesync"),
    Method("CheckUser", ("s",), ("b",), "checkuser", ("clerk",)),
    Method("CheckGroup", ("s",), ("b",), "checkgroup", ("clerk",)),
    Method("AddSystemUser", ("s", "s", "s", "as", "s", "s"), (), "adduser",
           ("new", "secret", "clerk", ["viewer"], "", "")),
    Method("ModifyUser", ("s", "s", "s", "as", "s", "s"), (), "modifyuser",
           ("clerk", "secret", "", [], "", "")),
    Method("ClearUserFields", ("s", "b", "b", "b"), (), "clearuserfields",
           ("clerk", True, True, True)),
    Method("AddUser", ("s", "s", "s", "s", "s"), (), "adduser",
           ("new", "secret", "clerk", "viewer", "")),
    Method("AddUidUser", ("s", "s", "s", "s", "s", "i"), (), "adduiduser",
           ("new", "secret", "clerk", "viewer", "", 1234)),
    Method("RemoveUser", ("s",), (), "removeuser", ("clerk",)),
    Method("GetUser", ("s",), ("b", "s", "as", "s", "i"), "getuser", ("clerk",)),
    Method("ChpasswdUser", ("s", "s"), (), "chpasswduser", ("clerk", "secret")),
    Method("AddGroup", ("s",), (), "addgroup", ("new",)),
    Method("RemoveGroup", ("s",), (), "removegroup", ("privane-viewer",)),
    Method("GetGroup", ("s",), ("i", "as"), "getgroup", ("clerk",)),
    Method("GetGroupList", (), ("as",), "getgrouplist"),
    Method("GetDigestList", (), ("as",), "getdigestlist"),
    Method("GetGroupListFull", (), ("as", "ai", "aas"), "getgrouplistfull"),
    Method("GetUserList", (), ("as",), "getuserlist"),
    Method("ReadBootblockParam", ("s",), ("s",), "readbootblockparam", ("SERNO",)),
    Method("AddBootblockParam", ("s", "s"), (), "addbootblockparam", ("COLOR", "blue")),
    Method("ReadSerno", (), ("s",), "readserno"),
    Method("StartNtp", (), (), "startntp"),
    Method("RestartNtp", (), (), "restartntp"),
    Method("StopNtp", (), (), "stopntp"),
    Method("StartLensd", (), (), "startlensd"),
    Method("StopLensd", (), (), "stoplensd"),
    Method("GetActiveNetworkInfo", ("s",), ("s",), "getactivenetworkinfo.all", ("all",)),
    Method("StartService", ("s",), (), "startservice.lensd", ("lensd",)),
    Method("StopService", ("s",), (), "stopservice.lensd", ("lensd",)),
    Method("RestartService", ("s",), (), "restartservice.lensd", ("lensd",)),
    Method("ReloadService", ("s",), (), "reloadservice.lensd", ("lensd",)),
    Method("SetDefaultTarget", ("s",), (), "setdefaulttarget.multi-user", ("multi-user",)),
    Method("GetSlabinfo", (), ("s",), "getslabinfo"),
    Method("ExecuteEthtool", ("s", "s"), ("s",), "executeethtool", ("d", "eth0")),
    Method("ExecuteSmartctl", ("s", "s"), ("s",), "executesmartctl", ("all", "/dev/sda")),
    Method("ExecuteLldpcli", ("s",), ("s",), "executelldpcli", ("show-neighbors",)),
)

# The methods that change nothing.
QUERIES = tuple(method for method in METHODS if method.member in (
    "CheckUser", "CheckGroup", "GetUser", "GetGroup", "GetGroupList", "GetGroupListFull",
    "GetUserList"))

# The actions that are declared to polkit: those of the methods above, apart from the units' own.
UNIT_ACTIONS = ("startservice", "stopservice", "restartservice", "reloadservice",
                "setdefaulttarget")
DECLARED_ACTIONS = frozenset(
    {method.action_id for method in METHODS if method.action.split(".")[0] not in UNIT_ACTIONS}
    | {ACTION_PREFIX + "getactivenetworkinfo.tcp-udp"})
