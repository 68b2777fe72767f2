"""tests/long/bus/temporary_watch.py: an unprivileged process that tries to read temporary files."""
import ctypes
import os
import select
import struct
import subprocess
import sys
import time
from collections.abc import Sequence
from pathlib import Path

# The temporary files of what is not everybody's to read.
WATCHED = ("/etc/shadow.tmp", "/etc/apache2/digest_auth_passwd.tmp",
           "/etc/privane/parameters.conf.tmp")
NOBODY = 65534
TRY_SECONDS = 0.002
ANSWER_SECONDS = 10

# inotify(7)
IN_ATTRIB, IN_CREATE = 0x4, 0x100
EVENT = struct.Struct("iIII")


class TemporaryWatch:
    """Tries to open a temporary file as soon as it appears or its mode changes, and a while on."""

    def __init__(self) -> None:
        self._process = subprocess.Popen(
            ["setpriv", f"--reuid={NOBODY}", f"--regid={NOBODY}", "--clear-groups", "--",
             sys.executable, __file__], stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        assert self._line() == "watching"
        self._require_it_sees()

    def _line(self) -> str:
        assert self._process.stdout is not None
        ready, _, _ = select.select([self._process.stdout], [], [], ANSWER_SECONDS)
        assert ready, "the watch does not answer"
        return self._process.stdout.readline().strip()

    def _require_it_sees(self) -> None:
        """A file that everybody can read is read."""
        canary = Path(WATCHED[0])
        canary.unlink(missing_ok=True)
        canary.write_text("canary")
        assert self._line() == f"read {canary}"
        canary.unlink()
        # Only what the service writes is to count.
        assert self._process.stdin is not None
        print("forget", file=self._process.stdin, flush=True)
        assert self._line() == "forgot"

    def require_nothing_read(self, written: Sequence[str] = WATCHED) -> None:
        """Of the files, those written since must each have been tried."""
        assert self._process.poll() is None and self._process.stdin is not None
        self._process.stdin.close()
        tried = self._line()
        assert tried.startswith("tried "), f"somebody else {tried}"
        missed = set(written) - set(tried.split()[1:])
        assert not missed, f"nobody tried to read {missed}"

    def close(self) -> None:
        self._process.kill()
        self._process.wait(5)


def _try_to_read(path: str) -> bool:
    end = time.monotonic() + TRY_SECONDS
    while time.monotonic() < end:
        try:
            os.close(os.open(path, os.O_RDONLY))
        except OSError:
            continue
        return True
    return False


def watch() -> None:
    libc = ctypes.CDLL(None)
    notices = libc.inotify_init()
    folders = {libc.inotify_add_watch(notices, folder.encode(), IN_CREATE | IN_ATTRIB): folder
               for folder in sorted({os.path.dirname(path) for path in WATCHED})}
    assert -1 not in folders, "inotify"
    print("watching", flush=True)
    tried: set[str] = set()
    while True:
        ready, _, _ = select.select([notices, sys.stdin], [], [])
        if notices not in ready:
            if not sys.stdin.readline():
                break
            tried.clear()
            print("forgot", flush=True)
            continue
        data = os.read(notices, 1 << 16)
        while data:
            number, _, _, length = EVENT.unpack_from(data)
            name = data[EVENT.size:EVENT.size + length].rstrip(b"\0").decode()
            data = data[EVENT.size + length:]
            path = os.path.join(folders.get(number, "/"), name)
            if path in WATCHED:
                if _try_to_read(path):
                    print(f"read {path}", flush=True)
                tried.add(path)
    print("tried", *sorted(tried), flush=True)


if __name__ == "__main__":
    watch()
