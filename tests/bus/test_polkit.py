"""tests/bus/test_polkit.py: the real polkitd decides, by our policy and rules."""
import time

import pytest

from harness.bus import Bus, BusError, User, domain_error, error_of
from harness.deadline import wait_for
from harness.interface import ACTION_PREFIX, DECLARED_ACTIONS, UNIT_ACTIONS
from harness.polkit import ExampleRules, actions, check, hanging_polkitd
from harness.roles import OPERATOR_ACTIONS, VIEWER_ACTIONS
from harness.sandbox import fake_library
from harness.service_fixtures import StartService

pytestmark = pytest.mark.polkit

# The answers of EnumerateActions: not authorized for any session, nor for an active one.
REFUSED_TO_ALL = (0, 0, 0)

AUTHZ_TIMED_OUT = 4
# Of the library that has a short one.
SHORT_DEADLINE = 0.3

# Those of the methods on units decide where a unit has none of its own.
DECLARED = DECLARED_ACTIONS | {ACTION_PREFIX + name for name in UNIT_ACTIONS}

every_declared_action = pytest.mark.parametrize("action", sorted(DECLARED))

NONE: set[str] = set()


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


def test_example_rules_grant_a_role_its_actions_only(bus: Bus, viewer: User, operator: User,
                                                     clerk: User, rules: ExampleRules) -> None:
    def allowed(user: User) -> set[str]:
        return {action for action in DECLARED if check(bus, user.unique_name, action)}

    assert allowed(viewer) == VIEWER_ACTIONS
    assert allowed(operator) == OPERATOR_ACTIONS
    assert allowed(clerk) == NONE


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
