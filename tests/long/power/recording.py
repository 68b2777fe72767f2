"""tests/long/power/recording.py: makes recordings in the virtual camera, and keeps them for the
next call with the same seed."""
import fcntl
import json
import os
import shutil
import subprocess
import sys
import tempfile
from collections.abc import Callable
from dataclasses import asdict
from pathlib import Path

from power_plan import Planner, Step
from recorded_run import (ANSWERS, BOOT_BLOCK_SIZE, DISK_SIZE, FILE_SYSTEM_SIZE, LOG, STEPS,
                          RecordedRun, RecordingError)

HERE = Path(__file__).resolve().parent
TREE = HERE.parents[2]
sys.path.insert(0, str(TREE / "device"))

from camera.base_layer import make_base  # noqa: E402  (found through the line above)
from camera.errors import CameraError  # noqa: E402, F401
from camera.host_tool import run_tool  # noqa: E402
from camera.image_layer import make_image  # noqa: E402
from camera.layer_cache import LayerCache, key_of  # noqa: E402
from camera.machine import Camera  # noqa: E402
from camera.storage_disk import BOOT_BLOCK_SIZE as PARTITION_SIZE  # noqa: E402
from camera.storage_disk import BOOT_BLOCK_START  # noqa: E402
from camera.storage_disk import DISK_SIZE as STORAGE_SIZE  # noqa: E402
from camera.warm_start import start_camera  # noqa: E402

KEPT = 8
SECTOR = 512
CALL_SECONDS = 300

# How each is made, and mounted with which options.
FILE_SYSTEMS = {
    "ext4": ("mkfs.ext4 -q -b 4096 -E nodiscard", "defaults"),
    "ext4-writeback": ("mkfs.ext4 -q -b 4096 -E nodiscard", "data=writeback,noauto_da_alloc"),
}

# The camera's second partition holds the disk that is logged, its log, and the answers: they are
# too long for the console, which loses what the driver does not read at once.
START = BOOT_BLOCK_START + PARTITION_SIZE
ANSWERS_SIZE = 16 << 20
LOG_SIZE = STORAGE_SIZE - START - DISK_SIZE - ANSWERS_SIZE

# The file system is mounted anew, so that the log is about changes only.
MAKE_DISKS = """set -e
make() {{ dmsetup create "$1" --noudevsync --noudevrules --table "$2"; dmsetup mknodes "$1"; }}
modprobe dm-log-writes
make cut-below "0 {disk} linear /dev/sda2 0"
make cut-log "0 {log} linear /dev/sda2 {disk}"
make cut-recorded "0 {disk} log-writes /dev/mapper/cut-below /dev/mapper/cut-log"
make cut-files "0 {files} linear /dev/mapper/cut-recorded 0"
make cut-boot "0 {boot} linear /dev/mapper/cut-recorded {files}"
{mkfs} /dev/mapper/cut-files
mkdir -p /run/cut
mount /dev/mapper/cut-files /run/cut
cp -a /etc /run/cut/etc
sed -i 's:^/dev/sda1:/dev/mapper/cut-boot:' /run/cut/etc/fw_env.config
dd if=/dev/sda1 of=/dev/mapper/cut-boot bs=32k count=1 conv=fsync status=none
umount /run/cut
mount -o {options} /dev/mapper/cut-files /run/cut
"""
START_SERVICE = """set -e
folder=/run/systemd/system/privane-system.service.d
mkdir -p $folder
cat >$folder/cut.conf <<end
[Service]
BindPaths=/run/cut/etc:/etc
DeviceAllow=block-device-mapper rw
end
systemctl daemon-reload
systemctl restart privane-system
"""
CALL = """set -e
/run/recorder cut-recorded /run/cut /dev/mapper/cut-boot /run/plan >/run/answers
dd if=/run/answers of=/dev/sda2 bs=1M seek={seek} conv=fsync status=none
stat -c %s /run/answers
"""
REMOVE_DISKS = """set -e
systemctl stop privane-system
umount /run/cut
for name in files boot recorded log below; do dmsetup remove --noudevsync cut-$name; done
sync
"""


