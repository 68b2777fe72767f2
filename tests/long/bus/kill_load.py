"""tests/long/bus/kill_load.py: several callers that change accounts, and a kill at a random moment.

A monitor of the bus tells in which order the calls reached the service and which it answered.
"""
import random
import select
import time
from collections import Counter
from contextlib import contextmanager
from typing import Any, Iterator

from gi.repository import Gio

from account_history import Call, History
from daemon_kill_points import Tracer
from harness.bus import INTERFACE, NAME, BusError
from harness.monitor import Monitor
from harness.passwords import MARK
from harness.wire import Wire
from killed_service import SIGNATURES, KilledService, same_error

CALLERS = 3
WINDOW = 2
LONGEST_MS = 60

# In half of the cases the disk is slow, so that the service is killed in the midst of writing and
# not of hashing: each of these calls on an account file takes so much longer.
SLOW_SHARE = 0.5
SLOW_CALLS = "rename,renameat,fsync"
SLOWNESS_US = 2000

USERS = ("carol", "dave", "erin", "frank")
SYSTEM_USERS = ("ftpd", "httpd", "snmpd")
STANDING = ("alice", "bob", "timer", "root")
GROUPS = ("guests", "staff", "night")
PRIMARY = ("users", "viewer", "operator")

# Every call to the service, every answer, and who owns its name.
SEEN = (f"type='method_call',interface='{INTERFACE}'", "type='method_return'", "type='error'",
        f"type='signal',member='NameOwnerChanged',arg0='{NAME}'")


def is_call(message: Gio.DBusMessage, call: Call) -> bool:
    body = message.get_body()
    return message.get_member() == call[0] and body is not None and body.unpack() == call[1:]


def is_loss_of_name(message: Gio.DBusMessage, owner: str) -> bool:
    """The owner of the service's name is it no more."""
    return (message.get_member() == "NameOwnerChanged"
            and message.get_body().unpack()[1:] == (owner, ""))


class Caller(Wire):
    """Has a few calls under way at a time."""

    def __init__(self) -> None:
        super().__init__()
        self.under_way = 0

    def fileno(self) -> int:
        return self._socket.fileno()

    def take(self) -> None:
        """One message, and those that came with it."""
        while True:
            if self.receive().kind != "signal":
                self.under_way -= 1
            if not self._buffer:
                return

    def begin(self, call: Call) -> None:
        self.send(call[0], SIGNATURES[call[0]], *call[1:])
        self.under_way += 1


