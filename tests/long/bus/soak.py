"""tests/long/bus/soak.py: many callers at once, for long, amid changes, disconnects and bad tools.

    tests/long/on_bus soak --amount SECONDS --seed S --figures FILE

64 connections call methods of every family for so many seconds, drop off in the middle of calls and
come back. Meanwhile one of them adds, changes and removes accounts and groups, and the tools that
the service runs fail, take their time, die of signals, print 10 MB, or hang. For a fifth of the
time polkit decides; where a policy file does, that is for all of it, and 300 more connections come
and go, whose answers have to follow the file as it changes. From the first fifth to the end the
service is the same process with the same descriptors and as many match rules on the bus, no child
left over, and less than 256 KiB larger; and the files hold what the calls made of them.

It is looked at again and again when nobody calls, and after a call that is too large: the service
gives freed memory back then, so that what is measured is what it holds.
"""
import os
import random
import threading
import time
from collections import Counter
from pathlib import Path
from typing import Any, Callable, Iterator

import pytest
from gi.repository import GLib

from harness import packaged, process
from harness.accounts import AccountFiles
from harness.bus import Bus, error_of
from harness.deadline import wait_for
from harness.device import LLDPCLI, Device
from harness.fake_authz import FakeAuthz, OwnAuthz
from harness.modelled_stage import ModelledStage
from harness.passwords import MARK
from harness.service import Service
from harness.stage import Stage
from harness.syslog_socket import SyslogSocket
from soak_callers import PATIENCE, Caller, Changer, Sandglass
from soak_crowd import REMEMBERED, Crowd
from soak_tools import TEN_MEGABYTES, SoakTools

CONNECTIONS = 64

GROWTH_KIB = 256
# Between the smallest and the largest that is seen at rest.
SWING_KIB = 1024
TOO_LARGE = 5 << 20

# After the first fifth; a tool hangs after the first of them, and in a long run once more.
LOOKS = 10
LOOKS_BETWEEN_HANGS = 5
SOME_LOOKS = 3
LONG_SECONDS = 600
HANG_SECONDS, LONG_HANG_SECONDS = 5, 20

# A tool behaves in one way for so long.
MANNERS_SECONDS = 0.5

# Of the time; what a policy file decides has a start of its own.
SHARES = {"allowed": 4 / 5, "polkit": 1 / 5, "policy_file": 1}

# Each must come about, in both parts, the last one in the first of them; that is waited for when
# the time is over.
TRIED = ("calls", "errors", "changes", "disconnects", "tools_run", "tools_failed", "tools_hung")
TRIED_ONCE = "tools_printed_10_mb"
TRIED_BY_CROWD = ("visits", "policies_granting", "policies_withholding", "policies_renamed",
                  "policies_edited")
LAST_WAIT = 5 * PATIENCE


class SoakedStage(Stage):
    """As the packaged unit starts it, and with a log that does not grow."""

    def start(self, *arguments: str, **options: Any) -> None:
        super().start(*arguments, **packaged.environment(), **options)

    def forget_output(self) -> None:
        """What the service printed goes, after a look for secrets in it."""
        new = self.service.forget_output()
        assert MARK.encode() not in new and b"$5$" not in new


class Housekeeper(threading.Thread):
    """Gives the tools other manners, and empties what grows around the service."""

    def __init__(self, glass: Sandglass, chance: random.Random, stage: SoakedStage, device: Device,
                 authz: FakeAuthz | OwnAuthz, caller: Caller) -> None:
        super().__init__()
        self._glass, self._stage, self._device, self._authz = glass, stage, device, authz
        self._caller = caller  # of the tool that is to hang
        self.tools = SoakTools(device, random.Random(chance.random()))
        self._hang_seconds = 0.0
        self.failed: BaseException | None = None

    def make_hang(self, seconds: float) -> None:
        """A tool, as soon as the caller is free to call it."""
        self._hang_seconds = seconds

    @property
    def awaits_hang(self) -> bool:
        return self._hang_seconds > 0 or self.tools.awaits_hang

    def run(self) -> None:
        try:
            self._keep()
        except BaseException as error:  # the test tells
            self.failed = error
            self._glass.give_up()

    def _keep(self) -> None:
        while not self._glass.is_over.wait(MANNERS_SECONDS):
            if self.tools.is_hanging():
                continue
            self.tools.note_runs()
            self.tools.take_up_manners()
            for fake in (*self._device.fakes(), self._stage.pidof, self._authz,
                         self._stage.syslog):
                fake.forget()
            self._stage.forget_output()
            # Where connections that were closed wait, with all that they have read, to tell of it.
            while GLib.MainContext.default().iteration(False):
                pass
            if self._hang_seconds > 0:
                wanted = self.tools.hang(self._hang_seconds)
                self._hang_seconds = 0.0
                self._caller.wanted = wanted


