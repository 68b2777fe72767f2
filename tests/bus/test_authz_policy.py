"""tests/bus/test_authz_policy.py: a policy file decides, through the service."""
import grp
import os
from typing import Iterator

import pytest

from harness.accounts import (CLERK_UID, STANDARD_GROUP, STANDARD_PASSWD, STANDARD_SHADOW,
                              VIEWER_ROLE_GID, AccountFiles, replace)
from harness.bus import Bus, BusError, User, domain_error, error_of
from harness.deadline import wait_for
from harness.fake_systemd import FakeSystemd
from harness.interface import ACTION_PREFIX
from harness.monitor import Monitor
from harness.policy_file import POLICY, ExamplePolicy, policy, role
from harness.service import Service
from harness.service_fixtures import StartService, make_user

pytestmark = pytest.mark.policy_file

REFUSED, FAILED = 1, 2

CHECK_USER = ACTION_PREFIX + "checkuser"
UNIT_MEMBERS = {"StartService": "startservice", "StopService": "stopservice",
                "RestartService": "restartservice", "ReloadService": "reloadservice",
                "SetDefaultTarget": "setdefaulttarget"}


def refusal(action: str, uid: int = CLERK_UID) -> BusError:
    return domain_error("authz", REFUSED, f"Authorization check failed: action {ACTION_PREFIX}"
                                          f"{action} is refused to uid {uid}")


def broken(why: str) -> BusError:
    return domain_error("authz", FAILED, "Authorization check failed: cannot check action "
                                         f"{CHECK_USER}: {POLICY}{why}")


def broken_folder(why: str) -> BusError:
    return domain_error("authz", FAILED, "Authorization check failed: cannot check action "
                                         f"{CHECK_USER}: {POLICY.parent}: {why}")


def check_user(caller: Bus | User) -> BusError | bool:
    """The error, or what the service answered."""
    try:
        (found,) = caller.call("CheckUser", "s", "root")
    except BusError as error:
        return error
    return bool(found)


@pytest.fixture(autouse=True)
def packaged_file() -> Iterator[str]:
    """The text of the file, which is there again after the test, as is its folder's owner."""
    packaged = POLICY.read_text()
    yield packaged
    os.chown(POLICY.parent, 0, 0)
    POLICY.parent.chmod(0o755)
    replace(POLICY, packaged, 0o644, 0)


@pytest.fixture
def systemd() -> Iterator[FakeSystemd]:
    stand_in = FakeSystemd()
    yield stand_in
    stand_in.close()


def test_packaged_file_allows_root_alone(real_service: Service, bus: Bus, clerk: User,
                                         viewer: User) -> None:
    assert check_user(bus) is True
    assert check_user(clerk) == refusal("checkuser")
    assert check_user(viewer) == refusal("checkuser", viewer.uid)


def test_service_asks_no_polkit(real_service: Service, bus: Bus, clerk: User) -> None:
    monitor = Monitor("type='method_call'", "type='method_return'")

    assert check_user(clerk) == refusal("checkuser")
    assert bus.call("CheckUser", "s", "marker") == (False,)

    seen = monitor.until(lambda message: message.get_body() is not None
                         and message.get_body().unpack() == (False,))
    monitor.close()
    members = {message.get_member() for message in seen}
    assert "GetConnectionCredentials" in members and "CheckAuthorization" not in members


def test_user_of_a_role_is_allowed_its_actions(real_service: Service, clerk: User,
                                               viewer: User) -> None:
    with policy(role("clerks", "users=clerk", f"actions={CHECK_USER}")):
        assert check_user(clerk) is True
        assert error_of(clerk.call, "CheckGroup", "s", "root") == refusal("checkgroup")
        assert check_user(viewer) == refusal("checkuser", viewer.uid)


def test_member_of_a_group_is_allowed_its_actions(real_service: Service, clerk: User,
                                                  viewer: User) -> None:
    with policy(role("viewers", "groups=privane-viewer", f"actions={CHECK_USER}")):
        assert check_user(viewer) is True
        assert check_user(clerk) == refusal("checkuser")


