"""tests/bus/harness/roles.py: the example roles, and what they grant."""
from typing import Protocol

from harness.interface import ACTION_PREFIX

VIEWER_ACTIONS = {ACTION_PREFIX + name for name in (
    "checkuser", "checkgroup", "getuser", "getuserlist", "getgroup", "getgrouplist",
    "getgrouplistfull")}

OPERATOR_ACTIONS = {ACTION_PREFIX + name for name in (
    "adjtime", "executeethtool", "executelldpcli", "executesmartctl", "getactivenetworkinfo.all",
    "getactivenetworkinfo.tcp-udp", "getnetworkspeedduplex", "getslabinfo", "notifytimesync",
    "readserno", "reboot", "restartntp", "settimeofday", "startlensd", "startntp", "stoplensd",
    "stopntp")}


class Roles(Protocol):
    """The packaged roles, which are in effect from install() to remove()."""

    def install(self) -> None: ...

    def remove(self) -> None: ...
