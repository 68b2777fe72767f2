"""tests/long/bus/other_writers.py: others that change and read the account files meanwhile."""
import ctypes
import threading
import time

from account_watch import rows
from harness.accounts import CLERK_UID, GROUP, PASSWD, SHADOW, SHADOW_GID, replace


class _Worker:
    """Does its step again and again, until it is told to end or cannot."""

    def __init__(self) -> None:
        self._goes_on = True
        self._error: Exception | None = None
        self._thread = threading.Thread(target=self._run)
        self._thread.start()

    def _run(self) -> None:
        try:
            while self._goes_on:
                self._step()
        except Exception as error:
            self._error = error

    def _step(self) -> None:
        raise NotImplementedError

    def end(self) -> None:
        """Raises what ended it before."""
        self._goes_on = False
        self._thread.join(10)
        assert not self._thread.is_alive()
        if self._error is not None:
            raise self._error


class Outsider(_Worker):
    """Another program that changes passwd and shadow, as useradd and chpasswd do: a new file that
    takes the old one's place, under the lock of lckpwdf."""

    def __init__(self) -> None:
        self.changes = 0
        self._libc = ctypes.CDLL(None)
        super().__init__()

    def _step(self) -> None:
        assert self._libc.lckpwdf() == 0
        self._change()
        self._libc.ulckpwdf()
        self.changes += 1
        time.sleep(0.003)

    def _change(self) -> None:
        number = self.changes
        passwd = [line for line in PASSWD.read_text().splitlines(True)
                  if not line.startswith("outsider:")]
        shadow = [line for line in SHADOW.read_text().splitlines(True)
                  if not line.startswith("outsider:")]
        if number % 2 == 0:
            passwd.append(f"outsider:x:777:{CLERK_UID}:Number {number}:/:/bin/false\n")
            shadow.append("outsider:!:19000:0:99999:7:0::\n")
        replace(PASSWD, "".join(passwd), 0o644, 0)
        replace(SHADOW, "".join(shadow), 0o640, SHADOW_GID)


class Reader(_Worker):
    """Reads the three files all the time: each must be whole at every moment."""

    def __init__(self) -> None:
        self.looks = 0
        super().__init__()

    def _step(self) -> None:
        for path in (PASSWD, SHADOW, GROUP):
            names = {row[0] for row in rows(path)}
            assert "root" in names and "polkitd" in names, (path, names)
        self.looks += 1
