"""tests/bus/test_startup_failures.py: a failing start says why, once, and leaves nothing."""
import errno
from pathlib import Path

import pytest

from harness.accounts import (GROUP, PASSWD, SHADOW, STANDARD_PASSWD, STANDARD_SHADOW,
                              AccountFiles)
from harness.bus import Bus
from harness.fake_authz import FakeAuthz
from harness.sandbox import fake_library
from harness.service import INITIALIZING, Service
from harness.service_fixtures import StartService
from harness.strace import Trace
from harness.syslog_socket import SyslogSocket

LOG_ERR = 3
LOG_NOTICE = 5

NO_GROUP_FILE = (
    "Failed to initialise the user management library: Could not initialise user management: "
    "Could not init group database, could not open group file '/etc/group', "
    "No such file or directory")


def database_trace(file: Path) -> Trace:
    return Trace(file, "open,openat", (str(PASSWD), str(SHADOW), str(GROUP)))


def bus_trace(file: Path) -> Trace:
    return Trace(file, "connect")


def assert_foreground_failure(service: Service, syslog: SyslogSocket, *lines: str) -> None:
    assert service.wait() == 1
    assert service.output() == list(lines)
    assert syslog.lines() == []


def assert_failure_before_detaching(service: Service, syslog: SyslogSocket, text: str) -> None:
    assert service.launcher_status() == 1
    assert service.output() == []
    assert [(line.severity, line.pid, line.text) for line in syslog.lines()] == [
        (LOG_ERR, service.started.pid, f"error: {text}")]


def test_failing_authorization_ends_the_foreground(start: StartService, authz: FakeAuthz, bus: Bus,
                                                   syslog: SyslogSocket, tmp_path: Path) -> None:
    authz.fail_init("the keeper is out")
    trace = database_trace(tmp_path / "trace")

    service = start(environment=authz.environment(), wrapper=trace.wrapper)

    assert_foreground_failure(service, syslog,
                              "error: Failed to initialize libauthz: the keeper is out")
    assert trace.calls() == []
    assert authz.calls() == ["init 1"]
    assert bus.owner() is None


def test_failing_authorization_ends_the_daemon_before_it_detaches(
        start: StartService, authz: FakeAuthz, bus: Bus, syslog: SyslogSocket,
        tmp_path: Path) -> None:
    authz.fail_init("the keeper is out")
    trace = database_trace(tmp_path / "trace")

    service = start((), environment=authz.environment(), wrapper=trace.wrapper)

    assert_failure_before_detaching(service, syslog,
                                    "Failed to initialize libauthz: the keeper is out")
    assert trace.calls() == []
    assert authz.calls() == ["init 1"]
    assert bus.owner() is None


NO_BUS = "Failed to initialize libauthz: Could not connect: No such file or directory"


@pytest.mark.polkit
def test_missing_bus_fails_the_real_authorization_in_the_foreground(
        start: StartService, syslog: SyslogSocket, tmp_path: Path) -> None:
    trace = database_trace(tmp_path / "trace")

    service = start(environment={"DBUS_SYSTEM_BUS_ADDRESS": "unix:path=/run/no_bus"},
                    wrapper=trace.wrapper)

    assert_foreground_failure(service, syslog, f"error: {NO_BUS}")
    assert trace.calls() == []


@pytest.mark.polkit
def test_missing_bus_fails_the_real_authorization_before_detaching(
        start: StartService, syslog: SyslogSocket, tmp_path: Path) -> None:
    trace = database_trace(tmp_path / "trace")

    service = start((), environment={"DBUS_SYSTEM_BUS_ADDRESS": "unix:path=/run/no_bus"},
                    wrapper=trace.wrapper)

    assert_failure_before_detaching(service, syslog, NO_BUS)
    assert trace.calls() == []


@pytest.mark.parametrize("text, shown", [
    ("two\nlines", r"two\x0Alines"),
    ("bell \a", r"bell \x07"),
    ("Latin-1 \udce9", r"Latin-1 \xE9"),
], ids=["line end", "control byte", "no UTF-8"])
def test_failure_text_stays_one_line(text: str, shown: str, start: StartService, authz: FakeAuthz,
                                     syslog: SyslogSocket) -> None:
    authz.fail_init(text)

    service = start((), environment=authz.environment())

    assert_failure_before_detaching(service, syslog, f"Failed to initialize libauthz: {shown}")


