"""tests/bus/test_intake.py: what the service lets in while it is busy, and what never."""
import os
from contextlib import contextmanager
from pathlib import Path
from typing import Callable, Iterator

import pytest
from gi.repository import Gio, GLib

from harness import packaged
from harness.bus import INTERFACE, NAME, PATH, Bus, BusError, domain_error, error_of
from harness.deadline import wait_for
from harness.device import LLDPCLI, Device
from harness.fake_authz import FakeAuthz
from harness.interface import ACTION_PREFIX, QUERIES
from harness.process import status
from harness.service import Service
from harness.stage import Stage
from harness.wire import Wire

TOO_MANY = BusError("org.freedesktop.DBus.Error.LimitsExceeded", "Too many calls are waiting")
TOO_LARGE = BusError("org.freedesktop.DBus.Error.LimitsExceeded",
                     "The arguments of the call are too large")

# As service/intake.h has them.
CALL_COST = 4 << 20
SENDER_CALLS = 16
SHARED_CALLS = 64

# Of these a call holds not much less than it may.
LONG_LIST = 29_000
KEPT_KIB = 5 * 1024

# The longest line of a web user, and how many there may be.
DIGEST_LINE = "{:0>14}:PRIVANE:" + "0" * 32 + "\n"
WEB_USERS = 59_001

OPENED = Path("/tmp/opened")


@contextmanager
def held_up(system: Stage, device: Device) -> Iterator[Callable[[], None]]:
    """The main loop is held up by a tool, until the function is called."""
    device.tools[LLDPCLI].before_answering(f"while [ ! -e {OPENED} ]; do sleep 0.01; done")
    system.wire.send("ExecuteLldpcli", "s", "show-neighbors")
    wait_for("the tool", lambda: (device.tools[LLDPCLI].directory / "descriptors").exists())
    yield OPENED.touch
    OPENED.touch()
    # The service has come to the end of the tool.
    assert system.bus.call("CheckUser", "s", "root") == (True,)
    OPENED.unlink()


@pytest.fixture
def busy(system: Stage, device: Device) -> Iterator[Callable[[], None]]:
    with held_up(system, device) as let_go:
        yield let_go


@pytest.fixture
def wires() -> Iterator[Callable[[int], list[Wire]]]:
    """Makes connections."""
    made: list[Wire] = []

    def make(count: int) -> list[Wire]:
        made.extend(Wire() for _ in range(count))
        return made[-count:]
    yield make
    for wire in made:
        wire.close()


def answers(wire: Wire, count: int) -> dict[int, object]:
    """By the number of the call."""
    messages = [wire.receive() for _ in range(count)]
    return {message.reply_serial: message.answer() for message in messages}


def test_64_connections_with_a_call_each_are_served(busy: Callable[[], None],
                                                    wires: Callable[[int], list[Wire]]) -> None:
    calls = [(wire, wire.send("CheckUser", "s", "root")) for wire in wires(64)]
    busy()
    for wire, serial in calls:
        assert answers(wire, 1) == {serial: (True,)}


def test_a_sender_has_its_share(busy: Callable[[], None],
                                wires: Callable[[int], list[Wire]]) -> None:
    eager, other = wires(2)
    serials = [eager.send("CheckUser", "s", "root") for _ in range(SENDER_CALLS + 1)]
    # At once, while the service is busy.
    assert answers(eager, 1) == {serials[-1]: TOO_MANY}
    asked = other.send("CheckUser", "s", "root")
    assert other.is_silent(0.2)
    busy()
    assert answers(eager, SENDER_CALLS) == dict.fromkeys(serials[:-1], (True,))
    assert answers(other, 1) == {asked: (True,)}
    # The places are free again.
    serial = eager.send("CheckUser", "s", "root")
    assert answers(eager, 1) == {serial: (True,)}


