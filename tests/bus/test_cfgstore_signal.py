"""tests/bus/test_cfgstore_signal.py: how cfgstore is found and signalled, and what may go wrong."""
import signal
import subprocess
from pathlib import Path
from typing import Any

import pytest

from harness.deadline import wait_for
from harness.interface import SIGNAL
from harness.passwords import NEW
from harness.stage import (EMITTED, LOG_ERR, LOG_WARNING, PIDOF, PIDOF_CALL, ROOT_FLAG_CALLS,
                           ROOT_FLAG_SET, Effects, Stage)
from harness.world import Neighbour

NO_PID = (LOG_WARNING, "Could not send signal to cfgstore: Unable to retrieve PID")
NOT_PARSED = (LOG_WARNING, "Could not parse PID for 'cfgstore'")


def unsent(stage: Stage, *syslog: tuple[int, str], pidof_run: bool = True) -> Effects:
    """AddSystemUser, which succeeds although cfgstore got no signal."""
    return Effects((), ["reply"], [PIDOF_CALL] if pidof_run else [], syslog=list(syslog))


# Of both only cfgstore learns, and everybody.
FTPD = ("AddSystemUser", "ftpd", NEW, "users", [], "", "")
ALICE = ("ModifyUser", "alice", "", "", [], "", "")


@pytest.mark.parametrize("output", [
    "", "\n", " ", "rubbish", "rubbish 12", "pid: 12", "-", "-1", "-5\n", "0", "0\n", "00", "+",
    "0x", "99999999999", "99999999999\n", "2147483648", "4294967296", "-4294967295",
    "9223372036854775807", "9223372036854775808", "18446744073709551617",
    "99999999999999999999999999", "\0001", "\u0661", "x" * 70000,
], ids=lambda output: repr(output[:30]))
def test_output_without_a_pid(output: str, stage: Stage) -> None:
    stage.pidof.print(output)

    assert stage.call(*FTPD) == unsent(stage, NOT_PARSED, NO_PID)


@pytest.mark.parametrize("output", ["{}", "{}\n", "{} {}\n", " {}\n", "\n\t{}\n", "+{}", "000{}",
                                    "{} x", "{}x", "{}.9", "{}\0"])
def test_output_with_a_pid_in_front(output: str, stage: Stage) -> None:
    stage.pidof.print(output.format(*[stage.cfgstore.pid] * 2))

    assert stage.call(*FTPD) == stage.done(pidof_run=True)


@pytest.mark.parametrize("status", [1, 255])
def test_exit_status_of_pidof_is_not_looked_at(status: int, stage: Stage) -> None:
    stage.pidof.exit_with(status)

    assert stage.call(*FTPD) == stage.done(pidof_run=True)


@pytest.mark.parametrize("pid", [2**22 + 1, 2**31 - 1])
def test_process_that_is_gone(pid: int, stage: Stage) -> None:
    stage.pidof.print(f"{pid}\n")

    expected = unsent(stage, (LOG_WARNING, "Could not send signal to cfgstore: No such process"))
    expected.output = [f"message: Got PID for process 'cfgstore': {pid}'"]
    assert stage.call(*FTPD) == expected


def test_first_of_two_gets_the_signal(stage: Stage) -> None:
    other = Neighbour("cfgstore")
    try:
        stage.pidof.print(f"{stage.cfgstore.pid} {other.pid}\n")

        assert stage.call(*FTPD) == stage.done(pidof_run=True)
        assert other.signals() == set()
    finally:
        other.close()


def test_first_that_the_real_pidof_prints_of_two_gets_the_signal(stage: Stage) -> None:
    stage.use_real_pidof()
    other = Neighbour("cfgstore")
    try:
        printed = subprocess.run([PIDOF, "cfgstore"], stdout=subprocess.PIPE, check=True).stdout
        first, second = map(int, printed.split())
        assert {first, second} == {stage.cfgstore.pid, other.pid}

        effects = stage.call(*FTPD)

        assert effects.output == [f"message: Got PID for process 'cfgstore': {first}'",
                                  f"message: Sent SIGUSR1 to cfgstore ({first})"]
        signals = {stage.cfgstore.pid: effects.signals, other.pid: other.signals()}
        assert signals == {first: {signal.SIGUSR1}, second: set()}
    finally:
        other.close()


@pytest.mark.parametrize("call, emitted", [(FTPD, False), (ALICE, True)],
                         ids=["alone", "after the bus signal"])
