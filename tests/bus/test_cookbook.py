"""tests/bus/test_cookbook.py: each role of the cookbook, given as it tells, lets its member do what the
table says and nothing else, whichever of our libauthz decides."""
import grp
import re
import subprocess
from pathlib import Path
from typing import Iterator

import pytest

from harness.accounts import (CLERK_UID, STANDARD_GROUP, STANDARD_PASSWD, STANDARD_SHADOW,
                              VIEWER_UID, AccountFiles)
from harness.bus import Bus, BusError, User, domain_error
from harness.fake_authz import FakeAuthz
from harness.fake_systemd import FakeSystemd
from harness.interface import ACTION_PREFIX, METHODS, Method
from harness.policy_file import ExamplePolicy
from harness.polkit import ExampleRules
from harness.roles import Roles
from harness.sandbox import POLKIT, authorization
from harness.service import Service
from harness.service_fixtures import StartService, make_user

COOKBOOK = Path(__file__).parents[2] / "docs" / "cookbook.md"
ROLES_FILE = Path("/usr/share/doc/privane-system/examples/privane-roles.conf")
GSHADOW = Path("/etc/gshadow")

ROLES = {role: {f"{ACTION_PREFIX}{name}" for name in re.findall(r"`([\w.-]+)`", actions)}
         for role, actions in re.findall(
             r"^\| \[(\w+)\]\([^|]* \| `[\w-]+` \| [^|]+ \| ([^|]+) \|$", COOKBOOK.read_text(),
             re.MULTILINE)}

every_role = pytest.mark.parametrize("role", ROLES)

# As METHODS, with what is asked for another mode.
QUESTIONS = (*METHODS, Method("GetActiveNetworkInfo", ("s",), ("s",), "getactivenetworkinfo.tcp-udp",
                              ("tcp-udp",)))


@pytest.fixture(autouse=True)
def no_gshadow() -> None:
    """As on a device; systemd-sysusers fails where a group is in this file alone."""
    GSHADOW.unlink(missing_ok=True)


@pytest.fixture
def systemd() -> Iterator[FakeSystemd]:
    stand_in = FakeSystemd()
    yield stand_in
    stand_in.close()


def spelled(pattern: str) -> str:
    """What the guide has between backquotes."""
    found = re.findall(f"`({pattern})`", COOKBOOK.read_text())
    assert len(found) == 1, (pattern, found)
    return found[0]


def write_lines(role: str, root: Path = Path("/")) -> Path:
    """Into its /etc/sysusers.d, by the guide's words for www-data and the role web."""
    example = ROLES_FILE.read_text()
    assert f"g privane-{role} -\n" in example
    lines = (spelled("g privane-web \\d+"), spelled("m www-data privane"),
             spelled("m www-data privane-web"))
    own = root / "etc/sysusers.d/roles.conf"
    own.parent.mkdir(exist_ok=True)
    own.write_text("".join(
        line.replace("-web", f"-{role}").replace("www-data", "clerk") + "\n" for line in lines))
    return own


def run(command: str) -> None:
    done = subprocess.run(command.split(), capture_output=True, text=True, check=False)
    assert done.returncode == 0, done.stderr


def gid_of(group: str) -> int:
    return grp.getgrnam(group).gr_gid


@pytest.fixture
def member(role: str, accounts: AccountFiles, privane_gid: int) -> Iterator[User]:
    """The clerk, who has got the role's group while no service ran."""
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW, STANDARD_GROUP.replace(f"privane-{role}:",
                                                                            f"old-{role}:"))
    own = write_lines(role)
    run(spelled("systemd-sysusers"))
    own.unlink()
    assert grp.getgrnam(f"privane-{role}").gr_mem == grp.getgrnam("privane").gr_mem == ["clerk"]
    assert gid_of(f"privane-{role}") < 500
    yield from make_user(CLERK_UID, privane_gid, gid_of(f"privane-{role}"))


@pytest.fixture
def outsider(member: User, privane_gid: int) -> Iterator[User]:
    """One whose process came without any role's group."""
    yield from make_user(VIEWER_UID, privane_gid)


@pytest.fixture
def grant(role: str, bus: Bus, member: User) -> Iterator[Roles]:
    packaged: Roles = (ExampleRules(bus, {role: member}) if authorization() == POLKIT
                       else ExamplePolicy())
    packaged.install()
    yield packaged
    packaged.remove()


