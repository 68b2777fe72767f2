"""tests/bus/test_authorization.py: who may call what, whichever of our libauthz decides."""
import pytest

from harness.accounts import CLERK_UID
from harness.bus import Bus, BusError, User, domain_error, error_of
from harness.interface import ACTION_PREFIX, METHODS, QUERIES, Method
from harness.roles import OPERATOR_ACTIONS, VIEWER_ACTIONS, Roles
from harness.service import Service

AUTHZ_REFUSED = 1

NONE: set[str] = set()

every_method = pytest.mark.parametrize("method", METHODS, ids=lambda method: method.member)


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
                                             rules: Roles) -> None:
    for user, granted in ((viewer, VIEWER_ACTIONS), (operator, OPERATOR_ACTIONS), (clerk, NONE)):
        if method.action_id in granted:
            assert is_authorized(user, method)
            if method in QUERIES:
                assert call(user, method) == call(bus, method)
        else:
            assert error_of(call, user, method) == refusal(method.action_id, user.uid)


def test_roles_that_go_take_their_grants_along(real_service: Service, viewer: User,
                                               rules: Roles) -> None:
    assert viewer.call("CheckUser", "s", "root") == (True,)

    rules.remove()

    assert error_of(viewer.call, "CheckUser", "s", "root") == refusal(
        ACTION_PREFIX + "checkuser", viewer.uid)
