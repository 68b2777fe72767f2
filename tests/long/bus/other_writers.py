"""tests/long/bus/other_writers.py: others that change and read the account files meanwhile."""
import ctypes
import threading

from account_watch import rows
from harness.accounts import CLERK_UID, GROUP, PASSWD, SHADOW, SHADOW_GID, replace


class Outsider:
    """Another program that changes passwd and shadow, as useradd and chpasswd do: a new file that
    takes the old one's place, under the lock of lckpwdf."""

    def __init__(self) -> None:
        self.changes = 0
        self._goes_on = True
        self._thread = threading.Thread(target=self._run)
        self._thread.start()

    def _run(self) -> None:
        libc = ctypes.CDLL(None)
        while self._goes_on:
            assert libc.lckpwdf() == 0
            self._change()
            libc.ulckpwdf()
            self.changes += 1
            threading.Event().wait(0.003)

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

    def end(self) -> None:
        self._goes_on = False
        self._thread.join(10)


class Reader:
    """Reads the three files all the time: each must be whole at every moment."""

    def __init__(self) -> None:
        self.looks = 0
        self.torn: list[str] = []
        self._goes_on = True
        self._thread = threading.Thread(target=self._run)
        self._thread.start()

    def _run(self) -> None:
        while self._goes_on:
            for path in (PASSWD, SHADOW, GROUP):
                try:
                    names = {row[0] for row in rows(path)}
                    assert "root" in names and "polkitd" in names, names
                except AssertionError as error:
                    self.torn.append(str(error))
            self.looks += 1

    def end(self) -> None:
        self._goes_on = False
        self._thread.join(10)
