"""tests/bus/test_readers.py: the methods that read a file or the link, and the one that relays."""
import os
import socket
import subprocess
from pathlib import Path
from typing import Iterator

import pytest

from harness.bus import BusError, domain_error, error_of
from harness.device import answered, asked, failed
from harness.ethernet import AUTONEGOTIATION, FULL, HALF, Ethernet
from harness.fake_authz import FakeAuthz
from harness.stage import EMITTED, Effects, Stage, refused
from harness.strace import Attached

SLABINFO = Path("/proc/slabinfo")

# glib's gfileutils.h
NO_DIRECTORY, NO_ENTRY, NO_DEVICE, LOOP, AGAIN, FAILED = 1, 4, 6, 11, 19, 24

# What a message carries at most, with the room that the service leaves for the rest of it.
MESSAGE_LIMIT = 32 << 20
LARGEST_TEXT = MESSAGE_LIMIT - (64 << 10) - 8

NO_SOCKET = failed(0, "Failed to create socket")
NO_ETHERNET = failed(1, "Cannot get device settings -1 No such device")
UNKNOWN_SPEED = failed(1, "Cannot get device settings 0 Success")


def file_error(code: int, text: str) -> Effects:
    return refused("g-file-error-quark", code, text)


@pytest.fixture
def ethernet() -> Iterator[Ethernet]:
    interface = Ethernet()
    yield interface
    interface.close()


@pytest.fixture
def over_slabinfo(tmp_path: Path) -> Iterator[Path]:
    """A file that is seen at /proc/slabinfo."""
    file = tmp_path / "slabinfo"
    file.write_text("slabinfo - version: 2.1\nkmalloc-8 1 2 3\n")
    subprocess.run(["mount", "--bind", file, SLABINFO], check=True)
    yield file
    subprocess.run(["umount", SLABINFO], check=True)


def slab_names(text: str) -> set[str]:
    return {line.split()[0] for line in text.splitlines()}


def test_slab_statistics_are_the_kernels(system: Stage, authz: FakeAuthz) -> None:
    authz.forget()
    before = slab_names(SLABINFO.read_text())
    (text,) = system.succeed("GetSlabinfo").answer
    after = slab_names(SLABINFO.read_text())

    # Caches come and go on a busy machine.
    assert before & after <= slab_names(text) <= before | after
    assert len(before & after) > 50
    assert text.startswith("slabinfo - version: 2.1\n")
    assert asked(authz) == ["getslabinfo"]


def test_slab_statistics_are_answered_whole(over_slabinfo: Path, system: Stage) -> None:
    assert system.call("GetSlabinfo") == answered(over_slabinfo.read_text())


def test_slab_statistics_that_cannot_be_read_are_an_error(tmp_path: Path, system: Stage) -> None:
    os.mkfifo(tmp_path / "fifo")
    subprocess.run(["mount", "--bind", tmp_path / "fifo", SLABINFO], check=True)
    try:
        assert system.call("GetSlabinfo") == file_error(
            AGAIN, "Error reading file “/proc/slabinfo”: Resource temporarily unavailable")
    finally:
        subprocess.run(["umount", SLABINFO], check=True)


@pytest.mark.parametrize("content, told", [
    (b"", ""), (b"one\ntwo", "one\ntwo"), (b"caf\xe9\n\xff", "caf\ufffd\n\ufffd"),
    ("ünïcode\n".encode(), "ünïcode\n"), (b"seen\0not seen", "seen"), (b"\0", "")])
def test_log_file_is_answered_whole(content: bytes, told: str, tmp_path: Path, system: Stage,
                                    authz: FakeAuthz) -> None:
    (tmp_path / "log").write_bytes(content)
    authz.forget()

    assert system.call("ReadLogFile", f"{tmp_path}/log") == answered(told)
    assert asked(authz) == ["readlogfile"]


def test_path_of_a_log_file_is_used_as_given(tmp_path: Path, system: Stage) -> None:
    (tmp_path / "-a file; $(name)\nüñ").write_text("odd\n")
    (tmp_path / "link").symlink_to("-a file; $(name)\nüñ")

    for path in ("-a file; $(name)\nüñ", "link", f"../{tmp_path.name}/./link", "//link"):
        assert system.call("ReadLogFile", f"{tmp_path}/{path}") == answered("odd\n")
    # Relative to where the service was started.
    assert Path(f"/proc/{system.service.pid}/cwd").samefile(".")
    assert system.call("ReadLogFile", "pytest.ini") == answered(Path("pytest.ini").read_text())


