"""tests/bus/test_units.py: the methods that control systemd units."""
from dataclasses import dataclass

import pytest
from gi.repository import GLib

from harness.bus import BusError, domain_error, error_of
from harness.device import Device, answered, asked, failed
from harness.fake_authz import FakeAuthz
from harness.stage import Stage


@dataclass(frozen=True)
class Action:
    """A method that acts on a unit of the caller's choice."""

    member: str
    action: str
    suffix: str
    call: str
    code: int

    def manager_call(self, unit: str) -> tuple[str, ...]:
        if self.call == "SetDefaultTarget":
            return (self.call, "sb", unit + self.suffix, "True")
        return (self.call, "ss", unit + self.suffix, "replace")


@dataclass(frozen=True)
class Wrapper:
    """A method that acts on one unit."""

    member: str
    call: str
    unit: str
    code: int
    failure: str

    @property
    def manager_call(self) -> tuple[str, ...]:
        return (self.call, "ss", self.unit, "replace")


ACTIONS = (
    Action("StartService", "startservice", ".service", "StartUnit", 29),
    Action("StopService", "stopservice", ".service", "StopUnit", 30),
    Action("RestartService", "restartservice", ".service", "RestartUnit", 31),
    Action("ReloadService", "reloadservice", ".service", "ReloadUnit", 32),
    Action("SetDefaultTarget", "setdefaulttarget", ".target", "SetDefaultTarget", 33),
)

WRAPPERS = (
    Wrapper("StartNtp", "StartUnit", "ntp.service", 21, "Failed to start ntp service: "),
    Wrapper("RestartNtp", "RestartUnit", "ntp.service", 22, "Failed to restart ntp service: "),
    Wrapper("StopNtp", "StopUnit", "ntp.service", 23, "Failed to stop ntp service: "),
    Wrapper("StartLensd", "StartUnit", "lensd.service", 26, "Failed to start lensd service: "),
    Wrapper("StopLensd", "StopUnit", "lensd.service", 27, "Failed to stop lensd service: "),
)

START = ACTIONS[0]

NO_SUCH_UNIT = "org.freedesktop.systemd1.NoSuchUnit"
NO_SYSTEMD = ("GDBus.Error:org.freedesktop.DBus.Error.ServiceUnknown: The name "
              "org.freedesktop.systemd1 was not provided by any .service files")

# GDBus's own, for a call without a timeout.
GDBUS_DEADLINE = 25

every_action = pytest.mark.parametrize("row", ACTIONS, ids=lambda row: row.member)
every_wrapper = pytest.mark.parametrize("row", WRAPPERS, ids=lambda row: row.member)


