"""tests/bus/test_privanectl_system.py: the client's commands on units, clocks, tools and files."""
from pathlib import Path

import pytest

from harness import process
from harness.bus import Bus, BusError
from harness.device import (ETHTOOL, LLDPCLI, NETSTAT, PINSRV, SMARTCTL, SYSFLASH, TIME_SYNC_HOOK,
                            Device)
from harness.ethernet import AUTONEGOTIATION, FULL, HALF, Ethernet
from harness.privanectl import DONE, Run, failed, privanectl, wrong_usage
from harness.stage import Stage

NOTHING = Run(DONE, "", "")
NO_RESULTS = Run(DONE, "{}\n", "")


@pytest.mark.parametrize("words, call", [
    (("unit", "start", "sshd"), ("StartUnit", "ss", "sshd.service", "replace")),
    (("unit", "stop", "getty@tty1.service"), ("StopUnit", "ss", "getty@tty1.service", "replace")),
    (("unit", "restart", "sshd.service"), ("RestartUnit", "ss", "sshd.service", "replace")),
    (("unit", "reload", "-j", "sshd"), ("ReloadUnit", "ss", "sshd.service", "replace")),
    (("default-target", "rescue"), ("SetDefaultTarget", "sb", "rescue.target", "True")),
    (("default-target", "rescue.target"), ("SetDefaultTarget", "sb", "rescue.target", "True")),
    (("ntp", "start"), ("StartUnit", "ss", "ntp.service", "replace")),
    (("ntp", "stop"), ("StopUnit", "ss", "ntp.service", "replace")),
    (("ntp", "restart"), ("RestartUnit", "ss", "ntp.service", "replace")),
    (("lensd", "start"), ("StartUnit", "ss", "lensd.service", "replace")),
    (("lensd", "stop"), ("StopUnit", "ss", "lensd.service", "replace")),
])
def test_units(words: tuple[str, ...], call: tuple[str, ...], system: Stage) -> None:
    assert privanectl(*words) == (NO_RESULTS if "-j" in words else NOTHING)
    assert system.calls() == [call]


def test_failure_of_systemd(system: Stage, device: Device) -> None:
    device.systemd.fail("org.freedesktop.systemd1.NoSuchUnit", "Unit sshd.service not found.")

    assert privanectl("unit", "start", "sshd") == failed(
        "Action startservice on sshd failed: StartUnit failed, "
        "GDBus.Error:org.freedesktop.systemd1.NoSuchUnit: Unit sshd.service not found. "
        "(privaneSystemError 29)")
    assert privanectl("unit", "start", "Sshd") == failed(
        "Invalid unit 'Sshd': Name contained invalid characters (privaneSystemError 29)")


@pytest.mark.parametrize("written, seconds, microseconds", [
    ("@1700000000", 1_700_000_000, 0), ("@1700000000.25", 1_700_000_000, 250_000),
    ("@1700000000.000001", 1_700_000_000, 1), ("2026-01-31 23:59:59", 1_769_903_999, 0),
    ("2026-01-31T23:59:59.5", 1_769_903_999, 500_000),
    ("2026-01-31T23:59:59+01:00", 1_769_900_399, 0)])
def test_clock_set(written: str, seconds: int, microseconds: int, hardware_clock: Path,
                   system_with_clock: Stage) -> None:
    time = (str(seconds), str(microseconds))

    assert privanectl("clock", "set", written) == NOTHING
    assert system_with_clock.calls() == [("settimeofday", *time), ("rtc_write_time", *time)]


def test_time_that_the_kernel_refuses_is_a_failure(hardware_clock: Path, system: Stage) -> None:
    # The sandbox lacks the right to set the system clock, which the service tells in its result.
    assert privanectl("clock", "set", "@7.5") == failed("The kernel refused the time")
    assert system.calls() == [("rtc_write_time", "7", "500000")]


def test_clock_set_in_local_time(hardware_clock: Path, system: Stage) -> None:
    privanectl("clock", "set", "2026-01-31 23:59:59", environment={"TZ": "<+02>-2"})

    assert system.calls() == [("rtc_write_time", str(1_769_903_999 - 7200), "0")]


@pytest.mark.parametrize("written", ["", "noon", "@", "@1.", "@1.1234567", "@2147483648", "@1e3",
                                     "2026-01-31", "2026-13-01 00:00:00", "2039-01-01 00:00:00"])
