"""tests/bus/test_pinsrv.py: the method that starts pinsrv and does not wait for it."""
from pathlib import Path

import pytest

from harness import process
from harness.bus import domain_error, error_of
from harness.deadline import wait_for
from harness.device import PINSRV, Device, answered, asked
from harness.fake_authz import FakeAuthz
from harness.fake_folder import StandInTool
from harness.stage import LOG_WARNING, Effects, Stage

NOT_FOUND = Effects((-1,), ["reply"],
                    syslog=[(LOG_WARNING, "pinserver not found or not executable")])


def not_started(reason: str) -> Effects:
    return answered(-1, output=("warning: Failed to start pinsrv: Failed to execute child process "
                                f"“/usr/bin/pinsrv” ({reason})",))


def run(system: Stage, pinsrv: StandInTool, arguments: list[str]) -> tuple[str, ...]:
    """Starts pinsrv and waits for its end; the vector that it was started with."""
    effects = system.call("Pinsrv", arguments)
    (pid,) = effects.answer
    # The reply may come before the record of the call.
    assert effects == Effects((pid,), ["reply"], effects.calls)
    assert process.wait_for_child(pid, 5) == 0
    (call,) = pinsrv.calls()
    return call.words


@pytest.fixture
def pinsrv(device: Device) -> StandInTool:
    return device.tools[PINSRV]


def test_pinsrv_is_started_with_the_elements_from_the_second_on(system: Stage, pinsrv: StandInTool,
                                                                authz: FakeAuthz) -> None:
    authz.forget()

    assert run(system, pinsrv, ["pinsrv", "-d"]) == (PINSRV, "-d")
    assert asked(authz) == ["pinsrv"]


@pytest.mark.parametrize("arguments, vector", [
    ([], ()), (["pinsrv"], ()), ([""], ()), (["/bin/sh"], ()), (["x", ""], ("",)),
    (["x", "", ""], ("", "")), (["x", "-c", "a b", "'", '"', "\n", "é"],
                                ("-c", "a b", "'", '"', "\n", "é")),
    (["x", *map(str, range(2000))], tuple(map(str, range(2000))))],
    ids=["empty", "name", "empty name", "another name", "an empty element", "two empty elements",
         "odd elements", "many elements"])
def test_elements_are_passed_through(arguments: list[str], vector: tuple[str, ...], system: Stage,
                                     pinsrv: StandInTool) -> None:
    assert run(system, pinsrv, arguments) == (PINSRV, *vector)


def test_answer_is_the_process_id(system: Stage, pinsrv: StandInTool, tmp_path: Path) -> None:
    pinsrv.before_answering(f"echo $PPID >{tmp_path}/pid")

    (pid,) = system.call("Pinsrv", ["pinsrv"]).answer

    assert process.wait_for_child(pid, 5) == 0
    assert (tmp_path / "pid").read_text() == f"{pid}\n"


def test_answer_does_not_wait_for_pinsrv(system: Stage, pinsrv: StandInTool) -> None:
    pinsrv.answer("linger", 60_000)
    (pid,) = system.call("Pinsrv", ["pinsrv"]).answer
    wait_for("pinsrv's start", pinsrv.calls)

    assert process.name(pid) == "pinsrv"
    assert process.children(system.service.pid) == set()
    system.restart()
    assert process.name(pid) == "pinsrv"

    process.end(pid)


@pytest.mark.parametrize("status", [1, 255])
def test_failure_of_pinsrv_is_not_told(status: int, system: Stage, pinsrv: StandInTool) -> None:
    pinsrv.exit_with(status)

    (pid,) = system.call("Pinsrv", ["pinsrv"]).answer
    assert process.wait_for_child(pid, 5) == status


def test_device_without_pinsrv_answers_minus_1(system: Stage, pinsrv: StandInTool) -> None:
    pinsrv.remove()

    assert system.call("Pinsrv", ["pinsrv", "-d"]) == NOT_FOUND


def test_link_to_nothing_answers_minus_1(system: Stage, pinsrv: StandInTool) -> None:
    pinsrv.remove()
    pinsrv.path.symlink_to("/nosuch")

    assert system.call("Pinsrv", []) == NOT_FOUND


def test_pinsrv_that_is_not_executable_answers_minus_1(system: Stage, pinsrv: StandInTool) -> None:
    pinsrv.path.chmod(0o644)

    assert system.call("Pinsrv", ["pinsrv", "-d"]) == NOT_FOUND


def test_folder_in_the_place_of_pinsrv_answers_minus_1(system: Stage, pinsrv: StandInTool) -> None:
    pinsrv.remove()
    pinsrv.path.mkdir()

    assert system.call("Pinsrv", ["pinsrv"]) == not_started("Permission denied")


def test_element_that_the_kernel_does_not_take_answers_minus_1(system: Stage,
                                                               pinsrv: StandInTool) -> None:
    # execve(2): 32 pages with the terminator.
    assert system.call("Pinsrv", ["pinsrv", "x" * (128 << 10)]) == not_started(
        "Argument list too long")
    assert run(system, pinsrv, ["pinsrv", "x" * ((128 << 10) - 1)])[1] == "x" * ((128 << 10) - 1)


def test_refused_caller_starts_nothing(system: Stage, pinsrv: StandInTool,
                                       authz: FakeAuthz) -> None:
    authz.refuse_silently()

    assert error_of(system.bus.call, "Pinsrv", "as", ["pinsrv"]) == domain_error(
        "privaneSystemError", 25, "Unknown")
    assert pinsrv.calls() == []
    pinsrv.remove()
    assert error_of(system.bus.call, "Pinsrv", "as", ["pinsrv"]) == domain_error(
        "privaneSystemError", 25, "Unknown")
    assert system.syslog.lines() == []
