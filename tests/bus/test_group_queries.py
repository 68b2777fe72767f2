"""tests/bus/test_group_queries.py: GetGroup, GetGroupList and GetGroupListFull."""
from typing import Callable, Iterator

import pytest

from harness.accounts import AccountFiles
from harness.bus import Bus
from harness.fake_authz import FakeAuthz
from harness.service_fixtures import StartService

Serve = Callable[[str | bytes], Bus]


@pytest.fixture
def serve(accounts: AccountFiles, start: StartService, authz: FakeAuthz,
          bus: Bus) -> Iterator[Serve]:
    """Starts the service on the given group file, and no users."""
    services = []

    def start_on(group: str | bytes) -> Bus:
        accounts.write_exactly("", "", group)
        services.append(start(environment=authz.environment()))
        services[-1].wait_registered(bus)
        return bus
    yield start_on
    for service in services:
        assert service.is_running(), f"the service ended: {service.status}, {service.output()}"
        assert service.stop() == 0


def test_group_is_described(serve: Serve) -> None:
    bus = serve("users:x:100:alice,bob,carol\n")

    gid, members = bus.call("GetGroup", "s", "users")
    assert gid == 100
    assert sorted(members) == ["alice", "bob", "carol"]


def test_group_without_members_has_an_empty_list(serve: Serve) -> None:
    bus = serve("users:x:100:\n")

    assert bus.call("GetGroup", "s", "users") == (100, [])


def test_member_that_stands_twice_is_told_once(serve: Serve) -> None:
    bus = serve("users:x:100:alice,alice\n")

    assert bus.call("GetGroup", "s", "users") == (100, ["alice"])


def test_users_are_members_only_where_the_file_lists_them(
        accounts: AccountFiles, start: StartService, authz: FakeAuthz, bus: Bus) -> None:
    accounts.write_exactly("alice:*:1001:100:::\nbob:*:1002:50:::\n", "",
                           "users:x:100:bob\nstaff:x:50:\n")
    start(environment=authz.environment()).wait_registered(bus)

    assert bus.call("GetGroup", "s", "users") == (100, ["bob"])
    assert bus.call("GetGroup", "s", "staff") == (50, [])


@pytest.mark.parametrize("gid", [0, 1, 499, 500, 999, 60001, 60010, 65534])
def test_gid_is_told(gid: int, serve: Serve) -> None:
    bus = serve(f"users:x:{gid}:\n")

    assert bus.call("GetGroup", "s", "users") == (gid, [])
    assert bus.call("GetGroupListFull") == (["users"], [gid], [[]])


def test_groups_are_listed_in_file_order(serve: Serve) -> None:
    names = ["zebra", "root", "audio", "Big", "0number", "mid"]
    bus = serve("".join(f"{name}:x:{500 + i}:\n" for i, name in enumerate(names)))

    assert bus.call("GetGroupList") == (names,)


def test_no_groups_are_empty_arrays(serve: Serve) -> None:
    bus = serve("")

    assert bus.call("GetGroupList") == ([],)
    assert bus.call("GetGroupListFull") == ([], [], [])


def test_full_list_is_aligned(serve: Serve) -> None:
    bus = serve("wheel:x:27:\nusers:x:100:alice,bob\nempty:x:60001:\nvideo:x:44:carol\n")

    names, gids, members = bus.call("GetGroupListFull")

    assert names == ["wheel", "users", "empty", "video"]
    assert gids == [27, 100, 60001, 44]
    assert [sorted(row) for row in members] == [[], ["alice", "bob"], [], ["carol"]]
    assert (names,) == bus.call("GetGroupList")


def test_full_list_agrees_with_single_answers(serve: Serve) -> None:
    bus = serve("".join(f"group{i}:x:{500 + i}:{','.join(f'm{n}' for n in range(i))}\n"
                        for i in range(100)))

    names, gids, members = bus.call("GetGroupListFull")

    for name, gid, row in zip(names, gids, members, strict=True):
        assert bus.call("GetGroup", "s", name) == (gid, row)


def test_full_list_names_both_groups_of_one_number(serve: Serve) -> None:
    bus = serve("users:x:100:alice\npeople:x:100:bob\n")

    assert bus.call("GetGroupListFull") == (["users", "people"], [100, 100], [["alice"], ["bob"]])


def test_group_of_100000_members_is_told(serve: Serve) -> None:
    names = [f"member{number}" for number in range(100_000)]
    bus = serve(f"users:x:100:{','.join(names)}\n")

    gid, members = bus.call("GetGroup", "s", "users")
    assert gid == 100
    assert sorted(members) == sorted(names)
    assert [sorted(row) for row in bus.call("GetGroupListFull")[2]] == [sorted(names)]


def test_utf8_comes_through_unchanged(serve: Serve) -> None:
    bus = serve("mäuse:x:100:jörg,猫\n")

    gid, members = bus.call("GetGroup", "s", "mäuse")
    assert (gid, sorted(members)) == (100, ["jörg", "猫"])


def test_bytes_that_are_no_utf8_are_replaced(serve: Serve) -> None:
    bus = serve(b"gr\xfcn:x:100:j\xf6rg\nusers:x:101:\xff\n")

    assert bus.call("GetGroupList") == (["gr\ufffdn", "users"],)
    assert bus.call("GetGroupListFull") == (
        ["gr\ufffdn", "users"], [100, 101], [["j\ufffdrg"], ["\ufffd"]])
    assert bus.call("GetGroup", "s", "users") == (101, ["\ufffd"])
    # A substitute stands for a byte and is no name.
    assert bus.call("CheckGroup", "s", "gr\ufffdn") == (False,)
