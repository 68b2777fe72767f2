"""tests/bus/test_tools.py: what a tool gets from the service, and odd tools."""
import time
from pathlib import Path

import pytest

from harness import process
from harness.bus import BusError, domain_error
from harness.deadline import wait_for
from harness.device import (ETHTOOL, LLDPCLI, NETSTAT, PINSRV, RUNNERS, SMARTCTL, SYSFLASH,
                            TIME_SYNC_HOOK, TOOLS, Device)
from harness.fake_folder import StandInTool
from harness.stage import Effects, Stage, refused

# Where a tool's standard output and standard error go.
CAPTURED, DROPPED, INHERITED = "captured", "dropped", "inherited"
STREAMS = {
    SYSFLASH: (INHERITED, INHERITED), TIME_SYNC_HOOK: (INHERITED, INHERITED),
    LLDPCLI: (CAPTURED, CAPTURED), ETHTOOL: (CAPTURED, CAPTURED),
    SMARTCTL: (CAPTURED, DROPPED), NETSTAT: (CAPTURED, DROPPED), PINSRV: (INHERITED, INHERITED),
}

# Starts the service with a file as its standard input, and as a descriptor that children inherit.
WITH_A_FILE_OPEN = ["bash", "-c", 'exec </etc/passwd 7</etc/passwd "$0" "$@"']

# The methods that answer with the tool's standard output.
TELLING = ("ExecuteLldpcli", "ExecuteSmartctl", "ExecuteEthtool", "GetActiveNetworkInfo")

# What stands in front of the spawn error, and GSpawnError's codes.
PREFIXES = {"ExecuteLldpcli": "Failed to execute lldpcli: ",
            "ExecuteSmartctl": "Failed to execute smartctl: ",
            "ExecuteEthtool": "Failed to execute ethtool: ",
            "GetActiveNetworkInfo": "Failed to spawn netstat: "}
NO_ACCESS, NO_ENTRY = 3, 8

MEBIBYTE = 1 << 20
SETTLED = 0.4  # seconds that a late tool takes

every_runner = pytest.mark.parametrize("member", RUNNERS)
every_telling_method = pytest.mark.parametrize("member", TELLING)


def call(system: Stage, member: str) -> Effects:
    return system.call(member, *RUNNERS[member][1])


def tool_of(device: Device, member: str) -> StandInTool:
    return device.tools[RUNNERS[member][0]]


def run_each_tool(system: Stage) -> None:
    for member in RUNNERS:
        call(system, member)
    (pid,) = system.call("Pinsrv", ["pinsrv"]).answer
    assert process.wait_for_child(pid, 5) == 0


def too_large(size: int) -> Effects:
    return refused("g-file-error-quark", 24,
                   f"The reply of {size + 8} bytes is larger than a bus message may be")


def assert_answer(effects: Effects, expected: Effects) -> None:
    """Apart from the calls of tools. Says little, where there are megabytes."""
    assert effects.messages == expected.messages
    assert effects.output == expected.output
    if isinstance(expected.answer, BusError):
        assert effects.answer == expected.answer
    else:
        assert effects.answer[0] == expected.answer[0], "another text"  # type: ignore[index]


def kind(target: str, own: str) -> str:
    if target == "/dev/null":
        return DROPPED
    return INHERITED if target == own else CAPTURED if target.startswith("pipe:") else target


def test_tools_get_no_descriptor_but_the_standard_ones(system: Stage, device: Device) -> None:
    system.stop()
    system.start(wrapper=WITH_A_FILE_OPEN)
    assert Path(f"/proc/{system.service.pid}/fd/7").readlink() == Path("/etc/passwd")
    run_each_tool(system)
    own = Path(f"/proc/{system.service.pid}/fd/1").readlink()

    for path in TOOLS:
        descriptors = device.tools[path].descriptors()
        assert list(descriptors) == [0, 1, 2], path
        assert descriptors[0] == "/dev/null", path
        assert (kind(descriptors[1], str(own)), kind(descriptors[2], str(own))) == STREAMS[path]


def test_tools_of_a_detached_service_get_the_null_device(system: Stage, device: Device) -> None:
    system.stop()
    system.start("detached")
    run_each_tool(system)

    for path in TOOLS:
        descriptors = device.tools[path].descriptors()
        assert list(descriptors) == [0, 1, 2], path
        assert all(target == "/dev/null" or target.startswith("pipe:")
                   for target in descriptors.values()), (path, descriptors)


