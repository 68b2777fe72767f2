"""tests/bus/test_bus_policy.py: whom the bus lets own the service's name, and call it."""
from harness.bus import ACCESS_DENIED, NAME, Bus, User, error_of
from harness.fake_authz import FakeAuthz
from harness.interface import METHODS
from harness.service import Service

PRIMARY_OWNER = 1


def test_stranger_cannot_call_any_method(service: Service, stranger: User,
                                         authz: FakeAuthz) -> None:
    authz.forget()

    for method in METHODS:
        error = error_of(stranger.call, method.member, method.signature, *method.arguments)
        assert error.name == ACCESS_DENIED, method.member
    assert authz.calls() == []


def test_member_of_the_group_can_call(service: Service, clerk: User) -> None:
    assert clerk.call("CheckUser", "s", "root") == (True,)


def test_only_root_can_own_the_name(stranger: User, clerk: User, bus: Bus) -> None:
    assert bus.owner() is None
    for user in (stranger, clerk):
        assert error_of(user.request_name, NAME).name == ACCESS_DENIED
    assert bus.owner() is None

    assert bus.ask_bus("RequestName", "su", NAME, 0) == (PRIMARY_OWNER,)
    bus.ask_bus("ReleaseName", "s", NAME)
