"""tests/long/process_groups.py: commands that end with all they started, in time or when told."""
import os
import select
import signal
import subprocess
import threading
import time
from collections.abc import Sequence
from pathlib import Path
from typing import IO

# To remove temporary files in, after SIGTERM and before SIGKILL.
LAST_SECONDS = 5


class Stopped(Exception):
    """The command did not come to an end of its own, since everything is to end."""


class ProcessGroups:
    """Commands may run on several threads. Each has a session of its own, so that neither the
    terminal's signals reach it nor its own ones others; a group is killed before its leader is
    waited for, so that its number still is its own."""

    def __init__(self) -> None:
        self._lock = threading.Lock()
        self._live: set[subprocess.Popen[bytes]] = set()
        self._stopped = False

    def run(self, command: Sequence[str], folder: Path, output: IO[bytes],
            seconds: float | None = None) -> int | None:
        """The exit status; None when the time was over. What the command left running is killed."""
        with self._lock:
            if self._stopped:
                raise Stopped
            process = subprocess.Popen(command, cwd=folder, stdin=subprocess.DEVNULL,
                                       stdout=output, stderr=subprocess.STDOUT,
                                       start_new_session=True)
            self._live.add(process)
        in_time = False
        try:
            in_time = _ends_within(process, seconds)
        finally:
            with self._lock:
                self._live.remove(process)
                _end({process}, 0 if in_time else LAST_SECONDS)
                status = process.wait()
        if self._stopped:
            raise Stopped
        return status if in_time else None

    def stop(self) -> None:
        """Ends whatever runs, and lets nothing start any more."""
        with self._lock:
            self._stopped = True
            _end(self._live, LAST_SECONDS)


def _ends_within(process: subprocess.Popen[bytes], seconds: float | None) -> bool:
    """Leaves the process to be waited for."""
    descriptor = os.pidfd_open(process.pid)
    try:
        poller = select.poll()
        poller.register(descriptor, select.POLLIN)
        return bool(poller.poll(None if seconds is None else max(seconds, 0) * 1000))
    finally:
        os.close(descriptor)


def _end(processes: set[subprocess.Popen[bytes]], seconds: float) -> None:
    """Nothing of the groups runs on; those with time left are asked first."""
    if seconds:
        _signal(processes, signal.SIGTERM)
        until = time.monotonic() + seconds
        for process in processes:
            _ends_within(process, until - time.monotonic())
    _signal(processes, signal.SIGKILL)


def _signal(processes: set[subprocess.Popen[bytes]], number: signal.Signals) -> None:
    for process in processes:
        try:
            os.killpg(process.pid, number)
        except PermissionError:
            pass  # all that is left of the group is root's, and this is not
