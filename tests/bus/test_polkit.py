"""tests/bus/test_polkit.py: the real polkitd decides, by our policy and rules."""
import time

import pytest

from harness.accounts import CLERK_UID
from harness.bus import Bus, BusError, User, domain_error, error_of
from harness.deadline import wait_for
from harness.interface import (ACTION_PREFIX, DECLARED_ACTIONS, METHODS, QUERIES,
                               UNIT_ACTIONS, Method)
from harness.polkit import ExampleRules, actions, check, hanging_polkitd
from harness.sandbox import fake_library
from harness.service import Service
from harness.service_fixtures import StartService

# The answers of EnumerateActions: not authorized for any session, nor for an active one.
REFUSED_TO_ALL = (0, 0, 0)

AUTHZ_REFUSED, AUTHZ_TIMED_OUT = 1, 4
# Of the library that has a short one.
SHORT_DEADLINE = 0.3

VIEWER_ACTIONS = {ACTION_PREFIX + name for name in (
    "checkuser", "checkgroup", "getuser", "getuserlist", "getgroup", "getgrouplist",
    "getgrouplistfull")}

OPERATOR_ACTIONS = {ACTION_PREFIX + name for name in (
    "adjtime", "executeethtool", "executelldpcli", "executesmartctl", "getactivenetworkinfo.all",
    "getactivenetworkinfo.tcp-udp", "getnetworkspeedduplex", "getslabinfo", "notifytimesync",
    "readserno", "reboot", "restartntp", "settimeofday", "startlensd", "startntp", "stoplensd",
    "stopntp")}

NONE: set[str] = set()

# Those of the methods on units decide where a unit has none of its own.
DECLARED = DECLARED_ACTIONS | {ACTION_PREFIX + name for name in UNIT_ACTIONS}

every_declared_action = pytest.mark.parametrize("action", sorted(DECLARED))
every_method = pytest.mark.parametrize("method", METHODS,
                                                   ids=lambda method: method.member)


def call(caller: Bus | User, method: Method) -> object:
    return caller.call(method.member, method.signature, *method.arguments)


def is_authorized(caller: Bus | User, method: Method) -> bool:
    """Whether the call got past the authorization; what it did then may have failed here."""
    try:
        call(caller, method)
    except BusError as error:
        return not error.text.startswith("Authorization check failed: ")
    return True


def refusal(action: str, uid: int) -> BusError:
    return domain_error("authz", AUTHZ_REFUSED, f"Authorization check failed: action {action} "
                                                f"is refused to uid {uid}")


def test_there_are_46_actions() -> None:
    assert len(DECLARED) == 46


def test_policy_declares_the_actions_and_refuses_them_to_all(bus: Bus) -> None:
    ours = {action: defaults for action, defaults in actions(bus).items()
            if action.startswith(ACTION_PREFIX)}

    assert ours == {action: REFUSED_TO_ALL for action in DECLARED}


@every_declared_action
def test_action_is_refused_to_a_user_and_allowed_to_root(action: str, bus: Bus,
                                                         clerk: User) -> None:
    assert check(bus, clerk.unique_name, action) is False
    assert check(bus, bus.unique_name, action) is True


@pytest.mark.parametrize("action", [*(f"{name}.lensd" for name in UNIT_ACTIONS), "nosuchaction"])
def test_action_that_is_not_declared_is_an_error_for_root_too(action: str, bus: Bus) -> None:
    error = error_of(check, bus, bus.unique_name, ACTION_PREFIX + action)

    assert error.name == "org.freedesktop.PolicyKit1.Error.Failed"
    assert f"Action {ACTION_PREFIX}{action} is not registered" in error.text


@every_method
def test_user_is_refused_through_the_service(method: Method, real_service: Service,
                                             clerk: User) -> None:
    before = real_service.output()
    expected = refusal(method.action_id, CLERK_UID)

    assert error_of(call, clerk, method) == expected
    assert real_service.output() == before + [f"warning: {expected.text}"]


@every_method
def test_root_is_allowed_through_the_service(method: Method, real_service: Service,
                                             bus: Bus) -> None:
    assert is_authorized(bus, method)

    assert not [line for line in real_service.output() if "Authorization" in line]


@every_method
def test_role_is_allowed_through_the_service(method: Method, real_service: Service, bus: Bus,
                                             viewer: User, operator: User, clerk: User,
                                             rules: ExampleRules) -> None:
    for user, granted in ((viewer, VIEWER_ACTIONS), (operator, OPERATOR_ACTIONS), (clerk, NONE)):
        if method.action_id in granted:
            assert is_authorized(user, method)
            if method in QUERIES:
                assert call(user, method) == call(bus, method)
        else:
            assert error_of(call, user, method) == refusal(method.action_id, user.uid)


def test_example_rules_grant_a_role_its_actions_only(bus: Bus, viewer: User, operator: User,
                                                     clerk: User, rules: ExampleRules) -> None:
    def allowed(user: User) -> set[str]:
        return {action for action in DECLARED if check(bus, user.unique_name, action)}

    assert allowed(viewer) == VIEWER_ACTIONS
    assert allowed(operator) == OPERATOR_ACTIONS
    assert allowed(clerk) == NONE


def test_rules_that_go_take_their_grants_along(real_service: Service, viewer: User,
                                               rules: ExampleRules) -> None:
    assert viewer.call("CheckUser", "s", "root") == (True,)

    rules.remove()

    assert error_of(viewer.call, "CheckUser", "s", "root") == refusal(
        ACTION_PREFIX + "checkuser", viewer.uid)


def silence(action: str) -> BusError:
    return domain_error("authz", AUTHZ_TIMED_OUT, "Authorization check failed: cannot check action "
                                                  f"{ACTION_PREFIX}{action}: no answer in time")


@pytest.mark.parametrize("is_known", [True, False], ids=["asked before", "never asked"])
@pytest.mark.parametrize("member, action", [("CheckUser", "checkuser"),
                                            ("StartService", "startservice.lensd")])
def test_call_is_refused_after_the_deadline_of_the_build(
        member: str, action: str, is_known: bool, start: StartService, bus: Bus) -> None:
    library = fake_library("authz_short_deadline/libauthz.so.1")
    service = start(environment={"LD_LIBRARY_PATH": str(library.parent)})
    service.wait_registered(bus)
    word = "lensd" if member == "StartService" else "root"
    if is_known:
        assert bus.call("CheckUser", "s", "root") == (True,)
    before = service.output()
    begin = time.monotonic()

    with hanging_polkitd():
        error = error_of(bus.call, member, "s", word)
        taken = time.monotonic() - begin

    assert error == silence(action)
    assert service.output() == before + [f"warning: {error.text}"]
    assert SHORT_DEADLINE <= taken < SHORT_DEADLINE + 2
    wait_for("polkitd", lambda: is_answered(bus))
    assert bus.call("CheckUser", "s", "root") == (True,)
    assert service.stop() == 0


def is_answered(bus: Bus) -> bool:
    return check(bus, bus.unique_name, ACTION_PREFIX + "checkuser")
