"""tests/device/test_readers.py: the link, the readers and the starters, on the real thing."""
import time

import pytest
from calls import BusError, ask
from camera.machine import Camera

SIGNALS = "/run/account-watcher/signals"


def test_the_link_is_as_ethtool_says(camera: Camera) -> None:
    shown = camera.run(["ethtool", "eth0"]).check().out
    assert ask(camera, "GetNetworkSpeedDuplex") == (1000, False, 64)
    for text in ("Speed: 1000Mb/s", "Duplex: Full", "Advertised auto-negotiation: Yes"):
        assert text in shown


def slab_names(text: str) -> list[str]:
    return [line.split()[0] for line in text.splitlines()]


def test_the_kernels_slabs(camera: Camera) -> None:
    before = slab_names(camera.read_file("/proc/slabinfo").decode())
    (answer,) = ask(camera, "GetSlabinfo")
    after = slab_names(camera.read_file("/proc/slabinfo").decode())
    assert answer.startswith("slabinfo - version: 2.1\n# name            <active_objs>")
    # The numbers move, and caches come and go.
    assert set(before) & set(after) <= set(slab_names(answer)) <= set(before) | set(after)
    assert len(set(before) & set(after)) > 50


def test_a_file_is_read_as_it_is(camera: Camera) -> None:
    for path in ("/var/log/keys.log", "/tmp/log", "/var/tmp/log", "/run/log.txt"):
        camera.put_file(path, "one\ntwo\n\nlast ä".encode(), 0o600)
        assert ask(camera, "ReadLogFile", path) == ("one\ntwo\n\nlast ä",)
    assert ask(camera, "ReadLogFile", "/etc/passwd") \
        == (camera.read_file("/etc/passwd").decode(),)


def test_peoples_homes_are_closed(camera: Camera) -> None:
    for path in ("/root/key", "/home/key", "/run/user/key"):
        camera.run(["mkdir", "-p", path.rpartition("/")[0]]).check()
        camera.put_file(path, b"key", 0o644)
        with pytest.raises(BusError) as caught:
            ask(camera, "ReadLogFile", path)
        assert caught.value.name.endswith("_g_2dfile_2derror_2dquark.Code4")


def test_pinsrv_runs_with_the_callers_arguments(camera: Camera) -> None:
    (pid,) = ask(camera, "Pinsrv", "['anything', '-d', 'two words', '']")
    words = camera.read_file(f"/proc/{pid}/cmdline").split(b"\0")[:-1]
    assert words[-4:] == [b"/usr/bin/pinsrv", b"-d", b"two words", b""]
    open_files = camera.run(f"readlink /proc/{pid}/fd/*").check().out.splitlines()
    # dash keeps its script open.
    assert [path for path in open_files if path != "/usr/bin/pinsrv"][0] == "/dev/null"
    assert len([path for path in open_files if path != "/usr/bin/pinsrv"]) == 3


def test_pinsrv_outlives_a_restart_of_the_service(camera: Camera) -> None:
    (pid,) = ask(camera, "Pinsrv", "['pinsrv']")
    camera.run(["systemctl", "restart", "privane-system"]).check()
    assert camera.run(["test", "-d", f"/proc/{pid}"]).status == 0


def test_pinsrv_that_is_not_executable(camera: Camera) -> None:
    camera.run(["chmod", "-x", "/usr/bin/pinsrv"]).check()
    assert ask(camera, "Pinsrv", "['pinsrv']") == (-1,)


def test_everybody_is_told_to_look_again(camera: Camera) -> None:
    assert camera.read_file(SIGNALS) == b""
    assert ask(camera, "RtspreadConfig") == ()
    end = time.monotonic() + 10
    while not (heard := camera.read_file(SIGNALS)) and time.monotonic() < end:
        time.sleep(0.1)
    assert heard.endswith(b"com.zintor.PrivaneSystem.UserDatabaseUpdated ()\n")