class Soak:
    """All that goes on at the same time; with a crowd, which needs the group privane."""

    def __init__(self, stage: SoakedStage, modelled: ModelledStage, device: Device,
                 authz: FakeAuthz | OwnAuthz, chance: random.Random,
                 crowd_gid: int | None) -> None:
        self.pid = stage.service.pid
        self._bus = stage.bus
        self._glass = Sandglass(CONNECTIONS + (crowd_gid is not None))
        all_are_allowed = isinstance(authz, FakeAuthz)
        self.callers = [Changer(self._glass, chance, modelled, all_are_allowed),
                        *(Caller(self._glass, chance) for _ in range(CONNECTIONS - 1))]
        self._keeper = Housekeeper(self._glass, chance, stage, device, authz, self.callers[-1])
        self._crowd = None if crowd_gid is None else Crowd(self._glass, chance, crowd_gid)
        self.tried = (*TRIED, *((TRIED_ONCE,) if all_are_allowed else ()),
                      *(TRIED_BY_CROWD if self._crowd else ()))
        self.counts: Counter[str] = Counter()

    @property
    def _counted(self) -> list[Caller | Crowd | SoakTools]:
        return [*self.callers, self._keeper.tools, *([self._crowd] if self._crowd else [])]

    def run(self, seconds: float) -> list[dict[str, int]]:
        """What was seen after each part of the time, first after a fifth of it."""
        try:
            if self._crowd:
                self._crowd.visit()  # The largest, so that no later one is the first.
            return self._run(seconds)
        finally:
            if self._crowd:
                self._crowd.close()

    def _run(self, seconds: float) -> list[dict[str, int]]:
        threads = (*self.callers, self._keeper, *([self._crowd] if self._crowd else []))
        looks: list[dict[str, int]] = []
        for thread in threads:
            thread.start()
        try:
            self._look(seconds, looks)
            wait_for("all that is tried",
                     lambda: self._glass.is_over.is_set() or self._is_all_tried(), LAST_WAIT)
        except threading.BrokenBarrierError:
            pass  # because of what failed
        finally:
            self._glass.give_up()
            for thread in threads:
                thread.join(PATIENCE)
        failed = [thread.failed for thread in threads
                  if thread.failed and not isinstance(thread.failed, threading.BrokenBarrierError)]
        assert not failed, failed[0]
        assert looks and not any(thread.is_alive() for thread in threads)
        assert not self._keeper.tools.is_hanging()
        return looks

    def _look(self, seconds: float, looks: list[dict[str, int]]) -> None:
        is_long = seconds > LONG_SECONDS
        self._glass.is_over.wait(seconds / 5)
        looks.append(self._glass.paused(self._held))
        for number in range(LOOKS):
            if number == 0 or is_long and number % LOOKS_BETWEEN_HANGS == 0:
                self._keeper.make_hang(LONG_HANG_SECONDS if is_long else HANG_SECONDS)
            self._glass.is_over.wait(seconds * 4 / 5 / LOOKS)
            looks.append(self._glass.paused(self._held))

    def _held(self) -> dict[str, int]:
        # Those are remembered who have called since they came.
        for caller in self.callers:
            assert caller.bus.call("CheckUser", "s", "root", timeout=PATIENCE) == (True,)
        return held(self._bus, self.pid)

    def _is_all_tried(self) -> bool:
        return not self._keeper.awaits_hang and not self._missing()

    def _missing(self) -> list[str]:
        """What has not come about yet."""
        seen: Counter[str] = Counter()
        for source in self._counted:
            seen.update(dict(source.counts))
        return [name for name in self.tried if not seen[name]]

    @property
    def longest_wait(self) -> float:
        return max(caller.longest_wait for caller in self.callers)

    def add_to(self, figures: Counter[str]) -> None:
        for source in self._counted:
            self.counts.update(source.counts)
        longest = {name: self.counts[name] for name in self.counts if name.startswith("max_")}
        figures.update(self.counts - Counter(longest))
        for name, value in longest.items():
            figures[name] = max(figures[name], value)


