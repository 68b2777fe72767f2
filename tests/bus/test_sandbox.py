"""tests/bus/test_sandbox.py: the surroundings keep the tests from changing the machine."""
import errno
import os
import signal
import time
from pathlib import Path

import pytest

from harness import process
from harness.bus import Bus
from harness.sandbox import BINARY, SYSTEM_BUS, build_directory, polkitd_pid
from harness.world import Neighbour, snapshot

# linux/capability.h
CAP_SYS_MODULE, CAP_SYS_RAWIO, CAP_SYS_BOOT, CAP_SYS_TIME = 16, 17, 22, 25


def test_clock_cannot_be_set() -> None:
    with pytest.raises(PermissionError):
        time.clock_settime(time.CLOCK_REALTIME, time.clock_gettime(time.CLOCK_REALTIME))


@pytest.mark.parametrize("capability",
                         [CAP_SYS_MODULE, CAP_SYS_RAWIO, CAP_SYS_BOOT, CAP_SYS_TIME])
def test_capability_is_gone_for_good(capability: int) -> None:
    fields = process.status(os.getpid())

    for mask in ("CapBnd", "CapPrm", "CapEff", "CapInh", "CapAmb"):
        assert not int(fields[mask], 16) & (1 << capability)


@pytest.mark.parametrize("path", ["/proc/sys/kernel/hostname", "/sys/new"])
def test_kernel_switches_are_read_only(path: str) -> None:
    with pytest.raises(OSError) as failure:
        Path(path).write_text("sandbox")
    assert failure.value.errno in (errno.EROFS, errno.EPERM)


def test_source_tree_is_read_only() -> None:
    with pytest.raises(OSError) as failure:
        (Path(__file__).parent / "new").touch()
    assert failure.value.errno == errno.EROFS


def test_dev_holds_no_log_no_clock_and_no_disk() -> None:
    assert sorted(os.listdir("/dev")) == ["fd", "full", "null", "ptmx", "pts", "random", "shm",
                                          "tty", "urandom", "zero"]


def test_network_is_private() -> None:
    assert os.listdir("/sys/class/net") == ["lo"]


def test_binary_is_the_one_that_was_built() -> None:
    built = build_directory() / "privane_system"

    # Installing takes the run path out and changes nothing else.
    assert Path(BINARY).stat().st_size == built.stat().st_size


def test_bus_and_polkitd_are_private_and_real(bus: Bus) -> None:
    assert Path(f"/proc/{polkitd_pid()}/exe").resolve().name == "polkitd"
    assert bus.pid_of("org.freedesktop.PolicyKit1") == polkitd_pid()
    assert SYSTEM_BUS.endswith("/run/dbus/system_bus_socket")


def test_snapshot_sees_what_it_should() -> None:
    neighbour = Neighbour("cfgstore")
    try:
        before = snapshot(neighbour)
        assert snapshot(neighbour) == before

        Path("/etc/passwd").touch()
        assert snapshot(neighbour).files != before.files
        Path("/etc/passwd.tmp").touch()
        assert snapshot(neighbour).folders != before.folders
        Path("/etc/passwd.tmp").unlink()
        assert snapshot(neighbour).last_pid == before.last_pid
        os.kill(neighbour.pid, signal.SIGUSR1)
        assert snapshot(neighbour).signals[neighbour.pid] == {signal.SIGUSR1}
        child = os.fork()
        if child == 0:
            os._exit(0)
        assert process.wait_for_child(child, 5) == 0
        assert snapshot(neighbour).last_pid == before.last_pid + 1
    finally:
        neighbour.close()
