"""tests/bus/test_loading.py: account files that are not as they should be, seen from outside."""
from pathlib import Path
from typing import Callable, Iterator

import pytest

from harness.accounts import HASH, AccountFiles
from harness.bus import Bus
from harness.fake_authz import FakeAuthz
from harness.service import Service
from harness.service_fixtures import StartService
from harness.syslog_socket import SyslogSocket

LOG_ERR = 3
LOG_WARNING = 4

Load = Callable[..., list[tuple[int, str]]]


@pytest.fixture
def load(accounts: AccountFiles, start: StartService, authz: FakeAuthz, bus: Bus,
         syslog: SyslogSocket) -> Iterator[Load]:
    """Starts the service on the given files and returns what it told syslog: (severity, text)."""
    services: list[Service] = []

    def load_files(passwd: str | bytes = "", shadow: str | bytes | None = "",
                   group: str | bytes = "root:x:0:\n") -> list[tuple[int, str]]:
        accounts.write_exactly(passwd, shadow, group)
        services.append(start(environment=authz.environment()))
        services[-1].wait_registered(bus)
        return syslog.texts()
    yield load_files
    for service in services:
        assert service.is_running(), f"the service ended: {service.status}, {service.output()}"
        assert service.stop() == 0


def users(bus: Bus) -> list[str]:
    return bus.call("GetUserList")[0]


def groups(bus: Bus) -> list[str]:
    return bus.call("GetGroupList")[0]


def test_sound_files_load_without_a_word(load: Load, bus: Bus) -> None:
    assert load(f"root:x:0:0:root:/root:/bin/sh\nalice:{HASH}:1001:100:::\n",
                f"root:{HASH}:19000:0:99999:7:::\n", "root:x:0:\nusers:x:100:alice\n") == []
    assert users(bus) == ["root", "alice"]
    assert groups(bus) == ["root", "users"]


def test_empty_files_load_without_a_word(load: Load, bus: Bus) -> None:
    assert load("", "", "") == []
    assert users(bus) == []
    assert groups(bus) == []


def test_first_of_two_groups_with_one_name_is_kept(load: Load, bus: Bus) -> None:
    told = load(group="users:x:100:\nroot:x:0:\nusers:x:200:\nusers:x:300:\n")

    assert told == [(LOG_WARNING, "Skipping duplicate group entry 'users'")] * 2
    assert bus.call("GetGroupListFull") == (["users", "root"], [100, 0], [[], []])


@pytest.mark.parametrize("gid", [1000, 5000, 60000, 60011, 65533, 65535, 4294967294])
def test_group_whose_number_has_no_type_is_skipped(gid: int, load: Load, bus: Bus) -> None:
    told = load(group=f"root:x:0:\nvisitors:x:{gid}:\nusers:x:100:\n")

    assert told == [(LOG_ERR, "Failed to parse group 'visitors': unable to determine group type")]
    assert groups(bus) == ["root", "users"]
    assert bus.call("CheckGroup", "s", "visitors") == (False,)


@pytest.mark.parametrize("uid", [60001, 65533, 65535, 4294967294])
def test_user_whose_number_has_no_type_is_skipped(uid: int, load: Load, bus: Bus) -> None:
    told = load(f"root:*:0:0:::\nalice:*:{uid}:0:::\nbob:*:1002:0:::\n")

    assert told == [(LOG_WARNING, "Failed to parse user 'alice': "
                                  "user type for alice could not be determined!")]
    assert users(bus) == ["root", "bob"]


def test_user_whose_group_was_skipped_is_skipped(load: Load, bus: Bus) -> None:
    told = load("alice:*:1001:5000:::\nbob:*:1002:0:::\n", group="root:x:0:\nalice:x:5000:\n")

    assert told == [
        (LOG_ERR, "Failed to parse group 'alice': unable to determine group type"),
        (LOG_WARNING, "Failed to parse user 'alice': "
                      "no group was found on the system for GID '5000'")]
    assert users(bus) == ["bob"]


def test_user_without_a_group_is_skipped(load: Load, bus: Bus) -> None:
    told = load("alice:*:1001:77:::\nbob:*:1002:4294967295:::\nroot:*:0:0:::\n")

    assert told == [
        (LOG_WARNING, "Failed to parse user 'alice': "
                      "no group was found on the system for GID '77'"),
        (LOG_WARNING, "Failed to parse user 'bob': "
                      "no group was found on the system for GID '-1'")]
    assert users(bus) == ["root"]


def test_user_without_a_shadow_line_is_skipped(load: Load, bus: Bus) -> None:
    told = load("alice:x:1001:0:::\nbob:x:1002:0:::\n", "bob:!:19000:0:99999:7:::\n")

    assert told == [(LOG_WARNING, "Failed to parse user 'alice': "
                                  "no corresponding shadow entry was found for 'alice'")]
    assert users(bus) == ["bob"]


