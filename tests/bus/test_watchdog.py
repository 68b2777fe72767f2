"""tests/bus/test_watchdog.py: the signs of life that a service manager asks for."""
import re
import time
from pathlib import Path
from typing import Callable, Iterator

import pytest

from harness import process
from harness.bus import Bus
from harness.deadline import wait_for
from harness.device import NETSTAT, PINSRV, Device
from harness.fake_authz import FakeAuthz
from harness.notify_socket import Notice, NotifySocket
from harness.sandbox import fake_library
from harness.service import Service
from harness.service_fixtures import StartService
from harness.stage import Stage

WATCHED_US = 300_000
PERIOD = WATCHED_US / 3 / 1e6
# What a busy machine may add to a gap.
DELAY = 0.3

O_CLOEXEC = 0o2000000

VARIABLES = (b"NOTIFY_SOCKET=", b"WATCHDOG_USEC=", b"WATCHDOG_PID=")

WITH_ITS_OWN_PID = ["bash", "-c", 'WATCHDOG_PID=$$ exec "$0" "$@"']


@pytest.fixture(params=["/run/notify-test", "@notify-test"], ids=["path", "abstract"])
def any_manager(request: pytest.FixtureRequest) -> Iterator[NotifySocket]:
    manager = NotifySocket(request.param)
    yield manager
    manager.close()


@pytest.fixture
def manager() -> Iterator[NotifySocket]:
    manager = NotifySocket("/run/notify-test")
    yield manager
    manager.close()


@pytest.fixture
def started(start: StartService, authz: FakeAuthz, bus: Bus) -> Callable[..., Service]:
    """Starts a service with more environment, and waits for it."""
    def start_service(environment: dict[str, str], **options: object) -> Service:
        service = start(environment={**authz.environment(), **environment}, **options)
        service.wait_registered(bus)
        return service
    return start_service


def gaps(notices: list[Notice]) -> list[float]:
    times = [notice.time for notice in notices]
    return [later - earlier for earlier, later in zip(times, times[1:])]


def require_signs(manager: NotifySocket, service: Service) -> None:
    """The service gives them three times in the time that was asked for."""
    notices = manager.notices(15 * PERIOD)
    assert {(notice.pid, notice.text) for notice in notices} == {(service.pid, "WATCHDOG=1")}
    assert 8 <= len(notices) <= 16
    assert max(gaps(notices)) < PERIOD + DELAY


def test_signs_come_three_times_in_the_watched_time(any_manager: NotifySocket,
                                                    started: Callable[..., Service]) -> None:
    service = started(any_manager.environment(WATCHED_US))

    require_signs(any_manager, service)


def test_process_that_is_asked_by_its_number_gives_signs(manager: NotifySocket,
                                                         started: Callable[..., Service]) -> None:
    service = started(manager.environment(WATCHED_US), wrapper=WITH_ITS_OWN_PID)

    require_signs(manager, service)


@pytest.mark.parametrize("environment", [
    {"WATCHDOG_USEC": None}, {"WATCHDOG_USEC": ""}, {"WATCHDOG_USEC": "0"},
    {"WATCHDOG_USEC": "-1"}, {"WATCHDOG_USEC": "abc"}, {"WATCHDOG_USEC": "300000us"},
    {"WATCHDOG_USEC": str(1 << 64)}, {"WATCHDOG_PID": "1"}, {"WATCHDOG_PID": ""},
    {"WATCHDOG_PID": "abc"}, {"NOTIFY_SOCKET": None}, {"NOTIFY_SOCKET": ""},
    {"NOTIFY_SOCKET": "run/notify-test"}, {"NOTIFY_SOCKET": "/"}, {"NOTIFY_SOCKET": "@"},
    {"NOTIFY_SOCKET": "/" + "x" * 107}, {"NOTIFY_SOCKET": "/run/no-such-socket"},
], ids=str)
def test_who_is_not_asked_or_cannot_tell_gives_no_sign(
        environment: dict[str, str | None], manager: NotifySocket, bus: Bus,
        started: Callable[..., Service]) -> None:
    asked = {**manager.environment(WATCHED_US), **environment}
    service = started({name: value for name, value in asked.items() if value is not None})

    assert manager.notices(5 * PERIOD) == []
    assert bus.call("CheckUser", "s", "root") == (True,)
    assert len(service.output()) == 3  # It has nothing to say about that.


