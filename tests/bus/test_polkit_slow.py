"""tests/bus/test_polkit_slow.py: many calls at once while polkit takes its time, or hangs."""
import time
from collections import Counter
from typing import Iterator

import pytest
from gi.repository import Gio

from harness.accounts import CLERK_UID
from harness.bus import Bus, User, domain_error
from harness.interface import ACTION_PREFIX
from harness.monitor import Monitor
from harness.polkit import hanging_polkitd, local_rules
from harness.sandbox import fake_library
from harness.service import Service
from harness.service_fixtures import StartService
from harness.wire import Wire, as_user

pytestmark = pytest.mark.polkit

CALLS = 10

# Longer than libauthz waits before it looks whether the answer was lost.
RULE_SECONDS = 1.3
SLOW_RULE = f"""
polkit.addRule(function (action, subject) {{
    if (action.id !== "{ACTION_PREFIX}checkuser" || subject.user !== "clerk")
        return undefined;
    polkit.spawn(["/bin/sleep", "{RULE_SECONDS}"]);
    return polkit.Result.YES;
}});
"""

# By default, and of the library that has a short one.
DEADLINE = 25.0
SHORT_DEADLINE = 0.3

# How often libauthz looks, at most, within the default deadline.
MOST_PROBES = 27

# Of an answer that waits for nothing but a busy machine: less than the default deadline.
PATIENCE = 15.0

POLKIT = "org.freedesktop.PolicyKit1"

SILENCE = domain_error("authz", 4, "Authorization check failed: cannot check action "
                                   f"{ACTION_PREFIX}checkuser: no answer in time")


@pytest.fixture
def hasty_service(start: StartService, bus: Bus) -> Iterator[Service]:
    """With polkit deciding within the short deadline."""
    library = fake_library("authz_short_deadline/libauthz.so.1")
    running = start(environment={"LD_LIBRARY_PATH": str(library.parent)})
    running.wait_registered(bus)
    yield running
    assert running.stop() == 0


@pytest.fixture
def monitor() -> Iterator[Monitor]:
    """Of what polkit is asked, and of all answers."""
    listener = Monitor(f"type='method_call',destination='{POLKIT}'",
                       "type='method_return'", "type='error'")
    yield listener
    listener.close()


def call(wire: Wire, count: int) -> list[int]:
    return [wire.send("CheckUser", "s", "root") for _ in range(count)]


def until_answered(monitor: Monitor, serial: int) -> list[Gio.DBusMessage]:
    """All up to the answer to a call."""
    return monitor.until(lambda message: message.get_reply_serial() == serial
                         and message.get_body().unpack() == (True,))


def require_at_once(messages: list[Gio.DBusMessage], count: int) -> None:
    """Each of the last so many calls was answered as soon as polkit had answered: with nothing said
    to polkit in between, neither a question nor a look whether it lives."""
    questions = [at for at, message in enumerate(messages)
                 if message.get_member() == "CheckAuthorization"]
    assert len(questions) >= count
    for at in questions[-count:]:
        question = (messages[at].get_sender(), messages[at].get_serial())
        rest = iter(messages[at + 1:])
        assert any((message.get_destination(), message.get_reply_serial()) == question
                   for message in rest), "polkit did not answer"
        after = next(message for message in rest if message.get_sender() == question[0])
        assert after.get_reply_serial() > 0, after.get_member()


def answers(wire: Wire, count: int, seconds: float) -> list[tuple[int, object, float]]:
    """Which call was answered, how, and how long that took since the last answer."""
    seen, before = [], time.monotonic()
    for _ in range(count):
        message = wire.receive(seconds)
        now = time.monotonic()
        seen.append((message.reply_serial, message.answer(), now - before))
        before = now
    return seen


