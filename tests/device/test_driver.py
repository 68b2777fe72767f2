"""tests/device/test_driver.py: the camera's driver itself: commands, files, snapshots, and that
nothing of it stays behind, however it ends."""
import os
import shutil
import signal
import subprocess
import sys
import time
from pathlib import Path

import pytest
from camera.deadline import Deadline
from camera.errors import CameraError
from camera.layer_cache import LayerCache
from camera.machine import Camera
from camera.paths import DEVICE
from camera.warm_start import start_camera

BOOT_ID = "/proc/sys/kernel/random/boot_id"


def machines(cache: LayerCache) -> list[int]:
    """The QEMU processes whose files are in this cache."""
    found = []
    for entry in Path("/proc").glob("[0-9]*"):
        try:
            words = (entry / "cmdline").read_bytes().split(b"\0")
        except OSError:
            continue
        folder = os.fsencode(cache.folder)
        if words[0].startswith(b"qemu") and any(folder in word for word in words):
            found.append(int(entry.name))
    return found


def test_a_command_gives_status_output_and_errors(camera: Camera) -> None:
    result = camera.run("echo out; echo error >&2; exit 7")
    assert (result.status, result.out, result.err) == (7, "out\n", "error\n")
    assert camera.run(["printf", "%s|", "a b", "$HOME", "'", "\n"]).out == "a b|$HOME|'|\n|"
    with pytest.raises(CameraError, match="status 7"):
        result.check()


def test_a_command_reads_nothing(camera: Camera) -> None:
    assert camera.run("cat", timeout=10).out == ""


def test_an_ordinary_user_has_only_what_is_theirs(camera: Camera) -> None:
    user, *groups = camera.run("id -un; id -Gn", user="cam-viewer").check().out.split()
    assert user == "cam-viewer"
    assert set(groups) == {"cam-viewer", "privane", "privane-viewer"}
    assert camera.run(["id", "-Gn"], user="cam-other").out == "cam-other\n"
    effective = camera.run("grep CapEff /proc/self/status", user="cam-web").check().out
    assert int(effective.split()[1], 16) == 0
    assert camera.run(["cat", "/etc/shadow"], user="cam-web").status == 1


def test_a_file_arrives_as_it_was_sent(camera: Camera) -> None:
    content = bytes(range(256)) * 400
    camera.put_file("/root/a file", content, 0o640)
    assert camera.read_file("/root/a file") == content
    assert camera.run(["stat", "-c", "%a %U", "/root/a file"]).out == "640 root\n"


def test_a_snapshot_brings_files_and_processes_back(camera: Camera) -> None:
    camera.put_file("/root/kept", b"1")
    camera.save("test")
    camera.run("echo 2 >/root/kept; rm /etc/hostname; systemctl stop dbus.socket dbus.service")
    camera.restore("test")
    assert camera.read_file("/root/kept") == b"1"
    assert camera.read_file("/etc/hostname") == b"camera\n"
    assert camera.run(["systemctl", "is-active", "dbus.service"]).out == "active\n"


def test_a_command_that_hangs_is_given_up(camera: Camera) -> None:
    start = time.monotonic()
    with pytest.raises(CameraError, match="longer than 1 s"):
        camera.run("sleep 3; echo late", timeout=1)
    assert time.monotonic() - start < 2
    assert camera.run("echo next").out == "next\n", "the late answer must not pass for the next one"


def test_a_machine_that_hangs_is_explained_by_its_last_words(camera: Camera) -> None:
    camera.run("echo the last words >/dev/ttyS0").check()
    camera.qmp.execute("stop", Deadline(10, "stopping the machine"))
    with pytest.raises(CameraError, match="(?s)end of serial.log.*the last words"):
        camera.run("true", timeout=2)


def test_a_camera_ends_with_its_block(packages_dir: Path, layer_cache: LayerCache) -> None:
    before = set(machines(layer_cache))
    folders = set(layer_cache.folder.glob("run-*"))
    with pytest.raises(ZeroDivisionError), start_camera(layer_cache, packages_dir) as second:
        assert set(machines(layer_cache)) - before == {second.pid}
        raise ZeroDivisionError
    assert set(machines(layer_cache)) <= before
    assert set(layer_cache.folder.glob("run-*")) <= folders


def test_power_off_is_a_shutdown(packages_dir: Path, layer_cache: LayerCache) -> None:
    with start_camera(layer_cache, packages_dir) as second:
        event = second.power_off()
        assert event["data"] == {"guest": True, "reason": "guest-shutdown"}
        assert not second.running
        assert second.pid not in machines(layer_cache)


def heed_signals() -> None:
    """Whoever started the tests may have let them ignore signals, as a shell does in the background."""
    for number in (signal.SIGINT, signal.SIGTERM, signal.SIGHUP):
        signal.signal(number, signal.SIG_DFL)


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGKILL])
def test_a_signal_leaves_no_machine(build_dir: Path, layer_cache: LayerCache,
                                    number: signal.Signals) -> None:
    before = set(machines(layer_cache))
    folders = set(layer_cache.folder.glob("run-*"))
    argv = [sys.executable, "-B", "-m", "camera", "--build", build_dir, "--no-shell"]
    with subprocess.Popen(argv, env={**os.environ, "PYTHONPATH": str(DEVICE)},
                          stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                          stderr=subprocess.PIPE, preexec_fn=heed_signals) as run:
        end = time.monotonic() + 60
        while not set(machines(layer_cache)) - before and time.monotonic() < end:
            time.sleep(0.05)
        assert set(machines(layer_cache)) - before, "no camera came up"
        run.send_signal(number)
        run.communicate(timeout=30)
    expected = {signal.SIGINT: 130, signal.SIGKILL: -9}.get(number, 128 + number)
    assert run.returncode == expected
    end = time.monotonic() + 5
    while set(machines(layer_cache)) - before and time.monotonic() < end:
        time.sleep(0.05)
    assert set(machines(layer_cache)) <= before
    if number != signal.SIGKILL:
        assert set(layer_cache.folder.glob("run-*")) <= folders


def test_from_the_first_boot_to_the_snapshot(packages_dir: Path, layer_cache: LayerCache,
                                             camera: Camera) -> None:
    """As after a change of the service: another image, booted once, then its snapshot."""
    shutil.rmtree(layer_cache.folder / "scratch", ignore_errors=True)
    scratch = LayerCache(layer_cache.folder / "scratch")
    try:
        (base,) = layer_cache.folder.glob("base-*")
        (scratch.folder / base.name).symlink_to(base)
        with start_camera(scratch, packages_dir) as first:
            booted = first.read_file(BOOT_ID)
        assert booted != camera.read_file(BOOT_ID)
        with start_camera(scratch, packages_dir) as again:
            assert again.read_file(BOOT_ID) == booted
    finally:
        shutil.rmtree(scratch.folder)
