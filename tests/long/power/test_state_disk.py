"""tests/long/power/test_state_disk.py: a disk is made of a log, and its files and boot block are
read."""
import json
import os
import struct
import subprocess
import zlib
from pathlib import Path

import pytest
import state_disk
from boot_copies import COPY_SIZE, active_parameters
from cut_states import State
from made_logs import made_log, marked, written
from mounted_state import NotMounted, read_mounted
from recorded_run import ANSWERS, DISK_SIZE, FILE_SYSTEM_SIZE, LOG, STEPS, RecordedRun
from state_disk import (ENVIRONMENT, PATHS, STATES_TO_A_MOUNT, BrokenFileSystem, StateDisk,
                        copy_data, is_mounted, sparse_file)
from write_log import FLUSH

CONTENT = {"passwd": b"root:x:0:0:\n", "shadow": b"debugfs: no command\n", "group": b""}


def boot_copy(number: int, text: bytes) -> bytes:
    padded = text.ljust(COPY_SIZE - 5, b"\0")
    return struct.pack("<IB", zlib.crc32(padded), number) + padded


@pytest.fixture(scope="module")
def disk_image(tmp_path_factory: pytest.TempPathFactory) -> bytes:
    folder = tmp_path_factory.mktemp("image")
    for name, content in CONTENT.items():
        path = folder / "root" / PATHS[name][1:]
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(content)
        path.chmod(0o640 if name == "shadow" else 0o644)
    (folder / "root/etc/shadow.tmp").write_bytes(b"left by a crash")
    image = folder / "disk"
    subprocess.run(["mkfs.ext4", "-q", "-b", "4096", "-d", folder / "root", image,
                    f"{FILE_SYSTEM_SIZE >> 10}k"], env=ENVIRONMENT, check=True)
    return image.read_bytes().ljust(DISK_SIZE, b"\0")


@pytest.fixture
def disk(disk_image: bytes, tmp_path: Path) -> StateDisk:
    new = boot_copy(2, b"B=" + b"2" * 1000 + b"\0")
    return disk_of(tmp_path, written(0, disk_image),
                   written(FILE_SYSTEM_SIZE, boot_copy(1, b"A=1\0")),
                   marked("start-0"), written(FILE_SYSTEM_SIZE + COPY_SIZE, new),
                   written(0, b"\0" * 8192), written(0, b"", FLUSH))


def disk_of(tmp_path: Path, *entries: bytes) -> StateDisk:
    (tmp_path / LOG).write_bytes(made_log(*entries))
    (tmp_path / STEPS).write_text(json.dumps([]))
    (tmp_path / ANSWERS).write_text("")
    return StateDisk(RecordedRun(tmp_path), tmp_path)


def state(base: int, *extra: int, torn: int = -1) -> State:
    return State(base, base, base, extra, torn, 512)


def test_the_files_of_a_state(disk: StateDisk) -> None:
    left = disk.left_by(state(3))
    owner = left["passwd"][1:3] if left["passwd"] else ()
    assert left == {"passwd": (0o644, *owner, CONTENT["passwd"]),
                    "shadow": (0o640, *owner, CONTENT["shadow"]),
                    "group": (0o644, *owner, b""), "digest": None, "parameters": None,
                    "boot": (0, 0, 0, b"A=1")}
    assert disk.temporaries() == {"shadow.tmp": b"left by a crash"}


def test_extra_writes_are_of_this_state_only(disk: StateDisk) -> None:
    assert disk.left_by(state(3, 3))["boot"] == (0, 0, 0, b"B=" + b"2" * 1000)
    assert disk.left_by(state(3))["boot"] == (0, 0, 0, b"A=1")
    assert disk.left_by(state(3, 3, torn=3))["boot"] == (0, 0, 0, b"A=1")
    with pytest.raises(BrokenFileSystem):
        disk.left_by(state(3, 4))
    assert disk.left_by(state(4))["boot"] == (0, 0, 0, b"B=" + b"2" * 1000)
    # Back to an earlier state: the disk is made anew.
    assert disk.left_by(state(3))["boot"] == (0, 0, 0, b"A=1")


def test_nothing_stays_of_the_state_before(tmp_path: Path) -> None:
    source = sparse_file(tmp_path / "source", 1 << 20)
    target = sparse_file(tmp_path / "target", 1 << 19)
    os.pwrite(source, b"kept", 8192)
    os.pwrite(source, b"behind the end", 1 << 19)
    for position in (0, 8192, 65536, (1 << 19) - 4096):
        os.pwrite(target, b"recovered" * 400, position)
    copy_data(source, target)
    assert os.pread(target, 1 << 20, 0) == os.pread(source, 1 << 19, 0)
    assert os.pread(target, 4, 8192) == b"kept"


