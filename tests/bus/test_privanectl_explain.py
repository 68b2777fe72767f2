"""tests/bus/test_privanectl_explain.py: what the client tells of actions, with the real polkit."""
from pathlib import Path
from typing import Any, Iterator

import pytest

from harness.accounts import CLERK_UID, STRANGER_UID, VIEWER_UID, VIEWER_ROLE_GID
from harness.bus import Bus, User
from harness.interface import ACTION_PREFIX, METHODS
from harness.policy_file import POLICY, role
from harness.polkit import ExampleRules, declared, local_rules
from harness.privanectl import (DONE, Run, as_user, failed, on_terminal, privanectl, wrong_usage)
from harness.sandbox import start_bus
from harness.deadline import wait_for
from harness.fake_authz import FakeAuthz
from harness.service import Service

pytestmark = pytest.mark.polkit

REFUSED, ALLOWED = "polkit refuses it", "polkit allows it"
CLOSED = "the bus lets only root and the group privane call the service"


def explain(*words: str, wrapper: list[str] | None = None) -> dict[str, Any]:
    return privanectl("explain", *words, "--json=short", wrapper=wrapper or ()).json


@pytest.fixture
def as_clerk(privane_gid: int) -> list[str]:
    return as_user(CLERK_UID, (privane_gid,))


def test_text_for_one_who_is_refused(real_service: Service, as_clerk: list[str]) -> None:
    assert privanectl("explain", "addsystemuser", wrapper=as_clerk) == Run(DONE, """\
    Method: AddSystemUser
    Action: com.zintor.privane-system.adduser
   Allowed: no (polkit refuses it)
Granted by: this rule in /etc/polkit-1/rules.d, which amounts to making root

polkit.addRule(function (action, subject) {
    if (action.id === "com.zintor.privane-system.adduser" &&
        subject.user === "clerk") {
        return polkit.Result.YES;
    }
    return polkit.Result.NOT_HANDLED;
});
""", "")


def test_text_for_root(real_service: Service) -> None:
    assert privanectl("explain", "RestartService", "sshd.service") == Run(DONE, """\
 Method: RestartService
 Action: com.zintor.privane-system.restartservice.sshd
Allowed: yes (polkit allows it)
""", "")


def test_who_is_allowed_already_is_told_of_no_rule(real_service: Service) -> None:
    told = explain("CheckUser")

    assert (told["allowed"], told["grant"], told["rule"]) == ("yes", None, None)


@pytest.mark.parametrize("method", METHODS, ids=lambda method: method.member)
def test_action_of_every_method(method: Any, real_service: Service, as_clerk: list[str]) -> None:
    depends = "." in method.action
    words = (method.member, *(method.arguments if depends else ()))
    told = explain(*words)

    assert (told["method"], told["action"], told["allowed"], told["reason"]) == (
        method.member, method.action_id, "yes", ALLOWED)
    if not depends or method.member == "GetActiveNetworkInfo":
        told = explain(*words, wrapper=as_clerk)
        assert (told["allowed"], told["reason"]) == ("no", REFUSED)


def test_actions_that_amount_to_root(real_service: Service) -> None:
    assert {method.action for method in METHODS if "." not in method.action
            and explain(method.member)["amounts_to_root"]} == {
        "adduser", "adduiduser", "modifyuser", "chpasswduser", "digest", "addbootblockparam",
        "readlogfile", "pinsrv"}


def test_rule_that_is_shown_grants_what_it_says(real_service: Service, bus: Bus, clerk: User,
                                                as_clerk: list[str]) -> None:
    told = explain("CheckUser", wrapper=as_clerk)
    assert told["allowed"] == "no"
    with local_rules(bus, clerk, told["rule"]):
        assert explain("CheckUser", wrapper=as_clerk)["allowed"] == "yes"
        assert explain("CheckGroup", wrapper=as_clerk)["allowed"] == "no"
        assert clerk.call("CheckUser", "s", "clerk") == (True,)


