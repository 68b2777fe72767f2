"""tests/bus/harness/syslog_socket.py: what programs send to syslog(3)."""
import os
import re
import socket
import threading
from dataclasses import dataclass

from harness.deadline import wait_for

PATH = "/dev/log"
RECORD = re.compile(rb"<(?P<priority>\d+)>\w{3} [ \d]\d \d\d:\d\d:\d\d "
                    rb"(?P<tag>[^:\[]+)(?:\[(?P<pid>\d+)\])?: (?P<text>.*)", re.DOTALL)


@dataclass(frozen=True)
class Line:
    """A record: facility and severity as syslog.h numbers them, and the bytes of the text."""

    facility: int
    severity: int
    tag: str
    pid: int | None
    raw: bytes

    @property
    def text(self) -> str:
        return self.raw.decode("utf-8", "backslashreplace")


def parse(record: bytes) -> Line:
    match = RECORD.fullmatch(record.rstrip(b"\0\n"))
    assert match, f"no syslog record: {record!r}"
    number = int(match["priority"])
    pid = int(match["pid"]) if match["pid"] else None
    return Line(number >> 3, number & 7, match["tag"].decode(), pid, match["text"])


class SyslogSocket:
    """Owns /dev/log and collects the records, in a thread: senders wait for a full socket."""

    def __init__(self) -> None:
        self._records: list[bytes] = []
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self._socket.bind(PATH)
        os.chmod(PATH, 0o666)
        self._thread = threading.Thread(target=self._collect, daemon=True)
        self._thread.start()

    def _collect(self) -> None:
        while record := self._socket.recv(1 << 20):
            self._records.append(record)

    def lines(self) -> list[Line]:
        """The records so far. A sender's records come in its order, and before anything that the
        sender did afterwards can be seen."""
        self._settle()
        return [parse(record) for record in list(self._records)]

    def texts(self) -> list[tuple[int, str]]:
        """The records so far as (severity, text)."""
        return [(line.severity, line.text) for line in self.lines()]

    def wait_for_text(self, text: str) -> None:
        wait_for(f"syslog: {text}", lambda: any(text in line.text for line in self.lines()))

    def forget(self) -> None:
        self._settle()
        self._records.clear()

    def _settle(self) -> None:
        """Waits until the reader has taken what was sent before this call."""
        mark = b"<0>Jan  1 00:00:00 harness: " + os.urandom(8).hex().encode()
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as sender:
            sender.connect(PATH)
            sender.send(mark)
        wait_for("the reader of /dev/log", lambda: mark in self._records)
        self._records.remove(mark)

    def close(self) -> None:
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as sender:
            sender.connect(PATH)
            sender.send(b"")
        self._thread.join(timeout=5)
        self._socket.close()
        os.unlink(PATH)