def test_tools_inherit_the_environment(system: Stage, device: Device) -> None:
    system.stop()
    system.start(MARK_OF_THE_TEST="a b\nc", EMPTY="")
    run_each_tool(system)
    own = Path(f"/proc/{system.service.pid}/environ").read_bytes()
    assert b"MARK_OF_THE_TEST=a b\nc\0" in own

    for path in TOOLS:
        assert device.tools[path].surroundings() == own, path


def test_tools_run_where_the_service_runs(system: Stage, device: Device, tmp_path: Path) -> None:
    for path in TOOLS:
        device.tools[path].before_answering(f"pwd >>{tmp_path}/{Path(path).name}")
    run_each_tool(system)

    own = str(Path(f"/proc/{system.service.pid}/cwd").readlink())
    assert {(tmp_path / Path(path).name).read_text() for path in TOOLS} == {f"{own}\n"}


def test_tools_are_found_by_their_whole_path_only(system: Stage, device: Device,
                                                  tmp_path: Path) -> None:
    for path in TOOLS:
        device.tools[path].remove()
        decoy = tmp_path / Path(path).name
        decoy.write_text(f"#!/bin/sh\ntouch {tmp_path}/was-run\n")
        decoy.chmod(0o755)
    system.stop()
    system.start(PATH=str(tmp_path))

    for member in RUNNERS:
        call(system, member)
    assert system.call("Pinsrv", ["pinsrv"]).answer == (-1,)
    assert not (tmp_path / "was-run").exists()


def test_tools_that_end_leave_no_child(system: Stage) -> None:
    run_each_tool(system)

    assert process.children(system.service.pid) == set()


@every_telling_method
@pytest.mark.parametrize("fault, code, reason", [
    ("missing", NO_ENTRY, "No such file or directory"),
    ("not executable", NO_ACCESS, "Permission denied"),
    ("a folder", NO_ACCESS, "Permission denied"),
    ("a link to nothing", NO_ENTRY, "No such file or directory")])
def test_tool_that_cannot_be_started_is_told_in_glibs_words(
        fault: str, code: int, reason: str, member: str, system: Stage, device: Device) -> None:
    tool = tool_of(device, member)
    if fault == "not executable":
        tool.path.chmod(0o644)
    else:
        tool.remove()
    if fault == "a folder":
        tool.path.mkdir()
    if fault == "a link to nothing":
        tool.path.symlink_to("/nosuch")

    assert call(system, member) == refused(
        "g-exec-error-quark", code,
        f"{PREFIXES[member]}Failed to execute child process “{tool.path}” ({reason})")


@every_telling_method
def test_tool_that_prints_nothing_answers_with_nothing(member: str, system: Stage) -> None:
    assert call(system, member).answer == ("",)


@every_telling_method
def test_tool_that_prints_16_mebibytes_is_answered_whole(member: str, system: Stage,
                                                         device: Device) -> None:
    text = "0123456789abcde\n" * MEBIBYTE
    tool_of(device, member).print(text)

    assert_answer(call(system, member), Effects((text,), ["reply"]))


@every_telling_method
def test_tool_that_prints_more_than_a_message_carries_is_an_error(member: str, system: Stage,
                                                                  device: Device) -> None:
    tool_of(device, member).print(b"x" * (40 * MEBIBYTE))

    assert_answer(call(system, member), too_large(40 * MEBIBYTE))
    tool_of(device, member).print("less\n")
    assert call(system, member).answer == ("less\n",)


@pytest.mark.parametrize("member", ["ExecuteLldpcli", "ExecuteEthtool"])
def test_error_text_that_no_message_carries_is_an_error(member: str, system: Stage,
                                                        device: Device) -> None:
    tool_of(device, member).print_error(b"x" * (40 * MEBIBYTE))
    tool_of(device, member).exit_with(1)

    assert_answer(call(system, member), too_large(40 * MEBIBYTE))


@pytest.mark.parametrize("member", ["ExecuteSmartctl", "GetActiveNetworkInfo"])
def test_dropped_error_text_of_any_size_does_no_harm(member: str, system: Stage,
                                                     device: Device) -> None:
    tool_of(device, member).print("an answer\n")
    tool_of(device, member).print_error(b"x" * (40 * MEBIBYTE))

    assert call(system, member).answer == ("an answer\n",)