def test_without_a_shadow_file_only_users_of_the_passwd_file_load(load: Load, bus: Bus) -> None:
    told = load(f"root:x:0:0:::\nalice:{HASH}:1001:0:::\nbob:x:1002:0:::\n", None)

    assert told == [
        (LOG_WARNING, f"Failed to parse user '{name}': "
                      f"no corresponding shadow entry was found for '{name}'")
        for name in ("root", "bob")]
    assert users(bus) == ["alice"]
    assert not Path("/etc/shadow").exists()


def test_shadow_line_without_a_user_is_no_matter(load: Load, bus: Bus) -> None:
    assert load("root:x:0:0:::\n", "ghost:!:::::::\nroot:!:::::::\n") == []
    assert users(bus) == ["root"]


def test_member_that_is_no_user_is_told(load: Load, bus: Bus) -> None:
    told = load("alice:*:1001:0:::\n", group="root:x:0:alice,ghost\nusers:x:100:ghost\n")

    assert told == [
        (LOG_WARNING, "Group 'root' lists member 'ghost', which has no passwd line"),
        (LOG_WARNING, "Group 'users' lists member 'ghost', which has no passwd line")]
    assert sorted(bus.call("GetGroup", "s", "root")[1]) == ["alice", "ghost"]


def test_lines_of_the_network_information_service_do_no_harm(load: Load, bus: Bus) -> None:
    told = load("root:*:0:0:root:/root:/bin/sh\n+alice::::::\n-bob::::::\n+\n-\n+@team::::::\n"
                "+::::::\n", "root:!:::::::\n+::::::::\n+\n-bob\n", "root:x:0:\n+:::\n-\n+users\n")

    # The C library reads them as records of number 0, as which they are listed.
    assert told == []
    assert users(bus) == ["root", "+alice", "-bob", "+", "-", "+@team", "+"]
    assert groups(bus) == ["root", "+", "-", "+users"]
    assert bus.call("GetUser", "s", "-bob")[4] == 0
    assert bus.call("GetGroup", "s", "+users") == (0, [])


DAMAGED_PASSWD = b"""\
# a comment

root:*:0:0:root:/root:/bin/sh
short
short:*
short:*:1
number:*:one:0:::
number:*:1001:zero:::
number:*:99999999999999999999:0:::
number:*:-1:0:::
  blank:*:1002:0:::
:*:1003:0:no name::
\tcomment:# *:1004:0:::
nul\0byte:*:1005:0:::
more:*:1006:0:a:b:c:d:e
last:*:1007:0:no line end::"""


def test_damaged_user_lines_are_passed_over(load: Load, bus: Bus) -> None:
    assert load(DAMAGED_PASSWD) == []

    # The C library takes blanks before a line away, and a line may lack its name.
    assert users(bus) == ["root", "blank", "", "comment", "more", "last"]
    assert bus.call("GetUser", "s", "") == (True, "root", [], "no name", 1003)
    assert bus.call("GetUser", "s", "more") == (True, "root", [], "a", 1006)
    assert bus.call("GetUser", "s", "last") == (True, "root", [], "no line end", 1007)


DAMAGED_GROUP = b"""\
# a comment

root:x:0:
short
short:x
number:x:one:
number:x:-1:
number:x:99999999999999999999:
  blank:x:500:
:x:501:
users:x:100:alice,,bob,
more:x:502:alice:more
last:x:503:bob"""


def test_damaged_group_lines_are_passed_over(load: Load, bus: Bus) -> None:
    told = load("alice:*:1001:0:::\nbob:*:1002:0:::\n", group=DAMAGED_GROUP)

    names, gids, members = bus.call("GetGroupListFull")
    assert names == ["root", "blank", "", "users", "more", "last"]
    assert gids == [0, 500, 501, 100, 502, 503]
    assert [sorted(row) for row in members] == [[], [], [], ["alice", "bob"], ["alice:more"],
                                                ["bob"]]
    assert told == [
        (LOG_WARNING, "Group 'more' lists member 'alice:more', which has no passwd line")]


def test_damaged_shadow_lines_are_passed_over(load: Load, bus: Bus) -> None:
    told = load("root:x:0:0:::\nalice:x:1001:0:::\n",
                b"# a comment\n\nshort\nroot:!:nineteen:::::::\nroot:*:19000::::::\n")

    assert told == [(LOG_WARNING, "Failed to parse user 'alice': "
                                  "no corresponding shadow entry was found for 'alice'")]
    assert users(bus) == ["root"]


@pytest.mark.parametrize("content", [bytes(range(256)) * 64, b"\0" * 4096, b"\xff" * 4096,
                                     b":" * 4096, b"\n" * 4096, b"a" * 1_000_000],
                         ids=["all bytes", "zeros", "ones", "colons", "line ends", "long line"])
def test_rubbish_does_no_harm(content: bytes, load: Load, bus: Bus) -> None:
    load(b"root:*:0:0:::\n" + content, content, b"root:x:0:\n" + content)

    assert users(bus)[0] == "root"
    assert groups(bus)[0] == "root"
    assert bus.call("GetGroupListFull")[1][0] == 0
