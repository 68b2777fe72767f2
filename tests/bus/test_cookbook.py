"""tests/bus/test_cookbook.py: each role of the cookbook, given as it tells, lets its member do what the
table says and nothing else, whichever of our libauthz decides."""
import re
from pathlib import Path
from typing import Iterator

import pytest

from harness.accounts import (CLERK_UID, STANDARD_GROUP, STANDARD_PASSWD, STANDARD_SHADOW,
                              VIEWER_UID, AccountFiles)
from harness.bus import Bus, BusError, User, domain_error
from harness.fake_systemd import FakeSystemd
from harness.interface import ACTION_PREFIX, METHODS, Method
from harness.policy_file import ExamplePolicy
from harness.polkit import ExampleRules
from harness.roles import Roles
from harness.sandbox import POLKIT, authorization
from harness.service import Service
from harness.service_fixtures import make_user

COOKBOOK = Path(__file__).parents[2] / "docs" / "cookbook.md"
GID = 760

ROLES = {role: {f"{ACTION_PREFIX}{name}" for name in re.findall(r"`([\w.-]+)`", actions)}
         for role, actions in re.findall(
             r"^\| \[(\w+)\]\([^|]* \| `[\w-]+` \| [^|]+ \| ([^|]+) \|$", COOKBOOK.read_text(),
             re.MULTILINE)}

every_role = pytest.mark.parametrize("role", ROLES)

# As METHODS, with what is asked for another mode.
QUESTIONS = (*METHODS, Method("GetActiveNetworkInfo", ("s",), ("s",), "getactivenetworkinfo.tcp-udp",
                              ("tcp-udp",)))


@pytest.fixture
def systemd() -> Iterator[FakeSystemd]:
    stand_in = FakeSystemd()
    yield stand_in
    stand_in.close()


@pytest.fixture
def member(role: str, accounts: AccountFiles, privane_gid: int) -> Iterator[User]:
    """The clerk, who has got the role's group."""
    group = STANDARD_GROUP.replace(f"privane-{role}:", f"old-{role}:")
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW, f"{group}privane-{role}:x:{GID}:clerk\n")
    yield from make_user(CLERK_UID, privane_gid, GID)


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
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW, f"{STANDARD_GROUP}privane-web:x:{GID}:\n")
    users = make_user(CLERK_UID, privane_gid, GID)
    added = next(users)

    (question,) = (method for method in METHODS if method.member == "CheckUser")
    expected = refusal(question, CLERK_UID) if authorization() == POLKIT else None
    assert outcome(added, question) == expected
    next(users, None)