def test_a_file_system_that_is_lost(disk: StateDisk) -> None:
    with pytest.raises(BrokenFileSystem):
        disk.left_by(state(5))


@pytest.mark.parametrize(("commands", "fault"), [
    (["stat /"], None),
    (["ssv free_blocks_count 7", "ssv free_inodes_count 7"], None),
    (["set_bg 0 free_blocks_count 7", "set_bg 0 checksum calc"], "for group #0"),
    (["set_bg 0 free_inodes_count 7", "set_bg 0 checksum calc"], "for group #0"),
    (["sif /etc/passwd links_count 2"], "ref count is 2, should be 1"),
    (["unlink /etc/group"], "zero-length inode"),
    (["unlink /etc/shadow"], "Unattached inode"),
    (["clri /etc/shadow"], "'shadow' in /etc")])
def test_a_file_system_that_is_not_in_order(commands: list[str], fault: str | None,
                                            disk_image: bytes, tmp_path: Path) -> None:
    """With -p, e2fsck would repair most of these and answer as after a recovery, one of them
    without a word."""
    image = tmp_path / "image"
    image.write_bytes(disk_image)
    for command in commands:
        subprocess.run(["debugfs", "-w", "-R", command, image], env=ENVIRONMENT, check=True,
                       capture_output=True)
    damaged = disk_of(tmp_path, written(0, image.read_bytes()), marked("start-0"),
                      written(0, b"", FLUSH))
    if fault is None:
        assert damaged.left_by(state(2))["passwd"] is not None
    else:
        with pytest.raises(BrokenFileSystem, match=fault):
            damaged.left_by(state(2))


def test_the_kernel_finds_the_same_files(disk: StateDisk, monkeypatch: pytest.MonkeyPatch) -> None:
    monkeypatch.setattr(state_disk, "is_mounted", lambda _: True)
    mounts = Path("/proc/mounts").read_text()
    left = disk.left_by(state(3))
    assert left["shadow"] is not None and left["shadow"][3] == CONTENT["shadow"]
    assert left["digest"] is None
    assert Path("/proc/mounts").read_text() == mounts
    monkeypatch.setattr(state_disk, "read_mounted", lambda *_: {**left, "group": None})
    with pytest.raises(BrokenFileSystem, match="mounted by the kernel, it has another group"):
        disk.left_by(state(3))


def test_files_of_a_mounted_disk(disk_image: bytes, tmp_path: Path) -> None:
    image, folder = tmp_path / "image", tmp_path / "folder"
    folder.mkdir()
    image.write_bytes(disk_image[:FILE_SYSTEM_SIZE])
    owner = os.getuid(), os.getgid()
    assert read_mounted(image, folder, PATHS) == {
        "passwd": (0o644, *owner, CONTENT["passwd"]),
        "shadow": (0o640, *owner, CONTENT["shadow"]),
        "group": (0o644, *owner, b""), "digest": None, "parameters": None}
    assert not list(folder.iterdir())
    image.write_bytes(b"\0" * FILE_SYSTEM_SIZE)
    with pytest.raises(NotMounted, match="wrong fs type"):
        read_mounted(image, folder, PATHS)


def test_every_twentieth_state_is_mounted() -> None:
    states = [state(base, *extra) for base in range(2000) for extra in ((), (base + 1,))]
    chosen = sum(map(is_mounted, states))
    assert 0.5 < chosen * STATES_TO_A_MOUNT / len(states) < 1.5


def test_the_boot_copy_that_counts() -> None:
    one, two = boot_copy(1, b"A=1\0"), boot_copy(2, b"A=2\0B=\0")
    assert active_parameters(one + two) == active_parameters(two + one) == b"A=2\0B="
    assert active_parameters(one + two[:-1] + b"x") == b"A=1"
    assert active_parameters(b"\xff" * COPY_SIZE + one) == b"A=1"
    assert active_parameters(boot_copy(255, b"A=1\0") + boot_copy(0, b"A=2\0")) == b"A=2"
    assert active_parameters(boot_copy(0, b"A=2\0") + boot_copy(255, b"A=1\0")) == b"A=2"
    assert active_parameters(b"\0" * 2 * COPY_SIZE) is None
    long = boot_copy(1, b"A=" + b"1" * 1000 + b"\0")
    assert active_parameters(long[:512] + b"\0" * (2 * COPY_SIZE - 512)) is None
