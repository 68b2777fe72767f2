"""tests/bus/harness/device_fixtures.py: the fixtures of the tests of the system methods."""
from pathlib import Path
from typing import Callable, Iterator

import pytest

from harness.accounts import AccountFiles
from harness.bus import Bus
from harness.device import Device
from harness.fake_authz import FakeAuthz
from harness.fake_folder import FakeClock
from harness.service import Service
from harness.stage import Stage
from harness.stage_fixtures import run_stage
from harness.syslog_socket import SyslogSocket

RTC = Path("/dev/rtc")


@pytest.fixture
def device(tmp_path: Path) -> Iterator[Device]:
    surroundings = Device(tmp_path)
    yield surroundings
    surroundings.close()


@pytest.fixture
def hardware_clock() -> Iterator[Path]:
    """Something at /dev/rtc that can be opened."""
    RTC.write_bytes(b"")
    yield RTC
    RTC.unlink(missing_ok=True)


@pytest.fixture
def system(device: Device, accounts: AccountFiles, start: Callable[..., Service], bus: Bus,
           authz: FakeAuthz, syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """The service amid a device of fakes; it must survive the test."""
    yield from run_stage(Stage(start, bus, authz, syslog, tmp_path, others=device.fakes()))


@pytest.fixture
def system_with_clock(device: Device, changing_accounts: AccountFiles,
                      start: Callable[..., Service], bus: Bus, authz: FakeAuthz,
                      syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """As system, with a clock that takes any time, which no clock of the sandbox does, and with
    accounts to change: every method can succeed."""
    others = (*device.fakes(), FakeClock(tmp_path / "clock"))
    yield from run_stage(Stage(start, bus, authz, syslog, tmp_path, others=others))
