"""tests/bus/test_polkit_units.py: who may act on which unit: root, nobody, and whom
the real polkitd allows it."""
import os
import signal
import subprocess
from typing import Any, Iterator

import pytest
from gi.repository import GLib

from harness.accounts import (CLERK_UID, STANDARD_GROUP, STANDARD_PASSWD, STANDARD_SHADOW,
                              AccountFiles)
from harness.bus import Bus, BusError, User, domain_error, error_of
from harness.deadline import wait_for
from harness.interface import ACTION_PREFIX
from harness.polkit import (ANSWER_SECONDS, AUTHORITY, EXAMPLES, actions, check, declared,
                            local_rules)
from harness.sandbox import PYTHON, STATE, SYSTEM_BUS, polkitd_pid
from harness.service import Service

AUTHZ_REFUSED, AUTHZ_UNREACHABLE = 1, 3

GENERATOR = "/usr/bin/privane-unit-actions"
UNITS_ROLE_GID = 752

SYSTEMD = ("org.freedesktop.systemd1", "/org/freedesktop/systemd1",
           "org.freedesktop.systemd1.Manager")
MOCK = "org.freedesktop.DBus.Mock"
MANAGER_METHODS = {"StartUnit": "ss", "StopUnit": "ss", "RestartUnit": "ss", "ReloadUnit": "ss",
                   "SetDefaultTarget": "sb"}

# Of each method the error code for a bad name, its action, and what it asks of systemd.
UNIT_METHODS = {
    "StartService": (29, "startservice", "StartUnit", ".service", "replace"),
    "StopService": (30, "stopservice", "StopUnit", ".service", "replace"),
    "RestartService": (31, "restartservice", "RestartUnit", ".service", "replace"),
    "ReloadService": (32, "reloadservice", "ReloadUnit", ".service", "replace"),
    "SetDefaultTarget": (33, "setdefaulttarget", "SetDefaultTarget", ".target", True),
}
every_unit_method = pytest.mark.parametrize("method", UNIT_METHODS)


class Systemd:
    """A stand-in of the manager, which does nothing and remembers what it was asked."""

    def __init__(self, bus: Bus) -> None:
        self._bus = bus
        self._process = subprocess.Popen(
            [PYTHON, "-m", "dbusmock", "--system", *SYSTEMD], stdout=subprocess.DEVNULL,
            env={**os.environ, "DBUS_SYSTEM_BUS_ADDRESS": SYSTEM_BUS})
        wait_for("the stand-in of systemd", lambda: bus.owner(SYSTEMD[0]), ANSWER_SECONDS)
        for name, signature in MANAGER_METHODS.items():
            self._ask("AddMethod", "sssss", SYSTEMD[2], name, signature, "", "")

    def _ask(self, member: str, signature: str = "", *arguments: Any) -> Any:
        return self._bus.send(SYSTEMD[0], SYSTEMD[1], MOCK, member,
                              GLib.Variant(f"({signature})", arguments))

    def take_calls(self) -> list[tuple[Any, ...]]:
        """What it was asked since it was asked for that."""
        (calls,) = self._ask("GetCalls")
        self._ask("ClearCalls")
        return [(name, *arguments) for _, name, arguments in calls]

    def close(self) -> None:
        self._process.kill()
        self._process.wait(5)


@pytest.fixture
def systemd(bus: Bus) -> Iterator[Systemd]:
    stand_in = Systemd(bus)
    yield stand_in
    stand_in.close()


def expected_call(method: str, unit: str) -> tuple[Any, ...]:
    _, _, member, suffix, last = UNIT_METHODS[method]
    return (member, unit + suffix, last)


def own_action(method: str, unit: str) -> str:
    """The exact action for a unit."""
    template, at, _ = unit.partition("@")
    return f"{ACTION_PREFIX}{UNIT_METHODS[method][1]}.{template}{'.any' if at else ''}"


def refusal(method: str, unit: str, uid: int = CLERK_UID) -> BusError:
    action = own_action(method, unit)
    return domain_error("authz", AUTHZ_REFUSED,
                        f"Authorization check failed: action {action} is refused to uid {uid}")


def rule(condition: str) -> str:
    return f"""polkit.addRule(function (action, subject) {{
    if (subject.user === "clerk" && {condition})
        return polkit.Result.YES;
}});"""


def rule_on_unit(action: str, unit: str) -> str:
    return rule(f'action.id === "{ACTION_PREFIX}{action}" && action.lookup("unit") === "{unit}"')


@every_unit_method
@pytest.mark.parametrize("unit", ["sshd", "no-such-unit-7", "getty@tty1", "getty@", "a" * 64,
                                  "any"])
def test_root_may_act_on_any_unit(method: str, unit: str, real_service: Service, bus: Bus,
                                  systemd: Systemd) -> None:
    assert bus.call(method, "s", unit) == ()

    assert systemd.take_calls() == [expected_call(method, unit)]


