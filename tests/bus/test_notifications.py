"""tests/bus/test_notifications.py: who learns of a change, and in which order."""
import os
import signal
from pathlib import Path
from typing import Any

import pytest

from harness.deadline import wait_for
from harness.interface import SIGNAL
from harness.passwords import NEW
from harness.stage import EMITTED, PIDOF_CALL, ROOT_FLAG_CALLS, ROOT_FLAG_SET, Stage
from harness.strace import Trace

CAROL = ("AddUser", "carol", NEW, "users", "", "")


def set_of(name: str) -> tuple[str, ...]:
    return ("digest_entry_set", name, NEW, "0")


def updated(name: str, shown_type: str) -> str:
    return f"message: Updated digest info {name} (usertype={shown_type})!"


def modify(name: str, password: str = "", groups: tuple[str, ...] = ()) -> tuple[Any, ...]:
    return ("ModifyUser", name, password, "", groups, "", "")


ANONYMOUS = "message: Updating anonymous user!"

# For each call: the calls of the libraries, the lines of the log before the notification, and
# whether the bus signal and SIGUSR1 follow.
ROWS = [
    (CAROL, [set_of("carol")], [], True, True),
    (("AddUidUser", "carol", NEW, "users", "", "", 5000), [set_of("carol")], [], True, True),
    (("AddSystemUser", "ftpd", NEW, "users", [], "", ""), [], [], False, True),
    (modify("root", NEW), [set_of("root"), *ROOT_FLAG_CALLS],
     [updated("root", "root"), ROOT_FLAG_SET], True, True),
    (modify("root"), [*ROOT_FLAG_CALLS], [ROOT_FLAG_SET], True, True),
    (modify("daemon"), [], [], False, False),
    (modify("timer", NEW), [], [], False, True),
    (modify("alice", NEW), [set_of("alice")], [updated("alice", "ornet")], True, True),
    (modify("nobody"), [], [], False, False),
    (modify("anonymous", groups=("viewer",)), [], [ANONYMOUS], True, True),
    (("ClearUserFields", "timer", True, False, False), [], [], True, True),
    (("ClearUserFields", "timer", False, True, False), [], [], True, True),
    (("ClearUserFields", "timer", False, False, True), [], [], False, False),
    (("ClearUserFields", "timer", True, True, True), [], [], True, True),
    (("ClearUserFields", "timer", False, False, False), [], [], False, False),
    (("ClearUserFields", "daemon", True, False, False), [], [], True, True),
    (("ClearUserFields", "alice", False, True, False), [], [], True, True),
    (("ChpasswdUser", "root", NEW), [*ROOT_FLAG_CALLS], [ROOT_FLAG_SET], False, False),
    (("ChpasswdUser", "alice", NEW), [], [], False, False),
    (("ChpasswdUser", "timer", NEW), [], [], False, False),
    (("RemoveUser", "alice"), [("digest_entry_delete", "alice", "0")], [], True, True),
    (("RemoveUser", "timer"), [], [], False, True),
    (("AddGroup", "guests"), [], [], False, False),
    (("RemoveGroup", "recorder"), [], [], False, False),
    (("Digest", ["create", "carol"]), [("digest_entry_set_list", "carol", "1")], [], False, False),
]

each_row = pytest.mark.parametrize("call, calls, lines, signal_sent, pidof_run", ROWS,
                                   ids=[f"{row[0][0]}-{row[0][1]}" for row in ROWS])


@each_row
def test_row(call: tuple[Any, ...], calls: list[tuple[str, ...]], lines: list[str],
             signal_sent: bool, pidof_run: bool, stage: Stage) -> None:
    assert stage.call(*call) == stage.done(*calls, signal_sent=signal_sent, pidof_run=pidof_run,
                                           lines=tuple(lines))


@each_row
def test_row_with_the_real_pidof(call: tuple[Any, ...], calls: list[tuple[str, ...]],
                                 lines: list[str], signal_sent: bool, pidof_run: bool,
                                 stage: Stage) -> None:
    stage.use_real_pidof()
    expected = stage.done(*calls, signal_sent=signal_sent, pidof_run=pidof_run, lines=tuple(lines))
    if pidof_run:
        expected.calls.remove(PIDOF_CALL)

    assert stage.call(*call) == expected


def test_signal_carries_nothing_and_comes_before_the_reply(stage: Stage) -> None:
    serial = stage.send(*CAROL)
    news, reply = stage.wire.until_reply(serial)

    assert (news.kind, news.member, news.body) == ("signal", SIGNAL, ())
    assert news.serial < reply.serial


