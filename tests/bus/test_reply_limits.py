"""tests/bus/test_reply_limits.py: answers that are too large for a message of the bus."""
from typing import Callable, Iterator

import pytest

from harness.accounts import AccountFiles
from harness.bus import Bus, domain_error, error_of
from harness.fake_authz import FakeAuthz
from harness.service import Service
from harness.service_fixtures import StartService

# dbus-daemon's limit for a message, beyond which it drops the connection of the sender.
MESSAGE_LIMIT = 32 * 1024 * 1024

# The largest arguments of a call that are let in, service/intake.h.
CALL_COST = 4 << 20

# G_FILE_ERROR_FAILED
TOO_LARGE = "org.gtk.GDBus.UnmappedGError.Quark._g_2dfile_2derror_2dquark.Code24"

# Few long names: tests and syslog get through them sooner than through many short ones.
NAME_LENGTH = 8000

# The C library's time to read a line grows with the square of its length: one of 33 MiB takes
# minutes. So a test with longer lines needs the fake reader.
LINE_LENGTH = 1 << 20

Start = Callable[..., Service]


def names(prefix: str, size: int) -> list[str]:
    """So many different names that they are size bytes long together."""
    return [f"{prefix}{number}-".ljust(NAME_LENGTH, "n") for number in range(size // NAME_LENGTH)]


@pytest.fixture
def start_on(accounts: AccountFiles, start: StartService, authz: FakeAuthz,
             bus: Bus) -> Iterator[Start]:
    """Starts the service on the given files, which the test must leave alive."""
    services = []

    def start_service(passwd: str, group: str) -> Service:
        accounts.write_exactly(passwd, "", group)
        services.append(start(environment=authz.environment()))
        services[-1].wait_registered(bus)
        return services[-1]
    yield start_service
    for service in services:
        assert service.is_running(), f"the service ended: {service.status}, {service.output()}"
        assert bus.call("CheckGroup", "s", "root") == (True,)
        assert service.stop() == 0


def assert_too_large(service: Service, bus: Bus, member: str, *arguments: str) -> None:
    before = service.output()

    error = error_of(bus.call, member, "s" * len(arguments), *arguments, timeout=30)

    assert error.name == TOO_LARGE
    assert error.text.startswith("The reply of ")
    assert error.text.endswith(" bytes is larger than a bus message may be")
    assert int(error.text.split()[3]) > MESSAGE_LIMIT - 128 * 1024
    assert service.output() == before + [f"warning: {error.text}"]


def test_members_of_one_group_that_are_too_large(start_on: Start, bus: Bus) -> None:
    group = f"root:x:0:\nusers:x:100:{','.join(names('m', 33 << 20))}\nstaff:x:50:alice\n"
    service = start_on("", group)

    assert_too_large(service, bus, "GetGroup", "users")
    assert_too_large(service, bus, "GetGroupListFull")
    assert bus.call("GetGroupList") == (["root", "users", "staff"],)
    assert bus.call("GetGroup", "s", "staff") == (50, ["alice"])


def groups_of_members(size: int) -> str:
    """Lines of a group file whose members are size bytes long together."""
    return "".join(f"group{i}:x:{500 + i}:{','.join(names(f'{i}m', LINE_LENGTH))}\n"
                   for i in range(size // LINE_LENGTH))


def test_members_of_all_groups_that_are_too_large_together(start_on: Start, bus: Bus) -> None:
    service = start_on("", "root:x:0:\n" + groups_of_members(33 << 20))

    assert_too_large(service, bus, "GetGroupListFull")
    assert len(bus.call("GetGroup", "s", "group32")[1]) == LINE_LENGTH // NAME_LENGTH


def test_group_names_that_are_too_large_together(start_on: Start, bus: Bus) -> None:
    groups = "".join(f"{name}:x:500:\n" for name in names("g", 33 << 20))
    service = start_on("", "root:x:0:\n" + groups)

    assert_too_large(service, bus, "GetGroupList")
    assert_too_large(service, bus, "GetGroupListFull")


def test_user_names_that_are_too_large_together(start_on: Start, bus: Bus) -> None:
    users = "".join(f"{name}:*:1000:0:::\n" for name in names("u", 33 << 20))
    service = start_on(users, "root:x:0:\n")

    assert_too_large(service, bus, "GetUserList")


def test_secondary_groups_that_are_too_large_together(start_on: Start, bus: Bus) -> None:
    groups = "".join(f"{name}:x:500:alice\n" for name in names("g", 33 << 20))
    service = start_on("alice:*:1001:0:::\nbob:*:1002:0:::\n", "root:x:0:\n" + groups)

    assert_too_large(service, bus, "GetUser", "alice")
    assert bus.call("GetUser", "s", "bob") == (True, "root", [], "", 1002)


def test_large_answer_that_fits_is_sent(start_on: Start, bus: Bus) -> None:
    start_on("", "root:x:0:\n" + groups_of_members(31 << 20))

    names_told, gids, members = bus.call("GetGroupListFull", timeout=30)
    assert names_told == ["root"] + [f"group{i}" for i in range(31)]
    assert gids == [0] + [500 + i for i in range(31)]
    assert [len(row) for row in members] == [0] + [LINE_LENGTH // NAME_LENGTH] * 31


def test_large_error_text_is_sent(service: Service, bus: Bus) -> None:
    name = "x" * (CALL_COST - 1)

    error = error_of(bus.call, "GetGroup", "s", name, timeout=30)

    assert error == domain_error("usermgmt", 4, f"Group '{name}' does not exist")
