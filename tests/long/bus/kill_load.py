"""tests/long/bus/kill_load.py: several callers that change accounts, and a kill at a random moment.

A monitor of the bus tells in which order the calls reached the service and which it answered.
"""
import random
import select
import time
from collections import Counter
from typing import Any

from gi.repository import Gio, GLib

from account_history import Call, History
from harness.bus import INTERFACE, NAME, BusError
from harness.passwords import MARK
from harness.wire import Wire
from killed_service import SIGNATURES, KilledService, same_error

CALLERS = 3
WINDOW = 2
LONGEST_MS = 60

USERS = ("carol", "dave", "erin", "frank")
SYSTEM_USERS = ("ftpd", "httpd", "snmpd")
STANDING = ("alice", "bob", "timer", "root")
GROUPS = ("guests", "staff", "night")
PRIMARY = ("users", "viewer", "operator")


class Monitor(Wire):
    """Sees every call to the service, every answer, and who owns which name."""

    def __init__(self) -> None:
        super().__init__()
        rules = [f"type='method_call',interface='{INTERFACE}'", "type='method_return'",
                 "type='error'", f"type='signal',member='NameOwnerChanged',arg0='{NAME}'"]
        serial = self._send("org.freedesktop.DBus", "/org/freedesktop/DBus",
                            "org.freedesktop.DBus.Monitoring", "BecomeMonitor",
                            GLib.Variant("(asu)", (rules, 0)))
        while self._receive().get_reply_serial() != serial:
            pass

    def skip_to(self, call: Call) -> None:
        """Forgets what came before a call that is under way or was made."""
        while True:
            message = self._receive()
            body = message.get_body()
            if message.get_member() == call[0] and body and body.unpack() == call[1:]:
                return

    def until_gone(self, owner: str) -> list[Gio.DBusMessage]:
        """All up to the moment at which the owner of the service's name lost it."""
        messages = []
        while True:
            message = self._receive()
            if (message.get_member() == "NameOwnerChanged"
                    and message.get_body().unpack()[1:] == (owner, "")):
                return messages
            messages.append(message)


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
        self._monitor = Monitor()
        self._passwords = 0
        self._marks = 0
        self.answered = 0
        self.unanswered = 0

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
        self._monitor.skip_to(mark)
        history = History(killed.hashes)
        owner = killed.bus.owner()
        assert owner is not None
        self._load(self._chance.uniform(0, LONGEST_MS) / 1000)
        killed.kill()
        calls, answers = self._seen(self._monitor.until_gone(owner), owner)
        self._drain()
        try:
            interrupted = self._judge(history, calls, answers)
            killed.recover(interrupted)
        except AssertionError as error:
            raise AssertionError(f"calls {calls}, answers {answers}: {error}") from error

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
        self.answered += len(answers)
        self.unanswered += len(calls) - len(answers)
        self._figures["calls"] += len(answers)
        place = self._killed.judge(history, answered)
        if place.ahead:
            self._figures["kills_between_files"] += 1
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


