"""tests/bus/test_account_queries.py: what all methods that read the accounts have in common."""
import pytest

from harness.accounts import HASH, STANDARD_GROUP, STANDARD_PASSWD, STANDARD_SHADOW, AccountFiles
from harness.bus import Bus, User, domain_error, error_of
from harness.fake_authz import FakeAuthz
from harness.interface import QUERIES, Method
from harness.service import Service
from harness.service_fixtures import StartService
from harness.syslog_socket import SyslogSocket
from harness.world import Neighbour, snapshot

every_query = pytest.mark.parametrize("method", QUERIES, ids=lambda method: method.member)

USERS = ["root", "clerk", "stranger", "viewer", "operator", "messagebus", "polkitd"]
GROUPS = ["root", "clerk", "stranger", "viewer", "operator", "privane-viewer", "privane-operator",
          "messagebus", "polkitd", "privane"]


def call(caller: Bus | User, method: Method) -> object:
    return caller.call(method.member, method.signature, *method.arguments)


def test_there_are_seven_queries() -> None:
    assert len(QUERIES) == 7


@every_query
def test_answer_is_not_logged(method: Method, service: Service, bus: Bus,
                              syslog: SyslogSocket) -> None:
    before = service.output()

    call(bus, method)

    assert service.output() == before
    assert syslog.lines() == []


@every_query
def test_query_changes_nothing(method: Method, service: Service, bus: Bus,
                               cfgstore: Neighbour) -> None:
    call(bus, method)
    before = snapshot(cfgstore)

    call(bus, method)

    assert snapshot(cfgstore) == before


@every_query
def test_failing_query_changes_nothing(method: Method, service: Service, bus: Bus,
                                       cfgstore: Neighbour) -> None:
    call(bus, method)
    before = snapshot(cfgstore)

    if method.member in ("GetUser", "GetGroup"):
        error_of(bus.call, method.member, "s", "nobody-at-all")
    else:
        bus.call(method.member, method.signature, *("nobody-at-all" for _ in method.arguments))

    assert snapshot(cfgstore) == before


@every_query
def test_hash_never_leaves_the_service(method: Method, service: Service, bus: Bus) -> None:
    arguments = tuple("root" for _ in method.arguments)

    reply = bus.call(method.member, method.signature, *arguments)

    assert HASH not in str(reply)
    assert not any(HASH in line for line in service.output())


@every_query
def test_answer_is_the_same_for_every_caller(method: Method, service: Service, bus: Bus,
                                             clerk: User) -> None:
    answer = call(bus, method)

    assert call(clerk, method) == answer
    assert call(bus, method) == answer


def test_lists_follow_the_files(service: Service, bus: Bus) -> None:
    assert bus.call("GetUserList") == (USERS,)
    assert bus.call("GetGroupList") == (GROUPS,)


def test_answers_come_from_the_files_as_they_were_at_the_start(
        bus: Bus, accounts: AccountFiles, start: StartService, authz: FakeAuthz) -> None:
    service = start(environment=authz.environment())
    service.wait_registered(bus)
    accounts.write(STANDARD_PASSWD + "late:x:1001:0:::\n", STANDARD_SHADOW + "late:!:::::::\n",
                   STANDARD_GROUP + "late:x:800:\n")

    assert bus.call("CheckUser", "s", "late") == (False,)
    assert bus.call("CheckGroup", "s", "late") == (False,)
    assert service.stop() == 0
    start(environment=authz.environment()).wait_registered(bus)
    assert bus.call("CheckUser", "s", "late") == (True,)
    assert bus.call("CheckGroup", "s", "late") == (True,)


@pytest.mark.parametrize("member, known, unknown", [
    ("CheckUser", "clerk", "privane-viewer"),
    ("CheckGroup", "privane-viewer", "messagebu"),
])
def test_check_tells_existing_names_from_others(member: str, known: str, unknown: str,
                                                service: Service, bus: Bus) -> None:
    assert bus.call(member, "s", known) == (True,)
    for name in (unknown, "", " ", known + " ", known.upper(), "x" * 100_000, "né", "%s%n"):
        assert bus.call(member, "s", name) == (False,)


@pytest.mark.parametrize("name", ["x", "", "privane-viewer", "root\t", "%s%n", "né"])
def test_unknown_user_is_an_error(name: str, service: Service, bus: Bus) -> None:
    assert error_of(bus.call, "GetUser", "s", name) == domain_error(
        "usermgmt", 3, f"Could not retrieve user '{name}', user does not exist")


@pytest.mark.parametrize("name", ["x", "", "Root", "%s%n", "né"])
def test_unknown_group_is_an_error(name: str, service: Service, bus: Bus) -> None:
    assert error_of(bus.call, "GetGroup", "s", name) == domain_error(
        "usermgmt", 4, f"Group '{name}' does not exist")
