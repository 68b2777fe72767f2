"""tests/bus/test_request_frame.py: what every method does before its own work, and how it fails."""
from pathlib import Path

import pytest

from harness.bus import Bus, BusError, User, domain_error, error_of
from harness.device import Device
from harness.fake_authz import CODE, DOMAIN, Check, FakeAuthz
from harness.interface import METHODS, Method
from harness.service import Service
from harness.stage import Stage
from harness.syslog_socket import SyslogSocket
from harness.wire import Wire
from harness.world import Neighbour, snapshot

UNKNOWN = domain_error("privaneSystemError", 25, "Unknown")

every_method = pytest.mark.parametrize("method", METHODS, ids=lambda method: method.member)


def call(caller: Bus | User, method: Method) -> object:
    return caller.call(method.member, method.signature, *method.arguments)


def new_lines(service: Service, before: list[str]) -> list[str]:
    output = service.output()
    assert output[:len(before)] == before
    return output[len(before):]


@every_method
def test_refusal_is_answered_with_its_error(method: Method, service: Service, bus: Bus,
                                            authz: FakeAuthz) -> None:
    authz.refuse("not for you", "some-domain", 77)

    assert error_of(call, bus, method) == domain_error(
        "some-domain", 77, "Authorization check failed: not for you")


@every_method
def test_refusal_is_logged_once_as_a_warning(method: Method, service: Service, bus: Bus,
                                             authz: FakeAuthz, syslog: SyslogSocket) -> None:
    authz.refuse("not for you")
    before = service.output()

    error_of(call, bus, method)

    assert new_lines(service, before) == ["warning: Authorization check failed: not for you"]
    assert syslog.lines() == []


@every_method
def test_silent_refusal_is_unknown_and_not_logged(method: Method, service: Service, bus: Bus,
                                                  authz: FakeAuthz, syslog: SyslogSocket) -> None:
    authz.refuse_silently()
    before = service.output()

    assert error_of(call, bus, method) == UNKNOWN
    assert new_lines(service, before) == []
    assert syslog.lines() == []


@every_method
def test_refused_call_does_nothing_else(method: Method, service: Service, bus: Bus,
                                        authz: FakeAuthz, cfgstore: Neighbour) -> None:
    authz.refuse("not for you")
    error_of(call, bus, method)
    before = snapshot(cfgstore)

    error_of(call, bus, method)
    authz.refuse_silently()
    error_of(call, bus, method)

    assert snapshot(cfgstore) == before


@every_method
def test_refused_call_reaches_no_library_tool_or_service(method: Method, hardware_clock: Path,
                                                         system: Stage, device: Device,
                                                         authz: FakeAuthz) -> None:
    authz.refuse("not for you")
    error_of(call, system.bus, method)
    authz.refuse_silently()
    error_of(call, system.bus, method)

    assert system.calls() == []


@every_method
def test_refused_call_sends_no_signal(method: Method, service: Service, authz: FakeAuthz) -> None:
    authz.refuse("not for you")
    wire = Wire()
    try:
        for refused in (method, method):
            serial = wire.send(refused.member, refused.signature, *refused.arguments)
            assert [message.kind for message in wire.until_reply(serial)] == ["error"]
    finally:
        wire.close()


@every_method
def test_action_is_asked_once_for_the_caller(method: Method, service: Service, bus: Bus,
                                             authz: FakeAuthz) -> None:
    authz.forget()
    try:
        call(bus, method)
    except BusError:
        pass  # this machine is no device: some have nothing to work on

    assert authz.checks() == [Check(bus.unique_name, method.action_id)]


@every_method
def test_action_is_asked_once_where_it_is_refused(method: Method, service: Service, bus: Bus,
                                                  authz: FakeAuthz) -> None:
    authz.refuse("not for you")
    authz.forget()
    error_of(call, bus, method)

    assert authz.checks() == [Check(bus.unique_name, method.action_id)]


def test_another_caller_is_asked_for_under_its_own_name(service: Service, bus: Bus, clerk: User,
                                                        authz: FakeAuthz) -> None:
    authz.forget()
    clerk.call("CheckUser", "s", "root")
    bus.call("CheckUser", "s", "root")

    assert [check.sender for check in authz.checks()] == [clerk.unique_name, bus.unique_name]


def test_every_call_is_asked_for_anew(service: Service, bus: Bus, authz: FakeAuthz) -> None:
    assert bus.call("CheckUser", "s", "root") == (True,)
    authz.refuse("no longer")
    assert error_of(bus.call, "CheckUser", "s", "root") == domain_error(
        DOMAIN, CODE, "Authorization check failed: no longer")
    authz.allow()
    assert bus.call("CheckUser", "s", "root") == (True,)


def test_refusal_comes_before_the_work(service: Service, bus: Bus, authz: FakeAuthz) -> None:
    authz.refuse("not for you")

    # Authorized, each of these would be answered with an error of its own.
    for member in ("GetUser", "GetGroup"):
        assert error_of(bus.call, member, "s", "nobody-at-all") == domain_error(
            DOMAIN, CODE, "Authorization check failed: not for you")


def test_error_of_the_database_keeps_domain_and_code(service: Service, bus: Bus) -> None:
    assert error_of(bus.call, "GetUser", "s", "x") == domain_error(
        "usermgmt", 3, "Could not retrieve user 'x', user does not exist")


@pytest.mark.parametrize("member, text", [
    ("GetUser", "Could not retrieve user 'x', user does not exist"),
    ("GetGroup", "Group 'x' does not exist"),
])
def test_error_of_the_database_is_logged_once_as_a_warning(
        member: str, text: str, service: Service, bus: Bus, syslog: SyslogSocket) -> None:
    before = service.output()

    error_of(bus.call, member, "s", "x")

    assert new_lines(service, before) == [f"warning: {text}"]
    assert syslog.lines() == []


def test_refusal_that_is_no_utf8_is_made_sendable(service: Service, bus: Bus,
                                                  authz: FakeAuthz) -> None:
    authz.refuse("caf\udce9")

    assert error_of(bus.call, "CheckUser", "s", "root") == domain_error(
        DOMAIN, CODE, "Authorization check failed: caf\ufffd")


def test_caller_cannot_forge_a_line_of_the_log(service: Service, bus: Bus) -> None:
    before = service.output()

    error_of(bus.call, "GetGroup", "s", "x\nmessage: all is well")

    assert new_lines(service, before) == [
        r"warning: Group 'x\x0Amessage: all is well' does not exist"]
