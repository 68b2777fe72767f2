"""tests/long/power/write_log.py: reads the log that dm-log-writes keeps of a disk's writes.

The log begins with a block that counts the entries. An entry is a block that says where its data
go (or holds the text of a mark), followed by the data. A write is logged once it has reached the
disk: all that was written since the last flush when the next flush is done, a write that bypasses
the disk's cache at once. So whatever stands before an entry cannot be lost any more when that entry
is made, and what stands behind it, up to the end of the next flush, may or may not be on the disk.
"""
import struct
from dataclasses import dataclass

MAGIC = 0x6A736677736872
FLUSH, FUA, DISCARD, MARK = 1, 2, 4, 8
SUPER = struct.Struct("<QQQI")
ENTRY = struct.Struct("<QQQQ")


class LogError(Exception):
    """This is no log, or not a whole one."""


@dataclass(frozen=True)
class Entry:
    """Positions and lengths are in bytes; `data` is where the data stand in the log."""

    flags: int
    start: int
    length: int
    data: int
    mark: str

    @property
    def ends_epoch(self) -> bool:
        return bool(self.flags & FLUSH)


def read_log(log: memoryview) -> list[Entry]:
    if len(log) < SUPER.size:
        raise LogError("the log is empty")
    magic, version, count, sector = SUPER.unpack_from(log)
    if magic != MAGIC or version != 1 or sector < 512 or sector % 512:
        raise LogError("this is no log of dm-log-writes")
    entries = []
    position = sector
    for number in range(count):
        if position + sector > len(log):
            raise LogError(f"the log ends before entry {number} of {count}")
        start, length, flags, text_length = ENTRY.unpack_from(log, position)
        text = bytes(log[position + ENTRY.size:position + ENTRY.size + text_length])
        position += sector
        entry = Entry(flags, start * sector, length * sector, position,
                      text.decode() if flags & MARK else "")
        if flags & DISCARD:
            raise LogError("the log has a discard, and nobody knows what a disk keeps of that")
        position += entry.length
        if position > len(log):
            raise LogError(f"the log ends within entry {number} of {count}")
        entries.append(entry)
    return entries


def mark_positions(entries: list[Entry]) -> dict[str, int]:
    """Where each mark stands; every one is set once."""
    marks: dict[str, int] = {}
    for position, entry in enumerate(entries):
        if entry.mark:
            if entry.mark in marks:
                raise LogError(f"the mark {entry.mark} stands twice in the log")
            marks[entry.mark] = position
    return marks