def test_many_eager_senders_leave_a_place_for_others(busy: Callable[[], None],
                                                     wires: Callable[[int], list[Wire]]) -> None:
    for eager in wires(SHARED_CALLS // SENDER_CALLS):
        for _ in range(SENDER_CALLS):
            eager.send("CheckUser", "s", "root")
    other, = wires(1)
    first, second = (other.send("CheckUser", "s", "root") for _ in range(2))
    assert answers(other, 1) == {second: TOO_MANY}
    busy()
    assert answers(other, 1) == {first: (True,)}


@pytest.mark.parametrize("size, is_taken", [(CALL_COST - 1, True), (CALL_COST, False)])
def test_the_largest_argument(size: int, is_taken: bool, service: Service, bus: Bus) -> None:
    # The text's terminator counts.
    name = "x" * size
    error = error_of(bus.call, "GetGroup", "s", name, timeout=30)
    if is_taken:
        assert error == domain_error("usermgmt", 4, f"Group '{name}' does not exist")
    else:
        assert error == TOO_LARGE


def test_a_digest_list_of_all_users_is_taken(system: Stage) -> None:
    users = "".join(map(DIGEST_LINE.format, range(WEB_USERS)))
    assert system.bus.call("Digest", "as", ["create", users], timeout=30) == ()
    (call,) = system.digest.calls()
    assert call.words[1] == users


def resident(service: Service) -> int:
    """In KiB."""
    return int(status(service.pid)["VmRSS"].split()[0])


def test_memory_of_large_calls_is_given_back(system: Stage, device: Device,
                                             wires: Callable[[int], list[Wire]]) -> None:
    system.stop()
    system.start(**packaged.environment())
    callers = wires(SHARED_CALLS // SENDER_CALLS)
    at_rest = resident(system.service)
    with held_up(system, device) as let_go:
        calls = [(wire, wire.send("ModifyUser", "sssasss", "root", "", "", ["nosuch"] * LONG_LIST,
                                  "", "")) for wire in callers]
        wait_for("their arrival", lambda: resident(system.service) > at_rest + 2 * KEPT_KIB)
        let_go()
        for wire, serial in calls:
            assert answers(wire, 1).keys() == {serial}
    wait_for("the memory", lambda: resident(system.service) <= at_rest + KEPT_KIB)


def test_a_long_list_is_refused(service: Service, bus: Bus) -> None:
    assert error_of(bus.call, "Pinsrv", "as", [""] * 40_000, timeout=30) == TOO_LARGE


def test_who_wants_no_answer_gets_none(service: Service, wires: Callable[[int], list[Wire]],
                                       bus: Bus) -> None:
    message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, "GetGroup")
    message.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
    message.set_body(GLib.Variant("(s)", ("x" * CALL_COST,)))
    heard = []
    bus.connection.add_filter(lambda _, heard_message, incoming: (
        heard.append(heard_message.get_reply_serial()) if incoming else None, heard_message)[1])
    _, serial = bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
    assert bus.call("CheckUser", "s", "root") == (True,)
    assert serial not in heard and heard


@pytest.mark.parametrize("member", [method.member for method in QUERIES])
def test_who_wants_no_answer_is_served(member: str, service: Service, authz: FakeAuthz,
                                       bus: Bus) -> None:
    (method,) = (row for row in QUERIES if row.member == member)
    message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, member)
    message.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
    if method.signature:
        message.set_body(GLib.Variant(f"({method.signature})", method.arguments))
    bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
    assert bus.call("CheckUser", "s", "root") == (True,)
    assert [check.action for check in authz.checks()][-2:] == [
        method.action_id, ACTION_PREFIX + "checkuser"]


def test_a_call_that_carries_descriptors_is_refused(service: Service, bus: Bus) -> None:
    before = os.listdir(f"/proc/{service.pid}/fd")
    message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, "CheckUser")
    message.set_body(GLib.Variant("(s)", ("root",)))
    message.set_unix_fd_list(Gio.UnixFDList.new_from_array([os.open("/dev/null", os.O_RDONLY)]))
    reply, _ = bus.connection.send_message_with_reply_sync(
        message, Gio.DBusSendMessageFlags.NONE, 10_000, None)
    assert reply.get_error_name() == "org.freedesktop.DBus.Error.InvalidArgs"
    assert reply.get_body().unpack() == ("No method takes file descriptors",)
    wait_for("the descriptors", lambda: os.listdir(f"/proc/{service.pid}/fd") == before)


def test_answers_to_the_services_own_calls_pass(real_service: Service, bus: Bus) -> None:
    # Of polkit, one a call, or of the bus.
    for _ in range(3 * SHARED_CALLS):
        assert bus.call("CheckUser", "s", "root") == (True,)


def test_answers_of_systemd_pass(system: Stage) -> None:
    for _ in range(3 * SENDER_CALLS):
        assert system.bus.call("StartService", "s", "lensd") == ()
