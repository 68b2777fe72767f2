"""tests/long/bus/flooding.py: one flood of the service, and root who calls meanwhile."""
import json
import os
import random
import subprocess
import threading
import time
from collections import Counter
from contextlib import contextmanager
from dataclasses import dataclass
from pathlib import Path
from typing import Iterator

import pytest

from harness import packaged, process
from harness.accounts import CLERK_UID, STRANGER_UID
from harness.bus import Bus, BusError
from harness.bus_limits import bus_limits
from harness.deadline import wait_for
from harness.flood_messages import HEAD, text_call
from harness.flooder import FEW, LARGE, MANY, MEBIBYTE, STALLED_CONNECTIONS, Connection
from harness.sandbox import PYTHON, STATE
from harness.service import Service

# Two that the bus lets call, one that it does not.
FLOODERS = (CLERK_UID, CLERK_UID, STRANGER_UID)
ALLOWED = FLOODERS.count(CLERK_UID)

# For want of room, by the service or by the bus.
REFUSED = "org.freedesktop.DBus.Error.LimitsExceeded"
# What polkit answers waits as all that the service is sent, platform/authz/polkit/polkit_client.cpp.
NOT_IN_TIME = "no answer in time"
# Of floods whose rest is measured as work, too, on a machine that has other work.
PATIENCE = 240.0
READY = 30.0
AFTERWARDS = 20

# Until root is answered again.
SECONDS = 2.0

# Calls carry up to 16 descriptors; the service has those of some messages at a time.
MORE_DESCRIPTORS = 64

LARGEST = bus_limits()["max_message_size"]
# Of the messages of a flood.
LARGE_SENT = min(LARGE, LARGEST)

SMALL = MEBIBYTE // 16
REST = 8 * MEBIBYTE
# All places taken by the largest calls, service/intake.h.
PLACES = 28 * MEBIBYTE

# What does not come through to the service: what is no call, or not whole.
KEPT_OUT = {"large_others", "too_large", "stalled"}

# What is large of one of these lists, its message alone tells: it never gets a place.
LONGEST_LISTS = {"text_lists", "variant_lists"}
LISTS = {"lists", *LONGEST_LISTS}


@dataclass(frozen=True)
class Bounds:
    """What the service may hold beside its memory at rest: in places, and of the message that is
    being read, which is there as bytes and as what GDBus builds of them, so many times its size.
    GDBus builds all of a message before the filter sees it."""

    message: int = SMALL
    times: int = 2
    places: int = PLACES

    def resident_kib(self) -> int:
        return (REST + self.places + self.times * self.message) // 1024


BOUNDS = {"large_calls": Bounds(LARGE_SENT), "lists": Bounds(min(LARGE_SENT, 2 * MEBIBYTE), 24),
          "text_lists": Bounds(LARGE_SENT, 24, places=0),
          "variant_lists": Bounds(LARGE_SENT, 74, places=0),
          **{kind: Bounds(places=0) for kind in KEPT_OUT}}

# What a flood may leave behind, in the heaps' ends and as GDBus's buffer of the size of the largest
# message, and the time to give the rest back.
TRIM_SECONDS = 120.0
KEPT_KIB = (16 * MEBIBYTE + LARGEST) // 1024


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
        assert (line := self._line()) == "ready\n", line

    def start(self) -> None:
        assert self._process.stdin is not None
        self._process.stdin.write("go\n")
        self._process.stdin.flush()

    def stop(self) -> None:
        assert self._process.stdin is not None
        self._process.stdin.close()

    def result(self) -> Counter:
        """What came of it; waits for its end."""
        told = Counter(json.loads(self._line()))
        assert self._process.wait(READY) == 0
        return told

    def discard(self) -> None:
        if self._process.poll() is None:
            self._process.kill()
            self._process.wait(5)


@contextmanager
def flooders_of(kind: str, gid: int, chance: random.Random) -> Iterator[list[Flooder]]:
    """Their processes, ready to start."""
    flooders: list[Flooder] = []
    try:
        for uid in FLOODERS:
            flooders.append(Flooder(kind, uid, gid, chance.randrange(1 << 32)))
        for flooder in flooders:
            flooder.wait_ready()
        yield flooders
    finally:
        for flooder in flooders:
            flooder.discard()


class Caller:
    """Root, who calls all the time, on a connection and in a thread of its own. Its calls are
    answered or refused; only where it is patient, also for want of polkit's answer."""

    def __init__(self, is_patient: bool) -> None:
        self.seen: Counter = Counter()
        self._is_patient = is_patient
        self._failed: BaseException | None = None
        self._is_over = threading.Event()
        self._thread = threading.Thread(target=self._run)

    def _run(self) -> None:
        try:
            bus = Bus()
            while not self._is_over.wait(0.02):
                self.seen["answered" if is_answered(bus, self._is_patient) else "refused"] += 1
            bus.close()
        except BaseException as error:  # the test tells
            self._failed = error

    @contextmanager
    def calling(self) -> Iterator[None]:
        """Raises afterwards what a call met, other than an answer or a refusal."""
        self._thread.start()
        try:
            yield
        finally:
            self._is_over.set()
            self._thread.join()
        if self._failed is not None:
            raise self._failed


def is_answered(bus: Bus, is_patient: bool = False) -> bool:
    """Whether root is, or else refused."""
    try:
        answer = bus.call("CheckUser", "s", "root", timeout=PATIENCE)
    except BusError as error:
        if error.name == REFUSED or is_patient and error.text.endswith(NOT_IN_TIME):
            return False
        raise
    assert answer == (True,), answer
    return True