def held(bus: Bus, pid: int) -> dict[str, int]:
    """What the service holds when nobody calls. The first of the calls that are too large also
    makes GDBus's buffer for what it reads as large as it will be."""
    for _ in range(3):
        error = error_of(bus.call, "CheckUser", "s", "x" * TOO_LARGE, timeout=PATIENCE)
        assert error.name == "org.freedesktop.DBus.Error.LimitsExceeded"
        assert bus.call("CheckUser", "s", "root", timeout=PATIENCE) == (True,)
    fields = process.status(pid)
    return {"kib": int(fields["VmRSS"].split()[0]), "peak": int(fields["VmHWM"].split()[0]),
            "heap": int(fields["RssAnon"].split()[0]),
            "descriptors": len(os.listdir(f"/proc/{pid}/fd")),
            "match_rules": bus.match_rules(),
            "children": len(process.children(pid))}


# What allows everything is the same beside each of our own libraries, and soaked beside one.
@pytest.fixture(params=[pytest.param("allowed", marks=pytest.mark.polkit),
                        pytest.param("polkit", marks=pytest.mark.polkit),
                        pytest.param("policy_file", marks=pytest.mark.policy_file)])
def decider(request: pytest.FixtureRequest, authz: FakeAuthz) -> FakeAuthz | OwnAuthz:
    return authz if request.param == "allowed" else OwnAuthz()


@pytest.fixture
def soaked(changing_accounts: AccountFiles, device: Device,
           start: Callable[..., Service], bus: Bus, decider: FakeAuthz | OwnAuthz,
           syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """A service with our own stores."""
    stage = SoakedStage(start, bus, decider, syslog, tmp_path, fake_stores=False,
                        others=device.fakes())
    try:
        yield stage
        stage.stop()
    finally:
        stage.close()


def test_soak(soaked: SoakedStage, request: pytest.FixtureRequest, accounts: AccountFiles,
              device: Device, decider: FakeAuthz | OwnAuthz, bus: Bus, amount: int,
              privane_gid: int, chance: random.Random, figures: Counter) -> None:
    part = request.node.callspec.params["decider"]
    is_with_crowd = part == "policy_file"
    seconds = amount * SHARES[part]
    modelled = ModelledStage(soaked, accounts)
    soaked.wire.close()
    # The largest answer, so that no later one is the first.
    device.tools[LLDPCLI].print(TEN_MEGABYTES)
    for _ in range(3):
        bus.call("ExecuteLldpcli", "s", "show-neighbors", timeout=PATIENCE)
    rules = bus.match_rules()
    soak = Soak(soaked, modelled, device, decider, chance, privane_gid if is_with_crowd else None)
    begin = time.monotonic()
    looks = soak.run(seconds)
    taken = int(time.monotonic() - begin)
    figures["seconds"] += taken
    soak.add_to(figures)
    sizes = [look["kib"] for look in looks]
    # With a crowd one look may find half a MiB more than those after it; what is kept for good is in
    # all of them.
    growth = (min(sizes[-SOME_LOOKS:]) - min(sizes[:SOME_LOOKS]) if is_with_crowd
              else max(sizes) - sizes[0])
    # Each part is one process: how long it ran, how much it grew, and the most that it ever held.
    figures[f"max_seconds_{part}"] = taken
    figures[f"max_growth_kib_{part}"] = growth
    figures[f"max_resident_kib_{part}"] = looks[-1]["peak"]
    figures["looks"] += len(looks)
    print(f"\n{request.node.name}: {dict(figures)}\n{looks[0]}\n{looks[-1]}\n{sizes} KiB",
          flush=True)
    assert soaked.service.is_running() and soaked.service.pid == soak.pid
    assert len(looks) == LOOKS + 1
    # A caller who is remembered takes one.
    rules += CONNECTIONS if is_with_crowd else 0
    assert {look["match_rules"] for look in looks} == {rules}, looks
    if is_with_crowd:
        # One more while room is made.
        assert soak.counts["max_match_rules"] in (REMEMBERED, REMEMBERED + 1), soak.counts
    assert growth < GROWTH_KIB, looks
    assert max(sizes) - min(sizes) < SWING_KIB, looks
    assert {look["descriptors"] for look in looks} == {looks[0]["descriptors"]}, looks
    assert not any(look["children"] for look in looks), looks
    modelled.check()
    assert min(caller.counts["calls"] for caller in soak.callers) > 0
    assert soak.longest_wait > soak.counts["max_hang_seconds"] - 1
    assert not (missing := [name for name in soak.tried if not soak.counts[name]]), missing