def test_any_file_of_the_device_is_read(system: Stage) -> None:
    assert system.call("ReadLogFile", "/etc/shadow") == answered(Path("/etc/shadow").read_text())


@pytest.mark.parametrize("path", ["", "/nosuch", "/nosuch/log", "/var/log/no such", "/etc/passwd "])
def test_log_file_that_does_not_exist_is_told_in_glibs_words(path: str, system: Stage) -> None:
    assert system.call("ReadLogFile", path) == file_error(
        NO_ENTRY, f"Failed to open file “{path}”: No such file or directory")


def test_log_file_that_cannot_be_opened_is_told(tmp_path: Path, system: Stage) -> None:
    (tmp_path / "loop").symlink_to("loop")
    with socket.socket(socket.AF_UNIX) as listener:
        os.chdir(tmp_path)
        listener.bind("socket")
        os.chdir(Path(__file__).parent)
    for name, code, reason in (("loop", LOOP, "Too many levels of symbolic links"),
                               ("socket", NO_DEVICE, "No such device or address")):
        assert system.call("ReadLogFile", f"{tmp_path}/{name}") == file_error(
            code, f"Failed to open file “{tmp_path}/{name}”: {reason}")


def test_folder_is_no_log_file(tmp_path: Path, system: Stage) -> None:
    assert system.call("ReadLogFile", str(tmp_path)) == file_error(
        NO_DIRECTORY, f"Error reading file “{tmp_path}”: Is a directory")


def test_log_file_that_would_block_is_an_error(tmp_path: Path, system: Stage) -> None:
    os.mkfifo(tmp_path / "fifo")
    terminal, other_end = os.openpty()
    for path in (str(tmp_path / "fifo"), os.ttyname(other_end)):
        assert system.call("ReadLogFile", path) == file_error(
            AGAIN, f"Error reading file “{path}”: Resource temporarily unavailable")
    os.close(terminal)
    os.close(other_end)


def test_endless_device_is_an_error(system: Stage) -> None:
    assert system.call("ReadLogFile", "/dev/zero") == file_error(
        FAILED, "Error reading file “/dev/zero”: File too large")


def test_largest_log_file_that_a_message_carries(tmp_path: Path, system: Stage) -> None:
    log = tmp_path / "log"
    log.write_text("x" * LARGEST_TEXT)
    assert len(system.succeed("ReadLogFile", str(log)).answer[0]) == LARGEST_TEXT

    with log.open("a") as stream:
        stream.write("x")
    assert system.call("ReadLogFile", str(log)) == file_error(
        FAILED, f"The reply of {LARGEST_TEXT + 9} bytes is larger than a bus message may be")

    log.write_text("x" * (MESSAGE_LIMIT + 1))
    assert system.call("ReadLogFile", str(log)) == file_error(
        FAILED, f"Failed to read from file “{log}”: File too large")


def test_log_file_that_grows_when_it_is_made_valid(tmp_path: Path, system: Stage) -> None:
    size = 12 << 20
    (tmp_path / "log").write_bytes(b"\xff" * size)

    assert system.call("ReadLogFile", f"{tmp_path}/log") == file_error(
        FAILED, f"The reply of {3 * size + 8} bytes is larger than a bus message may be")


@pytest.mark.parametrize("speed", [10, 100, 1000, 2500, 10000])
@pytest.mark.parametrize("duplex, flag", [(HALF, True), (FULL, False)])
@pytest.mark.parametrize("advertised, told", [
    (0, 0), (AUTONEGOTIATION, 64), (0xFFFFFFFF, 64), (0xFFFFFFBF, 0)])
def test_link_is_told(speed: int, duplex: int, flag: bool, advertised: int, told: int,
                      ethernet: Ethernet, system: Stage, authz: FakeAuthz) -> None:
    ethernet.report(speed, duplex, advertised)
    authz.forget()

    assert system.call("GetNetworkSpeedDuplex") == answered(speed, flag, told)
    assert asked(authz) == ["getnetworkspeedduplex"]


# The last two have a known speed in one half of the number.
@pytest.mark.parametrize("speed", [0, 1, 11, 99, 5000, 25000, 40000, 65535, 0xFFFFFFFF,
                                   1 << 16 | 100, 100 << 16])
