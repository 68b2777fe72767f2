"""tests/long/bus/soak.py: many callers at once, for long, amid changes, disconnects and bad tools.

    tests/long/on_bus soak --amount SECONDS --seed S --figures FILE

64 connections call methods of every family for so many seconds, drop off in the middle of calls and
come back. Meanwhile one of them adds, changes and removes accounts and groups, and the tools that
the service runs fail, take their time, die of signals or print 10 MB. For a fifth of the time
polkit decides. In the end the account files hold what the calls made of them, and the service is
the same process with the same descriptors, no child left over, and no larger than after a fifth.

Its size is looked at when nobody calls and after a call that is too large: the service gives freed
memory back then, so that what is measured is what it holds.
"""
import os
import random
import threading
import time
from collections import Counter
from pathlib import Path
from typing import Any, Callable, Iterator

import pytest
from gi.repository import Gio, GLib

from harness import packaged, process
from harness.account_model import Refused
from harness.accounts import AccountFiles
from harness.bus import INTERFACE, NAME, PATH, Bus, BusError, domain_error, error_of
from harness.deadline import wait_for
from harness.device import LLDPCLI, RUNNERS, Device
from harness.fake_authz import FakeAuthz
from harness.modelled_stage import ModelledStage
from harness.passwords import MARK
from harness.service import Service
from harness.stage import SIGNATURES, Stage
from harness.syslog_socket import SyslogSocket

CONNECTIONS = 64
PATIENCE = 60.0

GROWTH_KIB = 256
TOO_LARGE = 5 << 20
TEN_MEGABYTES = b"x" * (10 << 20)

# Accounts and groups that the changer has at most, so that the files do not grow.
ACCOUNTS = 12

# A connection drops off at one call in so many.
CALLS_TO_A_DISCONNECT = 40

# A tool behaves in one way for so long. It is run by a caller in one call of many, so that waiting
# for it does not take all the time.
MANNERS_SECONDS = 0.5
CALLS_TO_A_TOOL = 60
MANNERS = (":", ":", "sleep 0.05", "sleep 0.3", "kill -9 $PPID", "kill -15 $PPID")

TOOLS = tuple((member, arguments) for member, (_, arguments) in RUNNERS.items())
QUESTIONS: tuple[tuple[str, tuple[Any, ...]], ...] = (
    ("CheckUser", ("root",)), ("CheckUser", ("nosuch",)), ("CheckGroup", ("users",)),
    ("GetUser", ("alice",)), ("GetUser", ("nosuch",)), ("GetUserList", ()), ("GetGroupList", ()),
    ("GetGroup", ("users",)), ("GetGroup", ("nosuch",)), ("GetGroupListFull", ()),
    ("GetDigestList", ()), ("AuthUserBasic", ("alice", "wrong")), ("GetSlabinfo", ()),
    ("ReadLogFile", ("/etc/hostname",)), ("ReadLogFile", ("/nosuch",)), ("ReadSerno", ()),
    ("ReadBootblockParam", ("SERNO",)), ("AddBootblockParam", ("COLOR", "blue")),
    ("GetNetworkSpeedDuplex", ()), ("StartService", ("lensd",)), ("StopService", ("no/unit",)),
    ("StartNtp", ()), ("StopLensd", ()), ("AdjTime", (0, 1)), ("SetTimeOfDay", (0, 1)),
    ("ExecuteEthtool", ("x", "eth0")), ("ExecuteLldpcli", ("nosuch",)), ("RtspreadConfig", ()),
    ("SetDefaultTarget", ("multi-user",)), ("RemoveUser", ("nosuch",)), ("AddGroup", ("-no",)),
    ("ModifyUser", ("root", "", "users", [], "", "")), ("Digest", (["set"],)))


class Sandglass:
    """When it is over, and a pause at which nobody calls."""

    def __init__(self, callers: int) -> None:
        self.is_over = threading.Event()
        self._barrier = threading.Barrier(callers + 1)
        self._is_paused = threading.Event()

    def wait_if_paused(self) -> None:
        """What every caller does between two calls."""
        if self._is_paused.is_set():
            self._barrier.wait(PATIENCE)
            self._barrier.wait(PATIENCE)

    def paused(self, look: Callable[[], Any]) -> Any:
        """What is seen while nobody calls."""
        self._is_paused.set()
        self._barrier.wait(PATIENCE)
        try:
            return look()
        finally:
            self._is_paused.clear()
            self._barrier.wait(PATIENCE)

    def give_up(self) -> None:
        self.is_over.set()
        self._barrier.abort()


