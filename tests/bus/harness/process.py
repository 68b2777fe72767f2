"""tests/bus/harness/process.py: what /proc tells about processes, and orphans that come to us."""
import ctypes
import os
import signal
import time
from pathlib import Path

PR_SET_CHILD_SUBREAPER = 36


def adopt_orphans() -> None:
    """From now on, what a child of ours leaves behind becomes our child: its status can be had."""
    libc = ctypes.CDLL(None, use_errno=True)
    if libc.prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0) != 0:
        raise OSError(ctypes.get_errno(), "prctl(PR_SET_CHILD_SUBREAPER)")


def status(pid: int) -> dict[str, str]:
    """The fields of /proc/PID/status."""
    lines = Path(f"/proc/{pid}/status").read_text().splitlines()
    return {name: value.strip() for name, value in (line.split(":", 1) for line in lines)}


def children(pid: int | str = "self") -> set[int]:
    """The direct children, those that have ended and not been waited for included."""
    tasks = Path(f"/proc/{pid}/task")
    return {int(child) for task in tasks.iterdir()
            for child in (task / "children").read_text().split()}


def name(pid: int) -> str:
    return Path(f"/proc/{pid}/comm").read_text().strip()


def task_count(pid: int) -> int:
    return len(os.listdir(f"/proc/{pid}/task"))


def processor_seconds(pid: int) -> float:
    """Of all threads, ended ones too, by the process's own clock (clock_getcpuclockid(3))."""
    return time.clock_gettime((~pid << 3) | 2)


def ignores(pid: int, number: signal.Signals) -> bool:
    return bool(int(status(pid)["SigIgn"], 16) & (1 << (number - 1)))


def pending(pid: int) -> set[int]:
    """The signals that a process was sent and has not taken."""
    fields = status(pid)
    mask = int(fields["SigPnd"], 16) | int(fields["ShdPnd"], 16)
    return {number for number in range(1, 65) if mask & (1 << (number - 1))}


def wait_for_child(pid: int, seconds: float) -> int | None:
    """The exit status of a child (negative: the signal that ended it); None when it still runs."""
    end = time.monotonic() + seconds
    while True:
        done, raw = os.waitpid(pid, os.WNOHANG)
        if done == pid:
            return os.waitstatus_to_exitcode(raw)
        if time.monotonic() > end:
            return None
        time.sleep(0.002)


def end(pid: int) -> None:
    """Kills a child."""
    os.kill(pid, signal.SIGKILL)
    assert wait_for_child(pid, 5) == -signal.SIGKILL
