"""tests/long/bus/authorization_table.py: what the matrices of both libauthz share: every method is
called, under the eyes of a tracer and of a listener on the bus."""
import random
import re
import time
from collections import Counter
from pathlib import Path
from typing import Any, Callable, Iterator, Sequence

import pytest

from effects_trace import EffectsTrace
from harness.accounts import CLERK_UID
from harness.bus import Bus, BusError, domain_error
from harness.device import SYSFLASH, Device
from harness.fake_authz import OwnAuthz
from harness.interface import METHODS, Method
from harness.monitor import BUS, CALL, ERROR, Record, Seen
from harness.sandbox import POLICY_FILE, authorization
from harness.service import Service
from harness.stage import Stage
from harness.stage_fixtures import run_stage
from harness.syslog_socket import SyslogSocket
from harness.wire import as_user
from method_effects import OTHER_ARGUMENTS, Evidence, require_effect
from pipeline import Answer, Call, Pipeline, exchange
from polkit_control import NAME as POLKIT
from surroundings import differences, world

COLUMNS = 8
CELLS = len(METHODS) * COLUMNS

# authz.h
REFUSED, FAILED, UNREACHABLE, TIMED_OUT = 1, 2, 3, 4

SHORT_DEADLINE = 0.3  # of the libraries that have a short one

# A property is asked for where the answer is late, to see whether polkit lives.
TO_POLKIT = {"CheckAuthorization", "CancelCheckAuthorization", "Get", "GetAll"}
TO_THE_BUS = {"GetConnectionCredentials", "GetNameOwner", "GetConnectionUnixUser", "AddMatch",
              "RemoveMatch", "StartServiceByName"}

# What the policy file's libauthz reads.
READ = re.compile(r'openat\(AT_FDCWD, "/etc/(privane/authz\.conf|passwd|group)", O_RDONLY[|)]')


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
    """The service amid stand-ins, with our own authorization."""
    made = Stage(start, bus, OwnAuthz(library), syslog, tmp_path, others=device.fakes())
    assert bus.call("CheckUser", "s", "root") == (True,)
    yield from run_stage(made)


@pytest.fixture
def monitor() -> Iterator[Record]:
    listener = Record()
    yield listener
    listener.close()


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
        self._decides_by_file = authorization() == POLICY_FILE

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

    def _is_part_of_the_check(self, call: str) -> bool:
        return self._decides_by_file and READ.match(call) is not None

    def _require_refusal(self, method: Method, seen: Evidence, expected: BusError) -> None:
        member = method.member
        error = seen.answer.error if isinstance(seen.answer, Answer) else seen.answer
        assert error == expected, member
        work = [call for call in seen.trace if not self._is_part_of_the_check(call)]
        assert not work, (member, work)
        assert not seen.calls, (member, seen.calls)
        replies = [said for said in seen.messages if said.type == ERROR]
        others = [said for said in seen.messages if said.type != ERROR and not said.are_zeros()]
        assert len(replies) == 1 and replies[0].error_name == expected.name, (member, replies)
        bad = [said for said in others if said.type != CALL or not (
            said.destination in self._names_of_polkit() and said.member in TO_POLKIT
            or said.destination == BUS and said.member in TO_THE_BUS)]
        assert not bad, (member, bad, self._names_of_polkit())

    def require_service(self) -> None:
        """With everything in order, it works, and nothing was armed for the next restart."""
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


def require_allowed(table: Table, root: Pipeline, figures: Counter[str]) -> None:
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


def require_refused(table: Table, clerk_line: Pipeline) -> None:
    table.refused_column(
        lambda method: ask(clerk_line, method),
        lambda method: refusal(REFUSED, f"action {method.action_id} is refused to uid "
                                        f"{CLERK_UID}"))
    table.require_service()


def require_every_cell(figures: Counter[str], amount: int) -> None:
    rounds = max(1, amount // CELLS)
    assert figures["cells"] == len(METHODS) * ((COLUMNS - 1) * rounds + 1)
    # Further rounds, and other seeds, look at the same cells again.
    figures["looks"] = figures["cells"]
    figures["cells"] = figures["max_exhaustive_cells"] = CELLS
