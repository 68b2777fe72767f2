"""tests/device/terminal.py: a program on a terminal of its own, with somebody typing."""
import os
import pty
import select
import subprocess
import time
from collections.abc import Mapping, Sequence
from pathlib import Path


class Terminal:
    """Use it in a `with` block: leaving it ends the program."""

    def __init__(self, argv: Sequence[str | Path], env: Mapping[str, str] | None = None) -> None:
        self._ours, theirs = pty.openpty()
        self.process = subprocess.Popen(argv, stdin=theirs, stdout=theirs, stderr=theirs, env=env,
                                        start_new_session=True)
        os.close(theirs)
        self._unread = ""

    def wait_for(self, text: str, seconds: float = 120) -> None:
        """Reads up to the text and no further."""
        end = time.monotonic() + seconds
        while text not in self._unread:
            assert time.monotonic() < end, f"{text!r} did not come:\n{self._unread}"
            if select.select([self._ours], [], [], 1)[0]:
                self._unread += os.read(self._ours, 4096).decode(errors="replace")
        self._unread = self._unread.split(text, 1)[1]

    def type(self, keys: bytes) -> None:
        os.write(self._ours, keys)

    def __enter__(self) -> "Terminal":
        return self

    def __exit__(self, *error: object) -> None:
        if self.process.poll() is None:
            self.process.terminate()
            self.process.wait(30)
        os.close(self._ours)
