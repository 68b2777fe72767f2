"""device/camera/root_shell.py: the driver's end of the root shell on the camera's console."""
import base64
import os
import select
import shlex
import shutil
import socket
import sys
import termios
import tty
from collections.abc import Sequence
from dataclasses import dataclass

from .deadline import Deadline
from .errors import CameraError

READY = b"camera-shell ready"
LEAVE_KEY = b"\x1d"  # Ctrl-]
PUT_CHUNK = 48 << 10


@dataclass(frozen=True)
class Result:
    """What a command in the camera answered."""

    command: str
    status: int
    out_bytes: bytes
    err_bytes: bytes

    @property
    def out(self) -> str:
        return self.out_bytes.decode(errors="surrogateescape")

    @property
    def err(self) -> str:
        return self.err_bytes.decode(errors="surrogateescape")

    def check(self) -> "Result":
        if self.status != 0:
            raise CameraError(f"in the camera, status {self.status}: {self.command}\n"
                              f"{self.out}{self.err}")
        return self


class RootShell:
    """Runs commands as root through guest/usr/local/sbin/camera-shell, one at a time."""

    def __init__(self, connection: socket.socket) -> None:
        self._socket = connection
        self._buffer = b""
        self._count = 0

    def wait_until_ready(self, deadline: Deadline) -> None:
        while READY not in self._line(deadline):
            pass

    def run(self, command: str | Sequence[str], deadline: Deadline) -> Result:
        """A shell script, or the words of one command."""
        script = command if isinstance(command, str) else shlex.join(command)
        status, out, err = self._request("run", [_escaped(script)], deadline)
        return Result(script, status, out, err)

    def put(self, path: str, content: bytes, mode: int, deadline: Deadline) -> None:
        """Writes a file under another name, then moves it to its own."""
        work = "/run/camera-shell/put"
        self.run(f": >{work}", deadline).check()
        for start in range(0, len(content), PUT_CHUNK):
            chunk = base64.b64encode(content[start:start + PUT_CHUNK]).decode()
            self.run(f"base64 -d <<<{chunk} >>{work}", deadline).check()
        self.run(f"chmod {mode:o} {work} && mv -T {work} {shlex.quote(path)}", deadline).check()

    def _request(self, verb: str, words: list[str], deadline: Deadline) -> tuple[int, bytes, bytes]:
        token = self._send(verb, words, deadline)
        # An answer with another token belongs to a command that was given up, or to the time before
        # a snapshot was restored.
        while True:
            fields = self._line(deadline).split()
            if fields[:2] == [b"reply", token]:
                return int(fields[2]), _decoded(fields[3]), _decoded(fields[4])

    def _send(self, verb: str, words: list[str], deadline: Deadline) -> bytes:
        self._count += 1
        token = f"{os.getpid()}.{self._count}"
        self._socket.settimeout(deadline.left())
        try:
            self._socket.sendall(" ".join([verb, token, *words]).encode() + b"\n")
        except TimeoutError:
            raise deadline.missed() from None
        return token.encode()

    def _line(self, deadline: Deadline) -> bytes:
        pieces = [self._buffer]
        while b"\n" not in pieces[-1]:
            self._socket.settimeout(deadline.left())
            try:
                piece = self._socket.recv(1 << 16)
            except TimeoutError:
                raise deadline.missed() from None
            if not piece:
                raise CameraError("the camera was switched off")
            pieces.append(piece)
        line, self._buffer = b"".join(pieces).split(b"\n", 1)
        return line

    def interact(self) -> bool:
        """Hands the terminal to a shell in the camera until it ends or Ctrl-] is typed; false when
        the camera was switched off in it."""
        size = shutil.get_terminal_size()
        words = [str(size.lines), str(size.columns), os.environ.get("TERM", "vt100")]
        terminal = sys.stdin.fileno()
        before = termios.tcgetattr(terminal)
        try:
            tty.setraw(terminal)
            while True:
                token = self._send("interactive", words, Deadline(10, "the shell in the camera"))
                end = self._pass_through(terminal, [b"reply " + token, READY])
                # Ready once more: the camera was rebooted, or its shell had to be started anew.
                if end != READY:
                    return end is not None
        finally:
            termios.tcsetattr(terminal, termios.TCSADRAIN, before)

    def _pass_through(self, terminal: int, ends: list[bytes]) -> bytes | None:
        """Copies both ways until the camera sends one of the ends or the leave key is typed, and
        returns that; None when the camera is gone."""
        seen = b""
        self._socket.settimeout(None)
        while True:
            ready, _, _ = select.select([terminal, self._socket], [], [])
            if terminal in ready:
                typed = os.read(terminal, 4096)
                if not typed or LEAVE_KEY in typed:
                    return LEAVE_KEY
                self._socket.sendall(typed)
            if self._socket in ready:
                shown = self._socket.recv(1 << 16)
                if not shown:
                    return None
                old, seen = len(seen), seen + shown
                for end in ends:
                    if end in seen:
                        os.write(sys.stdout.fileno(), seen[old:seen.index(end)])
                        return end
                os.write(sys.stdout.fileno(), shown)
                # An end may come in two pieces.
                seen = seen[-64:]


def _escaped(script: str) -> str:
    """One word for the shell's `printf %b`."""
    return "".join(chr(byte) if chr(byte).isalnum() and byte < 128 else f"\\0{byte:03o}"
                   for byte in script.encode())


def _decoded(field: bytes) -> bytes:
    return b"" if field == b"-" else base64.b64decode(field)
