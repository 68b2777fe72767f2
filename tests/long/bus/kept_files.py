"""tests/long/bus/kept_files.py: the files that a killed service leaves, and the judgement on them.

Files are compared byte for byte, but for what the service draws by lot or takes from the clock: a
hash stands as the clear text that it is of, a day that is today's as TODAY, members in alphabetical
order. The boot block counts by what its newest valid copy says, as the device reads it.
"""
import os
import stat
import zlib
from dataclasses import dataclass
from pathlib import Path
from typing import Sequence

from harness.accounts import GROUP, PASSWD, SHADOW
from harness.changing_accounts import is_today
from harness.passwords import OLD, OLD_HASH, is_hash_of
from harness.stage_fixtures import DIGEST_FILE

PARAMETERS = Path("/etc/privane/parameters.conf")
BOOT_CONFIG = Path("/etc/fw_env.config")
BOOT_BLOCK = Path("/etc/bootblock")
BOOT_LOCK = Path("/run/lock/fw_printenv.lock")
BOOT_COPY = 4096

# In the order in which one call replaces them.
FILES = (PASSWD, SHADOW, GROUP, DIGEST_FILE, PARAMETERS, BOOT_BLOCK)
TEMPORARIES = tuple(Path(f"{file}.tmp") for file in FILES[:-1])
FOLDERS = tuple({file.parent: None for file in FILES})
LOCKS = tuple(Path(f"{file}.lock") for file in (DIGEST_FILE, PARAMETERS))

ROOT_LINE = "root:x:0:0:root:/root:/bin/sh"
PRIVATE = 0o600

Version = dict[Path, str]


class Hashes:
    """What clear text a hash is of, among those that were ever given for a user."""

    def __init__(self) -> None:
        self._known = {OLD_HASH: OLD}
        self._given: dict[str, list[str]] = {}

    def give(self, name: str, clear_text: str) -> None:
        self._given.setdefault(name, []).append(clear_text)

    def clear_text(self, name: str, field: str) -> str | None:
        """The newest is tried first; None is no hash of ours."""
        if field not in self._known and field.startswith("$"):
            for text in reversed(self._given.get(name, [])):
                if is_hash_of(field, text):
                    self._known[field] = text
                    break
        return self._known.get(field)


def boot_parameters(image: bytes) -> dict[str, str]:
    """Of the valid copy with the higher counter."""
    copies = []
    for start in range(0, len(image), BOOT_COPY):
        crc, counter, content = image[start:start + 4], image[start + 4], image[start + 5:
                                                                                start + BOOT_COPY]
        if int.from_bytes(crc, "little") == zlib.crc32(content):
            copies.append((counter, content))
    assert copies, "no copy of the boot block is valid"
    copies.sort(key=lambda copy: copy[0])
    # The counter is a byte and starts again at 0.
    newest = copies[0] if copies[-1][0] - copies[0][0] > 1 else copies[-1]
    words = newest[1].split(b"\0\0")[0].split(b"\0")
    return dict(word.decode().split("=", 1) for word in words)


def boot_text(parameters: dict[str, str]) -> str:
    return "".join(f"{name}={value}\n" for name, value in sorted(parameters.items()))


def _shadow_line(line: str, hashes: Hashes) -> str:
    name, field, day, *ageing = line.split(":")
    text = hashes.clear_text(name, field)
    return ":".join([name, field if text is None else f"<{text}>",
                     "TODAY" if is_today(day) else day, *ageing])


def sort_members(line: str) -> str:
    head, _, members = line.rpartition(":")
    return f"{head}:{','.join(sorted(members.split(',')))}"


def read_version(hashes: Hashes) -> Version:
    """The files as they are on disk. A missing one, or a last line without its end, shows."""
    version = {}
    for file in FILES:
        content = file.read_bytes()
        if file == BOOT_BLOCK:
            version[file] = boot_text(boot_parameters(content))
            continue
        *lines, rest = content.decode().split("\n")
        if file == SHADOW:
            lines = [_shadow_line(line, hashes) for line in lines]
        elif file == GROUP:
            lines = [sort_members(line) for line in lines]
        version[file] = "".join(f"{line}\n" for line in lines) + rest
    return version