def test_no_cfgstore_runs(call: tuple[Any, ...], emitted: bool, stage: Stage) -> None:
    stage.use_real_pidof()
    stage.cfgstore.close()
    stage.cfgstore = Neighbour("another")

    assert stage.call(*call) == Effects(
        (), [SIGNAL, "reply"] if emitted else ["reply"], output=[EMITTED] if emitted else [],
        syslog=[NOT_PARSED, NO_PID])


def not_started(reason: str) -> tuple[int, str]:
    return (LOG_ERR, "Could not get PID for 'cfgstore': Failed to execute child process "
            f"“/bin/pidof” ({reason})")


def test_pidof_is_missing(stage: Stage) -> None:
    stage.pidof.remove()

    assert stage.call(*FTPD) == unsent(stage, not_started("No such file or directory"), NO_PID,
                                       pidof_run=False)


def test_pidof_may_not_be_run(stage: Stage) -> None:
    stage.pidof.path.chmod(0o644)

    assert stage.call(*FTPD) == unsent(stage, not_started("Permission denied"), NO_PID,
                                       pidof_run=False)


def test_pidof_is_not_searched_for_in_the_path(stage: Stage, tmp_path: Path) -> None:
    elsewhere = tmp_path / "bin"
    elsewhere.mkdir()
    (elsewhere / "pidof").write_bytes(stage.pidof.path.read_bytes())
    (elsewhere / "pidof").chmod(0o755)
    stage.stop()
    stage.start(PATH=f"{elsewhere}:/usr/sbin:/usr/bin")
    stage.pidof.remove()

    assert stage.call(*FTPD) == unsent(stage, not_started("No such file or directory"), NO_PID,
                                       pidof_run=False)


def test_failing_notification_keeps_no_other_from_happening(stage: Stage) -> None:
    stage.pidof.remove()

    expected = stage.done(*ROOT_FLAG_CALLS, signal_sent=True, lines=(ROOT_FLAG_SET,))
    expected.syslog = [not_started("No such file or directory"), NO_PID]
    assert stage.call("ModifyUser", "root", "", "", [], "", "") == expected


def test_pid_is_looked_up_afresh_each_time(stage: Stage) -> None:
    assert stage.call(*FTPD) == stage.done(pidof_run=True)
    first = stage.cfgstore.pid

    assert stage.call("RemoveUser", "ftpd") == stage.done(pidof_run=True)
    assert stage.cfgstore.pid != first


def test_receiver_that_takes_the_signal_gets_it_once(stage: Stage, tmp_path: Path) -> None:
    taken = tmp_path / "taken"
    script = ("import signal, sys\n"
              "signal.signal(signal.SIGUSR1, lambda *_: print('taken', flush=True))\n"
              "print('ready', flush=True)\n"
              "while True: signal.pause()\n")
    with taken.open("w") as output:
        receiver = subprocess.Popen(["cfgstore", "-c", script], executable="/usr/bin/python3",
                                    stdout=output)
    try:
        wait_for("the receiver", lambda: taken.read_text() == "ready\n")
        stage.pidof.print(f"{receiver.pid}\n")
        stage.succeed(*FTPD)
        wait_for("the signal", lambda: taken.read_text() == "ready\ntaken\n")
        stage.succeed("ChpasswdUser", "alice", NEW)
        assert taken.read_text() == "ready\ntaken\n"
    finally:
        receiver.kill()
        receiver.wait(5)


def test_pidof_inherits_nothing_but_its_three_descriptors(stage: Stage, tmp_path: Path) -> None:
    stage.stop()
    stage.start(wrapper=["sh", "-c", 'exec "$@" </etc/hostname', "sh"])
    stage.pidof.before_answering(f"readlink /proc/$PPID/fd/0 >{tmp_path}/input")

    stage.succeed(*FTPD)

    assert list(stage.pidof.descriptors()) == [0, 1, 2]
    assert (tmp_path / "input").read_text() == "/dev/null\n"


def test_detached_service_sends_all_of_it_to_syslog(stage: Stage) -> None:
    stage.stop()
    stage.start("-d")
    pid = stage.cfgstore.pid

    stage.succeed(*ALICE)
    stage.pidof.print("")
    stage.syslog.forget()
    stage.bus.call("AddSystemUser", "sssasss", *FTPD[1:])
    failing = stage.syslog.lines()
    stage.pidof.print(f"{pid}\n")
    stage.syslog.forget()
    stage.bus.call("RemoveUser", "s", "alice")

    assert [(line.severity, line.text) for line in failing] == [NOT_PARSED, NO_PID]
    assert stage.syslog.texts() == [
        (5, EMITTED), (5, f"message: Got PID for process 'cfgstore': {pid}'"),
        (5, f"message: Sent SIGUSR1 to cfgstore ({pid})")]
