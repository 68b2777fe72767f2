"""tests/long/bus/effects_trace.py: the system calls of the service by which work may show: all but
those that are known to be harmless."""
import os
import re
import signal
from pathlib import Path

from harness.deadline import wait_for
from harness.strace import Attached

# What leaves nothing behind: reading from descriptors that are open, memory, time, waiting, and
# questions about files and about the process. Of everything else the tracer tells, calls included
# that did not exist when this was written: strace names those by their numbers.
HARMLESS = ("read", "recvmsg", "recvfrom", "?poll", "ppoll", "?epoll_wait", "epoll_pwait",
            "?select", "pselect6", "futex", "sched_yield", "restart_syscall", "nanosleep",
            "clock_nanosleep", "clock_gettime", "gettimeofday", "?time", "getpid", "gettid",
            "getppid", "getuid",
            "geteuid", "getgid", "getegid", "uname", "sysinfo", "getrandom", "getrusage", "brk",
            "mmap", "munmap", "mremap", "mprotect", "madvise", "close", "lseek", "fstat", "?stat",
            "?lstat", "newfstatat", "?access", "faccessat", "?faccessat2", "?readlink",
            "readlinkat", "statx", "statfs", "fstatfs", "getsockname", "getpeername", "getsockopt",
            "rt_sigprocmask", "rt_sigaction", "rt_sigreturn", "rt_sigpending", "rt_sigtimedwait",
            "sigaltstack", "set_robust_list", "?rseq", "sched_getaffinity", "sched_getattr",
            "eventfd2", "exit", "exit_group")

# The service ignores it, and strace tells of it.
MARK = signal.SIGURG
# Other proofs may keep the machine busy.
MARK_SECONDS = 30.0

# A thread of GLib's, and the wake-up of a loop in another thread.
THREAD = re.compile(r"clone3?\(.*CLONE_THREAD")
WAKE_UP = re.compile(r'write\(\d+, "\\1\\0\\0\\0\\0\\0\\0\\0", 8[) ]')
# What GLib does with each of its threads.
THREAD_NAME = re.compile(r"prctl\(PR_SET_NAME, ")
LOG_LINE = re.compile(r'write\(1, "warning: Authorization check failed: ')
RESUMED = re.compile(r"<\.\.\. \w+ resumed>")


class EffectsTrace(Attached):
    """A tracer that can be asked what was done since it was last asked."""

    def __init__(self, pid: int, file: Path) -> None:
        super().__init__(pid, file, "!" + ",".join(HARMLESS))
        self._service = pid
        self._output = file
        self._sockets = sockets_of(pid)
        self._read = 0
        self.calls_seen = 0

    def since_last(self) -> list[str]:
        """What was begun up to now."""
        os.kill(self._service, MARK)
        wait_for("the mark in the trace", self._is_marked, MARK_SECONDS)
        with self._output.open("rb") as trace:
            trace.seek(self._read)
            lines = trace.read().splitlines(keepends=True)
        if not lines[-1].endswith(b"\n"):  # strace is still at it
            lines.pop()
        self._read += sum(map(len, lines))
        calls = [re.sub(r" +", " ", line.split(maxsplit=1)[1])
                 for line in b"".join(lines).decode(errors="backslashreplace").splitlines()]
        self.calls_seen += len(calls)
        return calls

    def _is_marked(self) -> bool:
        with self._output.open() as trace:
            trace.seek(self._read)
            return f"--- {MARK.name} " in trace.read()

    def effects(self) -> list[str]:
        """What is no talk with the bus over the connections that the service had at the start, no
        log line of a refusal and no thread."""
        return [call for call in self.since_last() if not self._is_harmless(call)]

    def _is_harmless(self, call: str) -> bool:
        if call.startswith(("---", "+++")) or RESUMED.match(call):
            return True
        if match := re.match(r"send(to|msg|mmsg)\((\d+),", call):
            return int(match[2]) in self._sockets
        return any(pattern.match(call) for pattern in (THREAD, THREAD_NAME, WAKE_UP, LOG_LINE))


def sockets_of(pid: int) -> set[int]:
    """The descriptors that are sockets."""
    folder = Path(f"/proc/{pid}/fd")
    return {int(entry.name) for entry in folder.iterdir()
            if os.readlink(entry).startswith("socket:")}
