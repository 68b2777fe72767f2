"""tests/long/bus/expectations.py: which answers a hostile call may get."""
from typing import Callable

from harness.accounts import CLERK_UID
from harness.bus import BusError, domain_error
from harness.interface import ACTION_PREFIX, METHODS
from hostile_calls import METHOD, PROPERTIES, STANDARD, UNKNOWN, WRONG_SIGNATURE
from pipeline import Answer, Call

ACTIONS = {method.member: method.action for method in METHODS}

# These look at their argument before the authorization, since it is a part of the action.
CHECKED_FIRST = {"GetActiveNetworkInfo": 28, "StartService": 29, "StopService": 30,
                 "RestartService": 31, "ReloadService": 32, "SetDefaultTarget": 33}

# The errors of the methods themselves: of authorization, an allowed caller gets none, nor one that
# tells of a full disk or of a tool that is not there: here all is in order.
SYSTEM_CODES = {
    "GetNetworkSpeedDuplex": {0, 1, 2}, "AuthUserBasic": {5, 6, 7}, "AdjTime": {8},
    "NotifyTimeSync": {9}, "RemoveUser": {14, 24}, "ModifyUser": {14, 24}, "ClearUserFields": {14},
    "ReadBootblockParam": {15, 16}, "ReadSerno": {15, 16}, "AddBootblockParam": {15, 17},
    "StartNtp": {21}, "RestartNtp": {22}, "StopNtp": {23}, "Digest": {24}, "AddUser": {24},
    "AddUidUser": {24}, "UpdateReleaseFile": {25}, "StartLensd": {26}, "StopLensd": {27},
    "GetActiveNetworkInfo": {28}, "StartService": {29}, "StopService": {30},
    "RestartService": {31}, "ReloadService": {32}, "SetDefaultTarget": {33},
    "ExecuteEthtool": {35}, "ExecuteSmartctl": {36}, "ExecuteLldpcli": {37}}
# The database's: of an unknown or bad name of a user (3) or a group (4, 7; 4 also where the primary
# group of a user who is not among its members was removed), of a type that forbids
# it (5, 11, 12), of a name (6) or an ID (13, 14, 17) that is taken, of a password (10), of a user
# without a primary group or a password too long to hash (16), and of a group that is a primary one
# (8).
DATABASE_CODES = {
    "AddUser": {3, 4, 6, 10, 13, 17}, "AddUidUser": {3, 4, 6, 10, 13, 17},
    "AddSystemUser": {4, 6, 13, 16, 17}, "ModifyUser": {4, 5, 10, 12, 16},
    "ClearUserFields": {3, 4, 5, 16}, "ChpasswdUser": {3, 5, 10, 16}, "RemoveUser": {11},
    "GetUser": {3, 16}, "GetGroup": {4}, "AddGroup": {4, 7, 14}, "RemoveGroup": {7, 8, 11}}
# A field that no line of a file can hold.
UNWRITABLE = 101
WRITERS = ("AddUser", "AddUidUser", "AddSystemUser", "ModifyUser")
# Of opening and reading any file: a folder, no right, a long name, none there, no folder or device,
# a loop, an odd argument, what cannot be read, and what has no code or no reply can carry.
FILE_CODES = {"ReadLogFile": {1, 2, 3, 4, 5, 6, 7, 11, 17, 21, 24}}
CODES = {"privaneSystemError": SYSTEM_CODES, "usermgmt": DATABASE_CODES,
         "corefile": dict.fromkeys(WRITERS, {UNWRITABLE}), "g-file-error-quark": FILE_CODES}
KNOWN = {member: {domain_error(domain, code, "").name for domain, codes in CODES.items()
                  for code in codes.get(member, ())} for member in ACTIONS}
UNKNOWN_ERROR = domain_error("privaneSystemError", 25, "Unknown")

BUS_ERROR = "org.freedesktop.DBus.Error."
INVALID = {BUS_ERROR + "InvalidArgs"}
NO_SUCH = {BUS_ERROR + name for name in ("UnknownMethod", "UnknownInterface", "UnknownObject",
                                         "UnknownProperty")}
STANDARD_ANSWERS = {"Ping": "", "GetMachineId": "s", "Introspect": "s", "GetAll": "a{sv}"}

PREFIX = "Authorization check failed: "

Refusal = Callable[[Call], BusError]


def refusal_by_polkit(call: Call) -> BusError:
    """What clerk gets, with the action that was asked for."""
    action = ACTIONS[call.member]
    if call.member in CHECKED_FIRST:
        name, at, _ = call.arguments[0].partition("@")
        action = f"{call.member.lower()}.{name}{'.any' if at else ''}"
    return domain_error("authz", 1, f"{PREFIX}action {ACTION_PREFIX}{action} is refused to uid "
                                    f"{CLERK_UID}")


class Expectations:
    """Of callers who are all allowed, or all refused in the same manner."""

    def __init__(self, methods: dict[str, tuple[str, str]], refusal: Refusal | None) -> None:
        self._methods = methods
        self._refusal = refusal

    def holds(self, call: Call, answer: Answer) -> bool:
        name = answer.error.name if answer.error else None
        if call.kind == WRONG_SIGNATURE:
            return name in INVALID
        if call.kind == UNKNOWN:
            return name in NO_SUCH
        if call.kind in (PROPERTIES, STANDARD):
            if name is None:
                return answer.signature == STANDARD_ANSWERS.get(call.member)
            return call.kind == PROPERTIES and name in INVALID | NO_SUCH
        assert call.kind == METHOD
        if self._refusal is not None:
            return self._is_refusal(call, answer.error)
        if answer.error is None:
            return answer.signature == self._methods[call.member][1]
        return name in KNOWN[call.member] and (name != UNKNOWN_ERROR.name
                                               or answer.error == UNKNOWN_ERROR)

    def _is_refusal(self, call: Call, error: BusError | None) -> bool:
        assert self._refusal is not None
        if error is None:
            return False
        code = CHECKED_FIRST.get(call.member)
        if code is not None and error.name == domain_error("privaneSystemError", code, "").name:
            return error.text.startswith("Invalid ")
        return error == self._refusal(call)
