"""tests/long/power/state_disk.py: a disk as a power cut left it, and what is found on it after the
file system's own recovery."""
import os
import re
import subprocess
import zlib
from pathlib import Path

from boot_copies import COPY_SIZE, active_parameters
from cut_states import State
from mounted_state import NotMounted, read_mounted
from recorded_run import BOOT_BLOCK_SIZE, DISK_SIZE, FILE_SYSTEM_SIZE, File, RecordedRun, Version
from recovery import faults_of_recovery

PATHS = {
    "passwd": "/etc/passwd", "shadow": "/etc/shadow", "group": "/etc/group",
    "digest": "/etc/apache2/digest_auth_passwd", "parameters": "/etc/privane/parameters.conf"}
# What a write renames over the account files, whole or not.
TEMPORARIES = {f"{name}.tmp": f"{PATHS[name]}.tmp" for name in ("passwd", "shadow", "group")}
TOOL_SECONDS = 60
# One state of so many is mounted by the kernel as well.
STATES_TO_A_MOUNT = 20
ENVIRONMENT = {**os.environ, "PATH": os.environ.get("PATH", os.defpath) + ":/usr/sbin:/sbin",
               "LC_ALL": "C"}


class BrokenFileSystem(Exception):
    """It cannot be mounted any more, or is not in order after its recovery."""


def is_mounted(state: State) -> bool:
    """The same states in every run."""
    return zlib.crc32(repr(state).encode()) % STATES_TO_A_MOUNT == 0


class StateDisk:
    """Makes states in files of a folder; it is quick when they come in the order of the log."""

    def __init__(self, run: RecordedRun, folder: Path) -> None:
        self._run = run
        self._replayed = sparse_file(folder / "replayed", DISK_SIZE)
        self._path = folder / "state"
        self._state = sparse_file(self._path, FILE_SYSTEM_SIZE)
        self._mounted_path = folder / "mounted"
        self._mounted = sparse_file(self._mounted_path, FILE_SYSTEM_SIZE)
        self._mount_point = folder / "mount-point"
        self._mount_point.mkdir()
        self._commands = folder / "commands"
        self._dumped = folder / "temporaries"
        self._dumped.mkdir()
        self._commands.write_text(
            "".join(f"dump {path} {self._dumped / name}\n" for name, path in TEMPORARIES.items())
            + "".join(f"stat {path}\ncat {path}\n" for path in PATHS.values()))
        self._applied = 0

    def left_by(self, state: State) -> Version:
        """Raises BrokenFileSystem."""
        boot = self._make(state)
        if is_mounted(state):
            copy_data(self._state, self._mounted)
        self._recover()
        version = self._read_files()
        if is_mounted(state):
            self._require_mounted(version)
        parameters = active_parameters(boot)
        version["boot"] = None if parameters is None else (0, 0, 0, parameters)
        return version

    def temporaries(self) -> dict[str, bytes]:
        """The contents of those that the newest state has."""
        return {path.name: path.read_bytes() for path in self._dumped.iterdir()}

    def _make(self, state: State) -> bytes:
        """Returns the boot block's copies, which need no recovery."""
        if state.base < self._applied:
            os.ftruncate(self._replayed, 0)
            os.ftruncate(self._replayed, DISK_SIZE)
            self._applied = 0
        for number in range(self._applied, state.base):
            self._apply(self._replayed, number)
        self._applied = state.base

        copy_data(self._replayed, self._state)
        boot = bytearray(os.pread(self._replayed, BOOT_BLOCK_SIZE, FILE_SYSTEM_SIZE))
        for number in state.extra:
            entry = self._run.entries[number]
            data = self._run.data_of(entry)
            if number == state.torn:
                data = data[:state.bytes]
            if entry.start < FILE_SYSTEM_SIZE:
                os.pwrite(self._state, data, entry.start)
            else:
                start = entry.start - FILE_SYSTEM_SIZE
                boot[start:start + len(data)] = data
        return bytes(boot[:2 * COPY_SIZE])

    def _apply(self, disk: int, number: int) -> None:
        entry = self._run.entries[number]
        if entry.length:
            os.pwrite(disk, self._run.data_of(entry), entry.start)

    def _recover(self) -> None:
        """Replays the journal, as mounting would, and looks whether all is in order then."""
        # With -p, it would repair some of what it finds without a word.
        done = _tool("e2fsck", "-f", "-y", self._path)
        if faults := faults_of_recovery(done.returncode, done.stdout + done.stderr):
            raise BrokenFileSystem(f"e2fsck: {'; '.join(faults)[:600]}")

    def _require_mounted(self, version: Version) -> None:
        """The kernel's own recovery brings the same files, and leaves all in order."""
        try:
            mounted = read_mounted(self._mounted_path, self._mount_point, PATHS)
        except NotMounted as error:
            raise BrokenFileSystem(f"mount: {error}") from error
        if other := [name for name in PATHS if mounted[name] != version[name]]:
            raise BrokenFileSystem(f"mounted by the kernel, it has another {', '.join(other)}")
        done = _tool("e2fsck", "-f", "-n", self._mounted_path)
        if done.returncode != 0:
            raise BrokenFileSystem("e2fsck after the kernel: "
                                   f"{done.stdout.decode(errors='replace')[-600:]}")

    def _read_files(self) -> Version:
        for old in self._dumped.iterdir():
            old.unlink()
        done = _tool("debugfs", "-f", self._commands, self._path)
        if done.returncode != 0:
            raise BrokenFileSystem(f"debugfs: {done.stderr.decode(errors='replace')[-600:]}")
        return read_listing(done.stdout)


