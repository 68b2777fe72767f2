"""tests/bus/test_user_queries.py: GetUser and GetUserList."""
from typing import Callable, Iterator

import pytest

from harness.accounts import HASH, AccountFiles
from harness.bus import Bus
from harness.fake_authz import FakeAuthz
from harness.service_fixtures import StartService

Serve = Callable[..., Bus]

GROUPS = """\
root:x:0:
audio:x:29:alice
users:x:100:alice,bob
video:x:44:bob,alice
wheel:x:27:
staff:x:50:
low:x:1:
high:x:999:
nvr:x:60001:
nogroup:x:65534:
"""


@pytest.fixture
def serve(accounts: AccountFiles, start: StartService, authz: FakeAuthz,
          bus: Bus) -> Iterator[Serve]:
    """Starts the service on the given files; without a shadow text, every user has a line there."""
    services = []

    def start_on(passwd: str | bytes, group: str | bytes = GROUPS,
                 shadow: str | bytes | None = None) -> Bus:
        if shadow is None:
            lines = passwd.encode() if isinstance(passwd, str) else passwd
            shadow = b"".join(line.split(b":")[0] + f":{HASH}:19000:0:99999:7:::\n".encode()
                              for line in lines.splitlines())
        accounts.write_exactly(passwd, shadow, group)
        services.append(start(environment=authz.environment()))
        services[-1].wait_registered(bus)
        return bus
    yield start_on
    for service in services:
        assert service.is_running(), f"the service ended: {service.status}, {service.output()}"
        assert service.stop() == 0


def test_user_is_described(serve: Serve) -> None:
    bus = serve("alice:x:1001:100:Alice Liddell,room 1:/home/alice:/bin/sh\n")

    assert bus.call("GetUser", "s", "alice") == (
        True, "users", ["audio", "video"], "Alice Liddell,room 1", 1001)


def test_secondary_groups_follow_the_group_file(serve: Serve) -> None:
    bus = serve("bob:x:1002:50:::\n")

    assert bus.call("GetUser", "s", "bob")[1:3] == ("staff", ["users", "video"])


def test_primary_group_is_left_out_of_the_secondary_ones(serve: Serve) -> None:
    bus = serve("alice:x:1001:44:::\n")

    assert bus.call("GetUser", "s", "alice")[1:3] == ("video", ["audio", "users"])


def test_user_without_secondary_groups_has_an_empty_list(serve: Serve) -> None:
    bus = serve("carol:x:1003:50:::\n")

    assert bus.call("GetUser", "s", "carol") == (True, "staff", [], "", 1003)


def test_absent_comment_is_empty(serve: Serve) -> None:
    bus = serve("alice:x:1001:100::/home/alice:/bin/sh\n")

    assert bus.call("GetUser", "s", "alice")[3] == ""


@pytest.mark.parametrize("field", [HASH, "*", "!", "!" + HASH, ""],
                         ids=["hash", "star", "lock", "locked hash", "empty"])
def test_password_field_of_the_shadow_file_is_a_password(field: str, serve: Serve) -> None:
    bus = serve("alice:x:1001:100:::\n", shadow=f"alice:{field}:19000:0:99999:7:::\n")

    assert bus.call("GetUser", "s", "alice")[0] is True


@pytest.mark.parametrize("field", [HASH, "*", "!", ""], ids=["hash", "star", "lock", "empty"])
def test_password_field_of_the_passwd_file_is_a_password(field: str, serve: Serve) -> None:
    bus = serve(f"alice:{field}:1001:100:::\n", shadow="")

    assert bus.call("GetUser", "s", "alice")[0] is True


def test_line_without_a_password_field_has_no_password(serve: Serve) -> None:
    # The only line of the file that the C library reads as a user without one.
    bus = serve("root:x:0:0:::\n+guest\n")

    assert bus.call("GetUser", "s", "+guest") == (False, "root", [], "", 0)


@pytest.mark.parametrize("uid", [0, 1, 499, 500, 999, 1000, 60000, 65534])
def test_uid_is_told(uid: int, serve: Serve) -> None:
    bus = serve(f"alice:x:{uid}:100:::\n")

    assert bus.call("GetUser", "s", "alice")[4] == uid


@pytest.mark.parametrize("gid, group", [(0, "root"), (1, "low"), (999, "high"), (60001, "nvr"),
                                        (65534, "nogroup")])
def test_primary_group_is_found_by_its_number(gid: int, group: str, serve: Serve) -> None:
    bus = serve(f"alice:x:1001:{gid}:::\n")

    assert bus.call("GetUser", "s", "alice")[1] == group


def test_primary_group_of_two_with_one_number_is_the_later(serve: Serve) -> None:
    bus = serve("alice:x:1001:100:::\n", group="users:x:100:\npeople:x:100:alice\n")

    # Both keep their names; the number leads to the group that was read last.
    assert bus.call("GetUser", "s", "alice")[1:3] == ("people", [])
    assert bus.call("GetGroupList") == (["users", "people"],)


def test_users_are_listed_in_file_order(serve: Serve) -> None:
    names = ["zoe", "root", "alice", "Bob", "0number", "mid", "a"]
    bus = serve("".join(f"{name}:x:{1000 + i}:100:::\n" for i, name in enumerate(names)))

    assert bus.call("GetUserList") == (names,)


def test_no_users_are_an_empty_list(serve: Serve) -> None:
    bus = serve("", shadow="")

    assert bus.call("GetUserList") == ([],)


def test_many_users_are_listed(serve: Serve) -> None:
    names = [f"user{number}" for number in range(20_000)]
    bus = serve("".join(f"{name}:x:{1000 + i}:100:::\n" for i, name in enumerate(names)))

    assert bus.call("GetUserList") == (names,)
    assert bus.call("GetUser", "s", names[-1])[4] == 20_999


def test_name_that_stands_twice_is_listed_twice_and_described_by_the_later(serve: Serve) -> None:
    bus = serve("alice:x:1001:100:first:::\nalice:x:1002:50:second:::\n",
                shadow=f"alice:{HASH}:19000:0:99999:7:::\n")

    assert bus.call("GetUserList") == (["alice", "alice"],)
    assert bus.call("GetUser", "s", "alice") == (
        True, "staff", ["audio", "users", "video"], "second", 1002)


def test_utf8_comes_through_unchanged(serve: Serve) -> None:
    bus = serve("jörg:x:1001:100:Jörg Ω 猫:::\n", group="users:x:100:\nmäuse:x:101:jörg\n")

    assert bus.call("GetUserList") == (["jörg"],)
    assert bus.call("GetUser", "s", "jörg") == (True, "users", ["mäuse"], "Jörg Ω 猫", 1001)


def test_bytes_that_are_no_utf8_are_replaced(serve: Serve) -> None:
    bus = serve(b"alice:x:1001:100:caf\xe9 \xff\xfe:::\nj\xf6rg:x:1002:100:::\n",
                group=b"gr\xfcn:x:100:\nbla\xfc:x:101:alice\n")

    assert bus.call("GetUser", "s", "alice") == (
        True, "gr\ufffdn", ["bla\ufffd"], "caf\ufffd \ufffd\ufffd", 1001)
    assert bus.call("GetUserList") == (["alice", "j\ufffdrg"],)
    # A substitute stands for a byte and is no name.
    assert bus.call("CheckUser", "s", "j\ufffdrg") == (False,)