def test_what_is_no_time(written: str, hardware_clock: Path, system: Stage) -> None:
    assert privanectl("clock", "set", written) == wrong_usage(
        f"'{written}' is no time; write \"2026-01-31 23:59:59\" or @SECONDS")
    assert system.calls() == []


@pytest.mark.parametrize("written, seconds, microseconds", [
    ("1", 1, 0), ("-1", -1, 0), ("-1.5", -1, -500_000), ("0.000001", 0, 1),
    ("-0.5", 0, -500_000)])
def test_clock_adjust(written: str, seconds: int, microseconds: int, hardware_clock: Path,
                      system_with_clock: Stage) -> None:
    assert privanectl("clock", "adjust", written) == NOTHING
    assert system_with_clock.calls() == [("adjtime", str(seconds), str(microseconds))]


def test_adjustment_that_the_kernel_refuses_is_a_failure(system: Stage) -> None:
    assert privanectl("clock", "adjust", "1") == failed(
        "Failed to adjust the system clock. (privaneSystemError 8)")


@pytest.mark.parametrize("written", ["", "soon", "1,5", "--1"])
def test_what_is_no_adjustment(written: str, system: Stage) -> None:
    assert privanectl("clock", "adjust", "--", written) == wrong_usage(
        f"'{written}' is no number of seconds")


def test_clock_synced(system: Stage, device: Device) -> None:
    assert privanectl("clock", "synced") == NOTHING
    assert system.calls() == [(TIME_SYNC_HOOK, "settime")]
    device.tools[TIME_SYNC_HOOK].exit_with(1)
    assert privanectl("clock", "synced") == failed(
        "Failed to notify time sync. (privaneSystemError 9)")


@pytest.mark.parametrize("words, tool, arguments", [
    (("net", "info"), NETSTAT, ("-Wnap",)),
    (("net", "info", "all"), NETSTAT, ("-Wnap",)),
    (("net", "info", "tcp-udp"), NETSTAT, ("-Wnutp",)),
    (("ethtool", "eth0"), ETHTOOL, ("-d", "eth0")),
    (("smart", "/dev/sda"), SMARTCTL, ("--all", "/dev/sda")),
    (("lldp", "neighbors"), LLDPCLI, ("show", "neighbors", "details")),
    (("lldp", "interfaces"), LLDPCLI, ("show", "interfaces", "details")),
])
def test_tools(words: tuple[str, ...], tool: str, arguments: tuple[str, ...], system: Stage,
               device: Device) -> None:
    device.tools[tool].print("line\twith a tab\nlast, without its end")

    assert privanectl(*words) == Run(DONE, "line\twith a tab\nlast, without its end\n", "")
    assert system.calls() == [(tool, *arguments)]
    assert privanectl(*words, "-j").json == {"output": "line\twith a tab\nlast, without its end"}


def test_tool_that_prints_nothing(system: Stage) -> None:
    assert privanectl("lldp", "neighbors") == NOTHING
    assert privanectl("lldp", "neighbors", "-j").json == {"output": ""}


@pytest.mark.parametrize("speed, duplex, advertised, text", [
    (1000, FULL, AUTONEGOTIATION, "1000 no yes"), (10, HALF, 0, "10 yes no")])
def test_net_speed(speed: int, duplex: int, advertised: int, text: str, system: Stage) -> None:
    shown_speed, half, autonegotiation = text.split()
    link = Ethernet()
    try:
        link.report(speed, duplex, advertised)
        assert privanectl("net", "speed") == Run(DONE, f"""\
          Speed: {shown_speed} Mbit/s
    Half duplex: {half}
Autonegotiation: {autonegotiation}
""", "")
        assert privanectl("net", "speed", "-j").json == {
            "speed": speed, "half_duplex": duplex == HALF, "autonegotiation": advertised}
        link.report(5000)
        # What is no failure of the call is told as "Success".
        assert privanectl("net", "speed").errors == (
            "privanectl: Cannot get device settings 0 Success (privaneSystemError 1)\n")
        link.report(100, 2)
        assert privanectl("net", "speed") == failed("Unknown! (2) (privaneSystemError 2)")
    finally:
        link.close()


