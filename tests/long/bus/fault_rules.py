"""tests/long/bus/fault_rules.py: what the service answers, logs and leaves when one of its calls on
the file system fails, by the call as strace prints it.
"""
import errno
import os
import re
from dataclasses import dataclass, field
from pathlib import Path

from gi.repository import GLib

from account_history import Call
from harness.accounts import GROUP, PASSWD, SHADOW
from harness.bus import BusError, domain_error
from harness.stage_fixtures import DIGEST_FILE
from kept_files import PARAMETERS

# How each call can fail. strace does not make a call that it fails, so a close, which closes all
# the same, is left to the proof that traps calls in the process.
_OPENING = (errno.EIO, errno.ENOSPC, errno.EDQUOT, errno.EROFS, errno.EMFILE, errno.EACCES,
            errno.EPERM, errno.EINTR)
_LOOKING = (errno.EIO, errno.EACCES, errno.EINTR)
_REPLACING = (errno.EIO, errno.ENOSPC, errno.EDQUOT, errno.EROFS, errno.EACCES, errno.EPERM)
ERRORS: dict[str, tuple[int, ...]] = {
    "openat": _OPENING, "open": _OPENING,
    "read": (errno.EIO, errno.EACCES, errno.EINTR),
    "write": (errno.EIO, errno.ENOSPC, errno.EDQUOT, errno.EROFS, errno.EINTR),
    "newfstatat": _LOOKING, "fstat": _LOOKING, "stat": _LOOKING, "statx": _LOOKING,
    "unlink": (errno.EIO, errno.EROFS, errno.EACCES), "unlinkat": (errno.EIO, errno.EROFS),
    "rename": _REPLACING, "renameat": _REPLACING, "mkdir": _REPLACING,
    "fchmod": (errno.EIO, errno.EROFS, errno.EPERM, errno.EINTR),
    "fchown": (errno.EIO, errno.EDQUOT, errno.EROFS, errno.EPERM),
    "fsync": (errno.EIO, errno.ENOSPC, errno.EDQUOT, errno.EROFS, errno.EINTR),
    "flock": (errno.EIO, errno.EINTR),
}
# Those that do not fail, and what no error harms.
LEFT_OUT = ("close", "fcntl", "lseek", "mmap", "faccessat2", "access")

CORE_FILES = (PASSWD, SHADOW, GROUP)
STRANGERS = "{} was changed by another program; its changes are lost"
QUOTED = re.compile(r'"([^"]*)"')
DESCRIPTOR = re.compile(r"\d+<([^>]*)>")
CALL = re.compile(r"(\w+)\((.*)")

ACTIONS = {"AddUser": "add user", "AddUidUser": "add user", "AddSystemUser": "add user",
           "ModifyUser": "modify user", "ChpasswdUser": "modify user",
           "ClearUserFields": "modify user", "RemoveUser": "delete user", "AddGroup": "add group",
           "RemoveGroup": "delete group"}
DIGEST_ACTIONS = {"AddUser": "add", "AddUidUser": "add", "ModifyUser": "update",
                  "RemoveUser": "delete"}

_FOLDER, _LOCK, _READ, _WRITE, _SYNC = 6, 7, 10, 11, 12


@dataclass(frozen=True)
class Struck:
    """A call, which of those on its file by that name it is, and how it fails."""

    name: str
    path: str
    turn: int
    error: int

    @property
    def cause(self) -> str:
        return os.strerror(self.error)

    @property
    def is_opening(self) -> bool:
        return self.name in ("open", "openat")

    @property
    def is_look(self) -> bool:
        return self.name in ("stat", "fstat", "newfstatat", "statx")


@dataclass
class Expected:
    """error is None for success: then all files are new but for those in old; else as many of the
    account files, in their order, as ahead says. warnings: what syslog gets beside what it gets
    without a fault, now and by the next change of the groups. instead: a line of the log that is
    another."""

    error: BusError | None = None
    ahead: int = 0
    old: tuple[Path, ...] = ()
    output: list[str] = field(default_factory=list)
    warnings: list[tuple[int, str]] = field(default_factory=list)
    next_warnings: list[tuple[int, str]] = field(default_factory=list)
    instead: tuple[str, str] | None = None


def path_of(line: str) -> str:
    """Of the file that a call is about; of a rename, the temporary one's."""
    found = CALL.match(line)
    assert found, line
    arguments = found[2]
    name = QUOTED.search(arguments) if not arguments[:1].isdigit() or found[1].endswith("at") \
        else None
    folder = DESCRIPTOR.match(arguments)
    if name is None or not name[1]:
        assert folder, line
        return folder[1]
    return name[1] if name[1].startswith("/") or not folder else f"{folder[1]}/{name[1]}"


def calls_of(lines: list[str]) -> list[tuple[str, str, int]]:
    """Name, path, and which with both it is, of what strace printed."""
    calls: list[tuple[str, str, int]] = []
    for line in lines:
        found = CALL.match(line)
        if not found:
            continue
        name, path = found[1], path_of(line)
        calls.append((name, path, 1 + sum(call[:2] == (name, path) for call in calls)))
    return calls


