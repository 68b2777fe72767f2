"""tests/bus/test_startup.py: how the service comes up, in the foreground and as a daemon."""
import os
import signal
from pathlib import Path

import pytest

from harness import process
from harness.bus import Bus
from harness.deadline import wait_for
from harness.fake_authz import FakeAuthz
from harness.sandbox import BINARY, fake_library
from harness.service import INITIALIZING, REGISTERED, STARTING
from harness.service_fixtures import StartService
from harness.strace import Trace
from harness.syslog_socket import SyslogSocket

LOG_NOTICE = 5
LOG_DAEMON = 3
PROGRAM = "privane_system"

# Everything but "-n" alone starts a daemon; there is no other option and no usage text.
DAEMON_COMMAND_LINES = [(), ("-n", "-n"), ("-n", "more"), ("-h",), ("--help",), ("",), ("-nn",)]


STEPS = [INITIALIZING, STARTING, REGISTERED]


def test_foreground_logs_its_steps_to_standard_output(start: StartService, authz: FakeAuthz,
                                                      bus: Bus, syslog: SyslogSocket) -> None:
    service = start(("-n",), environment=authz.environment())
    service.wait_registered(bus)

    assert service.output() == [f"message: {text}" for text in STEPS]
    assert syslog.lines() == []


def test_foreground_does_not_detach(start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    service = start(("-n",), environment=authz.environment())
    service.wait_registered(bus)

    assert int(process.status(service.pid)["PPid"]) == os.getpid()
    assert os.getsid(service.pid) == os.getsid(0)
    assert os.readlink(f"/proc/{service.pid}/cwd") == os.getcwd()
    assert bus.call("CheckUser", "s", "root") == (True,)


@pytest.mark.parametrize("arguments", DAEMON_COMMAND_LINES, ids=lambda words: " ".join(words))
def test_every_other_command_line_starts_a_daemon(arguments: tuple[str, ...], start: StartService,
                                                  authz: FakeAuthz, bus: Bus,
                                                  syslog: SyslogSocket) -> None:
    service = start(arguments, environment=authz.environment())
    assert service.launcher_status() == 0
    service.wait_registered(bus)

    assert service.pid != service.started.pid
    assert bus.call("CheckUser", "s", "root") == (True,)
    assert [(line.facility, line.severity, line.tag, line.pid, line.text)
            for line in syslog.lines()] == [
        (LOG_DAEMON, LOG_NOTICE, PROGRAM, service.pid, f"message: {text}")
        for text in STEPS]
    assert service.output() == []


def test_daemon_leaves_its_surroundings(start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    service = start((), environment=authz.environment())
    service.wait_registered(bus)
    pid = service.pid

    assert int(process.status(pid)["PPid"]) == os.getpid()  # the adopter of orphans
    assert os.getsid(pid) == pid
    assert os.readlink(f"/proc/{pid}/cwd") == "/"
    for stream in range(3):
        assert os.readlink(f"/proc/{pid}/fd/{stream}") == "/dev/null"


def test_service_runs_the_installed_binary_with_the_library_in_front(
        start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    service = start(environment=authz.environment())
    service.wait_registered(bus)
    maps = Path(f"/proc/{service.pid}/maps").read_text()

    assert os.readlink(f"/proc/{service.pid}/exe") == BINARY
    assert {line.split()[-1] for line in maps.splitlines() if "libauthz" in line} == {
        str(authz.path)}
    assert "liblogbackend.so.1" in maps


@pytest.mark.parametrize("arguments", [("-n",), ()], ids=["foreground", "daemon"])
def test_authorization_client_is_opened_with_one_thread(
        arguments: tuple[str, ...], start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    start(arguments, environment=authz.environment()).wait_registered(bus)

    assert authz.calls() == ["init 1"]


def test_daemon_detaches_with_one_thread(start: StartService, authz: FakeAuthz, bus: Bus,
                                         tmp_path: Path) -> None:
    record = tmp_path / "detach"
    service = start((), environment={
        **authz.environment(), "FAKE_DETACH_RECORD": str(record),
        "LD_PRELOAD": str(fake_library("detach/libdetach.so"))})
    service.wait_registered(bus)

    # To "/" and the null device, with the first thread alone.
    assert record.read_text() == "daemon 0 0 1\n"


def test_foreground_never_asks_to_detach(start: StartService, authz: FakeAuthz, bus: Bus,
                                         tmp_path: Path) -> None:
    record = tmp_path / "detach"
    service = start(environment={
        **authz.environment(), "FAKE_DETACH_RECORD": str(record),
        "LD_PRELOAD": str(fake_library("detach/libdetach.so"))})
    service.wait_registered(bus)

    assert not record.exists()


@pytest.mark.real_authz
def test_no_thread_starts_before_the_detaching_with_the_real_authorization(
        start: StartService, bus: Bus, tmp_path: Path) -> None:
    trace = Trace(tmp_path / "trace", "clone,clone3,fork,vfork")
    service = start((), wrapper=trace.wrapper)
    service.wait_registered(bus)
    assert service.stop() == 0

    before = [call for call in trace.calls() if call.pid == service.started.pid]
    assert before, "the launcher made no process"
    assert not [call for call in before if "CLONE_THREAD" in call.rest]
    # The daemon, being a process with GDBus in it, has threads: the trace would have shown them.
    assert [call for call in trace.calls()
            if call.pid == service.pid and "CLONE_THREAD" in call.rest]


@pytest.mark.real_authz
def test_daemon_authorizes_although_it_detached(start: StartService, bus: Bus) -> None:
    service = start(())
    service.wait_registered(bus)

    assert bus.call("CheckUser", "s", "root") == (True,)


def test_ignored_child_signal_is_reset(start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    service = start(environment=authz.environment(), ignored=[signal.SIGCHLD])
    service.wait_registered(bus)

    assert not process.ignores(service.pid, signal.SIGCHLD)


def rtc_calls(start: StartService, authz: FakeAuthz, bus: Bus, file: Path) -> list[tuple[str, str]]:
    trace = Trace(file, "open,openat,read,ioctl,close", ("/dev/rtc",))
    service = start(environment=authz.environment(), wrapper=trace.wrapper)
    service.wait_registered(bus)
    assert service.stop() == 0
    return [(call.name, call.rest) for call in trace.calls()]


def test_absent_hardware_clock_is_no_error(start: StartService, authz: FakeAuthz, bus: Bus,
                                           tmp_path: Path) -> None:
    assert not Path("/dev/rtc").exists()

    calls = rtc_calls(start, authz, bus, tmp_path / "trace")

    assert [name for name, _ in calls] == ["openat"]
    assert "ENOENT" in calls[0][1]


def test_hardware_clock_is_probed_and_let_go(start: StartService, authz: FakeAuthz, bus: Bus,
                                             tmp_path: Path) -> None:
    Path("/dev/rtc").touch()
    try:
        calls = rtc_calls(start, authz, bus, tmp_path / "trace")
    finally:
        Path("/dev/rtc").unlink()

    assert [name for name, _ in calls] == ["openat", "close"]
    assert "O_RDONLY" in calls[0][1]


def wait_for_queue(bus: Bus, length: int) -> list[str]:
    return wait_for("the queue for the name",
                    lambda: queue if len(queue := bus.queue()) == length else None)


def test_second_instance_waits_for_the_name(start: StartService, authz: FakeAuthz,
                                            bus: Bus) -> None:
    first = start(environment=authz.environment())
    first.wait_registered(bus)
    second = start(environment=authz.environment())
    queue = wait_for_queue(bus, 2)

    assert [bus.pid_of(name) for name in queue] == [first.pid, second.pid]
    assert second.is_running()
    assert first.stop() == 0
    second.wait_registered(bus)
    assert bus.call("CheckUser", "s", "root") == (True,)
