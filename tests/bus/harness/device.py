"""tests/bus/harness/device.py: all that the system methods reach, as fakes and stand-ins."""
from pathlib import Path

from harness.bus import domain_error
from harness.fake_authz import FakeAuthz
from harness.fake_folder import FakeBootparam, FakeRtcClock, StandInTool
from harness.fake_systemd import FakeSystemd
from harness.stage import Effects, Fake

SYSFLASH = "/sbin/sysflash"
TIME_SYNC_HOOK = "/usr/lib/ntpd/ntpd_hook"
LLDPCLI = "/usr/sbin/lldpcli"
SMARTCTL = "/usr/sbin/smartctl"
ETHTOOL = "/usr/sbin/ethtool"
NETSTAT = "/usr/bin/netstat"
PINSRV = "/usr/bin/pinsrv"
TOOLS = (SYSFLASH, TIME_SYNC_HOOK, LLDPCLI, SMARTCTL, ETHTOOL, NETSTAT, PINSRV)

# For each method that runs a tool to its end: the tool, and arguments that it accepts.
RUNNERS = {
    "Reboot": (SYSFLASH, ()),
    "NotifyTimeSync": (TIME_SYNC_HOOK, ()),
    "ExecuteLldpcli": (LLDPCLI, ("show-neighbors",)),
    "ExecuteSmartctl": (SMARTCTL, ("all", "/dev/sda")),
    "ExecuteEthtool": (ETHTOOL, ("d", "eth0")),
    "GetActiveNetworkInfo": (NETSTAT, ("all",)),
}


class Device:
    """Tools that print nothing and succeed, a systemd that obeys, an empty boot block, and a clock
    that is set through a library."""

    def __init__(self, directory: Path, record_systemd: Path | None = None) -> None:
        self.tools = {path: StandInTool(path) for path in TOOLS}
        self.boot = FakeBootparam(directory / "boot")
        self.rtc = FakeRtcClock(directory / "rtc")
        self.systemd = FakeSystemd(record_systemd)

    def fakes(self) -> tuple[Fake, ...]:
        return (*self.tools.values(), self.boot, self.rtc, self.systemd)

    def close(self) -> None:
        self.systemd.close()
        for tool in self.tools.values():
            tool.close()


def answered(*values: object, calls: tuple[tuple[str, ...], ...] = (),
             output: tuple[str, ...] = ()) -> Effects:
    """A successful call that made these calls and logged these lines, and did nothing else."""
    return Effects(values, ["reply"], [*calls], output=[*output])


def failed(code: int, text: str, *calls: tuple[str, ...]) -> Effects:
    """A call that fails in the service's own domain after these calls, and says so once."""
    logged = text.replace("\n", r"\x0A")
    return Effects(domain_error("privaneSystemError", code, text), ["error"], [*calls],
                   output=[f"warning: {logged}"])


def asked(authz: FakeAuthz) -> list[str]:
    """The actions that were asked for, without the common prefix; of one call, since a stage asks
    another question after each."""
    return [check.action.removeprefix("com.zintor.privane-system.") for check in authz.checks()
            if not check.action.endswith(".checkuser")]