def test_refused_arguments_of_tools(system: Stage) -> None:
    assert privanectl("net", "info", "udp") == wrong_usage("MODE is one of all|tcp-udp, not 'udp'")
    assert privanectl("ethtool", "eth0.1") == failed(
        "Interface not supported by Privane: eth0.1 (privaneSystemError 35)")
    assert privanectl("smart", "/dev/nvme0") == failed(
        "Device not supported by Privane: /dev/nvme0 (privaneSystemError 36)")
    assert system.calls() == []


def test_boot_block_and_serial_number(system: Stage, device: Device) -> None:
    device.boot.hold("ACCC8E000001")

    assert privanectl("boot", "get", "COLOR") == Run(DONE, "ACCC8E000001\n", "")
    assert privanectl("boot", "get", "COLOR", "-j").json == {"value": "ACCC8E000001"}
    assert privanectl("serial") == Run(DONE, "ACCC8E000001\n", "")
    assert privanectl("serial", "-j").json == {"serial": "ACCC8E000001"}
    system.calls()
    device.boot.forget()
    assert privanectl("boot", "set", "COLOR", "light blue") == NOTHING
    assert [call[:3] for call in system.calls() if call[0] == "bootparam_write"] == [
        ("bootparam_write", "COLOR", "light blue")]


def test_slabinfo_and_log(system: Stage, tmp_path: Path) -> None:
    file = tmp_path / "log"
    file.write_text("first\nsecond\n")

    # The numbers change, the head does not.
    head = Path("/proc/slabinfo").read_text().splitlines()[:2]
    assert privanectl("slabinfo").output.splitlines()[:2] == head
    assert privanectl("slabinfo", "-j").json["contents"].startswith("slabinfo - version")
    assert privanectl("log", str(file)) == Run(DONE, "first\nsecond\n", "")
    assert privanectl("log", str(file), "-j").json == {"contents": "first\nsecond\n"}
    assert privanectl("log", "/missing") == failed(
        "Failed to open file “/missing”: No such file or directory (g-file-error-quark 4)")


def test_pinsrv(system: Stage, device: Device) -> None:
    run = privanectl("pinsrv", "--", "-d", "x y")
    assert run.status == DONE
    label, pid = run.output.split(": ")
    assert (label, int(pid) > 0) == ("PID", True)
    assert process.wait_for_child(int(pid), 5) == 0
    system.use_real_pidof()
    assert system.calls() == [(PINSRV, "-d", "x y")]
    assert set(privanectl("pinsrv", "-j").json) == {"pid"}

    device.tools[PINSRV].remove()
    assert privanectl("pinsrv") == failed("The PIN server could not be started")


def test_reboot_and_reset(system: Stage, device: Device) -> None:
    assert privanectl("reboot") == NOTHING
    assert privanectl("reset", "arm", "hard") == NOTHING
    assert privanectl("reboot", "-j").json == {"exit_status": 0}
    assert privanectl("reset", "arm", "soft", "-j") == NO_RESULTS
    assert privanectl("reboot") == NOTHING
    assert system.calls() == [(SYSFLASH, "reboot"), (SYSFLASH, "factorydefault", "onvifhard"),
                              (SYSFLASH, "factorydefault", "soft")]
    assert privanectl("reset", "arm", "maybe") == wrong_usage(
        "KIND is one of hard|soft, not 'maybe'")

    device.tools[SYSFLASH].exit_with(3)
    assert privanectl("reboot") == failed("The tool that reboots failed with status 3")
    device.tools[SYSFLASH].remove()
    assert privanectl("reboot") == failed("The tool that reboots could not be started")


def test_client_knows_which_units_the_service_takes(system: Stage, bus: Bus) -> None:
    """Each has a list of its own."""
    units = [*(f"a{chr(byte)}b" for byte in range(1, 128)), "a" * 64, "a" * 65, "\u00e4"]

    def is_taken_by_service(unit: str) -> bool:
        try:
            bus.call("StopService", "s", unit)
        except BusError as error:
            assert error.text.startswith("Invalid unit "), error
            return False
        return True

    def is_taken_by_client(unit: str) -> bool:
        refused = "privanectl: the service acts on no unit of the name "
        return not privanectl("explain", "StopService", unit).errors.startswith(refused)

    taken = {unit for unit in units if is_taken_by_service(unit)}
    assert {"azb", "a-b", "a@b", "a" * 64} < taken
    assert {unit for unit in units if is_taken_by_client(unit)} == taken