class KillLoad:
    def __init__(self, killed: KilledService, chance: random.Random,
                 figures: Counter[str]) -> None:
        self._killed = killed
        self._chance = chance
        self._figures = figures
        self._callers = [Caller() for _ in range(CALLERS)]
        self._monitor = Monitor(*SEEN)
        self._passwords = 0
        self._marks = 0

    def close(self) -> None:
        for wire in (*self._callers, self._monitor):
            wire.close()

    def begin_afresh(self) -> None:
        self._killed.restart_on(self._killed.fresh)

    def strike(self) -> None:
        """Load, kill, judgement and recovery. The service runs afterwards."""
        killed = self._killed
        self._marks += 1
        mark = ("CheckUser", f"mark {self._marks}")
        assert killed.call(mark) is None
        self._monitor.until(lambda message: is_call(message, mark))
        history = History(killed.hashes)
        owner = killed.bus.owner()
        assert owner is not None
        with self._disk():
            self._load(self._chance.uniform(0, LONGEST_MS) / 1000)
            killed.kill()
        seen = self._monitor.until(lambda message: is_loss_of_name(message, owner))
        calls, answers = self._seen(seen, owner)
        self._drain()
        try:
            interrupted = self._judge(history, calls, answers)
            # Who takes their names or removes their groups would not be served as the model says.
            killed.repair(killed.recover(interrupted))
        except AssertionError as error:
            raise AssertionError(f"calls {calls}, answers {answers}: {error}") from error

    @contextmanager
    def _disk(self) -> Iterator[None]:
        """A slow one or not."""
        if self._chance.random() >= SLOW_SHARE:
            yield
            return
        tracer = Tracer(self._killed.service.pid, "-e", f"trace={SLOW_CALLS}",
                        "-e", f"inject={SLOW_CALLS}:delay_exit={SLOWNESS_US}")
        try:
            yield
        finally:
            tracer.end()

    def _load(self, seconds: float) -> None:
        end = time.monotonic() + seconds
        while True:
            for caller in self._callers:
                while caller.under_way < WINDOW:
                    caller.begin(self._draw())
            left = end - time.monotonic()
            if left <= 0:
                return
            for caller in select.select(self._callers, [], [], left)[0]:
                caller.take()

    def _drain(self) -> None:
        """The bus answers what the service did not."""
        for caller in self._callers:
            while caller.under_way > 0:
                caller.take()

    def _seen(self, messages: list[Gio.DBusMessage],
              owner: str) -> tuple[list[Call], list[BusError | tuple[Any, ...]]]:
        """The calls in the order in which the service got them, and the answers in theirs."""
        order: list[tuple[str, int]] = []
        calls: list[Call] = []
        answers: dict[tuple[str, int], BusError | tuple[Any, ...]] = {}
        for message in messages:
            body = message.get_body()
            values = body.unpack() if body is not None else ()
            if (message.get_message_type() == Gio.DBusMessageType.METHOD_CALL
                    and message.get_interface() == INTERFACE):
                order.append((message.get_sender(), message.get_serial()))
                calls.append((message.get_member(), *values))
            elif message.get_sender() == owner and message.get_reply_serial():
                name = message.get_error_name()
                key = (message.get_destination(), message.get_reply_serial())
                answers[key] = BusError(name, values[0]) if name else values
        known = [answers[key] for key in order if key in answers]
        assert [key in answers for key in order[:len(known)]] == [True] * len(known), "order"
        return calls, known

    def _judge(self, history: History, calls: list[Call],
               answers: list[BusError | tuple[Any, ...]]) -> Call | None:
        """The call that was under way when the service was killed, if one was."""
        answered = 0
        last_versions = []
        for number, call in enumerate(calls):
            refusal = history.begin(call)
            last_versions.append(history.newest)
            if number < len(answers):
                answer = answers[number]
                same = (answer == () if refusal is None
                        else isinstance(answer, BusError) and same_error(answer, refusal))
                assert same, f"{call} is answered {answer} and not {refusal}"
                answered = history.newest
        self._figures["calls"] += len(answers)
        self._figures["kills_with_calls_under_way"] += len(calls) > len(answers)
        place = self._killed.judge(history, answered)
        self._figures["kills_between_files"] += bool(place.ahead)
        begun = [call for call, newest in zip(calls, last_versions) if newest > place.whole]
        return begun[0] if begun and len(answers) < len(calls) else None

    def _password(self) -> str:
        self._passwords += 1
        return f"{MARK}-{self._passwords}"

    def _draw(self) -> Call:
        chance = self._chance
        user, system = chance.choice(USERS), chance.choice(SYSTEM_USERS)
        standing, primary = chance.choice(STANDING), chance.choice(PRIMARY)
        others = chance.sample(("admin", "viewer", *GROUPS), 2)
        comment = f"Number {self._passwords}"
        password = self._password()
        anybody = chance.choice((user, system, "alice", "bob", "timer"))
        return chance.choice((
            ("AddUser", user, password, primary, ":".join(others[:1]), comment),
            ("AddUser", user, password, primary, "admin", comment),
            ("AddUidUser", user, password, primary, "", comment, chance.randint(2000, 2010)),
            ("AddSystemUser", system, password, primary, others[:1], "/bin/sh", comment),
            ("AddSystemUser", system, password, primary, ["viewer"], "", comment),
            ("ModifyUser", anybody, password, primary, ["admin"], "", comment),
            ("ModifyUser", "root", password, "", [], "", ""),
            ("ClearUserFields", chance.choice((system, "timer")), True, True, True),
            ("ClearUserFields", user, False, True, True),
            ("ChpasswdUser", chance.choice((user, system, standing)), password),
            ("RemoveUser", user), ("RemoveUser", system),
            ("AddGroup", chance.choice(GROUPS)), ("RemoveGroup", chance.choice(GROUPS)),
            ("Digest", ["create", f"{user}:PRIVANE:{self._passwords:032x}\n"]),
            ("Digest", ["delete", f"{user}\n"]),
            ("AddBootblockParam", chance.choice(("COLOR", "SERNO")), str(self._passwords)),
        ))


