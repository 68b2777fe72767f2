"""tests/long/power/recorded_run.py: a recording as it lies in its folder: the log of the disk's
writes, and what every file held after each answer."""
import base64
import json
import mmap
from dataclasses import dataclass
from pathlib import Path

from boot_copies import active_parameters
from power_plan import FILES
from write_log import FLUSH, Entry, mark_positions, read_log

# The disk whose writes are logged: a file system, and behind it the boot block.
FILE_SYSTEM_SIZE = 23 << 20
BOOT_BLOCK_SIZE = 1 << 20
DISK_SIZE = FILE_SYSTEM_SIZE + BOOT_BLOCK_SIZE

LOG, ANSWERS, STEPS = "log", "answers", "steps.json"


class RecordingError(Exception):
    """The recording shows nothing that could be judged."""


# What stands for a file: None when there is none, mode, owner, group, and content.
File = tuple[int, int, int, bytes] | None
Version = dict[str, File]


@dataclass(frozen=True)
class Change:
    """What a step did: the version behind it, and the files it wrote, in their order."""

    line: str
    version: Version
    written: tuple[str, ...]


class RecordedRun:
    def __init__(self, folder: Path) -> None:
        self.folder = folder
        with (folder / LOG).open("rb") as file:
            self._map = mmap.mmap(file.fileno(), 0, prot=mmap.PROT_READ)
        self.log = memoryview(self._map)
        self.entries: list[Entry] = read_log(self.log)
        self._marks = mark_positions(self.entries)
        self.start = self._position_of("start", 0)
        if not any(entry.flags & FLUSH for entry in self.entries[self.start:]):
            raise RecordingError("the camera's disk was never flushed: nothing there could be lost")
        steps = json.loads((folder / STEPS).read_text())
        self.changes = read_answers((folder / ANSWERS).read_text(), steps)
        numbers = range(1, len(self.changes))
        self.begun = [0] + [self._position_of("begin", number) for number in numbers]
        self.answered = [self.start] + [self._position_of("answer", number) for number in numbers]

    def _position_of(self, word: str, number: int) -> int:
        position = self._marks.get(f"{word}-{number}")
        if position is None:
            raise RecordingError(f"the log lacks the mark {word}-{number}")
        return position

    def data_of(self, entry: Entry) -> memoryview:
        return self.log[entry.data:entry.data + entry.length]


def read_answers(text: str, steps: list[dict[str, object]]) -> list[Change]:
    """What the recorder printed, as one change for each step behind the version at the start."""
    version: Version = dict.fromkeys(FILES)
    changes = [Change("start", version, ())]
    for line in text.splitlines():
        words = line.split(" ", 2)
        if words[0] == "answer":
            step = steps[len(changes) - 1]
            if int(words[1]) != len(changes) or (words[2] == "ok") != step["succeeds"]:
                raise RecordingError(f"this was not to be answered so: {step['line']}: {line}")
            changes.append(Change(str(step["line"]), changes[-1].version, ()))
        elif words[0] == "file":
            changes[-1] = _with_file(changes[-1], words[1], words[2], steps, len(changes) - 2)
        else:
            raise RecordingError(f"this is no line of the recorder: {line[:200]}")
    if len(changes) != len(steps) + 1:
        raise RecordingError(f"{len(changes) - 1} of {len(steps)} steps were answered")
    return changes


def _with_file(change: Change, name: str, described: str, steps: list[dict[str, object]],
               step: int) -> Change:
    version = {**change.version, name: _file_of(name, described)}
    if step < 0:
        return Change(change.line, version, ())
    if not steps[step]["succeeds"]:
        raise RecordingError(f"a refused call changed {name}: {change.line}")
    written = {*change.written, name}
    order = steps[step]["order"]
    assert isinstance(order, list)
    return Change(change.line, version, tuple(each for each in order if each in written))


def _file_of(name: str, described: str) -> File:
    if described == "absent":
        return None
    mode, owner, group, *content = described.split(" ")
    held = base64.b64decode(content[0]) if content else b""
    if name == "boot":
        parameters = active_parameters(held)
        if parameters is None:
            raise RecordingError("the boot block had no valid copy while all was well")
        return (0, 0, 0, parameters)
    return (int(mode, 8), int(owner), int(group), held)