def test_rule_for_a_unit_grants_it(real_service: Service, bus: Bus, clerk: User,
                                   as_clerk: list[str]) -> None:
    told = explain("StartService", "recorder@one", wrapper=as_clerk)
    assert told["action"] == ACTION_PREFIX + "startservice.recorder.any"
    # polkit answers questions with details to root alone.
    assert told["allowed"] == "unknown"
    assert told["reason"].startswith("polkit does not tell: ")
    with local_rules(bus, clerk, told["rule"]):
        for unit, is_granted in (("recorder@two", True), ("sshd", False)):
            run = privanectl("unit", "start", unit, wrapper=as_clerk)
            assert run.status == 1
            assert run.errors.startswith("privanectl: Authorization check failed") != is_granted


def test_declared_action_of_a_unit(real_service: Service, bus: Bus, as_clerk: list[str]) -> None:
    action = ACTION_PREFIX + "stopservice.sshd"
    policy = f"""<?xml version="1.0" encoding="UTF-8"?>
<!DOCTYPE policyconfig PUBLIC "-//freedesktop//DTD PolicyKit Policy Configuration 1.0//EN"
  "http://www.freedesktop.org/standards/PolicyKit/1/policyconfig.dtd">
<policyconfig><action id="{action}"><description>d</description><message>m</message>
<defaults><allow_any>no</allow_any><allow_inactive>no</allow_inactive>
<allow_active>no</allow_active></defaults></action></policyconfig>
"""
    with declared(bus, policy, {action}):
        told = explain("StopService", "sshd", wrapper=as_clerk)
        assert (told["action"], told["allowed"]) == (action, "no")
        assert f'action.id === "{action}"' in told["rule"] and "lookup" not in told["rule"]


def test_role_of_the_example_rules(real_service: Service, rules: ExampleRules,
                                   privane_gid: int) -> None:
    viewer = as_user(VIEWER_UID, (privane_gid, VIEWER_ROLE_GID))

    assert explain("GetUser", wrapper=viewer)["allowed"] == "yes"
    assert explain("RemoveUser", wrapper=viewer)["allowed"] == "no"


def test_bus_is_the_first_door(real_service: Service) -> None:
    told = explain("GetUser", wrapper=as_user(STRANGER_UID))

    assert (told["allowed"], told["reason"]) == ("no", CLOSED)
    assert told["grant"] == (
        "membership in the group privane, and this rule in /etc/polkit-1/rules.d")
    assert 'subject.user === "stranger"' in told["rule"]
    assert privanectl("user", "list", wrapper=as_user(STRANGER_UID)).errors.endswith(
        "(org.freedesktop.DBus.Error.AccessDenied)\n")


def test_rule_alone_does_not_open_the_bus(real_service: Service, bus: Bus, clerk: User) -> None:
    as_stranger = as_user(STRANGER_UID)
    with local_rules(bus, clerk, explain("GetUser", wrapper=as_stranger)["rule"]):
        told = explain("GetUser", wrapper=as_stranger)
    assert (told["allowed"], told["reason"]) == ("no", CLOSED)
    assert (told["grant"], told["rule"]) == ("membership in the group privane", None)


def test_service_that_does_not_run(bus: Bus, clerk: User) -> None:
    """The bus refuses strangers only what it could pass on; and nobody starts the service by asking."""
    untold = "polkit allows it; whether the bus does is told only while the service runs"
    as_stranger = as_user(STRANGER_UID)
    refused = explain("GetUser", wrapper=as_stranger)
    with local_rules(bus, clerk, refused["rule"]):
        for wrapper in (as_stranger, None):
            told = explain("GetUser", wrapper=wrapper)
            assert (told["allowed"], told["reason"], told["rule"]) == ("unknown", untold, None)
    assert (refused["allowed"], refused["reason"]) == ("no", REFUSED)


