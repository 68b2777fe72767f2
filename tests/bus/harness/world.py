"""tests/bus/harness/world.py: all that a method could touch, to show that it touched nothing."""
import os
import signal
import stat
import subprocess
from dataclasses import dataclass
from pathlib import Path

from harness import process
from harness.deadline import wait_for

# Files that a method writes, and the folders in which it would make new ones.
FILES = tuple(Path(path) for path in (
    "/etc/passwd", "/etc/shadow", "/etc/group", "/etc/apache2/digest_auth_passwd",
    "/etc/privane/parameters.conf"))
FOLDERS = tuple(Path(path) for path in (
    "/", "/etc", "/etc/apache2", "/etc/privane", "/run", "/tmp", "/dev"))


@dataclass(frozen=True)
class FileState:
    content: bytes | None
    identity: tuple[int, ...]


def file_state(path: Path) -> FileState | None:
    """Content, inode, mode, owner and times; None where there is no such file."""
    try:
        seen = path.stat()
    except FileNotFoundError:
        return None
    return FileState(path.read_bytes() if path.is_file() else None,
                     (seen.st_ino, seen.st_mode, seen.st_uid, seen.st_gid, seen.st_size,
                      seen.st_mtime_ns, seen.st_ctime_ns))


# Of each entry of a folder its inode and the times of its content and its attributes; of a device,
# which the whole machine writes to, its number instead of the time.
Entries = dict[str, tuple[int, int, int]]


def entries(folder: Path) -> Entries:
    seen = ((entry.name, entry.stat(follow_symlinks=False)) for entry in os.scandir(folder))
    return {name: (status.st_ino,
                   status.st_rdev if stat.S_ISCHR(status.st_mode) else status.st_mtime_ns,
                   status.st_ctime_ns) for name, status in seen}


def last_pid() -> int:
    """The number of the last process or thread made in this PID namespace."""
    return int(Path("/proc/sys/kernel/ns_last_pid").read_text())


class Neighbour:
    """A process under the name of a sibling daemon. It blocks every signal, so that one that was
    sent to it stays pending and can be seen."""

    def __init__(self, name: str) -> None:
        def block_signals() -> None:
            signal.pthread_sigmask(signal.SIG_BLOCK, signal.valid_signals())
        self._process = subprocess.Popen([name, "infinity"], executable="/usr/bin/sleep",
                                         preexec_fn=block_signals)
        wait_for("the neighbour's start", lambda: process.name(self._process.pid) == "sleep")

    @property
    def pid(self) -> int:
        return self._process.pid

    def signals(self) -> set[int]:
        return process.pending(self.pid)

    def close(self) -> None:
        self._process.kill()
        self._process.wait(5)


@dataclass(frozen=True)
class World:
    """Two of them are equal when in between no file or folder entry changed, appeared or went, no
    process or thread started in the sandbox, and no neighbour got a signal."""

    files: dict[str, FileState | None]
    folders: dict[str, Entries]
    signals: dict[int, frozenset[int]]
    last_pid: int


def snapshot(*neighbours: Neighbour) -> World:
    return World(
        files={str(path): file_state(path) for path in FILES},
        folders={str(path): entries(path) for path in FOLDERS if path.is_dir()},
        signals={neighbour.pid: frozenset(neighbour.signals()) for neighbour in neighbours},
        last_pid=last_pid())