def test_groups_are_those_with_which_the_caller_connected(
        accounts: AccountFiles, real_service: Service, clerk: User, privane_gid: int) -> None:
    """Not those of the group file: there the caller may be listed, or not."""
    members = make_user(CLERK_UID, privane_gid, VIEWER_ROLE_GID)
    member = next(members)
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW,
                   STANDARD_GROUP.replace(":viewer\n", ":clerk\n"))
    assert "clerk" in grp.getgrnam("privane-viewer").gr_mem

    with policy(role("viewers", "groups=privane-viewer", f"actions={CHECK_USER}")):
        assert check_user(clerk) == refusal("checkuser")
        assert check_user(member) is True
    members.close()


def test_group_of_another_number_counts_at_once(accounts: AccountFiles, real_service: Service,
                                                viewer: User) -> None:
    with policy(role("viewers", "groups=privane-viewer", f"actions={CHECK_USER}")):
        assert check_user(viewer) is True
        accounts.write(STANDARD_PASSWD, STANDARD_SHADOW,
                       STANDARD_GROUP.replace(f":{VIEWER_ROLE_GID}:", ":799:"))
        assert check_user(viewer) == refusal("checkuser", viewer.uid)


def test_role_of_a_user_that_does_not_exist_yet(accounts: AccountFiles, real_service: Service,
                                                clerk: User) -> None:
    with policy(role("later", "users=later", f"actions={CHECK_USER}")):
        assert check_user(clerk) == refusal("checkuser")
        accounts.write(STANDARD_PASSWD.replace("clerk:", "later:", 1), STANDARD_SHADOW,
                       STANDARD_GROUP)
        assert check_user(clerk) is True


@pytest.mark.parametrize("member", UNIT_MEMBERS)
def test_unit_is_granted_by_its_own_action(member: str, real_service: Service, clerk: User,
                                           systemd: FakeSystemd) -> None:
    action = UNIT_MEMBERS[member]
    with policy(role("units", "users=clerk", f"actions={ACTION_PREFIX}{action}.sshd")):
        assert clerk.call(member, "s", "sshd") == ()
        for unit, last in (("ssh", "ssh"), ("sshd2", "sshd2"), ("sshd@a", "sshd.any")):
            assert error_of(clerk.call, member, "s", unit) == refusal(f"{action}.{last}")
        for other, its_action in UNIT_MEMBERS.items():
            if other != member:
                assert error_of(clerk.call, other, "s", "sshd") == refusal(f"{its_action}.sshd")
    assert error_of(clerk.call, member, "s", "sshd") == refusal(f"{action}.sshd")


def test_template_and_all_units_can_be_granted(real_service: Service, clerk: User,
                                               systemd: FakeSystemd) -> None:
    granted = f"actions={ACTION_PREFIX}startservice.getty.any;{ACTION_PREFIX}stopservice.*"
    with policy(role("units", "users=clerk", granted)):
        for unit in ("getty@tty1", "getty@"):
            assert clerk.call("StartService", "s", unit) == ()
        assert error_of(clerk.call, "StartService", "s", "getty") == refusal("startservice.getty")
        for unit in ("getty@tty1", "sshd", "any"):
            assert clerk.call("StopService", "s", unit) == ()
        assert error_of(clerk.call, "RestartService", "s", "sshd") == refusal(
            "restartservice.sshd")


def test_example_grants_single_units(accounts: AccountFiles, real_service: Service,
                                     privane_gid: int, systemd: FakeSystemd) -> None:
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW, f"{STANDARD_GROUP}privane-units:x:752:\n")
    members = make_user(CLERK_UID, privane_gid, 752)
    member = next(members)
    granted = {("RestartService", "sshd"), ("ReloadService", "sshd"),
               ("StartService", "recorder@1"), ("StopService", "recorder@1")}
    ExamplePolicy().install()

    for method, action in UNIT_MEMBERS.items():
        for unit in ("sshd", "recorder@1", "recorder", "sshd@1"):
            if (method, unit) in granted:
                assert member.call(method, "s", unit) == ()
            else:
                name, at, _ = unit.partition("@")
                assert error_of(member.call, method, "s", unit) == refusal(
                    f"{action}.{name}{'.any' if at else ''}")
    members.close()


def test_replaced_file_counts_from_the_next_call_on(real_service: Service, clerk: User) -> None:
    granting = role("clerks", "users=clerk", f"actions={CHECK_USER}")
    withholding = role("clerks", "users=clerk", f"actions={CHECK_USER[:-1]}s")
    for _ in range(20):
        with policy(granting):
            assert check_user(clerk) is True
        with policy(withholding):
            assert check_user(clerk) == refusal("checkuser")


