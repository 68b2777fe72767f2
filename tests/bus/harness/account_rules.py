"""tests/bus/harness/account_rules.py: what may stand in an account, and how a call is refused.

Nothing of the service is asked or read here.
"""
import hashlib
import re
from dataclasses import dataclass, field
from typing import Any, Callable

ANYBODY = -1
REALM = "PRIVANE"
DEFAULT_SHELL = "/bin/false"
LONGEST_CLEAR_TEXT = 511

# The types of users and groups by the ranges of their IDs.
USER_RANGES = {"root": (0, 0), "permanent": (1, 499), "dynamic system": (500, 999),
               "ornet": (1000, 60000), "nobody": (65534, 65534)}
GROUP_RANGES = {"root": (0, 0), "permanent system": (1, 499), "dynamic system": (500, 999),
                "nobody": (65534, 65534), "permanent system nvr": (60001, 60010)}
TOLD_ON_THE_BUS = ("root", "ornet", "everybody")
TOLD_TO_CFGSTORE = (*TOLD_ON_THE_BUS, "dynamic system")

ORNET_NAME = re.compile(r"[A-Za-z0-9]{1,14}")
GROUP_NAME = re.compile(r"[A-Za-z0-9_.@-]*\$?")
WHITE_SPACE = " \t\n\v\f\r"


class Refused(Exception):
    """An error reply: domain, code and text."""


@dataclass
class ModelUser:
    """password is the clear text; None where nobody can have it, and then it may be absent."""

    name: str
    uid: int
    gid: int
    comment: str
    home: str
    shell: str
    password: str | None
    has_password: bool = True

    @property
    def type(self) -> str:
        return type_of(self.uid, USER_RANGES)


@dataclass
class ModelGroup:
    name: str
    gid: int
    members: set[str] = field(default_factory=set)


@dataclass
class Outcome:
    """What a call that succeeds answers, logs and announces."""

    answer: tuple[Any, ...] = ()
    lines: list[str] = field(default_factory=list)
    signal_sent: bool = False
    pidof_run: bool = False


def type_of(number: int, ranges: dict[str, tuple[int, int]]) -> str:
    (found,) = [name for name, (low, high) in ranges.items() if low <= number <= high]
    return found


def usermgmt(code: int, text: str) -> Refused:
    return Refused("usermgmt", code, text)


def own(code: int, text: str) -> Refused:
    return Refused("privaneSystemError", code, text)


def unwritable(file: str, index: int) -> Refused:
    return Refused("corefile", 101, "unable to sync core files, failed to write 1/3 core file(s) "
                   f"{file}: could not write entry #{index} to /etc/{file}.tmp: Invalid argument")


def size(text: str) -> int:
    return len(text.encode())


def digest_line(name: str, password: str) -> str:
    return f"{name}:{REALM}:{hashlib.md5(f'{name}:{REALM}:{password}'.encode()).hexdigest()}\n"


def is_digest_user(name: str) -> bool:
    return (0 < size(name) <= 255 and not set(name) & set(":\n\r")
            and name[0] not in "#" + WHITE_SPACE)


def require_type(user: ModelUser, with_groups: bool, password_alone: bool) -> None:
    if user.type == "root" and not password_alone:
        raise usermgmt(5, "only the password can be modified for root user")
    if user.type == "permanent" and not (with_groups and user.name == "anonymous"):
        raise usermgmt(5, "permanent system users cannot be modified")
    if user.type == "nobody":
        raise usermgmt(5, "invalid user type 'nobody'")


def require_ornet_name(name: str) -> None:
    if size(name) > 14:
        raise usermgmt(3, "username too long, max allowed length is 14 characters")
    if not ORNET_NAME.fullmatch(name):
        raise usermgmt(3, "username contains invalid characters")


def require_ornet_password(password: str) -> None:
    if not password:
        raise usermgmt(10, "missing password")
    if size(password) > 64:
        raise usermgmt(10, "password too long, max allowed length is 64 characters")


def require_line(name: str, shell: str, index: int) -> None:
    """A line of the passwd file that would be read as it was meant."""
    if set(name + shell) & set(":\n") or name[0] in "#+-" + WHITE_SPACE:
        raise unwritable("passwd", index)


def on_one_line(comment: str) -> str:
    """As the C library writes a comment."""
    return comment.replace(":", " ").replace("\n", " ")


def with_action(action: str, name: str, operation: Callable[..., None], *arguments: Any) -> None:
    try:
        operation(*arguments)
    except Refused as error:
        domain, code, text = error.args
        raise Refused(domain, code, f"Failed to {action} '{name}', {text}") from None
