"""tests/bus/test_shutdown.py: how the service ends."""
import os
import signal
from pathlib import Path
from typing import Iterator

import pytest

from harness.bus import Bus
from harness.deadline import wait_for
from harness.fake_authz import FakeAuthz
from harness.sandbox import start_bus
from harness.service import INITIALIZING, STARTING, STOP_SECONDS
from harness.service_fixtures import StartService
from harness.strace import Trace

QUIT_SIGNALS = [signal.SIGHUP, signal.SIGINT, signal.SIGTERM]
MODES = {"foreground": ("-n",), "daemon": ()}


@pytest.mark.parametrize("number", QUIT_SIGNALS, ids=lambda number: number.name)
@pytest.mark.parametrize("mode", MODES)
def test_quit_signal_ends_the_service(mode: str, number: signal.Signals, start: StartService,
                                      authz: FakeAuthz, bus: Bus) -> None:
    service = start(MODES[mode], environment=authz.environment())
    service.wait_registered(bus)

    assert service.stop(number) == 0
    assert bus.owner() is None
    assert authz.calls() == ["init 1", "release"]


@pytest.mark.real_authz
@pytest.mark.parametrize("mode", MODES)
def test_quit_signal_ends_the_service_with_the_real_authorization(
        mode: str, start: StartService, bus: Bus) -> None:
    service = start(MODES[mode])
    service.wait_registered(bus)
    assert bus.call("CheckUser", "s", "root") == (True,)

    assert service.stop() == 0
    assert bus.owner() is None


@pytest.mark.parametrize("mode", MODES)
def test_more_signals_while_quitting_are_harmless(mode: str, start: StartService,
                                                  authz: FakeAuthz, bus: Bus) -> None:
    service = start(MODES[mode], environment=authz.environment())
    service.wait_registered(bus)

    # Stopped, it finds all of them at once when it goes on.
    service.kill(signal.SIGSTOP)
    for number in QUIT_SIGNALS + QUIT_SIGNALS:
        service.kill(number)
    service.kill(signal.SIGCONT)

    assert service.wait(STOP_SECONDS) == 0
    assert authz.calls() == ["init 1", "release"]


def test_two_terminations_in_a_row_are_harmless(start: StartService, authz: FakeAuthz,
                                                bus: Bus) -> None:
    service = start(environment=authz.environment())
    service.wait_registered(bus)

    service.kill(signal.SIGTERM)
    try:
        service.kill(signal.SIGTERM)
    except ProcessLookupError:
        pass

    assert service.wait(STOP_SECONDS) == 0


@pytest.mark.parametrize("number", QUIT_SIGNALS, ids=lambda number: number.name)
def test_quit_signal_during_start_up_is_kept_for_the_loop(
        number: signal.Signals, start: StartService, authz: FakeAuthz, bus: Bus,
        tmp_path: Path) -> None:
    trace = Trace(tmp_path / "trace", "openat", ("/etc/group",))
    service = start(environment=authz.environment(), wrapper=[
        *trace.wrapper, "-e", f"inject=openat:signal={number.name}:when=1"])

    assert service.wait() == 0
    assert [call.name for call in trace.calls()] == ["openat"]
    assert service.output()[:2] == [f"message: {INITIALIZING}", f"message: {STARTING}"]
    assert authz.calls() == ["init 1", "release"]


def test_service_can_be_started_again(start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    for _ in range(2):
        service = start(environment=authz.environment())
        service.wait_registered(bus)
        assert bus.call("CheckUser", "s", "root") == (True,)
        assert service.stop() == 0


@pytest.fixture
def second_bus(tmp_path: Path) -> Iterator[tuple[str, int]]:
    """The address and the process of a bus of its own."""
    socket = Path("/run/second_bus_socket")
    address = f"unix:path={socket}"
    daemon = start_bus(address)
    wait_for("the second bus", socket.exists)
    yield address, daemon.pid
    daemon.kill()
    daemon.wait(5)
    socket.unlink(missing_ok=True)


@pytest.mark.parametrize("mode", MODES)
def test_losing_the_bus_ends_the_service(mode: str, second_bus: tuple[str, int],
                                         start: StartService, authz: FakeAuthz) -> None:
    address, bus_pid = second_bus
    bus = Bus(address)
    service = start(MODES[mode], environment={**authz.environment(),
                                              "DBUS_SYSTEM_BUS_ADDRESS": address})
    service.wait_registered(bus)

    os.kill(bus_pid, signal.SIGKILL)

    assert service.wait() == 0
    assert authz.calls() == ["init 1", "release"]