def read_listing(listing: bytes) -> Version:
    """What debugfs prints for the commands above: each command, and behind it its answer."""
    pieces = re.split(rb"^debugfs: (?:stat|cat) \S+\n", listing, flags=re.MULTILINE)[1:]
    if len(pieces) != 2 * len(PATHS):
        raise BrokenFileSystem(f"debugfs answered {len(pieces)} of {2 * len(PATHS)} commands")
    return {name: _file_of(pieces[2 * number], pieces[2 * number + 1])
            for number, name in enumerate(PATHS)}


def _file_of(status: bytes, content: bytes) -> File:
    """Nothing is on standard output for a file that is not there."""
    if not status.strip():
        return None
    found = re.search(rb"Type: (\w+) +Mode: +(\d+)", status)
    owners = re.search(rb"User: +(\d+) +Group: +(\d+)", status)
    if found is None or owners is None or found[1] != b"regular":
        raise BrokenFileSystem(f"debugfs: {status[:200]!r}")
    return int(found[2], 8), int(owners[1]), int(owners[2]), content


def _tool(*words: str | Path) -> subprocess.CompletedProcess[bytes]:
    return subprocess.run(words, stdin=subprocess.DEVNULL, capture_output=True, env=ENVIRONMENT,
                          timeout=TOOL_SECONDS, check=False)


def sparse_file(path: Path, size: int) -> int:
    descriptor = os.open(path, os.O_RDWR | os.O_CREAT | os.O_TRUNC | os.O_CLOEXEC, 0o600)
    os.ftruncate(descriptor, size)
    return descriptor


def _extents(disk: int) -> list[tuple[int, int]]:
    found = []
    end = 0
    while True:
        try:
            start = os.lseek(disk, end, os.SEEK_DATA)
        except OSError:  # no data behind the last
            return found
        end = os.lseek(disk, start, os.SEEK_HOLE)
        found.append((start, end))


def copy_data(source: int, target: int) -> None:
    """Makes the target's content that of the source's beginning, wherever either has any."""
    reached = 0
    size = os.fstat(target).st_size
    for start, end in sorted([*_extents(source), *_extents(target)]):
        start, end = max(start, reached), min(end, size)
        if start >= end:
            continue
        os.lseek(target, start, os.SEEK_SET)
        while start < end:
            start += os.sendfile(target, source, start, end - start)
        reached = end
