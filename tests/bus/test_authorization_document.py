"""tests/bus/test_authorization_document.py: what docs/authorization.md tells to write and to run does
what it says."""
import subprocess
from typing import Iterator

import pytest

from document_blocks import block
from harness.accounts import (CLERK_UID, OPERATOR_ROLE_GID, STANDARD_GROUP, STANDARD_PASSWD,
                              STANDARD_SHADOW, AccountFiles, replace)
from harness.bus import Bus, User, error_of
from harness.deadline import wait_for
from harness.fake_systemd import FakeSystemd
from harness.interface import ACTION_PREFIX
from harness.polkit import ANSWER_SECONDS, POLICIES, actions, local_rules
from harness.policy_file import POLICY
from harness.privanectl import surroundings
from harness.service import Service
from harness.service_fixtures import make_user

UNITS_GID = 752


@pytest.fixture
def systemd() -> Iterator[FakeSystemd]:
    stand_in = FakeSystemd()
    yield stand_in
    stand_in.close()


def is_refused(caller: Bus | User, member: str, *arguments: str) -> bool:
    error = error_of(caller.call, member, "s" * len(arguments), *arguments)
    return error.name.endswith("Quark._authz.Code1")


@pytest.mark.polkit
def test_rule_grants_one_unit_to_a_group(accounts: AccountFiles, clerk: User, viewer: User,
                                         bus: Bus, real_service: Service,
                                         systemd: FakeSystemd) -> None:
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW,
                   f"{STANDARD_GROUP}privane-units:x:{UNITS_GID}:clerk\n")

    with local_rules(bus, clerk, block("docs/authorization.md", "polkit.addRule(")):
        assert clerk.call("RestartService", "s", "sshd") == ()
        assert is_refused(clerk, "RestartService", "ssh")
        assert is_refused(clerk, "StopService", "sshd")
        assert is_refused(viewer, "RestartService", "sshd")


@pytest.mark.polkit
def test_actions_of_single_units_are_declared(bus: Bus) -> None:
    services = ("sshd", "recorder.any")
    wanted = {f"{ACTION_PREFIX}{verb}service.{unit}" for unit in services
              for verb in ("start", "stop", "restart", "reload")}
    wanted.add(f"{ACTION_PREFIX}setdefaulttarget.rescue")
    made = POLICIES / "com.example.camera.units.policy"
    known = set(actions(bus))
    try:
        commands = block("docs/authorization.md", "privane-unit-actions ")
        subprocess.run(["bash", "-euc", commands], check=True, env=surroundings())
        wait_for("polkitd's new actions", lambda: wanted <= set(actions(bus)), ANSWER_SECONDS)
        assert set(actions(bus)) - known == wanted
    finally:
        made.unlink(missing_ok=True)
        wait_for("polkitd's old actions", lambda: set(actions(bus)) == known, ANSWER_SECONDS)


@pytest.mark.policy_file
def test_policy_file_gives_its_roles(real_service: Service, bus: Bus, privane_gid: int,
                                     systemd: FakeSystemd) -> None:
    packaged = POLICY.read_text()
    operators = make_user(CLERK_UID, privane_gid, OPERATOR_ROLE_GID)
    operator = next(operators)
    try:
        replace(POLICY, block("docs/authorization.md", "[role root]"), 0o644, 0)
        assert operator.call("RestartService", "s", "sshd") == ()
        assert is_refused(operator, "RestartService", "ssh")
        assert is_refused(operator, "GetUserList")
        assert bus.call("CheckUser", "s", "root") == (True,)
    finally:
        replace(POLICY, packaged, 0o644, 0)
        next(operators, None)
