"""tests/device/test_clocks.py: the clock methods against the kernel's clock and the hardware's."""
import pytest
from calls import BusError, ask
from camera.bus_call import PRIVANE_ERROR
from camera.machine import Camera
from camera.system_tour import LEFT_TO_SLEW
from camera.transcript import sync_journal

# 2031-02-03 04:05:06 in UTC; a February, since months count from 0 in the hardware clock's call.
MOMENT = 1927857906
HOOK = "/usr/lib/ntpd/ntpd_hook"


def system_clock(camera: Camera) -> float:
    return float(camera.run(["date", "+%s.%N"]).check().out)


def hardware_clock(camera: Camera) -> int:
    return int(camera.run('date -d "$(hwclock -r --utc)" +%s').check().out)


def left_to_slew(camera: Camera) -> int:
    """Microseconds of an adjustment that are still to come."""
    return int(camera.run(LEFT_TO_SLEW).check().out)


def test_both_clocks_are_set(camera: Camera) -> None:
    assert abs(system_clock(camera) - MOMENT) > 1e6
    assert ask(camera, "SetTimeOfDay", str(MOMENT), "250000") == (0,)
    assert 0 <= system_clock(camera) - MOMENT < 60
    assert 0 <= hardware_clock(camera) - MOMENT < 60


def test_a_moment_that_the_kernel_refuses_still_sets_the_hardware_clock(camera: Camera) -> None:
    """The kernel takes no time below its own since boot, which a hardware clock knows nothing of."""
    camera.run("until [ $(cut -d. -f1 /proc/uptime) -ge 2 ]; do sleep 0.1; done").check()
    before = system_clock(camera)
    assert ask(camera, "SetTimeOfDay", "1", "0") == (-1,)
    assert 0 <= system_clock(camera) - before < 60
    # hwclock takes two digits of a year for one of this century or the last.
    assert "1970" in camera.run(["cat", "/sys/class/rtc/rtc0/date"]).check().out


def test_a_moment_that_is_none_sets_nothing(camera: Camera) -> None:
    before = system_clock(camera), hardware_clock(camera)
    assert ask(camera, "SetTimeOfDay", str(MOMENT), "1000000") == (-1,)
    assert 0 <= system_clock(camera) - before[0] < 60
    assert 0 <= hardware_clock(camera) - before[1] < 60


def ahead_of_uptime(camera: Camera) -> float:
    """Seconds between two readings at one moment, within the resolution of the kernel's file."""
    now, uptime = camera.run("date +%s.%N; cut -d' ' -f1 /proc/uptime").check().out.split()
    return float(now) - float(uptime)


def test_the_clock_is_slewed(camera: Camera) -> None:
    before = ahead_of_uptime(camera)
    assert ask(camera, "AdjTime", "2", "0") == ()
    first = left_to_slew(camera)
    camera.run(["sleep", "2"]).check()
    second = left_to_slew(camera)
    assert abs(ahead_of_uptime(camera) - before) < 0.5, "it does not jump"
    # The kernel makes up half a millisecond a second.
    assert 0 < second < first <= 2_000_000
    assert 500 <= first - second <= 10_000


def test_the_hook_is_run(camera: Camera) -> None:
    assert ask(camera, "NotifyTimeSync") == ()
    sync_journal(camera)
    assert camera.run(["journalctl", "-t", "ntpd_hook", "-o", "cat"]).check().out == "settime\n"


@pytest.mark.parametrize("hook", ["#!/bin/sh\nexit 1\n", "#!/bin/sh\nkill -9 $$\n", None])
def test_a_hook_that_fails_is_told(camera: Camera, hook: str | None) -> None:
    if hook is None:
        camera.run(["rm", HOOK]).check()
    else:
        camera.put_file(HOOK, hook.encode(), 0o755)
    with pytest.raises(BusError) as caught:
        ask(camera, "NotifyTimeSync")
    assert (caught.value.name, caught.value.text) \
        == (f"{PRIVANE_ERROR}9", "Failed to notify time sync.")