@every_unit_method
@pytest.mark.parametrize("unit", ["sshd", "getty@tty1", "getty@", "a@b@c"])
def test_user_is_refused_with_the_name_of_the_action(method: str, unit: str, clerk: User,
                                                     real_service: Service,
                                                     systemd: Systemd) -> None:
    before = real_service.output()
    expected = refusal(method, unit)

    assert error_of(clerk.call, method, "s", unit) == expected

    assert real_service.output() == before + [f"warning: {expected.text}"]
    assert systemd.take_calls() == []


@pytest.mark.polkit
@every_unit_method
def test_rule_on_the_parent_grants_one_unit(method: str, clerk: User, bus: Bus,
                                            real_service: Service, systemd: Systemd) -> None:
    with local_rules(bus, clerk, rule_on_unit(UNIT_METHODS[method][1], "sshd")):
        assert clerk.call(method, "s", "sshd") == ()
        assert systemd.take_calls() == [expected_call(method, "sshd")]

        for other in UNIT_METHODS:
            for unit in ("sshd", "ssh", "sshd2", "sshd@", "sshd@sshd"):
                if (other, unit) != (method, "sshd"):
                    assert error_of(clerk.call, other, "s", unit) == refusal(other, unit)
    assert error_of(clerk.call, method, "s", "sshd") == refusal(method, "sshd")
    assert systemd.take_calls() == []


@pytest.mark.polkit
def test_rule_grants_its_user_alone(clerk: User, viewer: User, bus: Bus, real_service: Service,
                                    systemd: Systemd) -> None:
    with local_rules(bus, clerk, rule_on_unit("startservice", "sshd")):
        assert error_of(viewer.call, "StartService", "s", "sshd") == refusal(
            "StartService", "sshd", viewer.uid)
    assert systemd.take_calls() == []


@pytest.mark.polkit
def test_template_is_told_from_a_unit_of_its_name(clerk: User, bus: Bus, real_service: Service,
                                                  systemd: Systemd) -> None:
    with local_rules(bus, clerk, rule_on_unit("startservice", "getty@")):
        for unit in ("getty@tty1", "getty@", "getty@a@b", "getty@sshd"):
            assert clerk.call("StartService", "s", unit) == ()
            assert systemd.take_calls() == [expected_call("StartService", unit)]
        for unit in ("getty", "getty-any", "any", "@getty", "@", "a@getty"):
            assert error_of(clerk.call, "StartService", "s", unit) == refusal("StartService", unit)
    assert systemd.take_calls() == []


@pytest.mark.polkit
def test_details_name_the_own_action(clerk: User, bus: Bus, real_service: Service,
                                     systemd: Systemd) -> None:
    condition = f'action.lookup("action") === "{ACTION_PREFIX}startservice.getty.any"'
    with local_rules(bus, clerk, rule(condition)):
        assert clerk.call("StartService", "s", "getty@tty1") == ()
        assert error_of(clerk.call, "StartService", "s", "getty") == refusal(
            "StartService", "getty")
    assert systemd.take_calls() == [expected_call("StartService", "getty@tty1")]


ODD_NAMES = ["", "-", "@", "@sshd", "-sshd", "sshd-", "sshd@", "any", "com", "startservice",
             "a" * 64, "s" * 63 + "@"]
BAD_NAMES = ["sshd.service", "sshd.any", "SSHD", "sshd ", " sshd", "sshd\n", "sshd/", "../sshd",
             "sshd!", "ssh\u0501", "sshd*", "s_shd"]


@pytest.mark.polkit
@pytest.mark.parametrize("unit", ODD_NAMES)
def test_odd_name_gets_nobody_past_a_rule(unit: str, clerk: User, bus: Bus, real_service: Service,
                                          systemd: Systemd) -> None:
    with local_rules(bus, clerk, rule_on_unit("startservice", "sshd")):
        assert error_of(clerk.call, "StartService", "s", unit) == refusal("StartService", unit)
        assert systemd.take_calls() == []

        assert bus.call("StartService", "s", unit) == ()
    assert systemd.take_calls() == [expected_call("StartService", unit)]


@every_unit_method
@pytest.mark.parametrize("unit", BAD_NAMES)
def test_name_that_no_unit_has_is_refused_unasked(method: str, unit: str, clerk: User, bus: Bus,
                                                  real_service: Service, systemd: Systemd) -> None:
    expected = domain_error("privaneSystemError", UNIT_METHODS[method][0],
                            f"Invalid unit '{unit}': Name contained invalid characters")

    for caller in (bus, clerk):
        assert error_of(caller.call, method, "s", unit) == expected
    assert systemd.take_calls() == []


def generate(*units: str) -> str:
    return subprocess.run([GENERATOR, *units], check=True, capture_output=True, text=True).stdout


def names_of(*units: str) -> set[str]:
    """The actions that belong to services."""
    return {own_action(method, unit) for unit in units for method in UNIT_METHODS
            if method != "SetDefaultTarget"}