class Caller(threading.Thread):
    """Calls all the time; an answer that is neither a result nor an error of the service's own
    is what failed."""

    def __init__(self, glass: Sandglass, chance: random.Random) -> None:
        super().__init__()
        self.counts: Counter = Counter()
        self.failed: BaseException | None = None
        self._glass = glass
        self.chance = random.Random(chance.random())
        self.bus = Bus()

    def run(self) -> None:
        try:
            while not self._glass.is_over.is_set():
                self._glass.wait_if_paused()
                self.step()
            self.bus.close()
        except BaseException as error:  # the test tells
            self.failed = error
            self._glass.give_up()

    def step(self) -> None:
        member, arguments = self.chance.choice(QUESTIONS)
        if self.chance.randrange(CALLS_TO_A_TOOL) == 0:
            member, arguments = self.chance.choice(TOOLS)
        if self.chance.randrange(CALLS_TO_A_DISCONNECT) == 0:
            self.drop_off(member, arguments)
        else:
            self.call(member, arguments)

    def call(self, member: str, arguments: tuple[Any, ...]) -> Any:
        self.counts["calls"] += 1
        try:
            return self.bus.call(member, SIGNATURES[member], *arguments, timeout=PATIENCE)
        except BusError as error:
            assert error.name.startswith("org.gtk.GDBus.UnmappedGError.Quark."), error
            self.counts["errors"] += 1
            return error

    def drop_off(self, member: str, arguments: tuple[Any, ...]) -> str:
        """Leaves without waiting for the answer; the name that it had."""
        message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, member)
        message.set_body(GLib.Variant(f"({SIGNATURES[member]})", arguments))
        self.bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
        self.bus.connection.flush_sync(None)
        left = self.bus.unique_name
        self.bus.close()
        self.bus = Bus()
        self.counts["disconnects"] += 1
        return left


class Changer(Caller):
    """The one that changes accounts, each change as the model has it. polkit refuses who is gone,
    if he is by then; so it drops off only where his call counts all the same."""

    def __init__(self, glass: Sandglass, chance: random.Random, modelled: ModelledStage,
                 may_drop_off: bool) -> None:
        super().__init__(glass, chance)
        self._may_drop_off = may_drop_off
        self._model = modelled.model
        self._number = 0
        self._users: list[str] = []
        self._groups: list[str] = []

    def _new(self, prefix: str) -> str:
        self._number += 1
        return f"{prefix}{self._number}"

    def _choose(self) -> tuple[str, tuple[Any, ...]]:
        chance = self.chance
        password = self._new(MARK)
        if not self._users or chance.random() < 0.2 and len(self._users) < ACCOUNTS:
            name = self._new("u")
            self._users.append(name)
            if chance.random() < 0.3:
                return "AddSystemUser", (name, password, "users", ["viewer"], "/bin/sh", "System")
            return "AddUser", (name, password, "users", chance.choice(("", "viewer", "admin")),
                               "Comment")
        if not self._groups or chance.random() < 0.1 and len(self._groups) < ACCOUNTS:
            self._groups.append(self._new("g"))
            return "AddGroup", (self._groups[-1],)
        if chance.random() < 0.1:
            return "RemoveGroup", (self._groups.pop(),)
        name = chance.choice(self._users)
        if chance.random() < 0.2:
            self._users.remove(name)
            return "RemoveUser", (name,)
        return chance.choice((
            ("ModifyUser", (name, password, "", ["operator"], "", self._new("Comment "))),
            ("ModifyUser", (name, "", "", ["nosuch"], "", "")),
            ("ChpasswdUser", (name, password)),
            ("ClearUserFields", (name, False, True, True)),
            ("AddUser", (name, password, "users", "", "")),
            ("AuthUserBasic", (name, "wrong")),
            ("GetUser", (name,))))

    def step(self) -> None:
        member, arguments = self._choose()
        self.counts["changes"] += 1
        try:
            expected: Any = self._model.call(member, *arguments).answer
        except Refused as error:
            expected = domain_error(*error.args)
        if self._may_drop_off and self.chance.randrange(CALLS_TO_A_DISCONNECT) == 0:
            left = self.drop_off(member, arguments)
            # What it sent before the bus forgot it, the service has before anything sent later.
            wait_for("the bus", lambda: self.bus.owner(left) is None, PATIENCE)
            return
        answer = self.call(member, arguments)
        assert answer == expected, (member, arguments, answer, expected)


class Housekeeper(threading.Thread):
    """Gives the tools other manners, and empties what grows around the service."""

    def __init__(self, glass: Sandglass, chance: random.Random, stage: Stage, device: Device,
                 authz: FakeAuthz) -> None:
        super().__init__()
        self._glass, self._stage, self._device, self._authz = glass, stage, device, authz
        self._chance = random.Random(chance.random())
        self.failed: BaseException | None = None

    def run(self) -> None:
        try:
            self._keep()
        except BaseException as error:  # the test tells
            self.failed = error
            self._glass.give_up()

    def _keep(self) -> None:
        while not self._glass.is_over.wait(MANNERS_SECONDS):
            for member, _ in TOOLS:
                tool = self._device.tools[RUNNERS[member][0]]
                tool.before_answering(self._chance.choice(MANNERS))
                tool.exit_with(self._chance.choice((0, 0, 1, 77)))
                tool.print(self._chance.choice((b"", b"out\n", b"\xff\xfe", TEN_MEGABYTES)))
            for fake in (*self._device.fakes(), self._stage.pidof, self._authz,
                         self._stage.syslog):
                fake.forget()
            self._stage.forget_output()


