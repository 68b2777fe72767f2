"""tests/bus/harness/privanectl.py: the installed client, run as a user would."""
import fcntl
import json
import os
import pty
import select
import signal
import subprocess
import termios
import time
from dataclasses import dataclass
from typing import Any, Mapping, Sequence

from harness.sandbox import SYSTEM_BUS

PROGRAM = "/usr/bin/privanectl"

# Longer than anything here takes on a busy machine.
SECONDS = 60.0

DONE, FAILED, USAGE = 0, 1, 2


@dataclass(frozen=True)
class Run:
    """How a run ended, and what it printed."""

    status: int
    output: str
    errors: str

    @property
    def json(self) -> Any:
        assert (self.status, self.errors) == (DONE, ""), self
        return json.loads(self.output)


def surroundings(**more: str) -> dict[str, str]:
    return {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "TERM": "xterm", "TZ": "UTC",
            "G_DEBUG": "fatal-criticals", "DBUS_SYSTEM_BUS_ADDRESS": SYSTEM_BUS, **more}


def as_user(uid: int, groups: Sequence[int] = ()) -> list[str]:
    """What stands in front of a command that another user runs."""
    listed = ",".join(str(group) for group in groups)
    return ["setpriv", f"--reuid={uid}", f"--regid={uid}",
            f"--groups={listed}" if groups else "--clear-groups", "--"]


def privanectl(*words: str | bytes, stdin: str = "", wrapper: Sequence[str] = (),
               descriptors: Sequence[int] = (), environment: Mapping[str, str] | None = None) -> Run:
    """Without a terminal: of a session that has none."""
    ended = subprocess.run([*wrapper, PROGRAM, *words], input=stdin.encode(), capture_output=True,
                           env=surroundings(**(environment or {})), pass_fds=descriptors,
                           start_new_session=True, timeout=SECONDS, check=False)
    return Run(ended.returncode, ended.stdout.decode(), ended.stderr.decode())


def with_password(password: str | bytes, *words: str) -> Run:
    """The password comes through a pipe."""
    reading, writing = os.pipe()
    try:
        os.write(writing, password.encode() if isinstance(password, str) else password)
        os.close(writing)
        return privanectl(*words, f"--password-fd={reading}", descriptors=(reading,))
    finally:
        os.close(reading)


def failed(text: str) -> Run:
    """A call that was refused or failed, and said so on one line."""
    return Run(FAILED, "", f"privanectl: {text}\n")


def wrong_usage(text: str) -> Run:
    return Run(USAGE, "", f"privanectl: {text}\n")


class Terminal:
    """A run on a terminal of its own."""

    def __init__(self, *words: str, environment: Mapping[str, str] | None = None,
                 program: Sequence[str] = (PROGRAM,)) -> None:
        self._master, slave = pty.openpty()
        self.shown = ""
        self.passed = ""

        def take_terminal() -> None:
            # Whoever runs the tests may ignore some, which would be inherited.
            for number in (signal.SIGHUP, signal.SIGINT, signal.SIGQUIT, signal.SIGTERM):
                signal.signal(number, signal.SIG_DFL)
            fcntl.ioctl(slave, termios.TIOCSCTTY, 0)
        self.process = subprocess.Popen([*program, *words], stdin=slave, stdout=slave, stderr=slave,
                                        env=surroundings(**(environment or {})),
                                        start_new_session=True, preexec_fn=take_terminal)
        self.settings = os.dup(slave)
        os.close(slave)

    def echoes(self) -> bool:
        return bool(termios.tcgetattr(self.settings)[3] & termios.ECHO)

    def await_text(self, text: str) -> None:
        """Until the text was shown behind what was awaited before; passed is what came between."""
        end = time.monotonic() + SECONDS
        while text not in self.shown:
            assert time.monotonic() < end, (text, self.shown)
            self.read(0.1)
        self.passed, _, self.shown = self.shown.partition(text)

    def type(self, text: str) -> None:
        os.write(self._master, text.encode())

    def wait(self) -> int:
        """The end of the run; shown then has all that came since."""
        end = time.monotonic() + SECONDS
        while self.process.poll() is None:
            assert time.monotonic() < end, self.shown
            self.read(0.02)
        while self.read(0):
            pass
        return self.process.returncode

    def close(self) -> None:
        if self.process.poll() is None:
            self.process.kill()
            self.process.wait(5)
        os.close(self.settings)
        os.close(self._master)

    def read(self, seconds: float) -> bool:
        if not select.select([self._master], [], [], seconds)[0]:
            return False
        self.shown += os.read(self._master, 65536).decode().replace("\r\n", "\n")
        return True


def on_terminal(*words: str, **environment: str) -> Run:
    """A run that asks nothing; standard error is the terminal's, too."""
    terminal = Terminal(*words, environment=environment)
    try:
        return Run(terminal.wait(), terminal.shown, "")
    finally:
        terminal.close()


def table() -> list[dict[str, Any]]:
    """The client's own table of its commands."""
    return privanectl("verbs", "--json=short").json
