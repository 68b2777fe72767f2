"""tests/long/bus/soak_callers.py: callers that never rest, and one of them that changes accounts."""
import random
import threading
import time
from collections import Counter
from typing import Any, Callable

from gi.repository import Gio, GLib

from harness.account_rules import Refused
from harness.bus import INTERFACE, NAME, PATH, Bus, BusError, domain_error
from harness.deadline import wait_for
from harness.modelled_stage import ModelledStage
from harness.passwords import MARK
from harness.stage import SIGNATURES
from soak_tools import TOOLS, seen_in

PATIENCE = 60.0

# Accounts and groups that the changer has at most, so that the files do not grow.
ACCOUNTS = 12

# A connection drops off at one call in so many. A tool is run by one call of many, so that waiting
# for it does not take all the time.
CALLS_TO_A_DISCONNECT = 40
CALLS_TO_A_TOOL = 60

QUESTIONS: tuple[tuple[str, tuple[Any, ...]], ...] = (
    ("CheckUser", ("root",)), ("CheckUser", ("nosuch",)), ("CheckGroup", ("users",)),
    ("GetUser", ("alice",)), ("GetUser", ("nosuch",)), ("GetUserList", ()), ("GetGroupList", ()),
    ("GetGroup", ("users",)), ("GetGroup", ("nosuch",)), ("GetGroupListFull", ()),
    ("GetDigestList", ()), ("AuthUserBasic", ("alice", "wrong")), ("GetSlabinfo", ()),
    ("ReadLogFile", ("/etc/hostname",)), ("ReadLogFile", ("/nosuch",)), ("ReadSerno", ()),
    ("ReadBootblockParam", ("SERNO",)), ("AddBootblockParam", ("COLOR", "blue")),
    ("GetNetworkSpeedDuplex", ()), ("StartService", ("lensd",)), ("StopService", ("no/unit",)),
    ("StartNtp", ()), ("StopLensd", ()), ("AdjTime", (0, 1)), ("SetTimeOfDay", (0, 1)),
    ("ExecuteEthtool", ("x", "eth0")), ("ExecuteLldpcli", ("nosuch",)), ("RtspreadConfig", ()),
    ("SetDefaultTarget", ("multi-user",)), ("RemoveUser", ("nosuch",)), ("AddGroup", ("-no",)),
    ("ModifyUser", ("root", "", "users", [], "", "")), ("Digest", (["set"],)))


class Sandglass:
    """When it is over, and a pause at which nobody calls."""

    def __init__(self, callers: int) -> None:
        self.is_over = threading.Event()
        self._barrier = threading.Barrier(callers + 1)
        self._is_paused = threading.Event()

    def wait_if_paused(self) -> None:
        """What every caller does between two calls."""
        if self._is_paused.is_set():
            self._barrier.wait(PATIENCE)
            self._barrier.wait(PATIENCE)

    def is_pausing(self) -> bool:
        """Whether a pause has begun, or waits for all callers."""
        return self._is_paused.is_set()

    def paused(self, look: Callable[[], Any]) -> Any:
        """What is seen while nobody calls."""
        self._is_paused.set()
        self._barrier.wait(PATIENCE)
        try:
            return look()
        finally:
            self._is_paused.clear()
            self._barrier.wait(PATIENCE)

    def give_up(self) -> None:
        self.is_over.set()
        self._barrier.abort()