class SoakedStage(Stage):
    """As the packaged unit starts it, and with a log that does not grow."""

    def start(self, *arguments: str, **options: Any) -> None:
        super().start(*arguments, **packaged.environment(), **options)
        self._seen = 0

    def forget_output(self) -> None:
        """What the service printed goes, after a look for secrets in it."""
        path = Path(self.service._output.name)
        with path.open("rb") as printed:
            printed.seek(self._seen)
            new = printed.read()
        self._seen += len(new)
        assert MARK.encode() not in new and b"$5$" not in new
        os.truncate(path, 0)


def held(bus: Bus, pid: int) -> dict[str, int]:
    """What the service holds when nobody calls. The first of the calls that are too large also
    makes GDBus's buffer for what it reads as large as it will be."""
    for _ in range(3):
        error = error_of(bus.call, "CheckUser", "s", "x" * TOO_LARGE, timeout=PATIENCE)
        assert error.name == "org.freedesktop.DBus.Error.LimitsExceeded"
        assert bus.call("CheckUser", "s", "root", timeout=PATIENCE) == (True,)
    fields = process.status(pid)
    return {"kib": int(fields["VmRSS"].split()[0]), "heap": int(fields["RssAnon"].split()[0]),
            "descriptors": len(os.listdir(f"/proc/{pid}/fd")),
            "children": len(process.children(pid))}


@pytest.fixture(params=["allowed", "polkit"])
def soaked(request: pytest.FixtureRequest, changing_accounts: AccountFiles, device: Device,
           start: Callable[..., Service], bus: Bus, authz: FakeAuthz, syslog: SyslogSocket,
           tmp_path: Path) -> Iterator[Stage]:
    """A service with our own stores."""
    if request.param == "polkit":
        authz.environment = lambda: {}  # type: ignore[method-assign]
    stage = SoakedStage(start, bus, authz, syslog, tmp_path, fake_stores=False,
                        others=device.fakes())
    try:
        yield stage
        stage.stop()
    finally:
        stage.close()


def test_soak(soaked: SoakedStage, request: pytest.FixtureRequest, accounts: AccountFiles,
              device: Device, authz: FakeAuthz, bus: Bus, amount: int, chance: random.Random,
              figures: Counter) -> None:
    is_with_polkit = request.node.callspec.params["soaked"] == "polkit"
    seconds = amount / 5 if is_with_polkit else amount * 4 / 5
    modelled = ModelledStage(soaked, accounts)
    soaked.wire.close()
    # The largest answer, so that no later one is the first.
    device.tools[LLDPCLI].print(TEN_MEGABYTES)
    for _ in range(3):
        bus.call("ExecuteLldpcli", "s", "show-neighbors", timeout=PATIENCE)
    pid = soaked.service.pid
    begin = time.monotonic()
    glass = Sandglass(CONNECTIONS)
    callers = [Changer(glass, chance, modelled, not is_with_polkit),
               *(Caller(glass, chance) for _ in range(CONNECTIONS - 1))]
    keeper = Housekeeper(glass, chance, soaked, device, authz)
    for thread in (*callers, keeper):
        thread.start()
    warm: dict[str, int] = {}
    end: dict[str, int] = {}
    try:
        glass.is_over.wait(seconds / 5)
        warm = glass.paused(lambda: held(bus, pid))
        glass.is_over.wait(seconds * 4 / 5)
        end = glass.paused(lambda: held(bus, pid))
    except threading.BrokenBarrierError:
        pass  # because of what failed
    finally:
        glass.give_up()
        for thread in (*callers, keeper):
            thread.join(PATIENCE)
    for caller in callers:
        figures.update(caller.counts)
    failed = [thread.failed for thread in (*callers, keeper)
              if thread.failed and not isinstance(thread.failed, threading.BrokenBarrierError)]
    assert not failed, failed[0]
    assert warm and end and not any(thread.is_alive() for thread in (*callers, keeper))

    growth = end["kib"] - warm["kib"]
    figures["seconds"] += int(time.monotonic() - begin)
    figures["max_growth_kib"] = max(figures["max_growth_kib"], growth)
    name = "polkit" if is_with_polkit else "allowed"
    print(f"\n{name}: {dict(figures)}\n{warm}\n{end}", flush=True)
    assert soaked.service.is_running() and soaked.service.pid == pid
    assert growth < GROWTH_KIB, (warm, end)
    assert {**end, "kib": 0, "heap": 0} == {**warm, "kib": 0, "heap": 0}
    assert end["children"] == 0
    modelled.check()
    assert min(caller.counts["calls"] for caller in callers) > 0
    assert figures["changes"] and figures["disconnects"] and figures["errors"]