def gate(stage: Stage, directory: Path) -> Path:
    """Makes pidof wait until the file that is returned is opened for writing."""
    fifo = directory / "gate"
    os.mkfifo(fifo)
    stage.pidof.before_answering(f"cat {fifo} >/dev/null")
    return fifo


def test_everything_comes_before_the_reply_in_its_order(stage: Stage, tmp_path: Path) -> None:
    stage.digest.before_answering(f"cp /etc/passwd {tmp_path}/passwd")
    fifo = gate(stage, tmp_path)
    before = stage.service.output()

    serial = stage.send(*CAROL)
    wait_for("the run of pidof", stage.pidof.calls)

    # By now the digest entry was written, and the signal sent and logged; no more.
    assert stage.calls() == [set_of("carol"), PIDOF_CALL]
    assert stage.wire.receive().member == SIGNAL
    assert stage.wire.is_silent(0.3)
    assert stage.service.output()[len(before):] == [EMITTED]
    assert stage.cfgstore.signals() == set()

    fifo.write_text("")
    (reply,) = stage.wire.until_reply(serial)
    assert reply.kind == "reply"
    assert stage.cfgstore.signals() == {signal.SIGUSR1}


# Long enough to see that nothing comes meanwhile, in microseconds.
DELAY = 400_000


@pytest.mark.parametrize("call, signal_sent",
                         [(call, signal_sent) for call, _, _, signal_sent, pidof_run in ROWS
                          if pidof_run], ids=lambda value: str(value)[:40])
def test_signals_come_before_the_reply(call: tuple[Any, ...], signal_sent: bool, stage: Stage,
                                       tmp_path: Path) -> None:
    stage.stop()
    trace = Trace(tmp_path / "trace", "kill")
    stage.start(wrapper=[*trace.wrapper, "-e", f"inject=kill:delay_enter={DELAY}"])

    serial = stage.send(*call)
    wait_for("the run of pidof", stage.pidof.calls)

    # The service is kept from sending SIGUSR1 for now, and has not answered.
    if signal_sent:
        assert stage.wire.receive().member == SIGNAL
    assert stage.wire.is_silent(0.2)
    assert stage.cfgstore.signals() == set()
    (reply,) = stage.wire.until_reply(serial)
    assert (reply.kind, stage.cfgstore.signals()) == ("reply", {signal.SIGUSR1})


@pytest.mark.parametrize("call", [modify("alice", NEW), modify("root", NEW),
                                  ("RemoveUser", "alice"), CAROL,
                                  ("AddUidUser", *CAROL[1:], 5000)],
                         ids=lambda call: f"{call[0]}-{call[1]}")
def test_nothing_is_announced_before_the_digest_entry_is_settled(call: tuple[Any, ...],
                                                                 stage: Stage,
                                                                 tmp_path: Path) -> None:
    fifo = tmp_path / "gate"
    os.mkfifo(fifo)
    stage.digest.before_answering(f"cat {fifo} >/dev/null")

    serial = stage.send(*call)
    wait_for("the call of the digest library", stage.digest.calls)

    assert stage.wire.is_silent(0.3)
    assert (stage.pidof.calls(), stage.cfgstore.signals()) == ([], set())

    fifo.write_text("")
    assert [message.kind for message in stage.wire.until_reply(serial)] == ["signal", "reply"]


def test_flag_of_root_is_set_before_the_reply(stage: Stage, tmp_path: Path) -> None:
    fifo = tmp_path / "gate"
    os.mkfifo(fifo)
    stage.params.before_answering(f"cat {fifo} >/dev/null")

    serial = stage.send("ChpasswdUser", "root", NEW)
    for count, call in enumerate(ROOT_FLAG_CALLS, 1):
        wait_for("the next call", lambda: len(stage.calls()) == count)
        assert stage.calls()[-1] == call
        assert stage.wire.is_silent(0.1)
        fifo.write_text("")

    assert [message.kind for message in stage.wire.until_reply(serial)] == ["reply"]


def test_flag_of_root_is_set_before_anything_is_announced(stage: Stage, tmp_path: Path) -> None:
    fifo = tmp_path / "gate"
    os.mkfifo(fifo)
    stage.params.before_answering(f"cat {fifo} >/dev/null")

    serial = stage.send(*modify("root", NEW))
    for count, call in enumerate(ROOT_FLAG_CALLS, 2):
        wait_for("the next call", lambda: len(stage.calls()) == count)
        assert stage.calls()[-1] == call
        assert stage.wire.is_silent(0.1)
        fifo.write_text("")

    assert [message.kind for message in stage.wire.until_reply(serial)] == ["signal", "reply"]
    assert stage.calls() == [set_of("root"), *ROOT_FLAG_CALLS, PIDOF_CALL]