@pytest.mark.polkit
def test_polkitd_takes_all_that_the_generator_declares(bus: Bus, clerk: User) -> None:
    services = ("sshd", "recorder@", "a" * 64, "-0", "any")
    names = names_of(*services) | {own_action("SetDefaultTarget", "rescue")}
    text = generate(*(f"{unit}.service" for unit in services), "rescue.target")

    known = actions(bus)
    with declared(bus, text, names):
        assert {name: row for name, row in actions(bus).items() if name not in known} == {
            name: (0, 0, 0) for name in names}
        for name in names:
            assert check(bus, clerk.unique_name, name) is False
            assert check(bus, bus.unique_name, name) is True


@pytest.mark.polkit
@pytest.mark.parametrize("unit, declaration", [("sshd", "sshd.service"),
                                               ("getty@tty1", "getty@.service")])
def test_declared_action_decides_instead_of_its_parent(unit: str, declaration: str, clerk: User,
                                                       bus: Bus, real_service: Service,
                                                       systemd: Systemd) -> None:
    name = declaration.removesuffix(".service")
    with local_rules(bus, clerk, rule_on_unit("startservice", name)):
        assert clerk.call("StartService", "s", unit) == ()
        with declared(bus, generate(declaration), names_of(name)):
            assert error_of(clerk.call, "StartService", "s", unit) == refusal("StartService", unit)
            assert bus.call("StartService", "s", unit) == ()
        assert clerk.call("StartService", "s", unit) == ()
    assert systemd.take_calls() == [expected_call("StartService", unit)] * 3


@pytest.mark.polkit
def test_declared_action_is_granted_by_itself(clerk: User, bus: Bus, real_service: Service,
                                              systemd: Systemd) -> None:
    granted = rule(f'action.id === "{ACTION_PREFIX}startservice.getty.any"')
    with declared(bus, generate("getty@.service"), names_of("getty@")), \
            local_rules(bus, clerk, granted):
        assert clerk.call("StartService", "s", "getty@tty1") == ()
        assert error_of(clerk.call, "StopService", "s", "getty@tty1") == refusal(
            "StopService", "getty@tty1")
        assert error_of(clerk.call, "StartService", "s", "getty") == refusal(
            "StartService", "getty")
    assert systemd.take_calls() == [expected_call("StartService", "getty@tty1")]


@pytest.mark.polkit
def test_example_grants_what_it_says(accounts: AccountFiles, clerk: User, viewer: User, bus: Bus,
                                     real_service: Service, systemd: Systemd) -> None:
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW,
                   f"{STANDARD_GROUP}privane-units:x:{UNITS_ROLE_GID}:clerk\n")
    granted = {("RestartService", "sshd"), ("ReloadService", "sshd"),
               ("StartService", "recorder@1"), ("StopService", "recorder@1")}

    with local_rules(bus, clerk, (EXAMPLES / "60-privane-units.rules").read_text()):
        for method in UNIT_METHODS:
            for unit in ("sshd", "recorder@1", "recorder", "sshd@1", "hasownproperty", ""):
                if (method, unit) in granted:
                    assert clerk.call(method, "s", unit) == ()
                    assert systemd.take_calls() == [expected_call(method, unit)]
                else:
                    assert error_of(clerk.call, method, "s", unit) == refusal(method, unit)
                assert error_of(viewer.call, method, "s", unit) == refusal(method, unit, viewer.uid)
        assert error_of(clerk.call, "GetUserList").text.startswith("Authorization check failed: ")
    assert systemd.take_calls() == []


def start_polkitd(bus: Bus, program: str) -> None:
    with (STATE / "polkitd.log").open("a") as log:
        process = subprocess.Popen([program, "--no-debug"], stdout=log, stderr=log)
    (STATE / "polkitd.pid").write_text(f"{process.pid}\n")
    wait_for("polkitd", lambda: bus.owner(AUTHORITY[0]), ANSWER_SECONDS)


@pytest.mark.polkit
def test_without_polkitd_nobody_is_allowed(clerk: User, bus: Bus, real_service: Service,
                                           systemd: Systemd) -> None:
    with local_rules(bus, clerk, rule_on_unit("startservice", "sshd")):
        assert clerk.call("StartService", "s", "sshd") == ()
        systemd.take_calls()
        program = os.readlink(f"/proc/{polkitd_pid()}/exe")
        os.kill(polkitd_pid(), signal.SIGINT)
        try:
            wait_for("polkitd's end", lambda: bus.owner(AUTHORITY[0]) is None)
            for caller in (clerk, bus):
                assert error_of(caller.call, "StartService", "s", "sshd") == domain_error(
                    "authz", AUTHZ_UNREACHABLE,
                    f"Authorization check failed: cannot check action {ACTION_PREFIX}startservice"
                    ".sshd: The name org.freedesktop.PolicyKit1 was not provided by any .service "
                    "files")
            assert systemd.take_calls() == []
        finally:
            start_polkitd(bus, program)
        assert clerk.call("StartService", "s", "sshd") == ()
        assert bus.call("StartService", "s", "lensd") == ()
    assert systemd.take_calls() == [expected_call("StartService", "sshd"),
                                    expected_call("StartService", "lensd")]