def test_failing_detaching_is_told(start: StartService, authz: FakeAuthz, bus: Bus,
                                   syslog: SyslogSocket, tmp_path: Path) -> None:
    trace = database_trace(tmp_path / "trace")

    detach = fake_library("detach/libdetach.so")
    service = start((), wrapper=[*trace.wrapper, "-E", f"LD_PRELOAD={detach}"],
                    environment={**authz.environment(),
                                 "FAKE_DETACH_RECORD": str(tmp_path / "detach"),
                                 "FAKE_DETACH_ERRNO": str(errno.EAGAIN)})

    assert_failure_before_detaching(service, syslog,
                                    "Daemon failed: Resource temporarily unavailable")
    assert (tmp_path / "detach").read_text() == "daemon 0 0 1\n"
    assert trace.calls() == []
    assert authz.calls() == ["init 1", "release"]
    assert bus.owner() is None


def test_failing_database_ends_the_foreground(start: StartService, authz: FakeAuthz, bus: Bus,
                                              accounts: AccountFiles, syslog: SyslogSocket,
                                              tmp_path: Path) -> None:
    accounts.write_exactly(STANDARD_PASSWD, STANDARD_SHADOW, None)
    trace = bus_trace(tmp_path / "trace")

    service = start(environment=authz.environment(), wrapper=trace.wrapper)

    assert service.wait() == 1
    assert service.output() == [f"message: {INITIALIZING}", f"error: {NO_GROUP_FILE}"]
    assert syslog.texts() == [(LOG_ERR, "Unable to parse group file (/etc/group)")]
    assert [call for call in trace.calls() if "/dev/log" not in call.rest] == []
    assert authz.calls() == ["init 1", "release"]
    assert bus.owner() is None


def test_failing_database_ends_the_daemon_after_it_detached(
        start: StartService, authz: FakeAuthz, bus: Bus, accounts: AccountFiles,
        syslog: SyslogSocket, tmp_path: Path) -> None:
    accounts.write_exactly(STANDARD_PASSWD, STANDARD_SHADOW, None)
    trace = bus_trace(tmp_path / "trace")

    service = start((), environment=authz.environment(), wrapper=trace.wrapper)

    assert service.launcher_status() == 0
    assert service.wait() == 1
    assert syslog.texts() == [(LOG_NOTICE, f"message: {INITIALIZING}"),
                              (LOG_ERR, "Unable to parse group file (/etc/group)"),
                              (LOG_ERR, f"error: {NO_GROUP_FILE}")]
    assert {line.pid for line in syslog.lines()} == {service.pid}
    assert service.output() == []
    assert [call for call in trace.calls() if "/dev/log" not in call.rest] == []
    assert authz.calls() == ["init 1", "release"]
    assert bus.owner() is None


@pytest.mark.real_authz
def test_failing_database_releases_the_real_authorization(start: StartService, bus: Bus,
                                                          accounts: AccountFiles) -> None:
    accounts.write_exactly(STANDARD_PASSWD, STANDARD_SHADOW, None)

    service = start()

    assert service.wait() == 1
    assert service.output()[-1] == f"error: {NO_GROUP_FILE}"
    assert bus.owner() is None


@pytest.mark.parametrize("absent, text", [
    ("passwd", "Could not init user database, could not open passwd file '/etc/passwd', "
               "No such file or directory"),
    ("group", "Could not init group database, could not open group file '/etc/group', "
              "No such file or directory"),
])
def test_missing_file_is_named(absent: str, text: str, start: StartService, authz: FakeAuthz,
                               accounts: AccountFiles) -> None:
    accounts.write()
    {"passwd": PASSWD, "group": GROUP}[absent].unlink()

    service = start(environment=authz.environment())

    assert service.wait() == 1
    assert service.output() == [
        f"message: {INITIALIZING}",
        "error: Failed to initialise the user management library: "
        f"Could not initialise user management: {text}"]


@pytest.mark.parametrize("path, text", [
    (PASSWD, "Could not init user database, could not read 'passwd' entry 0: Is a directory"),
    (SHADOW, "Could not init user database, could not read 'shadow' entry 0: Is a directory"),
    (GROUP, "Could not init group database, could not read 'group' entry 0: Is a directory"),
], ids=["passwd", "shadow", "group"])
def test_unreadable_file_is_named(path: Path, text: str, start: StartService, authz: FakeAuthz,
                                  accounts: AccountFiles) -> None:
    accounts.write()
    path.unlink()
    path.mkdir()
    try:
        service = start(environment=authz.environment())
        status, output = service.wait(), service.output()
    finally:
        path.rmdir()

    assert status == 1
    assert output[-1] == ("error: Failed to initialise the user management library: "
                          f"Could not initialise user management: {text}")
