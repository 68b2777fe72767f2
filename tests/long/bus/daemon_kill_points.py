"""tests/long/bus/daemon_kill_points.py: a kill of the service right before a file-system call."""
import re
import subprocess
from collections import Counter
from dataclasses import dataclass
from pathlib import Path
from typing import Any

from account_history import Call, History, rows
from harness.accounts import GROUP
from harness.bus import BusError
from harness.passwords import NEW
from kept_files import (BOOT_CONFIG, BOOT_LOCK, FILES, FOLDERS, LOCKS, PARAMETERS, TEMPORARIES,
                        Version, save_files)
from killed_service import KilledService

CHANGES: dict[str, Call] = {
    "AddUser": ("AddUser", "carol", NEW, "users", "viewer:admin", "Carol"),
    "AddUidUser": ("AddUidUser", "carol", NEW, "operator", "viewer", "Carol", 5000),
    "AddSystemUser": ("AddSystemUser", "ftpd", NEW, "users", ["operator"], "/bin/sh", "FTP"),
    "ModifyUser": ("ModifyUser", "alice", NEW, "viewer", ["admin"], "", "Alice"),
    "ModifyUser group": ("ModifyUser", "alice", "", "viewer", [], "", ""),
    "ModifyUser root": ("ModifyUser", "root", NEW, "", [], "", ""),
    "ClearUserFields": ("ClearUserFields", "timer", True, True, True),
    "ChpasswdUser": ("ChpasswdUser", "bob", NEW),
    "ChpasswdUser root": ("ChpasswdUser", "root", NEW),
    "RemoveUser": ("RemoveUser", "alice"),
    "RemoveUser system": ("RemoveUser", "timer"),
    "AddGroup": ("AddGroup", "guests"),
    "RemoveGroup": ("RemoveGroup", "recorder"),
    "Digest create": ("Digest", ["create", f"dave:PRIVANE:{'0' * 32}\n"]),
    "Digest delete": ("Digest", ["delete", "bob\n"]),
    "AddBootblockParam": ("AddBootblockParam", "COLOR", "third"),
}

# What a kill may leave of a change although the call was made again: the account is there, or gone,
# so that the second call changes nothing; or it has its new primary group.
LEFTOVERS: dict[str, set[str]] = {
    "AddUser": {"no member of users", "no member of viewer", "no member of admin",
                "no line in digest_auth_passwd"},
    "AddUidUser": {"no member of operator", "no member of viewer",
                   "no line in digest_auth_passwd"},
    "AddSystemUser": {"no member of users", "no member of operator"},
    "ModifyUser": {"no member of viewer"},
    "ModifyUser group": {"no member of viewer", "still a member of users"},
    "RemoveUser": {"still a member of users", "still a member of operator",
                   "still a line in shadow", "still a line in digest_auth_passwd"},
    "RemoveUser system": {"still a member of admin", "still a line in shadow"},
}

# Accounts of their own, so that every change above is still to be made. What is made first, the
# call that is killed, and before which call on the file system.
EARLIER_CRASHES: tuple[tuple[Call | None, Call, str, int], ...] = tuple(
    [(("AddUser", "dora", NEW, "users", "admin", ""), ("RemoveUser", "dora"), call, number)
     for call, number in (("rename", 2), ("rename", 3), ("renameat", 1))]
    + [(None, ("AddUser", "eve", NEW, "viewer", "admin", ""), call, number)
       for call, number in (("write", 3), ("rename", 1), ("rename", 2), ("rename", 3),
                            ("renameat", 1))]
    + [(("AddUser", "dora", NEW, "users", "admin", ""),
        ("ModifyUser", "dora", NEW + "er", "operator", ["viewer"], "", ""), "rename", 3),
       (None, ("AddBootblockParam", "SERNO", "4711"), "write", 1)])

EARLIER_SUBJECTS = ("dora", "eve")

PATHS = tuple(map(str, (*FILES, *TEMPORARIES, *FOLDERS, *LOCKS, BOOT_CONFIG, BOOT_LOCK)))
# Not right before a call, but when the answer has arrived.
ANSWERED = "answer"
STATES = ("clean", "leftover", "crashed")
TRACE = Path("/dev/shm/kill-trace")
CALL = re.compile(r"(\w+)\(")


@dataclass(frozen=True)
class Point:
    """The service makes a change on files in a state, and is killed right before its call on the
    file system of that name and number."""

    change: str
    call: str
    number: int
    state: str

    @property
    def changes_a_file(self) -> bool:
        return self.call in (ANSWERED, "rename", "renameat")


