"""tests/bus/test_clock.py: the methods that set and slew the clock.

The sandbox has no right to change the clock, so the kernel refuses every call here; a success is
one that strace answers in the kernel's place.
"""
from pathlib import Path

import pytest

from harness.bus import domain_error, error_of
from harness.device import TIME_SYNC_HOOK, Device, answered, asked, failed
from harness.fake_authz import FakeAuthz
from harness.stage import Stage
from harness.strace import Attached

# What the C library makes of settimeofday and adjtime, and all else that could change a clock.
CLOCK_CALLS = "settimeofday,clock_settime,adjtimex,clock_adjtime"

HOOK_CALL = (TIME_SYNC_HOOK, "settime")
HOOK_FAILED = failed(9, "Failed to notify time sync.", HOOK_CALL)
NOT_ADJUSTED = failed(8, "Failed to adjust the system clock.")

BIGGEST, SMALLEST = 2**31 - 1, -2**31


def rtc_call(seconds: int, microseconds: int) -> tuple[str, ...]:
    return ("rtc_write_time", str(seconds), str(microseconds))


@pytest.mark.parametrize("seconds, microseconds", [
    (1_700_000_000, 250_000), (0, 0), (0, 999_999), (BIGGEST, 1), (-1, 0), (SMALLEST, 7)])
def test_clock_is_set_to_exactly_this_time(seconds: int, microseconds: int, system: Stage,
                                           tmp_path: Path) -> None:
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS,
                  "clock_settime:retval=0") as trace:
        assert system.call("SetTimeOfDay", seconds, microseconds) == answered(0)

    assert trace.calls() == [f"clock_settime(CLOCK_REALTIME, {{tv_sec={seconds}, "
                             f"tv_nsec={microseconds * 1000}}}) = 0 (INJECTED)"]


def test_refused_time_is_an_ordinary_answer(system: Stage, authz: FakeAuthz,
                                            tmp_path: Path) -> None:
    authz.forget()
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS) as trace:
        assert system.call("SetTimeOfDay", 1_700_000_000, 250_000) == answered(-1)

    assert trace.calls() == ["clock_settime(CLOCK_REALTIME, {tv_sec=1700000000, "
                             "tv_nsec=250000000}) = -1 EPERM (Operation not permitted)"]
    assert asked(authz) == ["settimeofday"]


@pytest.mark.parametrize("seconds, microseconds", [
    (1_700_000_000, 250_000), (-5, 0), (0, 1_000_000), (0, -1), (BIGGEST, BIGGEST),
    (SMALLEST, SMALLEST)])
def test_hardware_clock_is_written_although_the_kernel_refuses(
        seconds: int, microseconds: int, hardware_clock: Path, system: Stage) -> None:
    assert system.call("SetTimeOfDay", seconds, microseconds) == answered(
        -1, calls=(rtc_call(seconds, microseconds),))


def test_hardware_clock_is_written_after_the_system_clock(hardware_clock: Path, system: Stage,
                                                          device: Device, tmp_path: Path) -> None:
    with Attached(system.service.pid, tmp_path / "trace", "clock_settime,openat",
                  "clock_settime:retval=0") as trace:
        assert system.call("SetTimeOfDay", 7, 8) == answered(0, calls=(rtc_call(7, 8),))

    record = str(device.rtc.directory / "calls")
    order = ["system" if call.startswith("clock_settime") else "hardware"
             for call in trace.calls() if call.startswith("clock_settime") or record in call]
    assert order[:2] == ["system", "hardware"]


@pytest.mark.parametrize("result", [-1, 1, 42])
def test_what_the_hardware_clock_says_is_not_used(result: int, hardware_clock: Path, system: Stage,
                                                  device: Device, tmp_path: Path) -> None:
    device.rtc.answer("result", result)

    assert system.call("SetTimeOfDay", 7, 8) == answered(-1, calls=(rtc_call(7, 8),))
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS, "clock_settime:retval=0"):
        assert system.call("SetTimeOfDay", 7, 8) == answered(0, calls=(rtc_call(7, 8),))


def test_hardware_clock_that_shows_up_later_is_never_written(system: Stage) -> None:
    rtc = Path("/dev/rtc")
    rtc.write_bytes(b"")
    try:
        assert system.call("SetTimeOfDay", 7, 8) == answered(-1)
    finally:
        rtc.unlink()


