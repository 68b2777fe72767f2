"""tests/bus/harness/notify_socket.py: a service manager's end of sd_notify(3)."""
import os
import socket
import struct
import time
from dataclasses import dataclass

CREDENTIALS = struct.Struct("iII")


@dataclass(frozen=True)
class Notice:
    """A datagram: when it was taken up, in seconds, the process that sent it, and its text."""

    time: float
    pid: int
    text: str


class NotifySocket:
    """name: a path, or "@" and the name of a socket in no file system; as in NOTIFY_SOCKET."""

    def __init__(self, name: str) -> None:
        self.name = name
        self._open()

    def _open(self) -> None:
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self._socket.setsockopt(socket.SOL_SOCKET, socket.SO_PASSCRED, 1)
        self._socket.bind("\0" + self.name[1:] if self.name.startswith("@") else self.name)

    def environment(self, microseconds: int | str) -> dict[str, str]:
        return {"NOTIFY_SOCKET": self.name, "WATCHDOG_USEC": str(microseconds)}

    def notices(self, seconds: float) -> list[Notice]:
        """Those that come within this time; older ones, which nobody has taken up, are dropped."""
        self._drop()
        taken = []
        end = time.monotonic() + seconds
        while (left := end - time.monotonic()) > 0:
            self._socket.settimeout(left)
            try:
                taken.append(self._take())
            except TimeoutError:
                break
        return taken

    def _take(self) -> Notice:
        data, [(_, _, credentials)], _, _ = self._socket.recvmsg(4096, 256)
        return Notice(time.monotonic(), CREDENTIALS.unpack(credentials)[0], data.decode())

    def _drop(self) -> None:
        self._socket.setblocking(False)
        try:
            while True:
                self._socket.recv(4096)
        except BlockingIOError:
            pass

    def make_anew(self) -> None:
        """As a manager does that starts over."""
        self._socket.close()
        os.unlink(self.name)
        self._open()

    def close(self) -> None:
        self._socket.close()
        if not self.name.startswith("@"):
            os.unlink(self.name)