class Tracer:
    """strace on the main thread of a running service, which makes all the changes."""

    def __init__(self, pid: int, *options: str) -> None:
        paths = [word for path in PATHS for word in ("-P", path)]
        self._tracer = subprocess.Popen(["strace", "-p", str(pid), "-o", str(TRACE), *options,
                                         *paths], stderr=subprocess.PIPE, text=True)
        assert self._tracer.stderr is not None
        # The kernel names a tracer before that sees any call; its own word comes after.
        told = self._tracer.stderr.readline()
        assert told.endswith("attached\n"), told

    def end(self) -> list[str]:
        """The names of the calls, of a service that is still there or not."""
        return [match[1] for match in map(CALL.match, self.end_with_lines()) if match]

    def end_with_lines(self) -> list[str]:
        """What strace printed of them."""
        self._tracer.terminate()
        self._tracer.communicate(timeout=5)
        return TRACE.read_text().splitlines()


class KillPoints:
    def __init__(self, killed: KilledService) -> None:
        self._killed = killed
        self._counts = {change: self._count(call) for change, call in CHANGES.items()}
        self._leftover = self._plant_leftovers()
        self._crashed = [self._crash(*crash) for crash in EARLIER_CRASHES]

    def _count(self, call: Call) -> Counter[str]:
        """How often the change makes each call on the file system."""
        history = self._killed.start_on(self._killed.fresh)
        tracer = Tracer(self._killed.service.pid, "-e", "trace=%file,%desc")
        assert self._killed.make(history, call) is None
        names = tracer.end()
        self._killed.stop()
        assert any(name.startswith("rename") for name in names) or "write" in names, (call, names)
        return Counter(names)

    def _plant_leftovers(self) -> dict[Any, Any]:
        """Half-written files under the temporary names."""
        seen = self._killed.fresh[PARAMETERS][1]
        return self._killed.fresh | {path: (b"evil:x:0:0::/root:/bin/sh\nhalf a li", seen)
                                     for path in TEMPORARIES}

    def _crash(self, first: Call | None, call: Call, name: str,
               number: int) -> tuple[dict[Any, Any], Call]:
        history = self._killed.start_on(self._killed.fresh)
        if first is not None:
            assert self._killed.make(history, first) is None
        self._kill_in(history, call, name, number)
        return save_files(), call

    def all_points(self) -> list[Point]:
        return [Point(change, call, number, state)
                for change, counts in self._counts.items()
                for call, count in (*counts.items(), (ANSWERED, 1))
                for number in range(1, count + 1) for state in STATES]

    def _files(self, point: Point) -> tuple[dict[Any, Any], Call | None]:
        """And the call that was cut off in them."""
        if point.state == "clean":
            return self._killed.fresh, None
        if point.state == "leftover":
            return self._leftover, None
        return self._crashed[hash_of(point) % len(self._crashed)]

    def _kill_in(self, history: History, call: Call, name: str, number: int) -> None:
        """Kills at the point and judges the files."""
        killed = self._killed
        if name == ANSWERED:
            killed.make(history, call)
            killed.kill()
            killed.judge(history, history.newest)
            return
        answered = history.newest
        assert history.begin(call) is None
        tracer = Tracer(killed.service.pid, "-e", f"trace={name}",
                        "-e", f"inject={name}:signal=KILL:when={number}")
        error = killed.call(call)
        assert isinstance(error, BusError) and error.name.endswith("NoReply"), error
        tracer.end()
        killed.await_death()
        killed.judge(history, answered)

    def strike(self, point: Point) -> set[str]:
        """Kills, judges and recovers; what of the change was not made good by making it again."""
        try:
            return self._strike(point)
        except AssertionError as error:
            raise AssertionError(f"{point}: {error}") from error

    def _strike(self, point: Point) -> set[str]:
        call = CHANGES[point.change]
        history = self._killed.start_on(*self._files(point))
        self._kill_in(history, call, point.call, point.number)
        recovered = self._killed.recover(call)
        self._killed.stop()
        return leftovers(recovered.versions[-1], history.versions[-1], call[1])


def leftovers(got: Version, ideal: Version, subject: str) -> set[str]:
    """What the subject of a change has too much or too little. Others, but for those of an earlier
    crash, have what they should."""
    found: set[tuple[str, str]] = set()
    for file in FILES:
        if file == GROUP:
            now, wanted = ({(row[0], member) for row in rows(version[file])
                            for member in row[3].split(",")} for version in (got, ideal))
            place = {(group, member): f"member of {group}" for group, member in now ^ wanted}
            found |= {(key[1], ("still a " if key in now else "no ") + place[key])
                      for key in now ^ wanted if key[1]}
        else:
            now, wanted = (set(version[file].splitlines()) for version in (got, ideal))
            found |= {(line.split(":")[0], ("still a " if line in now else "no ")
                       + f"line in {file.name}") for line in now ^ wanted}
    strange = {(name, what) for name, what in found if name not in (subject, *EARLIER_SUBJECTS)}
    assert not strange, strange
    return {what for name, what in found if name == subject}


def hash_of(point: Point) -> int:
    """The same in every run."""
    return sum(f"{point}".encode())
