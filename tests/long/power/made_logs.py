"""tests/long/power/made_logs.py: logs as dm-log-writes would have written them, for the tests."""
from write_log import ENTRY, MAGIC, MARK, SUPER

SECTOR = 512


def made_log(*entries: bytes) -> bytes:
    return SUPER.pack(MAGIC, 1, len(entries), SECTOR).ljust(SECTOR, b"\0") + b"".join(entries)


def written(start: int, data: bytes, flags: int = 0) -> bytes:
    """`start` is in bytes, and like the data a multiple of a sector."""
    assert start % SECTOR == 0 and len(data) % SECTOR == 0
    head = ENTRY.pack(start // SECTOR, len(data) // SECTOR, flags, 0)
    return head.ljust(SECTOR, b"\0") + data


def marked(text: str) -> bytes:
    return (ENTRY.pack(0, 0, MARK, len(text)) + text.encode()).ljust(SECTOR, b"\0")