@pytest.mark.slow
def test_slow_polkit_is_waited_for_by_each_of_many_calls(
        real_service: Service, bus: Bus, clerk: User, privane_gid: int, monitor: Monitor) -> None:
    with as_user(CLERK_UID, [privane_gid]):
        wire = Wire()
    before = real_service.output()

    with local_rules(bus, clerk, SLOW_RULE):
        serials = call(wire, CALLS)
        seen = answers(wire, CALLS, DEADLINE)

    wire.close()
    assert [(serial, answer) for serial, answer, _ in seen] == [(serial, (True,))
                                                                for serial in serials]
    assert sum(taken for *_, taken in seen) >= CALLS * RULE_SECONDS
    assert real_service.output() == before
    # It works on no question twice.
    messages = until_answered(monitor, serials[-1])
    actions = [message.get_body().unpack()[1] for message in messages
               if message.get_member() == "CheckAuthorization"]
    assert actions.count(f"{ACTION_PREFIX}checkuser") == CALLS


@pytest.mark.slow
def test_hanging_polkitd_costs_one_call_its_deadline(real_service: Service, bus: Bus,
                                                     monitor: Monitor) -> None:
    assert bus.call("CheckUser", "s", "root") == (True,)
    wire = Wire()
    before = real_service.output()

    with hanging_polkitd():
        (serial,) = call(wire, 1)
        [(answered, answer, seconds)] = answers(wire, 1, DEADLINE + 10)

    assert (answered, answer) == (serial, SILENCE)
    assert DEADLINE - 1 < seconds < DEADLINE + 10
    assert real_service.output() == before + [f"warning: {SILENCE.text}"]
    members = members_until_error(monitor)
    # Before it, one that was answered.
    assert members["CheckAuthorization"] == 1 + 1
    assert 0 < members["Get"] <= MOST_PROBES
    (serial,) = call(wire, 1)
    assert answers(wire, 1, PATIENCE)[0][:2] == (serial, (True,))
    require_at_once(until_answered(monitor, serial), 1)
    wire.close()


def members_until_error(monitor: Monitor) -> Counter[str | None]:
    """What polkit was asked, and how often, before somebody was answered with an error."""
    seen = monitor.until(lambda message: message.get_error_name() is not None)
    return Counter(message.get_member() for message in seen)


def test_calls_in_a_row_each_have_the_deadline(hasty_service: Service, bus: Bus,
                                               monitor: Monitor) -> None:
    assert bus.call("CheckUser", "s", "root") == (True,)
    wire = Wire()
    before = hasty_service.output()

    with hanging_polkitd():
        serials = call(wire, CALLS)
        seen = answers(wire, CALLS, PATIENCE)
        assert [(serial, answer) for serial, answer, _ in seen] == [(serial, SILENCE)
                                                                    for serial in serials]
        # The service's clock started before ours, which does behind the calls.
        assert sum(seconds for *_, seconds in seen) >= (CALLS - 0.5) * SHORT_DEADLINE
    (serial,) = call(wire, 1)
    assert answers(wire, 1, PATIENCE)[0][:2] == (serial, (True,))
    require_at_once(until_answered(monitor, serial), 1)

    wire.close()
    assert hasty_service.output() == before + [f"warning: {SILENCE.text}"] * CALLS


def test_call_that_waits_when_polkit_returns_is_answered(real_service: Service, bus: Bus,
                                                         monitor: Monitor) -> None:
    """With all that wait behind it."""
    assert bus.call("CheckUser", "s", "root") == (True,)
    wire = Wire()
    with hanging_polkitd():
        serials = call(wire, CALLS)
        assert wire.is_silent(3.5)

    seen = answers(wire, CALLS, PATIENCE)
    wire.close()
    assert [(serial, answer) for serial, answer, _ in seen] == [(serial, (True,))
                                                                for serial in serials]
    # Each was asked once, the one that waited as well, and one before them.
    messages = until_answered(monitor, serials[-1])
    questions = [message for message in messages if message.get_member() == "CheckAuthorization"]
    assert len(questions) == 1 + CALLS
    require_at_once(messages, CALLS)
