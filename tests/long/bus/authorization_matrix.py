"""tests/long/bus/authorization_matrix.py: 46 methods times the ways in which polkit does not say
yes, and the one in which it does.

Where it did not, no system call and no message of the service may tell of work. The amount counts
cells; 368 are once through the whole table.
"""
from collections import Counter

import pytest
from gi.repository import GLib

from authorization_table import (FAILED, REFUSED, SHORT_DEADLINE, TIMED_OUT, UNREACHABLE, Table,
                                 ask, call_of, clerk_line, failure, library, monitor, refusal,
                                 require_allowed, require_every_cell, require_refused, root, stage,
                                 table)
from harness.accounts import CLERK_UID
from harness.bus import NAME, Bus, BusError
from harness.deadline import wait_for
from harness.interface import UNIT_ACTIONS, Method
from harness.monitor import is_end_of
from harness.polkit import ANSWER_SECONDS, hanging_polkitd, stop_polkitd
from harness.sandbox import fake_library
from pipeline import Answer, Pipeline, exchange
from polkit_control import NonsensePolkit, PolkitControl

NOT_THERE = "The name org.freedesktop.PolicyKit1 was not provided by any .service files"


@pytest.fixture
def polkit(bus: Bus) -> PolkitControl:
    return PolkitControl(bus)


def test_allowed(table: Table, root: Pipeline, figures: Counter[str]) -> None:
    require_allowed(table, root, figures)


def test_refused(table: Table, clerk_line: Pipeline) -> None:
    require_refused(table, clerk_line)


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
    require_every_cell(figures, amount)
