"""tests/long/bus/authorization_matrix.py: 46 methods times the ways in which polkit does not say
yes, and the one in which it does.

Where it did not, no system call and no message of the service may tell of work. The amount counts
cells; 368 are once through the whole table.
"""
import random
import time
from collections import Counter
from pathlib import Path
from typing import Any, Callable, Iterator, Sequence

import pytest
from gi.repository import GLib

from effects_trace import EffectsTrace
from harness.accounts import CLERK_UID
from harness.bus import NAME, Bus, BusError, domain_error
from harness.device import SYSFLASH, Device
from harness.deadline import wait_for
from harness.fake_authz import PolkitDecides
from harness.interface import METHODS, UNIT_ACTIONS, Method
from harness.monitor import BUS, CALL, ERROR, Record, Seen, is_end_of
from harness.polkit import ANSWER_SECONDS, hanging_polkitd, stop_polkitd
from harness.sandbox import fake_library
from harness.service import Service
from harness.stage import Stage
from harness.stage_fixtures import run_stage
from harness.syslog_socket import SyslogSocket
from harness.wire import as_user
from method_effects import OTHER_ARGUMENTS, Evidence, require_effect
from pipeline import Answer, Call, Pipeline, exchange
from polkit_control import NAME as POLKIT, NonsensePolkit, PolkitControl
from surroundings import differences, world

COLUMNS = 8
CELLS = len(METHODS) * COLUMNS

# authz.h
REFUSED, FAILED, UNREACHABLE, TIMED_OUT = 1, 2, 3, 4

SHORT_DEADLINE = 0.3  # of the library of the hanging polkit

NOT_THERE = "The name org.freedesktop.PolicyKit1 was not provided by any .service files"

# A property is asked for where the answer is late, to see whether polkit lives.
TO_POLKIT = {"CheckAuthorization", "CancelCheckAuthorization", "Get", "GetAll"}
TO_THE_BUS = {"GetNameOwner", "GetConnectionUnixUser", "AddMatch", "RemoveMatch",
              "StartServiceByName"}


def refusal(code: int, text: str) -> BusError:
    return domain_error("authz", code, f"Authorization check failed: {text}")


def failure(method: Method, code: int, reason: str) -> BusError:
    return refusal(code, f"cannot check action {method.action_id}: {reason}")


@pytest.fixture
def library() -> Path | None:
    return None