def difference(got: Version, wanted: Version, most: int = 20) -> str:
    """The lines that only one of the two has."""
    shown = []
    for file in FILES:
        ours, theirs = got[file].splitlines(True), wanted[file].splitlines(True)
        shown += [f"{file}: has {line!r:.150}" for line in ours if line not in theirs]
        shown += [f"{file}: lacks {line!r:.150}" for line in theirs if line not in ours]
        if ours != theirs and sorted(ours) == sorted(theirs):
            shown.append(f"{file}: in another order")
    return "\n".join(shown[:most])


@dataclass(frozen=True)
class Place:
    """How far the changes came: so many versions whole, and of the next so many files."""

    whole: int
    ahead: int


def judge(got: Version, versions: Sequence[Version], answered: int) -> Place:
    """Where the files stand. Version number answered is the last that was answered, those after it
    were begun. The files are of one version, or the first few of them of the next."""
    for whole in range(answered, len(versions)):
        if got == versions[whole]:
            return Place(whole, 0)
    for whole in range(answered, len(versions) - 1):
        for ahead in range(1, len(FILES)):
            if got == {file: versions[whole + (place < ahead)][file]
                       for place, file in enumerate(FILES)}:
                return Place(whole, ahead)
    raise AssertionError(f"no version that may be there, from {answered} to {len(versions) - 1};\n"
                         f"against version {answered}:\n{difference(got, versions[answered])}\n"
                         f"against the last:\n{difference(got, versions[-1])}")


def _mode(seen: os.stat_result) -> int:
    return stat.S_IMODE(seen.st_mode)


class Access:
    """Owner and mode of the files at the start, and the entries of their folders."""

    def __init__(self) -> None:
        self._seen = {file: file.stat() for file in FILES}
        self._entries = set(self._list()) | set(map(str, TEMPORARIES + LOCKS))

    @staticmethod
    def _list() -> list[str]:
        return [entry.path for folder in FOLDERS for entry in os.scandir(folder)]

    def check(self) -> None:
        """Nothing is more open than it was, and nothing strange was left behind."""
        for file, before in self._seen.items():
            now = file.stat()
            # The account files are made anew by root, which takes shadow from its group.
            assert (_mode(now), now.st_uid) == (_mode(before), before.st_uid), file
            assert now.st_gid in (before.st_gid, 0), file
            temporary = Path(f"{file}.tmp")
            if temporary.exists():
                seen = temporary.lstat()
                assert stat.S_ISREG(seen.st_mode) and seen.st_uid == 0, temporary
                assert _mode(seen) in (PRIVATE, _mode(before)), (temporary, oct(seen.st_mode))
        strange = set(self._list()) - self._entries
        assert not strange, strange
        root, *_ = PASSWD.read_text().splitlines()
        assert root == ROOT_LINE, root
        assert [line.split(":")[0] for line in PASSWD.read_text().splitlines()
                if line.split(":")[2] == "0"] == ["root"]


def save_files() -> dict[Path, tuple[bytes, os.stat_result]]:
    """All that a kill may leave, to be put back."""
    return {path: (path.read_bytes(), path.stat()) for path in (*FILES, *TEMPORARIES)
            if path.exists()}


def restore_files(saved: dict[Path, tuple[bytes, os.stat_result]]) -> None:
    for path in (*FILES, *TEMPORARIES):
        if path not in saved:
            path.unlink(missing_ok=True)
            continue
        content, seen = saved[path]
        # Born private, as the service makes them: somebody watches.
        with open(os.open(path, os.O_WRONLY | os.O_CREAT | os.O_TRUNC, PRIVATE), "wb") as file:
            file.write(content)
        os.chown(path, seen.st_uid, seen.st_gid)
        os.chmod(path, _mode(seen))
