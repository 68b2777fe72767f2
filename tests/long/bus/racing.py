"""tests/long/bus/racing.py: callers whose connections vanish, and what came of their calls.

They are processes of clerk, who is in the group privane and has no role: polkit, or the policy file,
refuses whatever he asks for.
"""
import json
import subprocess
from collections import Counter
from pathlib import Path

from gi.repository import Gio, GLib

from harness.accounts import CLERK_UID
from harness.bus import INTERFACE, NAME, PATH, Bus
from harness.deadline import wait_for
from harness.interface import METHODS, QUERIES
from harness.monitor import BUS, CALL, ERROR, PATIENCE, RETURN, Record, Seen
from harness.sandbox import PYTHON, SYSTEM_BUS
from harness.service import Service
from harness.wire import NO_CAPABILITIES
from pipeline import Pipeline

RACERS = 3

# Connections that are made for each call that is wanted: what was sent on one that then ended, the
# bus may drop unread.
CONNECTIONS_TO_A_CALL = 1.4

WARNING = "warning: Authorization check failed: "

# The actions that somebody who means harm would ask for.
TEMPTING = {
    "AddUser": ("evil", "secret", "root", "privane", ""),
    "AddUidUser": ("evil", "secret", "root", "privane", "", 1500),
    "AddSystemUser": ("evil", "secret", "root", ["privane"], "/bin/sh", ""),
    "ModifyUser": ("root", "mine now", "", [], "", ""),
    "ChpasswdUser": ("root", "mine now"),
    "ClearUserFields": ("root", True, True, True),
    "RemoveUser": ("viewer",),
}


def blob(serial: int, destination: str, path: str, interface: str, member: str,
         body: GLib.Variant | None = None) -> bytes:
    message = Gio.DBusMessage.new_method_call(destination, path, interface, member)
    message.set_serial(serial)
    if body is not None:
        message.set_body(body)
    return message.to_blob(NO_CAPABILITIES)


def beginning(uid: int) -> bytes:
    """All that a connection says before its first call, without waiting for an answer."""
    return (b"\0AUTH EXTERNAL " + str(uid).encode().hex().encode() + b"\r\nBEGIN\r\n"
            + blob(1, BUS, "/org/freedesktop/DBus", BUS, "Hello"))


def tempting_calls() -> list[bytes]:
    return [blob(2, NAME, PATH, INTERFACE, method.member,
                 GLib.Variant(f"({method.signature})",
                              tuple(TEMPTING.get(method.member, method.arguments))))
            for method in METHODS if method not in QUERIES]


class Racer:
    """A process that makes so many connections."""

    def __init__(self, gid: int, connections: int, seed: int) -> None:
        self._process = subprocess.Popen(
            ["setpriv", f"--reuid={CLERK_UID}", f"--regid={CLERK_UID}", f"--groups={gid}", "--",
             PYTHON, str(Path(__file__).with_name("racer.py"))],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        assert self._process.stdin is not None
        json.dump({"socket": SYSTEM_BUS.removeprefix("unix:path="), "connections": connections,
                   "seed": seed, "begin": beginning(CLERK_UID).hex(),
                   "calls": [call.hex() for call in tempting_calls()]}, self._process.stdin)
        self._process.stdin.write("\n")
        self._process.stdin.flush()

    def is_running(self) -> bool:
        return self._process.poll() is None

    def result(self) -> dict[str, int]:
        assert self._process.stdout is not None and self._process.stdin is not None
        text = self._process.stdout.read()
        self._process.stdin.close()
        assert self._process.wait(PATIENCE) == 0, text
        result: dict[str, int] = json.loads(text)
        return result


class Races:
    """The races of one service."""

    def __init__(self, bus: Bus, service: Service, record: Record) -> None:
        self._bus, self._service, self._record = bus, service, record
        self._mark = record.mark()
        self._owner = bus.owner()
        self._connections = self._held()
        self.counts: Counter[str] = Counter()

    def run(self, racers: list[Racer]) -> None:
        """Returns when all that they sent has been answered."""
        while any(racer.is_running() for racer in racers):
            # Root comes right after one that went: allowed as itself, and nobody else is by that.
            line = Pipeline()
            serial = line.send("CheckUser", "s", "root")
            assert [message.body for message in line.until_reply(serial)] == [(True,)]
            line.close()
            self.counts["roots_in_between"] += 1
        for racer in racers:
            self.counts.update(racer.result())
        self._settle()

    def _held(self) -> tuple[int, int]:
        """How many connections the bus has, those included whose owners it does not know yet."""
        (stats,) = self._bus.send(BUS, "/org/freedesktop/DBus", f"{BUS}.Debug.Stats", "GetStats")
        return stats["ActiveConnections"], stats["IncompleteConnections"]

    def _settle(self) -> None:
        """Until the bus has let each of the connections go, and so passed on what they sent; then
        until the service has answered every call that reached it, with whatever."""
        Pipeline().close()  # those that were made earlier the bus accepted earlier
        wait_for("the end of the connections", lambda: self._held() == self._connections, PATIENCE)
        self._record.catch_up(self._bus)
        assert not (left := self._names_left()), left
        arrived = len(self.calls())
        # Each is served in its turn, before one that comes now.
        wait_for("the service", lambda: self._is_answered(arrived), PATIENCE)

    def _names_left(self) -> set[object]:
        changes = [seen.arguments for seen in self._record.since(self._mark)
                   if seen.member == "NameOwnerChanged"]
        given, gone = ({arguments[0] for arguments in changes if arguments[at] == ""}
                       for at in (1, 2))
        return given - gone

    def _is_answered(self, arrived: int) -> bool:
        assert self._service.is_running(), self._service.output()[-3:]
        assert self._bus.call("CheckUser", "s", "root", timeout=PATIENCE) == (True,)
        self._record.catch_up(self._bus)
        return len(self._answers()) >= arrived

    def told(self) -> list[str]:
        """The refusals that the service logged."""
        return [line for line in self._service.output() if line.startswith(WARNING)]

    def calls(self) -> list[str]:
        """The members called by others than this process's own connections."""
        return [str(seen.member) for seen in self._of_racers()]

    def _of_racers(self) -> list[Seen]:
        calls = [seen for seen in self._record.since(self._mark)
                 if seen.type == CALL and seen.destination == NAME]
        root = {seen.sender for seen in calls if seen.member == "CheckUser"}
        return [seen for seen in calls if seen.sender not in root]

    def _answers(self) -> list[Seen]:
        """What the service sent to those that called, gone as they are."""
        callers = {seen.sender for seen in self._of_racers()}
        return [seen for seen in self._record.since(self._mark)
                if seen.type in (RETURN, ERROR) and seen.sender == self._owner
                and seen.destination in callers]
