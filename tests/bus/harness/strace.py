"""tests/bus/harness/strace.py: the system calls of a run of the service."""
import re
from dataclasses import dataclass
from pathlib import Path

from harness import process

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
