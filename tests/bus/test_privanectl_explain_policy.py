"""tests/bus/test_privanectl_explain_policy.py: what the client tells of actions where a policy file
decides."""
import os
from typing import Any, Iterator

import pytest

from harness.accounts import CLERK_UID, STRANGER_UID, replace
from harness.bus import User
from harness.fake_authz import FakeAuthz
from harness.interface import ACTION_PREFIX
from harness.policy_file import POLICY, policy, role
from harness.privanectl import DONE, Run, as_user, privanectl
from harness.service import Service

pytestmark = pytest.mark.policy_file

ALLOWED, REFUSED = f"{POLICY} allows it", f"{POLICY} refuses it"
ROLE = f"this role in {POLICY}"


def explain(*words: str, wrapper: list[str] | None = None) -> dict[str, Any]:
    return privanectl("explain", *words, "--json=short", wrapper=wrapper or ()).json


@pytest.fixture(autouse=True)
def packaged_file() -> Iterator[str]:
    """The text of the file, which is there again after the test."""
    packaged = POLICY.read_text()
    yield packaged
    replace(POLICY, packaged, 0o644, 0)


@pytest.fixture
def as_clerk(privane_gid: int) -> list[str]:
    return as_user(CLERK_UID, (privane_gid,))


def test_text_for_one_who_is_refused(real_service: Service, as_clerk: list[str]) -> None:
    assert privanectl("explain", "addsystemuser", wrapper=as_clerk) == Run(DONE, f"""\
    Method: AddSystemUser
    Action: com.zintor.privane-system.adduser
   Allowed: no ({REFUSED})
Granted by: {ROLE}, which amounts to making root

[role adduser-clerk]
users=clerk
actions=com.zintor.privane-system.adduser
""", "")


def test_root_is_allowed_by_the_packaged_file(real_service: Service) -> None:
    told = explain("RestartService", "sshd")

    assert (told["allowed"], told["reason"], told["rule"]) == ("yes", ALLOWED, None)


def test_root_is_refused_where_no_role_is_its(real_service: Service) -> None:
    replace(POLICY, role("looking", "users=clerk", f"actions={ACTION_PREFIX}checkuser"), 0o644, 0)
    told = explain("Reboot")

    assert (told["allowed"], told["reason"]) == ("no", REFUSED)


def test_what_is_wrong_with_the_file_is_told(real_service: Service) -> None:
    replace(POLICY, "", 0o644, 0)
    told = explain("Reboot")

    assert (told["allowed"], told["reason"]) == (
        "no", f"{REFUSED}: cannot check action {ACTION_PREFIX}reboot: {POLICY}:1: no role in the file")


@pytest.mark.parametrize("words", [("CheckUser",), ("GetActiveNetworkInfo", "tcp-udp"),
                                   ("StartService", "getty@tty1")], ids=lambda words: words[0])
def test_role_that_is_shown_grants_what_it_says(words: tuple[str, ...], real_service: Service,
                                                as_clerk: list[str]) -> None:
    told = explain(*words, wrapper=as_clerk)
    assert (told["allowed"], told["reason"]) == ("no", REFUSED)
    with policy(told["rule"]):
        assert explain(*words, wrapper=as_clerk)["allowed"] == "yes"
        assert explain("CheckGroup", wrapper=as_clerk)["allowed"] == "no"
        assert explain("StartService", "sshd", wrapper=as_clerk)["allowed"] == "no"


def test_role_is_the_service_s_too(real_service: Service, clerk: User, as_clerk: list[str]) -> None:
    with policy(explain("CheckUser", wrapper=as_clerk)["rule"]):
        assert clerk.call("CheckUser", "s", "clerk") == (True,)


def test_broken_file_is_told(real_service: Service, as_clerk: list[str]) -> None:
    replace(POLICY, "[role\n", 0o644, 0)
    why = f"cannot check action {ACTION_PREFIX}checkuser: {POLICY}:1: "
    told = explain("CheckUser")
    assert told["allowed"] == "no"
    assert told["reason"].startswith(f"{REFUSED}: {why}")

    # Another may not see what the service sees.
    told = explain("CheckUser", wrapper=as_clerk)
    assert told["allowed"] == "unknown"
    assert told["reason"].startswith(f"{POLICY} does not tell: {why}")


def test_file_that_is_missing_decides_all_the_same(real_service: Service) -> None:
    POLICY.unlink()
    told = explain("CheckUser")

    assert (told["allowed"], told["grant"]) == ("no", ROLE)
    assert told["reason"].startswith(f"{REFUSED}: cannot check action {ACTION_PREFIX}checkuser: ")


def test_library_of_the_devices_maker(real_service: Service, authz: FakeAuthz) -> None:
    """The policy file is there, and it is not asked."""
    def ask() -> tuple[str, str]:
        told = privanectl("explain", "GetUser", "--json=short",
                          environment=authz.environment()).json
        return told["reason"], told["grant"]

    authz.allow()
    assert ask() == ("the authorization library allows it", None)
    authz.refuse("not for you")
    assert ask() == ("the authorization library refuses it: not for you",
                     "what the device's own authorization library asks")


def test_file_that_only_root_reads(real_service: Service, as_clerk: list[str]) -> None:
    os.chmod(POLICY, 0o600)
    told = explain("CheckUser", wrapper=as_clerk)
    assert told["allowed"] == "unknown"
    assert told["reason"].endswith("Permission denied")


def test_bus_is_the_first_door(real_service: Service) -> None:
    told = explain("GetUser", wrapper=as_user(STRANGER_UID))

    assert told["allowed"] == "no"
    assert told["reason"] == "the bus lets only root and the group privane call the service"
    assert told["grant"] == f"membership in the group privane, and {ROLE}"