def test_library_of_the_devices_maker(real_service: Service, authz: FakeAuthz) -> None:
    def ask() -> tuple[str, ...]:
        told = privanectl("explain", "GetUser", "--json=short",
                          environment=authz.environment()).json
        return told["allowed"], told["reason"], told["grant"], told["rule"]
    unknown = "what the device's own authorization library asks"

    authz.allow()
    assert ask() == ("yes", "the authorization library allows it", None, None)
    authz.refuse("not for you")
    assert ask() == ("no", "the authorization library refuses it: not for you", unknown, None)
    authz.refuse_silently()
    assert ask() == ("no", "the authorization library refuses it: libauthz.so.1 gives no reason",
                     unknown, None)
    assert privanectl("explain", "GetUser", environment=authz.environment()).output.endswith(
        f"Granted by: {unknown}\n")


@pytest.fixture
def policy_left_behind() -> Iterator[None]:
    """As by the removal of libauthz1-policy-file, which keeps its configuration."""
    POLICY.parent.mkdir(exist_ok=True)
    POLICY.write_text(role("root", "users=root", f"actions={ACTION_PREFIX}*"))
    yield
    POLICY.unlink()


def test_policy_file_that_was_left_behind_decides_nothing(
        policy_left_behind: None, real_service: Service, authz: FakeAuthz,
        as_clerk: list[str]) -> None:
    assert explain("GetUser")["reason"] == ALLOWED
    assert explain("GetUser", wrapper=as_clerk)["reason"] == REFUSED

    text = privanectl("explain", "GetUser", environment=authz.environment()).output
    assert text.endswith("Allowed: yes (the authorization library allows it)\n")
    authz.refuse("not for you")
    text = privanectl("explain", "GetUser", environment=authz.environment()).output
    assert "no (the authorization library refuses it: not for you)" in text
    assert str(POLICY) not in text


def test_library_that_is_not_there(real_service: Service, tmp_path: Path) -> None:
    (tmp_path / "libauthz.so.1").write_text("no library")
    told = privanectl("explain", "GetUser", "--json=short",
                      environment={"LD_LIBRARY_PATH": str(tmp_path)}).json

    assert told["allowed"] == "unknown"
    assert told["reason"].startswith(
        f"the authorization library does not tell: {tmp_path}/libauthz.so.1: ")


def test_bus_without_polkit(tmp_path: Any) -> None:
    address = f"unix:path={tmp_path}/bus"
    other = start_bus(address)
    try:
        wait_for("the other bus", (tmp_path / "bus").exists)
        told = explain("GetUser", f"--address={address}")
        assert told["allowed"] == "unknown"
        assert told["reason"].startswith("the authorization library does not tell: "
                                         "org.freedesktop.PolicyKit1 is neither running")
    finally:
        other.terminate()
        other.wait(5)


def test_answer_is_coloured_nowhere(real_service: Service) -> None:
    assert "\x1b" not in on_terminal("explain", "GetUser").output


@pytest.mark.parametrize("words, text", [
    (("Frobnicate",), "no method is named 'Frobnicate'"),
    (("StartService",), "the action of StartService depends on the unit"),
    (("SetDefaultTarget",), "the action of SetDefaultTarget depends on the target"),
    (("GetActiveNetworkInfo",),
     "the action of GetActiveNetworkInfo depends on its mode: all or tcp-udp"),
    (("GetActiveNetworkInfo", "udp"),
     "the action of GetActiveNetworkInfo depends on its mode: all or tcp-udp"),
    (("GetUser", "alice"), "the action of GetUser depends on nothing"),
    (("StartService", "Sshd"), "the service acts on no unit of the name 'Sshd'"),
    (("StartService", ""), "the service acts on no unit of the name ''"),
    (("StopService", ".service"), "the service acts on no unit of the name ''"),
    (("SetDefaultTarget", ""), "the service acts on no unit of the name ''"),
    (("StartService", "a" * 65), f"the service acts on no unit of the name '{'a' * 65}'"),
])
def test_wrong_questions(words: tuple[str, ...], text: str) -> None:
    assert privanectl("explain", *words) == wrong_usage(text)


def test_bus_that_is_not_there() -> None:
    assert privanectl("explain", "GetUser", "--address=unix:path=/missing") == failed(
        "Cannot reach the bus: Could not connect: No such file or directory (g-io-error-quark 1)")