def test_netstat_that_fails_after_much_output_is_its_usual_error(system: Stage,
                                                                 device: Device) -> None:
    device.tools[NETSTAT].print(b"x" * (40 * MEBIBYTE))
    device.tools[NETSTAT].exit_with(3)

    assert call(system, "GetActiveNetworkInfo").answer == domain_error(
        "privaneSystemError", 28, "netstat call failed with code: 3")


@every_telling_method
def test_output_that_is_no_utf8_is_made_sendable(member: str, system: Stage,
                                                 device: Device) -> None:
    tool_of(device, member).print(b"caf\xe9 \xff\xfe ok \xed\xa0\x80\n")

    assert call(system, member).answer == (
        "caf\ufffd \ufffd\ufffd ok \ufffd\ufffd\ufffd\n",)


@every_telling_method
def test_output_that_grows_too_large_when_it_is_made_valid_is_an_error(
        member: str, system: Stage, device: Device) -> None:
    tool_of(device, member).print(b"\xff" * (16 * MEBIBYTE))

    assert_answer(call(system, member), too_large(48 * MEBIBYTE))


@every_telling_method
def test_output_ends_at_a_nul_byte(member: str, system: Stage, device: Device) -> None:
    tool_of(device, member).print(b"seen\0not seen")

    assert call(system, member).answer == ("seen",)


@every_telling_method
def test_tool_that_reads_gets_nothing(member: str, system: Stage, device: Device) -> None:
    tool_of(device, member).before_answering("wc -c")

    assert call(system, member).answer == ("0\n",)


@every_runner
def test_tool_that_closes_its_output_is_waited_for(member: str, system: Stage,
                                                   device: Device) -> None:
    tool_of(device, member).print("x")
    tool_of(device, member).answer("linger", int(SETTLED * 1000))
    tool_of(device, member).exit_with(0 if member == "NotifyTimeSync" else 1)
    begin = time.monotonic()

    effects = call(system, member)

    assert time.monotonic() - begin >= SETTLED
    assert effects.answer == {
        "Reboot": (256,), "NotifyTimeSync": (), "ExecuteSmartctl": ("x",),
        "GetActiveNetworkInfo": domain_error("privaneSystemError", 28,
                                             "netstat call failed with code: 1"),
    }.get(member, ("",))
    assert process.children(system.service.pid) == set()


@every_runner
def test_other_calls_wait_for_the_tool(member: str, system: Stage, device: Device) -> None:
    tool_of(device, member).answer("linger", int(SETTLED * 1000))

    first = system.send(member, *RUNNERS[member][1])
    second = system.send("CheckUser", "root")

    assert [message.reply_serial for message in system.wire.until_reply(second)] == [first, second]


@every_telling_method
def test_output_of_what_a_tool_leaves_behind_belongs_to_the_answer(member: str, system: Stage,
                                                                   device: Device) -> None:
    tool_of(device, member).before_answering(f"(sleep {SETTLED}; echo late) &")
    tool_of(device, member).print("early\n")
    begin = time.monotonic()

    assert call(system, member).answer == ("early\nlate\n",)
    assert time.monotonic() - begin >= SETTLED


@pytest.mark.parametrize("member", ["Reboot", "NotifyTimeSync"])
def test_what_a_tool_without_an_answer_leaves_behind_is_not_waited_for(
        member: str, system: Stage, device: Device) -> None:
    tool_of(device, member).before_answering("sleep 30 &")
    others = process.children()

    effects = call(system, member)

    assert not isinstance(effects.answer, BusError)
    (left,) = wait_for("what the tool left", lambda: [
        child for child in process.children() - others if process.name(child) == "sleep"])
    process.end(left)


@every_runner
def test_odd_tools_leave_the_next_call_as_it_is(member: str, system: Stage,
                                                device: Device) -> None:
    before = call(system, member)
    tool = tool_of(device, member)
    tool.before_answering("kill -KILL $PPID")
    call(system, member)
    content = tool.path.read_bytes()
    tool.remove()
    call(system, member)

    (tool.directory / "hook").unlink()
    tool.path.write_bytes(content)
    tool.path.chmod(0o755)
    assert call(system, member) == before
