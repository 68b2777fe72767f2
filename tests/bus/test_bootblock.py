"""tests/bus/test_bootblock.py: the methods on the parameters of the boot block."""
import errno

import pytest

from harness.bus import domain_error, error_of
from harness.device import Device, answered, asked, failed
from harness.fake_authz import FakeAuthz
from harness.stage import Effects, Stage

DEFAULTS = ("bootparam_default_chip",)
SET_CHIP = ("bootparam_set_chip", "0", "0")

# The answers of the library that count as an empty value.
ABSENT, BLANK = -988, -982

ADD = ("AddBootblockParam", "COLOR", "blue")
WRITE = ("bootparam_write", "COLOR", "blue", "0")

# A reader, the name that it reads, and how a message of its failure names it.
READERS = {"ReadSerno": ((), "SERNO", '"SERNO"'),
           "ReadBootblockParam": (("COLOR",), "COLOR", '"COLOR"')}

every_reader = pytest.mark.parametrize("member", READERS)


def reads(name: str) -> tuple[tuple[str, ...], ...]:
    return (DEFAULTS, SET_CHIP, ("bootparam_read", name, "0", "0"))


def read(system: Stage, member: str) -> Effects:
    return system.call(member, *READERS[member][0])


@every_reader
def test_value_is_read(member: str, system: Stage, device: Device, authz: FakeAuthz) -> None:
    authz.forget()
    device.boot.hold("00408C123456")

    assert read(system, member) == answered("00408C123456", calls=reads(READERS[member][1]))
    assert asked(authz) == [member.lower()]


@every_reader
def test_success_without_a_value_is_empty(member: str, system: Stage) -> None:
    assert read(system, member) == answered("", calls=reads(READERS[member][1]))


@every_reader
@pytest.mark.parametrize("result", [ABSENT, BLANK])
def test_parameter_that_is_not_there_is_empty(result: int, member: str, system: Stage,
                                              device: Device) -> None:
    device.boot.fail("read", result, errno.ENOENT)

    assert read(system, member) == answered("", calls=reads(READERS[member][1]))


@every_reader
@pytest.mark.parametrize("result", [ABSENT, BLANK])
def test_value_that_comes_with_such_a_result_is_answered(result: int, member: str, system: Stage,
                                                         device: Device) -> None:
    device.boot.hold("a default")
    device.boot.fail("read", result, errno.ENOENT)

    assert read(system, member) == answered("a default", calls=reads(READERS[member][1]))


@every_reader
@pytest.mark.parametrize("result, number", [
    (-1, 5), (-2, 0), (1, 22), (988, 3), (982, 3), (-981, 2), (-983, 2), (-987, 2), (-989, 2)])
def test_any_other_result_is_an_error(result: int, number: int, member: str, system: Stage,
                                      device: Device) -> None:
    device.boot.fail("read", result, number)
    device.boot.hold("not to be told")

    assert read(system, member) == failed(
        16, f"Failed to read bootblock parameter {READERS[member][2]}, res={result}, "
            f"error={number}", *reads(READERS[member][1]))


@every_reader
@pytest.mark.parametrize("result, number", [(-1, 19), (1, 0), (ABSENT, 2), (BLANK, 2)])
def test_failing_chip_selection_stops_a_read(result: int, number: int, member: str, system: Stage,
                                             device: Device) -> None:
    device.boot.fail("set-chip", result, number, errno.ENODEV)

    assert read(system, member) == failed(
        15, f"Failed to set chip parameters, error={number}", DEFAULTS, SET_CHIP)


@every_reader
def test_error_number_starts_at_0_in_each_call(member: str, system: Stage,
                                               device: Device) -> None:
    device.boot.fail("read", -1, 77)
    first = read(system, member)

    assert read(system, member) == first
    assert first.calls[-1][-1] == "0"


@every_reader
def test_chip_is_selected_afresh_for_each_call(member: str, system: Stage,
                                               device: Device) -> None:
    for value in ("one", "two"):
        device.boot.hold(value)
        assert read(system, member) == answered(value, calls=reads(READERS[member][1]))


