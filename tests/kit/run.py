"""tests/kit/run.py: the inside of tools/sandbox: a device around the service, and a command in it.

    run.py FOLDER [LIBRARY_FOLDER...] -- COMMAND [ARGUMENT...]

In the end FOLDER holds the files log and calls, what the service logged and what it called, and, where
the command was run beside the service to its end, status, its exit status. Where it was not, ends with
125 and says why.
"""
import os
import subprocess
import sys
from pathlib import Path

sys.path.insert(0, str(Path(__file__).resolve().parents[1] / "bus"))

from harness import process  # noqa: E402  (found through the line above)
from harness.accounts import (GROUP, STANDARD_GROUP, STANDARD_PASSWD,  # noqa: E402
                              STANDARD_SHADOW, AccountFiles, replace)
from harness.bus import Bus  # noqa: E402
from harness.device import Device  # noqa: E402
from harness.fake_folder import FakeClock, StandInTool, together  # noqa: E402
from harness.fake_systemd import FakeSystemd  # noqa: E402
from harness.sandbox import SYSTEM_BUS, require_sandbox  # noqa: E402
from harness.service import Service  # noqa: E402
from harness.world import Neighbour  # noqa: E402

KIT = Path("/run/testkit")
CALLS_COMMAND = Path("/usr/local/bin/testkit-calls")
DIGEST_FILE = Path("/etc/apache2/digest_auth_passwd")
RTC = Path("/dev/rtc")

CALLERS = "clerk,viewer,operator"

NO_SERVICE = 125

# On a busy machine.
STOP_SECONDS = 30.0


def make_accounts() -> None:
    """Those of the tests, and a group for users who are added; all but stranger may send to the
    service."""
    AccountFiles().write(STANDARD_PASSWD, STANDARD_SHADOW, f"{STANDARD_GROUP}users:x:100:\n")
    lines = [line + CALLERS if line.startswith("privane:") else line
             for line in GROUP.read_text().splitlines()]
    replace(GROUP, "\n".join(lines) + "\n", 0o644, 0)


class Surroundings:
    """All that the service reaches, apart from what it keeps below /etc."""

    def __init__(self) -> None:
        self.device = Device(KIT, record_systemd=KIT / "systemd")
        self.clock = FakeClock(KIT / "clock")
        self.cfgstore = Neighbour("cfgstore")
        self._pidof = StandInTool("/bin/pidof")
        self._pidof.print(f"{self.cfgstore.pid}\n")
        DIGEST_FILE.parent.mkdir(exist_ok=True)
        DIGEST_FILE.write_text("")
        RTC.touch()
        CALLS_COMMAND.symlink_to(Path(__file__).with_name("calls"))

    def environment(self) -> dict[str, str]:
        return together(self.clock.environment(), self.device.boot.environment(),
                        self.device.rtc.environment())

    def close(self) -> None:
        self.cfgstore.close()
        self._pidof.close()
        self.device.close()


def run_command(command: list[str]) -> int:
    """As a shell tells it: 128 and the number of the signal that ended it, 127 for no command."""
    environment = {**os.environ, "DBUS_SYSTEM_BUS_ADDRESS": SYSTEM_BUS,
                   "PATH": f"{CALLS_COMMAND.parent}:{os.environ['PATH']}"}
    for name in ("BUS_RING_BUILD", "BUS_RING_AUTHZ"):
        del environment[name]
    try:
        status = subprocess.run(command, env=environment, check=False).returncode
    except OSError as error:
        print(f"tools/sandbox: {command[0]}: {error.strerror}", file=sys.stderr)
        return 127
    return status if status >= 0 else 128 - status


def wait_for_service(service: Service) -> None:
    bus = Bus()
    try:
        service.wait_registered(bus)
    except AssertionError:
        said = service.output() or ["nothing"]
        raise RuntimeError(f"the service did not start; the last that it said: {said[-1]}") from None
    bus.close()


def run(folder: Path, libraries: list[str], command: list[str]) -> int:
    """The command's status, with the service there to its end; raises where that cannot be had."""
    require_sandbox()
    process.adopt_orphans()
    make_accounts()
    surroundings = Surroundings()
    own = [{"LD_LIBRARY_PATH": library} for library in libraries]
    service = Service(environment=together(*own, surroundings.environment()),
                      stop_seconds=STOP_SECONDS)
    try:
        wait_for_service(service)
        status = run_command(command)
        if not service.is_running():
            raise RuntimeError(f"the service ended, with status {service.status}")
        if (ended := service.stop()) != 0:
            raise RuntimeError(f"the service stopped with status {ended}")
    finally:
        (folder / "log").write_text("".join(f"{line}\n" for line in service.output()))
        service.discard()
        with (folder / "calls").open("w") as record:
            subprocess.run([CALLS_COMMAND], stdout=record, check=True)
        surroundings.close()
    return status


def main(words: list[str]) -> int:
    end = words.index("--")
    folder, *libraries = words[:end]
    try:
        status = run(Path(folder), libraries, words[end + 1:])
    except Exception as error:  # Whatever it was, it is no status of the command's.
        print(f"tools/sandbox: {error}", file=sys.stderr)
        return NO_SERVICE
    (Path(folder) / "status").write_text(f"{status}\n")
    return status


sys.exit(main(sys.argv[1:]))