def refusal(method: Method, uid: int) -> BusError:
    return domain_error("authz", 1, f"Authorization check failed: action {method.action_id} "
                                    f"is refused to uid {uid}")


def outcome(caller: User, method: Method) -> BusError | None:
    """The refusal; None where the call got past the authorization, whatever became of it."""
    try:
        caller.call(method.member, method.signature, *method.arguments)
    except BusError as error:
        return error if error.text.startswith("Authorization check failed: ") else None
    return None


def test_the_table_is_read() -> None:
    assert {"web", "time", "updater", "monitor"} <= set(ROLES)
    known = {method.action_id for method in QUESTIONS}
    assert [role for role, actions in ROLES.items() if not actions or not actions <= known] == []


@every_role
def test_member_may_do_what_the_table_says(role: str, member: User, outsider: User, grant: Roles,
                                           real_service: Service, systemd: FakeSystemd) -> None:
    granted = {method.action_id for method in QUESTIONS if outcome(member, method) is None}
    assert granted == ROLES[role]

    for method in QUESTIONS:
        if method.action_id not in granted:
            assert outcome(member, method) == refusal(method, CLERK_UID)
        assert outcome(outsider, method) == refusal(method, VIEWER_UID)
    assert systemd.calls() == [] or role == "operator"


@every_role
def test_grant_goes_with_the_role(role: str, member: User, grant: Roles,
                                  real_service: Service) -> None:
    grant.remove()

    assert [method.member for method in QUESTIONS if outcome(member, method) is None] == []


@pytest.mark.parametrize("role", ["web"])
def test_group_that_a_unit_adds(role: str, grant: Roles, accounts: AccountFiles, privane_gid: int,
                                real_service: Service) -> None:
    """As by SupplementaryGroups=, without a line in /etc/group."""
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW, f"{STANDARD_GROUP}privane-web:x:481:\n")
    users = make_user(CLERK_UID, privane_gid, 481)
    added = next(users)

    (question,) = (method for method in METHODS if method.member == "CheckUser")
    expected = refusal(question, CLERK_UID) if authorization() == POLKIT else None
    assert outcome(added, question) == expected
    next(users, None)


def test_group_on_a_device_that_runs(accounts: AccountFiles, start: StartService, authz: FakeAuthz,
                                     bus: Bus, clerk: User) -> None:
    """systemctl stands for itself: what it stops and starts is the service of the sandbox."""
    commands = ("systemctl stop privane-system.service", "systemd-sysusers", "rm -f /etc/gshadow",
                "systemctl start privane-system.service")
    places = [COOKBOOK.read_text().index(f"`{command}`") for command in commands]
    assert places == sorted(places)
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW, STANDARD_GROUP)
    own = write_lines("web")

    running = start(environment=authz.environment())
    running.wait_registered(bus)
    assert running.stop() == 0
    run(commands[1])
    assert GSHADOW.exists()
    run(commands[2])
    running = start(environment=authz.environment())
    running.wait_registered(bus)
    clerk.call("AddGroup", "s", "guests")
    own.unlink()
    assert grp.getgrnam("guests")
    assert grp.getgrnam("privane-web").gr_mem == ["clerk"]
    assert not GSHADOW.exists()


def test_group_behind_a_service_that_runs(accounts: AccountFiles, service: Service, clerk: User) -> None:
    own = write_lines("web")
    run("systemd-sysusers")
    own.unlink()
    GSHADOW.unlink()
    assert grp.getgrnam("privane-web").gr_mem == ["clerk"]
    clerk.call("AddGroup", "s", "guests")
    assert [group.gr_name for group in grp.getgrall() if group.gr_name == "privane-web"] == []


def test_group_in_an_image(tmp_path: Path) -> None:
    etc = tmp_path / "etc"
    etc.mkdir()
    for name, text in (("passwd", STANDARD_PASSWD), ("shadow", STANDARD_SHADOW),
                       ("group", STANDARD_GROUP + "privane:x:480:\n")):
        (etc / name).write_text(text)
    write_lines("web", tmp_path)
    run(spelled("systemd-sysusers --root=FOLDER").replace("FOLDER", str(tmp_path)))
    assert (etc / "gshadow").exists()
    group = (etc / "group").read_text().splitlines()
    assert {"privane:x:480:clerk", "privane-web:x:481:clerk"} <= set(group)
