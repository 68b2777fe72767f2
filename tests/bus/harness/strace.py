"""tests/bus/harness/strace.py: the system calls of a run of the service."""
import re
import signal
import subprocess
from dataclasses import dataclass
from pathlib import Path

from harness import process
from harness.deadline import wait_for

LINE = re.compile(r"(?P<pid>\d+) +(?P<name>\w+)\((?P<rest>.*)")


@dataclass(frozen=True)
class SystemCall:
    """A call of one thread: its name, and its arguments and result as strace prints them."""

    pid: int
    name: str
    rest: str


class Trace:
    """Use wrapper in front of the binary; the service stays the direct child of who starts it."""

    def __init__(self, file: Path, calls: str, paths: tuple[str, ...] = ()) -> None:
        self._file = file
        self._others = process.children()
        self.wrapper = ["strace", "-D", "-f", "-qq", "-s", "256", "-o", str(file),
                        "-e", f"trace={calls}", *(word for path in paths for word in ("-P", path))]

    def wait_complete(self) -> None:
        """Waits for the tracer, which ends after all that it traces and is then our orphan."""
        for tracer in process.children() - self._others:
            if process.name(tracer) == "strace":
                assert process.wait_for_child(tracer, 5) == 0

    def calls(self) -> list[SystemCall]:
        """In their order; of a call that another thread interrupted, the first half."""
        self.wait_complete()
        return [SystemCall(int(match["pid"]), match["name"], match["rest"])
                for match in map(LINE.match, self._file.read_text().splitlines()) if match]


class Attached:
    """A tracer of a service that runs already; a context manager. inject is a clause of strace's,
    such as "socket:error=EMFILE": the calls that it names are not made."""

    def __init__(self, pid: int, file: Path, calls: str, inject: str = "") -> None:
        self._pid = pid
        self._file = file
        self._command = ["strace", "-f", "-qq", "-s", "256", "-p", str(pid), "-o", str(file),
                         "-e", f"trace={calls}", *(["-e", f"inject={inject}"] if inject else [])]

    def __enter__(self) -> "Attached":
        self._tracer = subprocess.Popen(self._command)
        wait_for("strace to attach", self._is_attached)
        return self

    def __exit__(self, *_: object) -> None:
        self._tracer.send_signal(signal.SIGINT)
        self._tracer.wait(5)

    def _is_attached(self) -> bool:
        assert self._tracer.poll() is None, "strace cannot attach"
        tasks = Path(f"/proc/{self._pid}/task").iterdir()
        return all(process.status(int(task.name))["TracerPid"] == str(self._tracer.pid)
                   for task in tasks)

    def calls(self) -> list[str]:
        """What strace printed, after its end, a line for each call without the process's number;
        runs of blanks are one."""
        return [re.sub(r" +", " ", line.split(maxsplit=1)[1])
                for line in self._file.read_text().splitlines()]
