"""tests/bus/test_bus_policy.py: whom the bus lets own the service's name, and send to it."""
import signal
import time
from pathlib import Path

import pytest

from harness.accounts import CLERK_UID
from harness.bus import ACCESS_DENIED, KINDS, NAME, OF_ROOT, Bus, User, domain_error, error_of
from harness.fake_authz import FakeAuthz
from harness.interface import ACTION_PREFIX, METHODS
from harness.polkit import hanging_polkitd
from harness.sandbox import fake_library
from harness.service import Service
from harness.service_fixtures import StartService
from harness.strace import Attached
from harness.wire import Wire, as_user

PRIMARY_OWNER = 1

# A member that stands in a message of somebody, and in no other.
FOREIGN, OWN = "TokenOfAStranger", "TokenOfAMember"

every_kind = pytest.mark.parametrize("kind", KINDS)
by_every_name = pytest.mark.parametrize("name", ["well-known", "unique"])


def address(bus: Bus, name: str) -> str:
    owner = bus.owner()
    assert owner is not None
    return owner if name == "unique" else NAME


def received(service: Service, bus: Bus, folder: Path, send: User, *message: str) -> str:
    """What the service reads while this is sent, up to a call of root's that it answers."""
    trace = Attached(service.pid, folder / "trace", "recvmsg,recvfrom,read,readv")
    with trace:
        send.send_alone(*message)
        assert bus.call("CheckUser", "s", "marker") == (False,)
    text = "\n".join(trace.calls())
    assert "CheckUser" in text
    return text


@by_every_name
def test_stranger_cannot_call_any_method(name: str, service: Service, bus: Bus, stranger: User,
                                         authz: FakeAuthz) -> None:
    authz.forget()

    for method in METHODS:
        error = error_of(stranger.call, method.member, method.signature, *method.arguments,
                         destination=address(bus, name))
        assert error.name == ACCESS_DENIED, method.member
    assert authz.calls() == []


@every_kind
@by_every_name
def test_nothing_of_a_stranger_reaches_the_service(kind: str, name: str, service: Service, bus: Bus,
                                                   stranger: User, tmp_path: Path) -> None:
    assert FOREIGN not in received(service, bus, tmp_path, stranger, kind, address(bus, name),
                                   FOREIGN)
    assert len(service.output()) == 3  # as when it had started


@by_every_name
def test_a_call_of_a_member_of_the_group_reaches_the_service(
        name: str, service: Service, bus: Bus, clerk: User, tmp_path: Path) -> None:
    assert OWN in received(service, bus, tmp_path, clerk, "call", address(bus, name), OWN)


@pytest.mark.parametrize("kind", ["signal", "reply", "error"])
def test_nothing_else_of_a_member_reaches_the_service(
        kind: str, service: Service, bus: Bus, clerk: User, tmp_path: Path) -> None:
    assert OWN not in received(service, bus, tmp_path, clerk, kind, address(bus, "unique"), OWN)


# GDBus takes a reply by its number alone, whoever sent it.
@pytest.mark.polkit
@pytest.mark.parametrize("liar", ["stranger", "clerk"])
def test_forged_answer_of_polkit_allows_nothing(liar: str, start: StartService, bus: Bus,
                                                request: pytest.FixtureRequest) -> None:
    user: User = request.getfixturevalue(liar)
    library = fake_library("authz_short_deadline/libauthz.so.1")
    service = start(environment={"LD_LIBRARY_PATH": str(library.parent)})
    service.wait_registered(bus)
    assert bus.call("CheckUser", "s", "root") == (True,)  # Then it asks polkit one question a call.
    wire = Wire()

    with hanging_polkitd():
        asked = wire.send("CheckUser", "s", "root")
        for _ in range(5):
            user.send_alone("reply", address(bus, "unique"), "Allowed", range(1, 200))
            time.sleep(0.03)
        answer = wire.until_reply(asked)[-1].answer()
    wire.close()

    assert answer == domain_error("authz", 4, "Authorization check failed: cannot check action "
                                              f"{ACTION_PREFIX}checkuser: no answer in time")
    assert service.stop() == 0


# The service is stopped meanwhile, so that it finds the call and then them, and asks the bus while
# it still reads them: an answer that the bus had let through would come before its own.
@pytest.mark.policy_file
@pytest.mark.parametrize("liar", ["stranger", "clerk"])
def test_forged_answer_of_the_bus_makes_nobody_root(liar: str, real_service: Service, bus: Bus,
                                                    privane_gid: int,
                                                    request: pytest.FixtureRequest) -> None:
    user: User = request.getfixturevalue(liar)
    forged = range(1, 100)
    refused = domain_error("authz", 1, f"Authorization check failed: action {ACTION_PREFIX}"
                                       f"checkuser is refused to uid {CLERK_UID}")
    assert bus.call("CheckUser", "s", "root") == (True,)
    with as_user(CLERK_UID, [privane_gid]):
        fresh = Wire()

    real_service.kill(signal.SIGSTOP)
    asked = fresh.send("CheckUser", "s", "root")
    user.send_alone("reply", address(bus, "unique"), "Told", [*forged] * 20, OF_ROOT)
    real_service.kill(signal.SIGCONT)
    told = fresh.until_reply(asked)[-1]

    assert told.answer() == refused
    assert told.serial in forged  # So was the number of the question, which came before.
    for _ in range(3):
        assert fresh.until_reply(fresh.send("CheckUser", "s", "root"))[-1].answer() == refused
    fresh.close()


def test_member_of_the_group_can_call(service: Service, clerk: User) -> None:
    assert clerk.call("CheckUser", "s", "root") == (True,)


def test_only_root_can_own_the_name(stranger: User, clerk: User, bus: Bus) -> None:
    assert bus.owner() is None
    for user in (stranger, clerk):
        assert error_of(user.request_name, NAME).name == ACCESS_DENIED
    assert bus.owner() is None

    assert bus.ask_bus("RequestName", "su", NAME, 0) == (PRIMARY_OWNER,)
    bus.ask_bus("ReleaseName", "s", NAME)