@pytest.fixture
def stage(library: Path | None, device: Device, hardware_clock: Path, start: Callable[..., Service],
          bus: Bus, syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """The service amid stand-ins, with polkit deciding."""
    made = Stage(start, bus, PolkitDecides(library), syslog, tmp_path, others=device.fakes())
    assert bus.call("CheckUser", "s", "root") == (True,)
    yield from run_stage(made)


@pytest.fixture
def monitor() -> Iterator[Record]:
    listener = Record()
    yield listener
    listener.close()


@pytest.fixture
def polkit(bus: Bus) -> PolkitControl:
    return PolkitControl(bus)


class Table:
    """Makes the calls of a column, each under the eyes of a tracer and of a listener on the bus."""

    def __init__(self, stage: Stage, device: Device, monitor: Record, directory: Path,
                 chance: random.Random, figures: Counter[str], rounds: int) -> None:
        self.stage = stage
        self._fakes = (*device.fakes(), stage.digest, stage.params, stage.pidof)
        self.monitor = monitor
        self.bus = stage.bus
        self._trace_file = directory / "trace"
        self._figures = figures
        self._rounds = rounds
        self._chance = chance
        owner = self.bus.owner()
        assert owner is not None
        self.service = owner
        self._polkit = self.bus.owner(POLKIT)

    def methods(self) -> list[Method]:
        order = []
        for _ in range(self._rounds):
            order += self._chance.sample(METHODS, len(METHODS))
        return order

    def tracer(self) -> EffectsTrace:
        return EffectsTrace(self.stage.service.pid, self._trace_file)

    def forget(self) -> None:
        for fake in self._fakes:
            fake.forget()

    def evidence(self, trace: EffectsTrace, make: Callable[[], Any],
                 least_seconds: float = 0) -> Evidence:
        mark = self.monitor.mark()
        begin = time.monotonic()
        answer = make()
        taken = time.monotonic() - begin
        assert taken >= least_seconds, f"answered after {taken:.3f} s"
        self._figures["max_milliseconds"] = max(self._figures["max_milliseconds"],
                                                int(taken * 1000))
        self.monitor.catch_up(self.bus)
        return Evidence(answer, trace.effects(), self.said(mark), self.stage.calls())

    def said(self, mark: int) -> list[Seen]:
        """The service's own messages since a mark."""
        return [seen for seen in self.monitor.since(mark) if seen.sender == self.service]

    def _names_of_polkit(self) -> set[str | None]:
        """Its name, and who has owned it."""
        changes = [seen.arguments for seen in self.monitor.since(0)
                   if seen.member == "NameOwnerChanged" and seen.arguments[0] == POLKIT]
        return {POLKIT, self._polkit, *(str(owner) for change in changes for owner in change[1:])}

    def refused_column(self, make: Callable[[Method], Any],
                       expected: Callable[[Method], BusError], least_seconds: float = 0,
                       unit: str = "cells") -> None:
        """Every method must be refused so, and nothing else may come of it."""
        before = world(self.stage.cfgstore)
        with self.tracer() as trace:
            trace.since_last()
            for method in self.methods():
                seen = self.evidence(trace, lambda: make(method), least_seconds)
                self._require_refusal(method, seen, expected(method))
                self._figures[unit] += 1
            after = world(self.stage.cfgstore)
            assert after == before, differences(before, after)
        assert trace.calls_seen > len(METHODS), "the tracer saw nothing"
        self._figures["traced_calls"] += trace.calls_seen

    def _require_refusal(self, method: Method, seen: Evidence, expected: BusError) -> None:
        member = method.member
        error = seen.answer.error if isinstance(seen.answer, Answer) else seen.answer
        assert error == expected, member
        assert not seen.trace, (member, seen.trace)
        assert not seen.calls, (member, seen.calls)
        replies = [said for said in seen.messages if said.type == ERROR]
        others = [said for said in seen.messages if said.type != ERROR and not said.are_zeros()]
        assert len(replies) == 1 and replies[0].error_name == expected.name, (member, replies)
        bad = [said for said in others if said.type != CALL or not (
            said.destination in self._names_of_polkit() and said.member in TO_POLKIT
            or said.destination == BUS and said.member in TO_THE_BUS)]
        assert not bad, (member, bad, self._names_of_polkit())

    def require_service(self) -> None:
        """With polkit there and willing, it works, and nothing was armed for the next restart."""
        assert self.bus.call("CheckUser", "s", "root") == (True,)
        assert self.bus.call("Reboot") == (0,)
        assert self.stage.calls() == [(SYSFLASH, "reboot")]


@pytest.fixture
def table(stage: Stage, device: Device, monitor: Record, tmp_path: Path, chance: random.Random,
          figures: Counter[str], amount: int) -> Table:
    return Table(stage, device, monitor, tmp_path, chance, figures, max(1, amount // CELLS))


@pytest.fixture
def root() -> Iterator[Pipeline]:
    line = Pipeline()
    yield line
    line.close()


@pytest.fixture
def clerk_line(privane_gid: int) -> Iterator[Pipeline]:
    with as_user(CLERK_UID, [privane_gid]):
        line = Pipeline()
    yield line
    line.close()


def call_of(method: Method, arguments: Sequence[Any] | None = None) -> Call:
    return Call("method", method.member, method.signature,
                method.arguments if arguments is None else arguments)


def ask(line: Pipeline, method: Method, arguments: Sequence[Any] | None = None) -> Answer:
    answers: list[Answer] = []
    exchange([line], [call_of(method, arguments)], lambda _, answer: answers.append(answer))
    (answer,) = answers
    return answer


def test_allowed(table: Table, root: Pipeline, device: Device, figures: Counter[str],
                 tmp_path: Path) -> None:
    """The first round through, since what was done cannot be done again."""
    table_of_effects: dict[str, Evidence] = {}
    with table.tracer() as trace:
        trace.since_last()
        for method in METHODS:
            table.forget()
            arguments = OTHER_ARGUMENTS.get(method.member)
            seen = table.evidence(trace, lambda: ask(root, method, arguments))
            require_effect(method, seen)
            table_of_effects[method.member] = seen
            figures["cells"] += 1
    # UpdateReleaseFile came before.
    assert (SYSFLASH, "factorydefault", "soft") in table_of_effects["Reboot"].calls


def test_refused(table: Table, clerk_line: Pipeline) -> None:
    table.refused_column(
        lambda method: ask(clerk_line, method),
        lambda method: refusal(REFUSED, f"action {method.action_id} is refused to uid "
                                        f"{CLERK_UID}"))
    table.require_service()


def declared_part(method: Method) -> str:
    """The action that is asked for last: a unit's own is not declared, its parent may be."""
    action, _, unit = method.action_id.removeprefix("com.zintor.privane-system.").partition(".")
    return method.action_id.removesuffix(f".{unit}") if action in UNIT_ACTIONS else method.action_id


def test_undeclared(table: Table, root: Pipeline, polkit: PolkitControl) -> None:
    with polkit.knowing_no_action():
        table.refused_column(
            lambda method: ask(root, method),
            lambda method: failure(method, FAILED,
                                   f"Action {declared_part(method)} is not registered"))
    table.require_service()


def gone_caller(table: Table, method: Method) -> BusError:
    """Root, which would be allowed, asks and leaves before polkit looks; what the service then
    tells nobody."""
    mark = table.monitor.mark()
    caller = Pipeline()
    with hanging_polkitd():
        caller.start(call_of(method))
        made = table.monitor.wait_for("the call", mark, lambda seen: seen.destination == NAME)
        table.monitor.wait_for("the question", mark, lambda seen: seen.sender == table.service
                               and seen.member == "CheckAuthorization")
        caller.close()
        table.monitor.wait_for("the caller's end", mark, is_end_of(made.sender))
    answer = table.monitor.wait_for("the answer", mark, lambda seen: seen.sender == table.service
                                    and seen.destination == made.sender)
    told = str(answer.arguments[0]).replace(f"'{made.sender}'", "'THE CALLER'")
    return BusError(answer.error_name or "", told)


def test_caller_gone(table: Table) -> None:
    table.refused_column(
        lambda method: gone_caller(table, method),
        lambda method: failure(method, UNREACHABLE,
                               "Could not get UID of name 'THE CALLER': no such name"))
    table.require_service()


def test_absent(table: Table, root: Pipeline, polkit: PolkitControl) -> None:
    with polkit.absent():
        table.refused_column(
            lambda method: ask(root, method),
            lambda method: failure(method, UNREACHABLE, NOT_THERE))
    table.require_service()


@pytest.mark.parametrize("library", [fake_library("authz_short_deadline/libauthz.so.1")],
                         ids=["short_deadline"])
def test_hanging(table: Table, root: Pipeline) -> None:
    with hanging_polkitd():
        table.refused_column(
            lambda method: ask(root, method),
            lambda method: failure(method, TIMED_OUT, "no answer in time"),
            SHORT_DEADLINE)
    wait_for("polkit's answer", lambda: table.bus.call("CheckUser", "s", "root") == (True,),
             ANSWER_SECONDS)
    table.require_service()


def restarted(table: Table, polkit: PolkitControl, line: Pipeline, method: Method) -> Answer:
    """A polkit that was asked ends without an answer, and another one has taken its place."""
    mark = table.monitor.mark()
    answers: list[Answer] = []
    stop_polkitd()
    line.start(call_of(method))
    table.monitor.wait_for("the question", mark, lambda seen: seen.sender == table.service
                           and seen.member == "CheckAuthorization")
    polkit.replace_hanging()
    exchange([line], [], lambda _, answer: answers.append(answer))
    (answer,) = answers
    return answer


def test_restarted(table: Table, clerk_line: Pipeline, polkit: PolkitControl) -> None:
    table.refused_column(
        lambda method: restarted(table, polkit, clerk_line, method),
        lambda method: refusal(REFUSED, f"action {method.action_id} is refused to uid "
                                        f"{CLERK_UID}"))
    table.require_service()


NO_MESSAGE = "no message"
YES = (True, False, {})
NONSENSE: dict[str, GLib.Variant | None] = {
    NO_MESSAGE: None,
    "()": GLib.Variant("()", ()),
    "(b)": GLib.Variant("(b)", (True,)),
    "(i)": GLib.Variant("(i)", (1,)),
    "(s)": GLib.Variant("(s)", ("yes",)),
    "(v)": GLib.Variant("(v)", (GLib.Variant("(bba{ss})", YES),)),
    "(bba{ss})": GLib.Variant("(bba{ss})", YES),
    "((bb))": GLib.Variant("((bb))", ((True, True),)),
    "((bba{sv}))": GLib.Variant("((bba{sv}))", (YES,)),
    "((bba{ss})s)": GLib.Variant("((bba{ss})s)", (YES, "")),
    "((ssa{ss}))": GLib.Variant("((ssa{ss}))", (("yes", "no", {}),)),
}


def nonsensical(root: Pipeline, method: Method, body: GLib.Variant | None) -> Answer:
    authority = NonsensePolkit(body)
    answer = ask(root, method)
    authority.close()
    assert authority.questions > 0
    return answer


def malformed(method: Method, kind: str) -> BusError:
    """A polkit that was thrown out is none."""
    if kind == NO_MESSAGE:
        return failure(method, UNREACHABLE, NOT_THERE)
    return failure(method, FAILED, "the answer has no valid form")


def test_malformed_answer(table: Table, root: Pipeline, polkit: PolkitControl) -> None:
    """Each kind of nonsense for each method; a cell is done with the last of them."""
    kinds = [*NONSENSE]
    with polkit.absent():
        for kind in kinds:
            table.refused_column(
                lambda method: nonsensical(root, method, NONSENSE[kind]),
                lambda method: malformed(method, kind),
                unit="cells" if kind == kinds[-1] else "malformed_answers")
    table.require_service()


def test_every_cell_was_looked_at(figures: Counter[str], amount: int) -> None:
    rounds = max(1, amount // CELLS)
    assert figures["cells"] == len(METHODS) * ((COLUMNS - 1) * rounds + 1)
    # Further rounds, and other seeds, look at the same cells again.
    figures["looks"] = figures["cells"]
    figures["cells"] = figures["max_exhaustive_cells"] = CELLS
