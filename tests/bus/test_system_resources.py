"""tests/bus/test_system_resources.py: what the system methods take is released."""
from pathlib import Path
from typing import Any

from harness.bus import BusError
from harness.device import LLDPCLI, PINSRV, TOOLS, Device
from harness.ethernet import Ethernet
from harness.interface import METHODS
from harness.stage import SIGNATURES, Stage

# The status that tells of a finding, since the service itself would end with 0 or 1.
FOUND = 99
VALGRIND = ["valgrind", "--quiet", f"--error-exitcode={FOUND}", "--leak-check=full",
            "--errors-for-leak-kinds=definite", "--show-leak-kinds=definite",
            "--child-silent-after-fork=yes"]

# Under valgrind a call takes some ten times as long.
CALL_SECONDS = 60


def attempt(system: Stage, member: str, *arguments: Any) -> None:
    try:
        system.bus.call(member, SIGNATURES[member], *arguments, timeout=CALL_SECONDS)
    except BusError:
        pass


def call_each_method(system: Stage) -> None:
    for method in METHODS:
        attempt(system, method.member, *method.arguments)


def test_nothing_is_lost_by_good_and_bad_calls(hardware_clock: Path, system: Stage,
                                               device: Device) -> None:
    system.stop()
    system.start(wrapper=VALGRIND, G_SLICE="always-malloc")
    ethernet = Ethernet()
    ethernet.report(100)
    device.boot.hold("a value")
    device.tools[LLDPCLI].print("an answer\n")

    call_each_method(system)
    device.systemd.fail("org.freedesktop.systemd1.NoSuchUnit", "no")
    device.boot.fail("read", -1, 5)
    device.boot.fail("write", -1, 5)
    ethernet.report(5000)
    for path in TOOLS:
        device.tools[path].exit_with(1)
    call_each_method(system)
    made = {call[0] for call in system.calls()}
    for path in TOOLS:
        device.tools[path].remove()
    call_each_method(system)
    device.tools[PINSRV].path.mkdir()
    for member, *arguments in (
            ("StartService", "Bad"), ("StartService", "a" * 65), ("StartService", "foo@bar"),
            ("GetActiveNetworkInfo", "bad"), ("ExecuteLldpcli", "bad"),
            ("ExecuteSmartctl", "all", "bad"), ("ExecuteEthtool", "d", "bad"),
            ("ReadLogFile", "/dev/zero"), ("ReadLogFile", "/etc"), ("ReadLogFile", "/etc/passwd"),
            ("UpdateReleaseFile", "neither"), ("AdjTime", 5000, 0), ("Pinsrv", [])):
        attempt(system, member, *arguments)
    ethernet.close()

    # The end of the service, which the stage waits for, has the verdict on the rest.
    assert made >= {*TOOLS, "StartUnit", "SetDefaultTarget", "bootparam_read", "bootparam_write",
                    "rtc_write_time"}