@every_action
def test_unit_is_acted_on_by_its_full_name(row: Action, system: Stage, authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call(row.member, "sshd") == answered(calls=(row.manager_call("sshd"),))
    assert asked(authz) == [f"{row.action}.sshd"]


def test_default_target_is_set_with_force(system: Stage) -> None:
    assert system.call("SetDefaultTarget", "multi-user").calls == [
        ("SetDefaultTarget", "sb", "multi-user.target", "True")]


@every_action
def test_instance_is_authorized_for_its_whole_template(row: Action, system: Stage,
                                                       authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call(row.member, "getty@tty1") == answered(
        calls=(row.manager_call("getty@tty1"),))
    assert asked(authz) == [f"{row.action}.getty.any"]


@pytest.mark.parametrize("unit, action", [
    ("foo@bar", "foo.any"), ("foo@", "foo.any"), ("foo@bar@baz", "foo.any"), ("foo@@", "foo.any"),
    ("@bar", ".any"), ("@", ".any"), ("foo", "foo"), ("foo-any", "foo-any"), ("-foo", "-foo"),
    ("--", "--"), ("0", "0"), ("", "")])
def test_action_and_full_name_of_an_accepted_name(unit: str, action: str, system: Stage,
                                                  authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call("StartService", unit).calls == [
        ("StartUnit", "ss", unit + ".service", "replace")]
    assert asked(authz) == [f"startservice.{action}"]


@every_action
def test_name_of_64_characters_is_accepted_and_of_65_refused(row: Action, system: Stage) -> None:
    longest = "a" * 64

    assert system.call(row.member, longest) == answered(calls=(row.manager_call(longest),))
    assert system.call(row.member, longest + "a") == failed(
        row.code, f"Invalid unit '{longest}a': Name too long")


def test_length_is_counted_in_bytes_and_before_the_characters(system: Stage) -> None:
    assert system.call("StartService", "é" * 33) == failed(
        29, f"Invalid unit '{'é' * 33}': Name too long")
    assert system.call("StartService", "é" * 32) == failed(
        29, f"Invalid unit '{'é' * 32}': Name contained invalid characters")
    assert system.call("StartService", "X" * 65) == failed(
        29, f"Invalid unit '{'X' * 65}': Name too long")


@every_action
@pytest.mark.parametrize("unit", [
    "foo.service", "foo.target", ".", "Sshd", "sshD", "foo_bar", "!", "foo!", "foo bar", " foo",
    "foo ", "foo\n", "foo\tbar", "foo/bar", "../foo", "/etc/systemd/system/foo", "foo:bar",
    "foo\\x2dbar", "foo;reboot", "$(reboot)", "`reboot`", "foo*", "café", "foo,bar", "\x7f"])
def test_name_with_another_character_is_refused(unit: str, row: Action, system: Stage) -> None:
    expected = failed(row.code, f"Invalid unit '{unit}': Name contained invalid characters")
    expected.output = [expected.output[0].replace("\t", r"\x09").replace("\x7f", r"\x7F")]

    assert system.call(row.member, unit) == expected


@every_action
@pytest.mark.parametrize("unit, reason", [
    ("a" * 65, "Name too long"), ("foo.service", "Name contained invalid characters")])
def test_malformed_name_is_told_before_any_authorization(unit: str, reason: str, row: Action,
                                                         system: Stage, authz: FakeAuthz) -> None:
    authz.refuse("not for you")
    authz.forget()

    assert error_of(system.bus.call, row.member, "s", unit) == domain_error(
        "privaneSystemError", row.code, f"Invalid unit '{unit}': {reason}")
    assert authz.checks() == []


@every_action
@pytest.mark.parametrize("unit, action", [("sshd", "sshd"), ("getty@tty1", "getty.any")])
def test_refusal_is_the_one_check_and_nothing_reaches_systemd(
        unit: str, action: str, row: Action, system: Stage, device: Device,
        authz: FakeAuthz) -> None:
    authz.refuse("not for you")
    authz.forget()
    text = "Authorization check failed: not for you"

    assert error_of(system.bus.call, row.member, "s", unit) == domain_error("fake-authz", 42, text)
    assert asked(authz) == [f"{row.action}.{action}"]
    assert device.systemd.calls() == []
    assert system.service.output()[-1] == f"warning: {text}"


@every_action
@pytest.mark.parametrize("unit", ["foo", "foo@bar"])
def test_error_of_systemd_is_told_with_the_unit_as_given(unit: str, row: Action, system: Stage,
                                                         device: Device) -> None:
    device.systemd.fail(NO_SUCH_UNIT, f"Unit {unit} not found.")

    assert system.call(row.member, unit) == failed(
        row.code, f"Action {row.action} on {unit} failed: {row.call} failed, "
                  f"GDBus.Error:{NO_SUCH_UNIT}: Unit {unit} not found.", row.manager_call(unit))


@every_wrapper
def test_fixed_unit_is_acted_on(row: Wrapper, system: Stage, authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call(row.member) == answered(calls=(row.manager_call,))
    assert asked(authz) == [row.member.lower()]


@every_wrapper
def test_error_of_systemd_about_a_fixed_unit_is_told(row: Wrapper, system: Stage,
                                                     device: Device) -> None:
    device.systemd.fail(NO_SUCH_UNIT, f"Unit {row.unit} not found.")

    assert system.call(row.member) == failed(
        row.code, f"{row.failure}{row.call} failed, GDBus.Error:{NO_SUCH_UNIT}: "
                  f"Unit {row.unit} not found.", row.manager_call)


@every_wrapper
def test_refused_wrapper_does_not_reach_systemd(row: Wrapper, system: Stage, device: Device,
                                                authz: FakeAuthz) -> None:
    authz.refuse_silently()

    assert error_of(system.bus.call, row.member) == domain_error(
        "privaneSystemError", 25, "Unknown")
    assert device.systemd.calls() == []


def test_device_without_systemd_is_told(system: Stage, device: Device) -> None:
    device.systemd.close()

    assert system.call("ReloadService", "foo") == failed(
        32, f"Action reloadservice on foo failed: ReloadUnit failed, {NO_SYSTEMD}")
    assert system.call("StopLensd") == failed(
        27, f"Failed to stop lensd service: StopUnit failed, {NO_SYSTEMD}")


def test_systemd_that_vanishes_at_a_call_is_told(system: Stage, device: Device) -> None:
    device.systemd.vanish_at_a_call()
    gone = ("GDBus.Error:org.freedesktop.DBus.Error.NoReply: "
            "Message recipient disconnected from message bus without replying")

    assert system.call("StartNtp") == failed(
        21, f"Failed to start ntp service: StartUnit failed, {gone}", WRAPPERS[0].manager_call)


def test_error_of_systemd_without_a_text_is_told(system: Stage, device: Device) -> None:
    device.systemd.fail(NO_SUCH_UNIT, None)

    assert system.call("StartService", "foo") == failed(
        29, f"Action startservice on foo failed: StartUnit failed, GDBus.Error:{NO_SUCH_UNIT}: "
            "Error return with empty body: ",
        START.manager_call("foo"))


@pytest.mark.parametrize("body", [None, GLib.Variant("(s)", ("done",)),
                                  GLib.Variant("(ai)", ([],))],
                         ids=["empty", "text", "numbers"])
def test_reply_of_systemd_is_not_looked_at(body: GLib.Variant | None, system: Stage,
                                           device: Device) -> None:
    device.systemd.reply_with(body)

    assert system.call("StartService", "foo") == answered(calls=(START.manager_call("foo"),))
    assert system.call("StartNtp") == answered(calls=(WRAPPERS[0].manager_call,))


def test_failed_call_leaves_the_next_one_as_it_is(system: Stage, device: Device) -> None:
    device.systemd.fail(NO_SUCH_UNIT, "no")
    assert isinstance(system.call("StartService", "foo").answer, BusError)
    device.systemd.reply_with(None)

    assert system.call("StartService", "foo") == answered(calls=(START.manager_call("foo"),))


@pytest.mark.slow
def test_silent_systemd_is_given_up_by_the_bus_library(system: Stage, device: Device) -> None:
    device.systemd.never_reply()

    assert error_of(system.bus.call, "StartService", "s", "foo",
                    timeout=GDBUS_DEADLINE + 10) == domain_error(
        "privaneSystemError", 29,
        "Action startservice on foo failed: StartUnit failed, Timeout was reached")
    assert system.bus.call("CheckUser", "s", "root") == (True,)