def test_manager_that_makes_its_socket_anew_gets_signs(manager: NotifySocket,
                                                       started: Callable[..., Service]) -> None:
    service = started(manager.environment(WATCHED_US))
    require_signs(manager, service)

    manager.make_anew()

    require_signs(manager, service)


def test_manager_that_does_not_read_holds_nothing_up(manager: NotifySocket, bus: Bus,
                                                     started: Callable[..., Service]) -> None:
    length = int(Path("/proc/sys/net/unix/max_dgram_qlen").read_text())
    started(manager.environment(3000))

    time.sleep(0.003 * length + 0.5)  # The queue is full in a third of it.

    assert bus.call("CheckUser", "s", "root") == (True,)
    assert manager.notices(0.2) != []


def test_sign_that_is_due_in_a_long_time_is_no_trouble(manager: NotifySocket, bus: Bus,
                                                       started: Callable[..., Service]) -> None:
    started(manager.environment((1 << 63) - 1))

    assert manager.notices(2 * PERIOD) == []
    assert bus.call("CheckUser", "s", "root") == (True,)


def test_hung_tool_stops_the_signs(system: Stage, device: Device, manager: NotifySocket,
                                  tmp_path: Path) -> None:
    hung = tmp_path / "hung"
    system.stop()
    system.start(**manager.environment(WATCHED_US))
    device.tools[NETSTAT].before_answering(f"touch {hung}; sleep 2")
    serial = system.send("GetActiveNetworkInfo", "all")
    wait_for("the tool", hung.exists)

    assert manager.notices(1.5) == []
    system.wire.until_reply(serial)
    require_signs(manager, system.service)


# The calls wait in one turn of the main loop.
def test_calls_in_a_row_are_signs_themselves(system: Stage, device: Device,
                                             manager: NotifySocket) -> None:
    system.stop()
    system.start(**manager.environment(WATCHED_US))
    device.tools[NETSTAT].before_answering("sleep 0.25")
    serials = [system.send("GetActiveNetworkInfo", "all") for _ in range(10)]

    notices = manager.notices(10 * 0.25)
    system.wire.until_reply(serials[-1])

    assert len(notices) >= 6
    assert max(gaps(notices)) < 0.25 + PERIOD + DELAY


def test_children_are_not_asked(system: Stage, device: Device, manager: NotifySocket) -> None:
    system.stop()
    system.start(**manager.environment(WATCHED_US), wrapper=WITH_ITS_OWN_PID)
    require_signs(manager, system.service)

    system.succeed("GetActiveNetworkInfo", "all")
    (pid,) = system.call("Pinsrv", ["pinsrv"]).answer
    assert process.wait_for_child(pid, 5) == 0

    for tool in (NETSTAT, PINSRV):
        variables = device.tools[tool].surroundings().split(b"\0")
        assert any(variable.startswith(b"PATH=") for variable in variables)
        assert not [variable for variable in variables if variable.startswith(VARIABLES)]


def test_every_descriptor_is_closed_on_exec(manager: NotifySocket,
                                            started: Callable[..., Service]) -> None:
    service = started(manager.environment(WATCHED_US))
    infos = {int(info.name): info.read_text()
             for info in Path(f"/proc/{service.pid}/fdinfo").iterdir()}
    flags = {number: int(match[1], 8) for number, text in infos.items()
             if number > 2 and (match := re.search(r"^flags:\s*(\d+)$", text, re.MULTILINE))}

    assert len(flags) >= 3
    assert not [number for number, value in flags.items() if not value & O_CLOEXEC]


def test_daemon_detaches_with_one_thread_and_gives_signs(
        manager: NotifySocket, started: Callable[..., Service], tmp_path: Path) -> None:
    record = tmp_path / "detach"
    service = started({**manager.environment(WATCHED_US), "FAKE_DETACH_RECORD": str(record),
                       "LD_PRELOAD": str(fake_library("detach/libdetach.so"))}, arguments=())

    assert record.read_text() == "daemon 0 0 1\n"
    require_signs(manager, service)
