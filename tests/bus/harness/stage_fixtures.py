"""tests/bus/harness/stage_fixtures.py: the fixtures of the tests that change accounts."""
from pathlib import Path
from typing import Callable, Iterator

import pytest

from harness.accounts import AccountFiles
from harness.bus import Bus
from harness.changing_accounts import write_changing_accounts
from harness.fake_authz import FakeAuthz
from harness.service import Service
from harness.stage import Stage
from harness.syslog_socket import SyslogSocket

DIGEST_FILE = Path("/etc/apache2/digest_auth_passwd")


@pytest.fixture(autouse=True)
def digest_file() -> Path:
    """The web server's digest file, empty at the start of every test."""
    DIGEST_FILE.parent.mkdir(exist_ok=True)
    DIGEST_FILE.write_text("")
    return DIGEST_FILE


@pytest.fixture
def changing_accounts(accounts: AccountFiles) -> AccountFiles:
    """A user and a group of every type."""
    write_changing_accounts(accounts)
    return accounts


def run_stage(stage: Stage) -> Iterator[Stage]:
    try:
        yield stage
        stage.stop()
        stage.require_no_leaks()
    finally:
        stage.close()


@pytest.fixture
def stage(changing_accounts: AccountFiles, start: Callable[..., Service], bus: Bus,
          authz: FakeAuthz, syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """The service amid fakes; it must survive the test and give no secret away."""
    yield from run_stage(Stage(start, bus, authz, syslog, tmp_path))


@pytest.fixture
def stage_with_stores(changing_accounts: AccountFiles, start: Callable[..., Service], bus: Bus,
                      authz: FakeAuthz, syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """As stage, with our own digest library and parameter store."""
    yield from run_stage(Stage(start, bus, authz, syslog, tmp_path, fake_stores=False))