def test_hardware_clock_that_goes_after_the_start_is_still_written(hardware_clock: Path,
                                                                   system: Stage) -> None:
    hardware_clock.unlink()

    assert system.call("SetTimeOfDay", 7, 8) == answered(-1, calls=(rtc_call(7, 8),))


@pytest.mark.parametrize("seconds, microseconds, offset", [
    (1, 0, 1_000_000), (0, 0, 0), (0, 1, 1), (0, -1, -1), (-3, 250_000, -2_750_000),
    (2, 2_000_000, 4_000_000), (2145, 0, 2_145_000_000)])
def test_clock_is_slewed_by_exactly_this_much(seconds: int, microseconds: int, offset: int,
                                              system: Stage, authz: FakeAuthz,
                                              tmp_path: Path) -> None:
    authz.forget()
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS,
                  "clock_adjtime:retval=0") as trace:
        assert system.call("AdjTime", seconds, microseconds) == answered()

    (call,) = trace.calls()
    assert call.startswith("clock_adjtime(CLOCK_REALTIME, {modes=ADJ_OFFSET_SINGLESHOT, "
                           f"offset={offset}, ")
    assert asked(authz) == ["adjtime"]


def test_state_of_the_clock_is_no_failure_of_the_slewing(system: Stage, tmp_path: Path) -> None:
    time_error = 5  # adjtimex(2): the clock is not synchronized
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS,
                  f"clock_adjtime:retval={time_error}"):
        assert system.call("AdjTime", 1, 0) == answered()


def test_slewing_that_the_kernel_refuses_is_an_error(system: Stage, tmp_path: Path) -> None:
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS) as trace:
        assert system.call("AdjTime", 1, 500_000) == NOT_ADJUSTED

    (call,) = trace.calls()
    assert call.startswith("clock_adjtime(CLOCK_REALTIME, ")
    assert call.endswith("= -1 EPERM (Operation not permitted)")


@pytest.mark.parametrize("seconds", [2147, BIGGEST, -2147, SMALLEST])
def test_slewing_out_of_range_is_an_error(seconds: int, system: Stage, tmp_path: Path) -> None:
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS,
                  "clock_adjtime:retval=0") as trace:
        assert system.call("AdjTime", seconds, 0) == NOT_ADJUSTED

    assert trace.calls() == []


def test_slewing_leaves_the_hardware_clock_alone(hardware_clock: Path, system: Stage) -> None:
    assert system.call("AdjTime", 1, 0).calls == []


def test_refused_callers_touch_no_clock(hardware_clock: Path, system: Stage, device: Device,
                                        authz: FakeAuthz, tmp_path: Path) -> None:
    authz.refuse_silently()
    with Attached(system.service.pid, tmp_path / "trace", CLOCK_CALLS) as trace:
        for member in ("SetTimeOfDay", "AdjTime"):
            assert error_of(system.bus.call, member, "ii", 1, 2) == domain_error(
                "privaneSystemError", 25, "Unknown")

    assert trace.calls() == []
    assert device.rtc.calls() == []


def test_hook_is_told_of_a_time_sync(system: Stage, authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call("NotifyTimeSync") == answered(calls=(HOOK_CALL,))
    assert asked(authz) == ["notifytimesync"]


@pytest.mark.parametrize("status", [1, 2, 127, 128, 255])
def test_hook_that_exits_with_a_failure_is_told(status: int, system: Stage,
                                                device: Device) -> None:
    device.tools[TIME_SYNC_HOOK].exit_with(status)

    assert system.call("NotifyTimeSync") == HOOK_FAILED


@pytest.mark.parametrize("signal", ["TERM", "KILL", "ABRT"])
def test_hook_that_is_killed_is_told(signal: str, system: Stage, device: Device) -> None:
    device.tools[TIME_SYNC_HOOK].before_answering(f"kill -{signal} $PPID")

    assert system.call("NotifyTimeSync") == HOOK_FAILED


def test_hook_that_is_not_there_is_told_in_the_same_words(system: Stage, device: Device) -> None:
    device.tools[TIME_SYNC_HOOK].remove()

    assert system.call("NotifyTimeSync") == failed(9, "Failed to notify time sync.")


def test_what_the_hook_prints_goes_where_the_service_prints(system: Stage, device: Device) -> None:
    device.tools[TIME_SYNC_HOOK].print("stepped\n")
    device.tools[TIME_SYNC_HOOK].print_error("by 3 s\n")

    assert system.call("NotifyTimeSync") == answered(calls=(HOOK_CALL,),
                                                     output=("stepped", "by 3 s"))