def _failed(domain: str, code: int, text: str, ahead: int = 0) -> Expected:
    return Expected(domain_error(domain, code, text), ahead, output=[f"warning: {text}"])


def _core_step(struck: Struck, live: str) -> str:
    """As the error has it."""
    temporary, name = f"{live}.tmp", live.rpartition("/")[2]
    of_temporary = {
        "unlink": "could not fopen/fileno temporary file", "openat": None,
        "fchmod": ("could not chmod() temporary file" if struck.turn == 1
                   else "could not fchmod() file"),
        "write": "could not fflush() file", "fsync": "could not fsync() file"}
    if struck.path == live:
        return f"could not stat() core file at '{live}': {struck.cause}"
    if struck.name.startswith("rename"):
        return f"{name}: could not rename file '{temporary}' -> '{live}', {struck.cause}"
    step = of_temporary[struck.name] or of_temporary["unlink"]
    return f"{step} '{temporary}': {struck.cause}"


def _core_failure(call: Call, file: str, step: str, ahead: int) -> Expected:
    action = ACTIONS[call[0]]
    if call[0] == "ClearUserFields" and call[2]:
        action = "disable password for "
    return _failed("corefile", 101,
                   f"Failed to {action} '{call[1]}', unable to sync core files, failed to write "
                   f"1/3 core file(s) {file}: {step}", ahead)


def _of_core_file(call: Call, struck: Struck) -> Expected:
    live = struck.path.removesuffix(".tmp")
    row = [str(path) for path in CORE_FILES].index(live)
    warning = (4, STRANGERS.format(live))
    if struck.path == live:
        assert struck.is_look, struck
        if struck.turn == 1:
            return Expected(warnings=[warning])
        if struck.turn == 3:
            return Expected(next_warnings=[warning] if live == str(GROUP) else [])
    ahead = row if struck.name.startswith("rename") else 0
    return _core_failure(call, live.rpartition("/")[2], _core_step(struck, live), ahead)


def _of_folder(call: Call, struck: Struck, renamed: list[str]) -> Expected:
    """It stops nothing: the other files are replaced all the same."""
    name = renamed[struck.turn - 1]
    return _core_failure(call, name, f"{name}: could not open/sync directory '/etc/', "
                         f"{struck.cause}", len(CORE_FILES))


def _store_number(struck: Struck, file: str) -> int:
    """That the libraries answer for the digest file and for the parameters; 0 for no harm."""
    if struck.error == errno.EINTR and struck.name in ("read", "write", "flock"):
        return 0
    if struck.path == file.rpartition("/")[0]:
        return _SYNC if struck.name == "fsync" else _FOLDER
    if struck.path == f"{file}.lock":
        return _LOCK
    return _WRITE if struck.path == f"{file}.tmp" else _READ


def _of_digest(call: Call, struck: Struck) -> Expected:
    number = _store_number(struck, str(DIGEST_FILE))
    if number == 0:
        return Expected()
    if call[0] == "Digest":  # tells nobody
        return Expected(old=(DIGEST_FILE,))
    action = DIGEST_ACTIONS[call[0]]
    # An account that was added goes again.
    return _failed("privaneSystemError", 24,
                   f"Failed to {action} digest info for '{call[1]}' (Err {number})",
                   0 if action == "add" else len(CORE_FILES))


def _of_parameters(struck: Struck) -> Expected:
    number = _store_number(struck, str(PARAMETERS))
    if number == 0:
        return Expected()
    return Expected(old=(PARAMETERS,), instead=(
        "message: Updating root user!",
        f"warning: Updating root user failed to sync param! Error: {number}"))


def _of_read_file(struck: Struck) -> Expected:
    if struck.name == "read" and struck.error == errno.EINTR:
        return Expected()
    told = "Failed to open file" if struck.is_opening else (
        "Error reading file" if struck.is_look else "Failed to read from file")
    return _failed("g-file-error-quark", int(GLib.file_error_from_errno(struck.error)),
                   f"{told} “{struck.path}”: {struck.cause}")


def _of_password_check(call: Call, struck: Struck) -> Expected:
    if struck.is_look:
        return Expected()  # only for the buffer's size
    if struck.path == str(SHADOW):
        return _failed("privaneSystemError", 7, f"No valid password for user {call[1]}")
    expected = _failed("privaneSystemError", 5, f"Failed to locate user {call[1]}.")
    expected.output *= 2
    return expected


def expected_of(call: Call, struck: Struck, renamed: list[str]) -> Expected:
    """renamed: the account files that the change replaces, in their order."""
    if call[0] == "AuthUserBasic":
        return _of_password_check(call, struck)
    if call[0] in ("ReadLogFile", "GetSlabinfo"):
        return _of_read_file(struck)
    if struck.path.removesuffix(".tmp") in map(str, CORE_FILES):
        return _of_core_file(call, struck)
    if struck.path == "/etc":
        return _of_folder(call, struck, renamed)
    if struck.path.startswith(str(DIGEST_FILE.parent)):
        return _of_digest(call, struck)
    assert struck.path.startswith(str(PARAMETERS.parent)), struck
    return _of_parameters(struck)
