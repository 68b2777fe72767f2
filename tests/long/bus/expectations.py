"""tests/long/bus/expectations.py: which answers a hostile call may get."""
from typing import Callable

from harness.accounts import CLERK_UID
from harness.bus import BusError, domain_error
from harness.interface import ACTION_PREFIX, METHODS
from hostile_calls import METHOD, PROPERTIES, STANDARD, UNKNOWN, WRONG_SIGNATURE
from pipeline import Answer, Call

# These look at their argument before the authorization, since it is a part of the action.
CHECKED_FIRST = {"GetActiveNetworkInfo": 28, "StartService": 29, "StopService": 30,
                 "RestartService": 31, "ReloadService": 32, "SetDefaultTarget": 33}

# The errors of the methods themselves: of authorization, an allowed caller gets none.
CODES = {"privaneSystemError": {*range(3), *range(5, 10), *range(14, 18), *range(21, 34),
                                *range(35, 38)} - {25},
         "usermgmt": {*range(1, 15), *range(16, 19)}, "corefile": range(100, 106),
         "g-file-error-quark": range(25), "g-exec-error-quark": range(20)}
KNOWN = {domain_error(domain, code, "").name for domain, codes in CODES.items() for code in codes}
UNKNOWN_ERROR = domain_error("privaneSystemError", 25, "Unknown")

BUS_ERROR = "org.freedesktop.DBus.Error."
INVALID = {BUS_ERROR + "InvalidArgs"}
NO_SUCH = {BUS_ERROR + name for name in ("UnknownMethod", "UnknownInterface", "UnknownObject",
                                         "UnknownProperty")}
STANDARD_ANSWERS = {"Ping": "", "GetMachineId": "s", "Introspect": "s", "GetAll": "a{sv}"}

ACTIONS = {method.member: method.action for method in METHODS}
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
        return (name in KNOWN or (answer.error == UNKNOWN_ERROR
                                  and call.member == "UpdateReleaseFile"))

    def _is_refusal(self, call: Call, error: BusError | None) -> bool:
        assert self._refusal is not None
        if error is None:
            return False
        code = CHECKED_FIRST.get(call.member)
        if code is not None and error.name == domain_error("privaneSystemError", code, "").name:
            return error.text.startswith("Invalid ")
        return error == self._refusal(call)