def floods(request: pytest.FixtureRequest) -> int:
    """How many were selected."""
    return sum(item.originalname == "test_flood" for item in request.session.items
               if isinstance(item, pytest.Function))


@pytest.fixture
def flooded(start, bus: Bus) -> Iterator[Service]:
    """The service as the packaged unit starts it, with polkit deciding."""
    running = start(environment=packaged.environment())
    running.wait_registered(bus)
    # The connections to polkit stand, and what is loaded once is loaded.
    for _ in range(20):
        assert is_answered(bus)
    yield running
    assert running.is_running(), f"the service ended: {running.status}, {running.output()[-9:]}"
    assert running.stop() == 0


def kib(pid: int, field: str) -> int:
    return int(process.status(pid)[field].split()[0])


def bus_pid() -> int:
    return int((STATE / "dbus-daemon.pid").read_text())


def descriptors(pid: int) -> int:
    return len(os.listdir(f"/proc/{pid}/fd"))


def watch(pid: int, seconds: float) -> int:
    """The most descriptors that a process held meanwhile."""
    end = time.monotonic() + seconds
    most = 0
    while time.monotonic() < end:
        most = max(most, descriptors(pid))
        time.sleep(0.02)
    return most


def wait_until_answered(bus: Bus, is_patient: bool) -> None:
    end = time.monotonic() + PATIENCE
    while not is_answered(bus, is_patient):
        assert time.monotonic() < end, "refused all the time"
        time.sleep(0.01)


def work_done(service: int) -> float:
    """The processor seconds of the service and of the bus so far."""
    return process.processor_seconds(service) + process.processor_seconds(bus_pid())


def wait_until_trimmed(pid: int, bound: int) -> int:
    """What the service still holds, after time to come to the end of what it was sent."""
    end = time.monotonic() + TRIM_SECONDS
    while (left := kib(pid, "VmRSS")) > bound and time.monotonic() < end:
        time.sleep(0.1)
    return left


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


def check_bus_takes_no_larger_messages() -> None:
    assert not is_thrown_out(LARGEST - HEAD)
    assert is_thrown_out(LARGEST)


def check_arrival(kind: str, results: list[Counter]) -> None:
    """Who may call is let, who may not is not, and a message is thrown out only for its size."""
    assert all(result["messages"] > 0 for result in results), results
    if kind == "too_large":
        # The last one may be under way when the flood ends.
        assert all(result["thrown_out"] >= max(1, result["messages"] - 1)
                   for result in results), results
        return
    assert all(result["thrown_out"] == 0 for result in results), results
    if kind == "stalled":
        assert all(result["stalled"] > 0 and result["messages"] == STALLED_CONNECTIONS
                   for result in results), results
        return
    allowed = sum(results[:ALLOWED], Counter())
    kept_out = sum(results[ALLOWED:], Counter())
    if kind in KEPT_OUT:
        allowed, kept_out = Counter(), allowed + kept_out
    else:
        assert allowed["answered"] >= (FEW if kind in BOUNDS else MANY), results
    assert allowed["denied"] == 0 and kept_out["answered"] == 0, results
    assert kept_out["denied"] > 0, results


def flood(kind: str, service: Service, bus: Bus, seconds: int, chance: random.Random,
          figures: Counter, gid: int, most_work: float | None = None) -> None:
    """Floods the service, and looks at what it held and how long root waited afterwards: not above
    SECONDS, or else no longer than the service and the bus had so many processor seconds of work
    left."""
    pid, bounds = service.pid, BOUNDS.get(kind, Bounds())
    held, resting = descriptors(pid), kib(pid, "VmRSS")
    # Begins VmHWM anew.
    Path(f"/proc/{pid}/clear_refs").write_text("5")
    is_patient = most_work is not None
    caller = Caller(is_patient)
    with flooders_of(kind, gid, chance) as flooders, caller.calling():
        for flooder in flooders:
            flooder.start()
        most = watch(pid, seconds)
        stopped, worked = time.monotonic(), work_done(pid)
        for flooder in flooders:
            flooder.stop()
        wait_until_answered(bus, is_patient)
        waited, work = time.monotonic() - stopped, work_done(pid) - worked
        results = [flooder.result() for flooder in flooders]
    left = wait_until_trimmed(pid, resting + KEPT_KIB)
    for _ in range(AFTERWARDS):
        assert is_answered(bus)
    peak = kib(pid, "VmHWM")
    print(f"{kind}: {[dict(result) for result in results]}; root {dict(caller.seen)}, "
          f"answered again after {waited:.2f} s and {work:.2f} s of work; KiB at rest {resting}, peak "
          f"{peak} of {bounds.resident_kib()}, at the end {left}; descriptors {held}, most {most}; "
          f"the bus's KiB {kib(bus_pid(), 'VmRSS')}", flush=True)
    figures["messages"] += sum(result["messages"] for result in results)
    figures[f"max_{kind}_resident_kib"] = peak
    figures[f"max_{kind}_wait_ms"] = int(waited * 1000)
    figures[f"max_{kind}_work_ms"] = int(work * 1000)
    check_arrival(kind, results)
    assert caller.seen.total() > 0
    if most_work is None:
        assert waited <= SECONDS, waited
    else:
        assert work <= most_work, work
    assert peak <= bounds.resident_kib(), (peak, bounds.resident_kib())
    assert left <= resting + KEPT_KIB, left
    assert most <= held + MORE_DESCRIPTORS, most
    wait_for("the descriptors", lambda: descriptors(pid) == held)
    if kind in LONGEST_LISTS:
        # That much only such a list takes.
        assert peak > resting + 16 * LARGE_SENT // 1024, "none arrived"