class Caller(threading.Thread):
    """Calls all the time; an answer that is neither a result nor an error of the service's own
    is what failed."""

    def __init__(self, glass: Sandglass, chance: random.Random) -> None:
        super().__init__()
        self.counts: Counter = Counter()
        self.longest_wait = 0.0
        self.failed: BaseException | None = None
        # A call that comes before those that are drawn.
        self.wanted: tuple[str, tuple[Any, ...]] | None = None
        self._glass = glass
        self.chance = random.Random(chance.random())
        self.bus = Bus()

    def run(self) -> None:
        try:
            while not self._glass.is_over.is_set():
                self._glass.wait_if_paused()
                self.step()
            self.bus.close()
        except BaseException as error:  # the test tells
            self.failed = error
            self._glass.give_up()

    def step(self) -> None:
        if self.wanted is not None:
            wanted, self.wanted = self.wanted, None
            self.call(*wanted)
            return
        member, arguments = self.chance.choice(QUESTIONS)
        if self.chance.randrange(CALLS_TO_A_TOOL) == 0:
            member, arguments = self.chance.choice(TOOLS)
        if self.chance.randrange(CALLS_TO_A_DISCONNECT) == 0:
            self.drop_off(member, arguments)
        else:
            self.call(member, arguments)

    def call(self, member: str, arguments: tuple[Any, ...]) -> Any:
        self.counts["calls"] += 1
        begin = time.monotonic()
        try:
            answer = self.bus.call(member, SIGNATURES[member], *arguments, timeout=PATIENCE)
        except BusError as error:
            assert error.name.startswith("org.gtk.GDBus.UnmappedGError.Quark."), error
            self.counts["errors"] += 1
            answer = error
        self.longest_wait = max(self.longest_wait, time.monotonic() - begin)
        if (member, arguments) in TOOLS:
            self.counts += seen_in(answer)
        return answer

    def drop_off(self, member: str, arguments: tuple[Any, ...]) -> str:
        """Leaves without waiting for the answer; the name that it had."""
        message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, member)
        message.set_body(GLib.Variant(f"({SIGNATURES[member]})", arguments))
        self.bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
        self.bus.connection.flush_sync(None)
        left = self.bus.unique_name
        self.bus.close()
        self.bus = Bus()
        self.counts["disconnects"] += 1
        return left


class Changer(Caller):
    """The one that changes accounts, each change as the model has it. Who is gone is refused by our
    own libauthz, if he is by then; so it drops off only where his call counts all the same."""

    def __init__(self, glass: Sandglass, chance: random.Random, modelled: ModelledStage,
                 may_drop_off: bool) -> None:
        super().__init__(glass, chance)
        self._may_drop_off = may_drop_off
        self._model = modelled.model
        self._number = 0
        self._users: list[str] = []
        self._groups: list[str] = []

    def _new(self, prefix: str) -> str:
        self._number += 1
        return f"{prefix}{self._number}"

    def _choose(self) -> tuple[str, tuple[Any, ...]]:
        chance = self.chance
        password = self._new(MARK)
        if not self._users or chance.random() < 0.2 and len(self._users) < ACCOUNTS:
            name = self._new("u")
            self._users.append(name)
            if chance.random() < 0.3:
                return "AddSystemUser", (name, password, "users", ["viewer"], "/bin/sh", "System")
            return "AddUser", (name, password, "users", chance.choice(("", "viewer", "admin")),
                               "Comment")
        if not self._groups or chance.random() < 0.1 and len(self._groups) < ACCOUNTS:
            self._groups.append(self._new("g"))
            return "AddGroup", (self._groups[-1],)
        if chance.random() < 0.1:
            return "RemoveGroup", (self._groups.pop(),)
        name = chance.choice(self._users)
        if chance.random() < 0.2:
            self._users.remove(name)
            return "RemoveUser", (name,)
        return chance.choice((
            ("ModifyUser", (name, password, "", ["operator"], "", self._new("Comment "))),
            ("ModifyUser", (name, "", "", ["nosuch"], "", "")),
            ("ChpasswdUser", (name, password)),
            ("ClearUserFields", (name, False, True, True)),
            ("AddUser", (name, password, "users", "", "")),
            ("AuthUserBasic", (name, "wrong")),
            ("GetUser", (name,))))

    def step(self) -> None:
        member, arguments = self._choose()
        self.counts["changes"] += 1
        try:
            expected: Any = self._model.call(member, *arguments).answer
        except Refused as error:
            expected = domain_error(*error.args)
        if self._may_drop_off and self.chance.randrange(CALLS_TO_A_DISCONNECT) == 0:
            left = self.drop_off(member, arguments)
            # What it sent before the bus forgot it, the service has before anything sent later.
            wait_for("the bus", lambda: self.bus.owner(left) is None, PATIENCE)
            return
        answer = self.call(member, arguments)
        assert answer == expected, (member, arguments, answer, expected)