class Recordings:
    """The recordings below a build folder."""

    def __init__(self, build: Path, say: Callable[[str], None]) -> None:
        build = build.resolve()
        self._packages = build / "packages"
        self._say = say
        self._program = build / "tests/long/power/power_recorder"
        if not self._program.exists():
            raise RecordingError(f"{self._program} is not built; ninja makes it in a folder that "
                                 "was set up with -Dtests=true")
        # The service is recorded as the tree has it, be it broken on purpose.
        run_tool(TREE / "tools/build_packages", self._packages)
        self._cache = LayerCache(build / "camera", say)
        self._folder = build / "power-cuts"
        self._folder.mkdir(exist_ok=True)

    def get(self, file_system: str, seed: int, changes: int, anew: bool) -> RecordedRun:
        """The one of this seed and this product, recorded if it is not there."""
        folder = self._folder / f"{file_system}-{seed}-{changes}-{self._key()}"
        with (self._folder / "lock").open("w") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX)
            if anew:
                shutil.rmtree(folder, ignore_errors=True)
            if not folder.exists():
                self._forget_old()
                self._say(f"{file_system}: recording {changes} changes in the camera")
                self._record(folder, file_system, seed, changes)
        return RecordedRun(folder)

    def keep(self, run: RecordedRun) -> None:
        """One that shows a failure stays until somebody removes it."""
        (run.folder / "failed").touch()

    def _key(self) -> str:
        """Of all that is installed in the camera, and of what makes the recording."""
        with self._cache.locked():
            image = make_image(self._cache, make_base(self._cache), self._packages)
        makers = [self._program, *(HERE / name for name in ("recording.py", "power_plan.py"))]
        return key_of(((path.name, path) for path in makers), image.folder.name)

    def _forget_old(self) -> None:
        kept = [folder for folder in self._folder.iterdir()
                if folder.is_dir() and not (folder / "failed").exists()]
        kept.sort(key=lambda folder: folder.stat().st_mtime, reverse=True)
        for folder in kept[KEPT - 1:]:
            shutil.rmtree(folder)

    def _record(self, folder: Path, file_system: str, seed: int, changes: int) -> None:
        steps = Planner(f"{file_system} {seed}").steps(changes)
        work = Path(tempfile.mkdtemp(prefix="making-", dir=self._folder))
        try:
            (work / STEPS).write_text(json.dumps([asdict(step) for step in steps], indent=1))
            with start_camera(self._cache, self._packages) as camera:
                length = self._call_in(camera, file_system, steps)
                camera.quit()
                _take_from(camera.disks["storage"], work, length)
            RecordedRun(work)  # which refuses one that is not whole
            work.rename(folder)
        except BaseException:
            shutil.rmtree(work, ignore_errors=True)
            raise

    def _call_in(self, camera: Camera, file_system: str, steps: list[Step]) -> int:
        """Returns the length of the answers."""
        mkfs, options = FILE_SYSTEMS[file_system]
        camera.put_file("/run/recorder", _stripped(self._program), 0o755)
        camera.put_file("/run/plan", "".join(f"{step.line}\n" for step in steps).encode())
        camera.run(MAKE_DISKS.format(disk=DISK_SIZE // SECTOR, files=FILE_SYSTEM_SIZE // SECTOR,
                                     boot=BOOT_BLOCK_SIZE // SECTOR, log=LOG_SIZE // SECTOR,
                                     mkfs=mkfs, options=options)).check()
        camera.run(START_SERVICE).check()
        call = CALL.format(seek=(DISK_SIZE + LOG_SIZE) >> 20)
        length = int(camera.run(call, timeout=CALL_SECONDS).check().out)
        camera.run(REMOVE_DISKS).check()
        return length


def _stripped(program: Path) -> bytes:
    """Without what only a debugger needs: it goes through the console."""
    with tempfile.NamedTemporaryFile() as copy:
        subprocess.run(["strip", "-o", copy.name, program], check=True)
        return Path(copy.name).read_bytes()


def _take_from(storage: Path, work: Path, answers: int) -> None:
    """The log from the camera's disk, without the empty rest of it, and the answers."""
    raw = work / "storage"
    subprocess.run(["qemu-img", "convert", "-O", "raw", storage, raw], check=True)
    with raw.open("rb") as source:
        start = START + DISK_SIZE
        end = start
        while end < start + LOG_SIZE:
            try:
                data = os.lseek(source.fileno(), end, os.SEEK_DATA)
            except OSError:  # no data behind the last
                break
            if data >= start + LOG_SIZE:
                break
            end = os.lseek(source.fileno(), data, os.SEEK_HOLE)
        (work / LOG).write_bytes(os.pread(source.fileno(), min(end - start, LOG_SIZE), start))
        (work / ANSWERS).write_bytes(os.pread(source.fileno(), answers, start + LOG_SIZE))
    raw.unlink()