def test_broken_file_refuses_everybody_until_it_is_mended(real_service: Service, bus: Bus,
                                                          clerk: User) -> None:
    lines = len(POLICY.read_text().splitlines())
    before = real_service.output()
    expected = broken(f":{lines + 2}: unknown key 'user'")

    with policy("[role clerks]\nuser=clerk\n"):
        assert check_user(bus) == expected
        assert check_user(clerk) == expected
    assert real_service.output() == before + [f"warning: {expected.text}"] * 2
    assert check_user(bus) is True


@pytest.mark.parametrize("mode", [0o664, 0o646])
def test_file_that_others_may_write_refuses_everybody(mode: int, real_service: Service,
                                                      bus: Bus) -> None:
    assert check_user(bus) is True
    POLICY.chmod(mode)
    assert check_user(bus) == broken(": others than root may write it")
    POLICY.chmod(0o644)
    assert check_user(bus) is True


@pytest.mark.parametrize("mode", [0o775, 0o757, 0o1777])
def test_folder_that_others_may_write_refuses_everybody(mode: int, real_service: Service,
                                                        bus: Bus, clerk: User) -> None:
    folder = POLICY.parent
    before = real_service.output()
    expected = broken_folder("others than root may write it")
    assert check_user(bus) is True

    folder.chmod(mode)
    assert check_user(bus) == expected
    assert check_user(clerk) == expected
    folder.chmod(0o755)
    assert check_user(bus) is True
    assert real_service.output() == before + [f"warning: {expected.text}"] * 2


def test_folder_of_somebody_else_refuses_everybody(real_service: Service, bus: Bus) -> None:
    os.chown(POLICY.parent, CLERK_UID, 0)
    assert check_user(bus) == broken_folder("does not belong to root")
    os.chown(POLICY.parent, 0, 0)
    assert check_user(bus) is True


@pytest.mark.parametrize("text", ["", "# [role root]\n"])
def test_file_without_a_role_refuses_everybody(text: str, real_service: Service, bus: Bus) -> None:
    replace(POLICY, text, 0o644, 0)
    assert check_user(bus) == broken(":1: no role in the file")


def test_file_of_somebody_else_refuses_everybody(real_service: Service, bus: Bus) -> None:
    os.chown(POLICY, CLERK_UID, 0)
    assert check_user(bus) == broken(": does not belong to root")
    os.chown(POLICY, 0, 0)
    assert check_user(bus) is True


def test_service_starts_without_its_file(start: StartService, bus: Bus,
                                         packaged_file: str) -> None:
    POLICY.unlink()
    service = start()
    service.wait_registered(bus)

    assert check_user(bus) == broken(": No such file or directory")
    replace(POLICY, packaged_file, 0o644, 0)
    assert check_user(bus) is True
    assert service.stop() == 0


def test_caller_is_asked_about_once(real_service: Service, bus: Bus, clerk: User) -> None:
    monitor = Monitor("type='method_call',member='GetConnectionCredentials'",
                      "type='method_return'")
    owner = bus.owner()
    fresh = Bus()

    for _ in range(20):
        assert check_user(fresh) is True
    assert fresh.call("CheckUser", "s", "marker") == (False,)

    seen = monitor.until(lambda message: message.get_body() is not None
                         and message.get_body().unpack() == (False,))
    monitor.close()
    asked = [message.get_body().unpack() for message in seen
             if message.get_member() == "GetConnectionCredentials"
             and message.get_sender() == owner]
    assert asked == [(fresh.unique_name,)]
    fresh.close()


def test_callers_who_are_gone_leave_no_match_rule(real_service: Service) -> None:
    """The bus lets a connection have 512, and each caller who is remembered takes one."""
    watcher = Bus()
    at_rest = watcher.match_rules()
    callers = [Bus() for _ in range(120)]
    assert [check_user(caller) for caller in callers] == [True] * len(callers)
    assert watcher.match_rules() == at_rest + len(callers)
    for caller in callers:
        caller.close()
    wait_for("the end of the rules", lambda: watcher.match_rules() == at_rest)
    assert check_user(watcher) is True
    watcher.close()
