"""tests/bus/harness/sandbox.py: where the tests run, and the refusal to run anywhere else."""
import functools
import os
import subprocess
from pathlib import Path

BINARY = "/usr/sbin/privane_system"
PYTHON = "/usr/bin/python3"
SYSTEM_BUS = "unix:path=/run/dbus/system_bus_socket"
STATE = Path("/run/bus-sandbox")
MARK = "bus-sandbox"


def mounted_at(path: str) -> list[str]:
    """Type and source of the file system on top there; none where nothing is mounted."""
    mounts = [line.split() for line in Path("/proc/self/mountinfo").read_text().splitlines()]
    found = [mount[mount.index("-") + 1:] for mount in mounts if mount[4] == path]
    return found[-1][:2] if found else []


@functools.cache
def require_sandbox() -> None:
    """Raises unless / is a copy-on-write view in a mount namespace of its own: the service rewrites
    the account files of the machine that it runs on. Its /tmp is its own, too."""
    if mounted_at("/") != ["overlay", MARK]:
        raise RuntimeError("not in the sandbox; start the tests with tests/bus/run BUILD_DIR")
    if mounted_at("/tmp") != ["tmpfs", "tmp"]:
        raise RuntimeError("/tmp is the machine's own; what lies right below it cannot be shown")


def build_directory() -> Path:
    return Path(os.environ["BUS_RING_BUILD"])


def fake_library(name: str) -> Path:
    """A library of tests/fakes, which is a prerequisite of the ring."""
    library = build_directory() / "tests/fakes" / name
    if not library.exists():
        raise RuntimeError(f"{library} is missing; build with -Dtests=true")
    return library


# Which of our two libauthz is installed.
POLKIT, POLICY_FILE = "polkit", "policy-file"


def authorization() -> str:
    chosen = os.environ["BUS_RING_AUTHZ"]
    assert chosen in (POLKIT, POLICY_FILE), chosen
    return chosen


def polkitd_pid() -> int:
    return int((STATE / "polkitd.pid").read_text())


def start_bus(address: str) -> "subprocess.Popen[bytes]":
    """A second bus with the configuration of the first."""
    return subprocess.Popen(["dbus-daemon", f"--config-file={STATE / 'bus.conf'}", "--nofork",
                             "--nopidfile", f"--address={address}"])
