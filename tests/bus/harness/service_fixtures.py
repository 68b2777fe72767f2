"""tests/bus/harness/service_fixtures.py: the service, its users, and what is around it."""
import grp
from pathlib import Path
from typing import Any, Callable, Iterator

import pytest

from harness import process
from harness.accounts import (CLERK_UID, OPERATOR_ROLE_GID, OPERATOR_UID, STANDARD_GROUP,
                              STANDARD_PASSWD, STANDARD_SHADOW, STRANGER_UID, VIEWER_ROLE_GID,
                              VIEWER_UID, AccountFiles, replace)
from harness.bus import Bus, User
from harness.fake_authz import FakeAuthz
from harness.policy_file import POLICY, ExamplePolicy
from harness.polkit import ExampleRules
from harness.roles import Roles
from harness.sandbox import POLKIT, STATE, authorization, polkitd_pid, require_sandbox
from harness.service import Service
from harness.syslog_socket import SyslogSocket
from harness.world import Neighbour

StartService = Callable[..., Service]

# Of each daemon's log, its last characters.
LOG_SHOWN = 8000


def pytest_sessionstart() -> None:
    try:
        require_sandbox()
    except RuntimeError as error:
        pytest.exit(str(error), returncode=125)
    process.adopt_orphans()


def pytest_collection_modifyitems(config: pytest.Config, items: list[pytest.Item]) -> None:
    """Marks the tests that ask the real authorization, and leaves out those of the other one."""
    for item in items:
        if "real_service" in getattr(item, "fixturenames", ()):
            item.add_marker("real_authz")
    other = "policy_file" if authorization() == POLKIT else "polkit"
    left_out = [item for item in items if item.get_closest_marker(other)]
    if left_out:
        config.hook.pytest_deselected(items=left_out)
        items[:] = [item for item in items if item not in left_out]


def pytest_terminal_summary(terminalreporter: Any, exitstatus: int) -> None:
    """Shows what the sandbox's daemons printed, where that may explain a failure."""
    if exitstatus == 0:
        return
    if not Path(f"/proc/{polkitd_pid()}").exists():
        terminalreporter.section("polkitd ended before the tests did")
    for log in sorted(STATE.glob("*.log")):
        if text := log.read_text(errors="backslashreplace"):
            terminalreporter.section(log.name)
            # A flood leaves some hundred thousand lines.
            terminalreporter.write(text[-LOG_SHOWN:])


@pytest.fixture(scope="session")
def account_files() -> AccountFiles:
    """The account files, which hold the standard accounts between tests: the bus lets a user in
    only when it knows the user."""
    files = AccountFiles()
    files.write(STANDARD_PASSWD, STANDARD_SHADOW, STANDARD_GROUP)
    return files


@pytest.fixture(autouse=True)
def accounts(account_files: AccountFiles) -> Iterator[AccountFiles]:
    """The account files, with the standard accounts at the start of the test."""
    yield account_files
    account_files.write(STANDARD_PASSWD, STANDARD_SHADOW, STANDARD_GROUP)


@pytest.fixture(scope="session")
def packaged_policy() -> str | None:
    """The policy file as it was installed; None with polkit."""
    return None if authorization() == POLKIT else POLICY.read_text()


@pytest.fixture(autouse=True)
def policy_stays(packaged_policy: str | None) -> Iterator[None]:
    """It is there at the start of each test: some empty its folder."""
    yield
    if packaged_policy is not None and not POLICY.exists():
        POLICY.parent.mkdir(exist_ok=True)
        replace(POLICY, packaged_policy, 0o644, 0)


@pytest.fixture(scope="session")
def bus(account_files: AccountFiles) -> Iterator[Bus]:
    """A connection of root."""
    connection = Bus()
    yield connection
    connection.close()


@pytest.fixture
def authz(tmp_path: Path) -> FakeAuthz:
    """An authorization library that allows everything, for services that use it."""
    directory = tmp_path / "authz"
    directory.mkdir()
    return FakeAuthz(directory)


@pytest.fixture
def syslog() -> Iterator[SyslogSocket]:
    log = SyslogSocket()
    yield log
    log.close()


@pytest.fixture
def start() -> Iterator[StartService]:
    """Starts services, and ends at the end of the test those that still run."""
    services: list[Service] = []

    def start_service(*arguments: Any, **options: Any) -> Service:
        services.append(Service(*arguments, **options))
        return services[-1]
    yield start_service
    for service in services:
        service.discard()


@pytest.fixture
def service(start: StartService, authz: FakeAuthz, bus: Bus) -> Iterator[Service]:
    """The service in the foreground, with the fake authorization; it must survive the test."""
    running = start(environment=authz.environment())
    running.wait_registered(bus)
    yield running
    assert running.is_running(), f"the service ended: {running.status}, {running.output()}"
    assert running.stop() == 0


@pytest.fixture
def real_service(start: StartService, bus: Bus) -> Iterator[Service]:
    """The service in the foreground, with our own authorization; it must survive the test."""
    running = start()
    running.wait_registered(bus)
    yield running
    assert running.is_running(), f"the service ended: {running.status}, {running.output()}"
    assert running.stop() == 0


@pytest.fixture(scope="session")
def privane_gid(account_files: AccountFiles) -> int:
    return grp.getgrnam("privane").gr_gid


def make_user(uid: int, *groups: int) -> Iterator[User]:
    user = User(uid, uid, groups)
    yield user
    user.close()


@pytest.fixture(scope="session")
def clerk(privane_gid: int) -> Iterator[User]:
    """A user whom the bus lets call, and who has no role."""
    yield from make_user(CLERK_UID, privane_gid)


@pytest.fixture(scope="session")
def stranger(account_files: AccountFiles) -> Iterator[User]:
    """A user outside the group privane."""
    yield from make_user(STRANGER_UID)


@pytest.fixture(scope="session")
def viewer(privane_gid: int) -> Iterator[User]:
    """A user with the role of a viewer, where the example rules are installed."""
    yield from make_user(VIEWER_UID, privane_gid, VIEWER_ROLE_GID)


@pytest.fixture(scope="session")
def operator(privane_gid: int) -> Iterator[User]:
    """A user with the role of an operator, where the example rules are installed."""
    yield from make_user(OPERATOR_UID, privane_gid, OPERATOR_ROLE_GID)


@pytest.fixture
def rules(bus: Bus, viewer: User, operator: User) -> Iterator[Roles]:
    """The packaged example roles, in effect."""
    packaged: Roles = (ExampleRules(bus, {"viewer": viewer, "operator": operator})
                       if authorization() == POLKIT else ExamplePolicy())
    packaged.install()
    yield packaged
    packaged.remove()


@pytest.fixture
def cfgstore() -> Iterator[Neighbour]:
    neighbour = Neighbour("cfgstore")
    yield neighbour
    neighbour.close()
