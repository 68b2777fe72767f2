"""tests/long/bus/flood.py: callers without an action try to exhaust memory, files or the loop.

    tests/long/on_bus flood --amount SECONDS --seed S --figures FILE [--bus-defaults]

Each kind of flood of harness/flooder.py goes on for so many seconds, from processes of a user whom
the bus lets call and who has no role, and from one whom it does not let call. polkit decides.
Meanwhile and afterwards root calls, who may. The service's memory stays bounded, its descriptors
come back to what they were, and root is answered again within two seconds; with dbus-daemon's own
limits, --bus-defaults, after floods of lists later.
"""
import json
import os
import random
import statistics
import subprocess
import threading
import time
from collections import Counter
from dataclasses import dataclass
from pathlib import Path
from typing import Iterator

import pytest

from harness import packaged, process
from harness.accounts import CLERK_UID, STRANGER_UID
from harness.bus import Bus, BusError
from harness.bus_limits import DEFAULTS, bus_limits
from harness.deadline import wait_for
from harness.flooder import HEAD, KINDS, Connection, text_call
from harness.sandbox import PYTHON, STATE
from harness.service import Service

# Two that the bus lets call, one that it does not.
FLOODERS = (CLERK_UID, CLERK_UID, STRANGER_UID)

REFUSED = "org.freedesktop.DBus.Error.LimitsExceeded"
PATIENCE = 60.0
READY = 30.0
CALM_CALLS = 20
AFTERWARDS = 20

# Calls carry up to 16 descriptors; the service has those of some messages at a time.
MORE_DESCRIPTORS = 64


MEBIBYTE = 1 << 20
LIMITS = bus_limits()
LARGEST = LIMITS["max_message_size"]

REST = 8 * MEBIBYTE
# All places taken by the largest calls, service/intake.h.
PLACES = 28 * MEBIBYTE


@dataclass(frozen=True)
class Bounds:
    """What the service may hold beside its memory at rest: in places, and of the message that is
    being read, which is there as bytes and as what GDBus builds of them, so many times its size.
    GDBus builds all of a message before the filter sees it."""

    places: int = PLACES
    times: int = 2

    def resident_kib(self) -> int:
        return (REST + self.places + self.times * LARGEST) // 1024


# Such lists never get a place.
BOUNDS = {"lists": Bounds(times=24), "text_lists": Bounds(places=0, times=24),
          "variant_lists": Bounds(places=0, times=74)}

# Until root is answered again. What waits of lists in a bus that keeps 127 MiB takes longer.
SECONDS = 2.0
SECONDS_OF_DEFAULTS = 60.0
LONGEST_LISTS = {"text_lists", "variant_lists"}
LISTS = {"lists", *LONGEST_LISTS}

# What a flood may leave behind, GDBus's buffer of the size of the largest message included, and
# the time to give the rest back.
TRIM_SECONDS = 20.0
KEPT_KIB = (32 * MEBIBYTE + LARGEST) // 1024


class Flooder:
    """A process of harness/flooder.py."""

    def __init__(self, kind: str, uid: int, gid: int, seed: int) -> None:
        groups = f"--groups={gid}" if uid == CLERK_UID else "--clear-groups"
        harness = Path(process.__file__).parent
        self._process = subprocess.Popen(
            ["setpriv", f"--reuid={uid}", f"--regid={uid}", groups, "--", PYTHON,
             str(harness / "flooder.py"), kind, str(seed), str(LARGEST)],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True,
            env={**os.environ, "PYTHONPATH": str(harness.parent)})

    def _line(self) -> str:
        assert self._process.stdout is not None
        line = self._process.stdout.readline()
        assert line, "a flooder ended early"
        return line

    def wait_ready(self) -> None:
        assert self._line() == "ready\n"

    def start(self) -> None:
        assert self._process.stdin is not None
        self._process.stdin.write("go\n")
        self._process.stdin.flush()

    def stop(self) -> None:
        assert self._process.stdin is not None
        self._process.stdin.close()

    def result(self) -> Counter:
        """What it did; waits for its end."""
        told = Counter(json.loads(self._line()))
        assert self._process.wait(READY) == 0
        return told

    def discard(self) -> None:
        if self._process.poll() is None:
            self._process.kill()
            self._process.wait(5)


@pytest.fixture
def flooded(start, bus: Bus) -> Iterator[Service]:
    """The service as the packaged unit starts it, with polkit deciding."""
    running = start(environment=packaged.environment())
    running.wait_registered(bus)
    # The connections to polkit stand, and what is loaded once is loaded.
    for _ in range(20):
        assert bus.call("CheckUser", "s", "root") == (True,)
    yield running
    assert running.is_running(), f"the service ended: {running.status}, {running.output()[-9:]}"
    assert running.stop() == 0


def kib(pid: int, field: str) -> int:
    return int(process.status(pid)[field].split()[0])


def bus_pid() -> int:
    return int((STATE / "dbus-daemon.pid").read_text())


def descriptors(pid: int) -> int:
    return len(os.listdir(f"/proc/{pid}/fd"))


