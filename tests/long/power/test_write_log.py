"""tests/long/power/test_write_log.py: the log of dm-log-writes is read as its kernel module writes
it."""
import struct

import pytest
from made_logs import made_log, marked, written
from write_log import DISCARD, FLUSH, FUA, MARK, LogError, mark_positions, read_log

LOG = made_log(written(4096, b"a" * 1024), written(0, b"", FLUSH), marked("begin-1"),
               written(8192, b"b" * 512, FUA), marked("answer-1"))


def test_five_entries() -> None:
    log = memoryview(LOG)
    entries = read_log(log)
    assert [(entry.flags, entry.start, entry.length, entry.mark) for entry in entries] == [
        (0, 4096, 1024, ""), (FLUSH, 0, 0, ""), (MARK, 0, 0, "begin-1"), (FUA, 8192, 512, ""),
        (MARK, 0, 0, "answer-1")]
    assert log[entries[0].data:entries[0].data + 1024] == b"a" * 1024
    assert log[entries[3].data:entries[3].data + 512] == b"b" * 512
    assert mark_positions(entries) == {"begin-1": 2, "answer-1": 4}


def test_bytes_from_a_kernel() -> None:
    """Written out in hexadecimal, so that not the same mistake is on both sides."""
    head = bytes.fromhex("7268737766736a00 0100000000000000 0100000000000000 00020000")
    entry = bytes.fromhex("0300000000000000 0100000000000000 0100000000000000 0000000000000000")
    entries = read_log(memoryview(head.ljust(512, b"\0") + entry.ljust(512, b"\0") + b"c" * 512))
    assert [(entry.flags, entry.start, entry.length, entry.data) for entry in entries] == [
        (FLUSH, 3 * 512, 512, 1024)]


@pytest.mark.parametrize("log", [b"", LOG[:512], LOG[:1500], LOG[:-512], b"\0" * 4096,
                                 LOG[:8] + struct.pack("<Q", 2) + LOG[16:]])
def test_what_is_no_whole_log(log: bytes) -> None:
    with pytest.raises(LogError):
        read_log(memoryview(log))


def test_a_discard_is_refused() -> None:
    with pytest.raises(LogError):
        read_log(memoryview(made_log(written(0, b"", DISCARD))))


def test_a_mark_that_stands_twice() -> None:
    with pytest.raises(LogError):
        mark_positions(read_log(memoryview(made_log(marked("start-0"), marked("start-0")))))