@pytest.mark.parametrize("name", ["", "SERNO", "a=b", "two words", "café", "x\ny", "-n", "%s%n",
                                  "a" * 1000])
def test_name_is_handed_to_the_library_unchecked(name: str, system: Stage, device: Device) -> None:
    device.boot.hold("v")
    assert system.call("ReadBootblockParam", name) == answered("v", calls=reads(name))

    device.boot.fail("read", -2, errno.EINVAL)
    assert system.call("ReadBootblockParam", name) == failed(
        16, f'Failed to read bootblock parameter "{name}", res=-2, error=22', *reads(name))


@every_reader
def test_value_that_is_no_utf8_is_made_sendable(member: str, system: Stage,
                                                device: Device) -> None:
    device.boot.hold(b"caf\xe9\n")

    assert read(system, member).answer == ("caf\ufffd\n",)


@every_reader
def test_value_that_no_message_carries_is_an_error(member: str, system: Stage,
                                                   device: Device) -> None:
    device.boot.hold(b"x" * (33 << 20))

    effects = read(system, member)

    text = f"The reply of {(33 << 20) + 8} bytes is larger than a bus message may be"
    assert effects.answer == domain_error("g-file-error-quark", 24, text)
    assert effects.output == [f"warning: {text}"]


def test_parameter_is_written(system: Stage, authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call(*ADD) == answered(calls=(DEFAULTS, SET_CHIP, WRITE))
    assert asked(authz) == ["addbootblockparam"]


@pytest.mark.parametrize("name, value", [
    ("", ""), ("a=b", "c=d"), ("SERNO", ""), ("x\ny", "1\n2"), ("café", "%s%n"),
    ("n" * 5000, "v" * 100_000)])
def test_name_and_value_are_handed_to_the_library_unchecked(name: str, value: str,
                                                            system: Stage) -> None:
    assert system.call("AddBootblockParam", name, value) == answered(
        calls=(DEFAULTS, SET_CHIP, ("bootparam_write", name, value, "0")))


@pytest.mark.parametrize("result", [-1, 1, ABSENT, BLANK])
def test_failing_chip_selection_stops_a_write(result: int, system: Stage, device: Device) -> None:
    device.boot.fail("set-chip", result, 19, errno.ENODEV)

    assert system.call(*ADD) == failed(
        15, "Failed to set chip parameters 19 No such device", DEFAULTS, SET_CHIP)


@pytest.mark.parametrize("result", [-1, 1, ABSENT, BLANK])
def test_failing_write_is_an_error(result: int, system: Stage, device: Device) -> None:
    device.boot.fail("write", result, 28, errno.ENOSPC)

    assert system.call(*ADD) == failed(
        17, "Failed to write bootblock parameter 28 No space left on device",
        DEFAULTS, SET_CHIP, WRITE)


@pytest.mark.parametrize("function, code, text", [
    ("set-chip", 15, "Failed to set chip parameters 7 Success"),
    ("write", 17, "Failed to write bootblock parameter 7 Success")])
def test_failure_without_an_errno_tells_none_of_earlier_calls(
        function: str, code: int, text: str, system: Stage, device: Device) -> None:
    device.boot.fail(function, -1, 7)

    assert system.call(*ADD).answer == domain_error("privaneSystemError", code, text)


@pytest.mark.parametrize("member, arguments", [
    ("ReadSerno", ()), ("ReadBootblockParam", ("COLOR",)), ("AddBootblockParam", ("COLOR", "b"))])
def test_refused_caller_does_not_reach_the_boot_block(
        member: str, arguments: tuple[str, ...], system: Stage, device: Device,
        authz: FakeAuthz) -> None:
    authz.refuse_silently()

    assert error_of(system.bus.call, member, "s" * len(arguments), *arguments) == domain_error(
        "privaneSystemError", 25, "Unknown")
    assert device.boot.calls() == []