def test_link_with_another_speed_is_an_error(speed: int, ethernet: Ethernet,
                                             system: Stage) -> None:
    ethernet.report(speed)

    assert system.call("GetNetworkSpeedDuplex") == UNKNOWN_SPEED


@pytest.mark.parametrize("duplex", [2, 100, 255])
def test_link_with_another_duplex_is_an_error(duplex: int, ethernet: Ethernet,
                                              system: Stage) -> None:
    ethernet.report(100, duplex)
    assert system.call("GetNetworkSpeedDuplex") == failed(2, f"Unknown! ({duplex})\n")

    ethernet.report(5000, duplex)
    assert system.call("GetNetworkSpeedDuplex") == UNKNOWN_SPEED


def test_device_without_eth0_is_an_error(system: Stage) -> None:
    assert system.call("GetNetworkSpeedDuplex") == NO_ETHERNET


def test_other_interfaces_are_not_asked(system: Stage) -> None:
    other = Ethernet("eth1")
    other.report(100)

    assert system.call("GetNetworkSpeedDuplex") == NO_ETHERNET
    other.close()


def test_socket_that_cannot_be_made_is_an_error(ethernet: Ethernet, system: Stage,
                                                tmp_path: Path) -> None:
    ethernet.report(100)
    with Attached(system.service.pid, tmp_path / "trace", "socket,ioctl",
                  "socket:error=EMFILE") as trace:
        assert system.call("GetNetworkSpeedDuplex") == NO_SOCKET

    (call,) = trace.calls()
    assert call.startswith(("socket(AF_INET, SOCK_DGRAM, IPPROTO_IP)",
                            "socket(AF_INET, SOCK_DGRAM|SOCK_CLOEXEC, IPPROTO_IP)"))


def test_failing_close_does_not_change_the_reason(system: Stage, tmp_path: Path) -> None:
    traced = "socket,ioctl,close"
    with Attached(system.service.pid, tmp_path / "trace", traced, "close:error=EIO") as trace:
        assert system.call("GetNetworkSpeedDuplex") == NO_ETHERNET

    calls = trace.calls()
    (ioctl,) = [i for i, call in enumerate(calls) if "SIOCETHTOOL" in call]
    descriptor = calls[ioctl].split("(")[1].split(",")[0]
    assert any(call.startswith(f"close({descriptor})") and "(INJECTED)" in call
               for call in calls[ioctl:])


def test_no_descriptor_is_left_open(ethernet: Ethernet, system: Stage, tmp_path: Path) -> None:
    descriptors = Path(f"/proc/{system.service.pid}/fd")
    (tmp_path / "log").write_text("x")
    before = len(list(descriptors.iterdir()))

    for speed in (100, 5000):
        ethernet.report(speed)
        for _ in range(5):
            system.call("GetNetworkSpeedDuplex")
    for path in (f"{tmp_path}/log", str(tmp_path), "/dev/zero", "/nosuch"):
        system.call("ReadLogFile", path)
        system.call("GetSlabinfo")

    assert len(list(descriptors.iterdir())) == before


def test_notification_is_relayed_and_nothing_else_done(system: Stage, authz: FakeAuthz) -> None:
    authz.forget()
    system.assert_unmoved(Effects((), ["UserDatabaseUpdated", "reply"], output=[EMITTED]),
                          "RtspreadConfig")
    assert "rtspreadconfig" in asked(authz)


def test_refused_callers_read_nothing(system: Stage, authz: FakeAuthz, tmp_path: Path) -> None:
    authz.refuse_silently()
    with Attached(system.service.pid, tmp_path / "trace", "openat,socket,ioctl") as trace:
        for member, arguments in (("ReadLogFile", ("/etc/shadow",)), ("GetSlabinfo", ()),
                                  ("GetNetworkSpeedDuplex", ())):
            assert error_of(system.bus.call, member, "s" * len(arguments), *arguments) == (
                domain_error("privaneSystemError", 25, "Unknown"))

    assert not [call for call in trace.calls()
                if call.startswith(("socket", "ioctl")) or "shadow" in call or "slabinfo" in call]


def test_error_of_one_file_leaves_the_next_one_as_it_is(system: Stage) -> None:
    assert isinstance(system.call("ReadLogFile", "/nosuch").answer, BusError)
    assert system.call("ReadLogFile", "pytest.ini") == answered(Path("pytest.ini").read_text())
