"""tests/long/bus/policy_matrix.py: 46 methods times the states of a policy file and of the bus that
tells who calls.

Where it was not allowed, no system call and no message of the service may tell of work. The amount
counts cells; 368 are once through the whole table.
"""
import os
import signal
import time
from collections import Counter
from contextlib import contextmanager
from typing import Iterator

import pytest

from authorization_table import (FAILED, REFUSED, SHORT_DEADLINE, TIMED_OUT, Table, ask, call_of,
                                 clerk_line, failure, library, monitor, refusal, require_allowed,
                                 require_every_cell, require_refused, root, stage, table)
from harness import process
from harness.accounts import replace
from harness.bus import NAME, BusError
from harness.deadline import wait_for
from harness.interface import METHODS, Method
from harness.monitor import is_end_of
from harness.policy_file import POLICY, role
from harness.sandbox import STATE, fake_library
from pipeline import Answer, Pipeline, exchange

pytestmark = pytest.mark.policy_file

# For what the bus has sent to be in the service's socket.
DELIVERY_SECONDS = 0.1
# For a service that gets next to nothing of the processor.
PATIENCE_SECONDS = 60


(CHECK_USER,) = (method for method in METHODS if method.member == "CheckUser")


@pytest.fixture(autouse=True)
def packaged_file() -> Iterator[str]:
    """Its text; the file is there again after the test, and its folder is as it was."""
    packaged = POLICY.read_text()
    yield packaged
    POLICY.parent.chmod(0o755)
    replace(POLICY, packaged, 0o644, 0)


def test_allowed(table: Table, root: Pipeline, figures: Counter[str]) -> None:
    require_allowed(table, root, figures)


def test_refused(table: Table, clerk_line: Pipeline) -> None:
    require_refused(table, clerk_line)


def refused_to_root(table: Table, root: Pipeline, why: str) -> None:
    table.refused_column(lambda method: ask(root, method),
                         lambda method: failure(method, FAILED, f"{POLICY}{why}"))


def test_absent(table: Table, root: Pipeline, packaged_file: str) -> None:
    POLICY.unlink()
    # For its first text of an errno, GLib reads the tables of the character sets.
    assert ask(root, CHECK_USER).error is not None
    refused_to_root(table, root, ": No such file or directory")
    replace(POLICY, packaged_file, 0o644, 0)
    table.require_service()


def test_broken(table: Table, root: Pipeline, packaged_file: str) -> None:
    replace(POLICY, packaged_file + "user=root\n", 0o644, 0)
    line = len(packaged_file.splitlines()) + 1
    refused_to_root(table, root, f":{line}: unknown key 'user'")
    replace(POLICY, packaged_file, 0o644, 0)
    table.require_service()


def test_other_mode(table: Table, root: Pipeline) -> None:
    POLICY.chmod(0o664)
    refused_to_root(table, root, ": others than root may write it")
    POLICY.chmod(0o644)
    POLICY.parent.chmod(0o775)
    assert ask(root, CHECK_USER).error == failure(
        CHECK_USER, FAILED, f"{POLICY.parent}: others than root may write it")
    POLICY.parent.chmod(0o755)
    table.require_service()


def test_replaced(table: Table, clerk_line: Pipeline, packaged_file: str) -> None:
    """By one that takes everything from a caller who is known and was allowed."""
    granted = role("clerks", "users=clerk", "actions=com.zintor.privane-system.*")
    replace(POLICY, packaged_file + granted, 0o644, 0)
    assert ask(clerk_line, CHECK_USER).error is None
    replace(POLICY, packaged_file, 0o644, 0)
    require_refused(table, clerk_line)


@contextmanager
def stopped(pid: int) -> Iterator[None]:
    os.kill(pid, signal.SIGSTOP)
    try:
        wait_for("the stop", lambda: process.status(pid)["State"][0] in "Tt")
        yield
    finally:
        os.kill(pid, signal.SIGCONT)


def gone_caller(table: Table, method: Method) -> BusError:
    """Root, which would be allowed, calls and leaves before the service looks; what the service
    then tells nobody."""
    mark = table.monitor.mark()
    caller = Pipeline()
    with stopped(table.stage.service.pid):
        caller.start(call_of(method))
        made = table.monitor.wait_for("the call", mark, lambda seen: seen.destination == NAME)
        caller.close()
        table.monitor.wait_for("the caller's end", mark, is_end_of(made.sender))
    answer = table.monitor.wait_for("the answer", mark, lambda seen: seen.sender == table.service
                                    and seen.destination == made.sender)
    told = str(answer.arguments[0]).replace(f"to {made.sender},", "to THE CALLER,")
    return BusError(answer.error_name or "", told)


def test_caller_gone(table: Table) -> None:
    table.refused_column(
        lambda method: gone_caller(table, method),
        lambda method: refusal(REFUSED, f"action {method.action_id} is refused to THE CALLER, "
                                        "whose uid is not known"))
    table.require_service()


def slow_bus(table: Table, method: Method) -> Answer:
    """Root calls, and the bus stops before the service asks who that is."""
    mark = table.monitor.mark()
    caller = Pipeline()
    answers: list[Answer] = []
    daemon = int((STATE / "dbus-daemon.pid").read_text())

    def refusals() -> int:
        return sum("no answer in time" in line for line in table.stage.service.output())

    told = refusals()
    with stopped(table.stage.service.pid):
        caller.start(call_of(method))
        table.monitor.wait_for("the call", mark, lambda seen: seen.destination == NAME)
        time.sleep(DELIVERY_SECONDS)
        os.kill(daemon, signal.SIGSTOP)
    # A service that got little of the processor has asked late, and must not be answered after all.
    try:
        wait_for("the end of the wait", lambda: refusals() > told,
                 PATIENCE_SECONDS)
    finally:
        os.kill(daemon, signal.SIGCONT)
    exchange([caller], [], lambda _, answer: answers.append(answer))
    caller.close()
    (answer,) = answers
    return answer


@pytest.mark.parametrize("library",
                         [fake_library("authz_policy_short_deadline/libauthz.so.1")],
                         ids=["short_deadline"])
def test_slow_bus(table: Table) -> None:
    table.refused_column(
        lambda method: slow_bus(table, method),
        lambda method: failure(method, TIMED_OUT, "no answer in time"), SHORT_DEADLINE)
    table.require_service()


def test_every_cell_was_looked_at(figures: Counter[str], amount: int) -> None:
    require_every_cell(figures, amount)