class Caller:
    """Root, who calls all the time, on a connection and in a thread of its own."""

    def __init__(self) -> None:
        self.seen: Counter = Counter()
        self._is_over = threading.Event()
        self._thread = threading.Thread(target=self._run)
        self._thread.start()

    def _run(self) -> None:
        bus = Bus()
        while not self._is_over.wait(0.02):
            begin = time.monotonic()
            try:
                assert bus.call("CheckUser", "s", "root", timeout=PATIENCE) == (True,)
                self.seen["answered_meanwhile"] += 1
            except BusError as error:
                self.seen["refused_meanwhile" if error.name == REFUSED else error.name] += 1
            waited = int((time.monotonic() - begin) * 1000)
            self.seen["max_wait_ms"] = max(self.seen["max_wait_ms"], waited)
        bus.close()

    def stop(self) -> Counter:
        self._is_over.set()
        self._thread.join()
        return self.seen


def watch(pid: int, seconds: float) -> int:
    """The most descriptors that a process held meanwhile."""
    end = time.monotonic() + seconds
    most = 0
    while time.monotonic() < end:
        most = max(most, descriptors(pid))
        time.sleep(0.02)
    return most


def seconds_until_answered(bus: Bus) -> float:
    """Root tries again when it is refused, by the service or by the bus."""
    begin = time.monotonic()
    while True:
        try:
            bus.call("CheckUser", "s", "root", timeout=PATIENCE)
        except BusError as error:
            assert error.name == REFUSED and time.monotonic() < begin + PATIENCE, error
            time.sleep(0.01)
        else:
            return time.monotonic() - begin


def wait_until_trimmed(pid: int, bound: int) -> int:
    """What the service still holds, after time to come to the end of what it was sent."""
    end = time.monotonic() + TRIM_SECONDS
    while (left := kib(pid, "VmRSS")) > bound and time.monotonic() < end:
        time.sleep(0.1)
    return left


def calm_call(bus: Bus) -> float:
    """Seconds that a call takes on this machine at this moment, when nobody else calls."""
    return statistics.median(seconds_until_answered(bus) for _ in range(CALM_CALLS))


def is_thrown_out(size: int) -> bool:
    """Whom the bus throws out for a call with a text of that size to nobody."""
    connection = Connection()
    connection.socket.settimeout(READY)
    answers = b""
    try:
        connection.socket.sendall(connection.number(text_call(size)))
        while b"ServiceUnknown" not in answers:
            got = connection.socket.recv(4096)
            if not got:
                return True
            answers += got
    except ConnectionError:
        return True
    return False


def test_bus_takes_no_larger_messages() -> None:
    assert not is_thrown_out(LARGEST - HEAD)
    assert is_thrown_out(LARGEST)


@pytest.mark.parametrize("kind", KINDS)
def test_flood(kind: str, flooded: Service, bus: Bus, amount: int, chance: random.Random,
               figures: Counter, privane_gid: int) -> None:
    pid, calm = flooded.pid, calm_call(bus)
    held, resting = descriptors(pid), kib(pid, "VmRSS")
    # Begins VmHWM anew.
    Path(f"/proc/{pid}/clear_refs").write_text("5")
    flooders = [Flooder(kind, uid, privane_gid, chance.randrange(1 << 32)) for uid in FLOODERS]
    try:
        for flooder in flooders:
            flooder.wait_ready()
        caller = Caller()
        for flooder in flooders:
            flooder.start()
        most = watch(pid, amount)
        for flooder in flooders:
            flooder.stop()
        results = [flooder.result() for flooder in flooders]
        waited = seconds_until_answered(bus)
        seen = caller.stop()
    finally:
        for flooder in flooders:
            flooder.discard()
    peak = kib(pid, "VmHWM")
    left = wait_until_trimmed(pid, resting + KEPT_KIB)
    sent = [result["messages"] for result in results]
    found_too_large = sum(result["found_too_large"] for result in results[:2])
    print(f"{kind}: {sent} sent, {found_too_large} answered as too large; root {dict(seen)}, "
          f"answered again after {waited:.2f} s, calm {calm * 1000:.1f} ms; KiB at "
          f"rest {resting}, peak {peak}, at the end {left}; descriptors {held}, most "
          f"{most}; the bus's KiB {kib(bus_pid(), 'VmRSS')}", flush=True)
    figures["messages"] += sum(sent)
    # Few are answered, and of the longest lists the answer may come after the end.
    figures[f"{kind}_found_too_large"] += found_too_large
    figures["seconds"] += amount / len(KINDS)  # all of them together are one amount
    figures[f"max_{kind}_resident_kib"] = peak
    figures[f"max_{kind}_wait_ms"] = int(waited * 1000)
    for _ in range(AFTERWARDS):
        assert bus.call("CheckUser", "s", "root") == (True,)
    assert waited <= (SECONDS_OF_DEFAULTS if LIMITS == DEFAULTS and kind in LISTS else SECONDS)
    assert peak <= BOUNDS.get(kind, Bounds()).resident_kib()
    assert left <= resting + KEPT_KIB
    assert most <= held + MORE_DESCRIPTORS
    wait_for("the descriptors", lambda: descriptors(pid) == held)
    assert min(sent[:2]) > 0
    if kind in LONGEST_LISTS:
        # That much only such a list takes.
        assert peak > resting + 16 * LARGEST // 1024, "none arrived"
