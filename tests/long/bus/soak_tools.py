"""tests/long/bus/soak_tools.py: tools that fail, die, take their time, hang or print 10 MB.

That they did is counted where it shows: that one ran by its own record, that it failed or printed
so much by what the service answered, and that it hung by what it leaves behind when it goes on.
"""
import random
import time
from collections import Counter
from typing import Any

from harness.bus import BusError
from harness.device import RUNNERS, Device
from harness.fake_folder import STAND_INS, StandInTool

TOOLS = tuple((member, arguments) for member, (_, arguments) in RUNNERS.items())
PATHS = tuple(tool for tool, _ in RUNNERS.values())

TEN_MEGABYTES = b"x" * (10 << 20)
COMPLAINT = "the tool complains\n"
FAILURES = ("netstat call failed with code: ", "Failed to notify time sync.")

MANNERS = (":", ":", "sleep 0.05", "sleep 0.3", "kill -9 $PPID", "kill -15 $PPID")

GONE_ON = STAND_INS / "gone-on"


def seen_in(answer: Any) -> Counter[str]:
    """What the answer to a call that runs a tool tells of it."""
    if isinstance(answer, BusError):
        return Counter(tools_failed=int(answer.text.startswith(FAILURES)))
    # NotifyTimeSync tells nothing, Reboot the wait status, and the others a text.
    (told,) = answer or ("",)
    is_failure = told == COMPLAINT or isinstance(told, int) and told != 0
    is_large = isinstance(told, str) and len(told) == len(TEN_MEGABYTES)
    return Counter(tools_failed=int(is_failure), tools_printed_10_mb=int(is_large))


class SoakTools:
    """The stand-ins of a device, of which the service runs one at a time."""

    def __init__(self, device: Device, chance: random.Random) -> None:
        self._tools = {path: device.tools[path] for path in PATHS}
        self._chance = chance
        self._hung: tuple[StandInTool, float] | None = None
        self.counts: Counter[str] = Counter()
        for tool in self._tools.values():
            tool.print_error(COMPLAINT)

    def take_up_manners(self) -> None:
        """Others than before, or so it may be."""
        for tool in self._tools.values():
            tool.before_answering(self._chance.choice(MANNERS))
            tool.exit_with(self._chance.choice((0, 0, 1, 77)))
            tool.print(self._chance.choice((b"", b"out\n", b"\xff\xfe", TEN_MEGABYTES)))

    def note_runs(self) -> None:
        """To be called before the records are forgotten."""
        self.counts["tools_run"] += sum(len(tool.calls()) for tool in self._tools.values())

    def hang(self, seconds: float) -> tuple[str, tuple[Any, ...]]:
        """The next run of one of them hangs for so long, and only that; a call that runs it."""
        GONE_ON.unlink(missing_ok=True)
        index = self._chance.randrange(len(PATHS))
        tool = self._tools[PATHS[index]]
        self.note_runs()
        tool.forget()
        tool.before_answering(f'rm -- "$0"\nsleep {seconds}\n: >{GONE_ON}')
        self._hung = tool, seconds
        return TOOLS[index]

    @property
    def awaits_hang(self) -> bool:
        """Whether that has not been counted yet."""
        return self._hung is not None

    def is_hanging(self) -> bool:
        """Whether it is still to hang, or does. When it does no more, that is counted."""
        if self._hung is None:
            return False
        if not GONE_ON.exists():
            return True
        tool, seconds = self._hung
        hung = time.monotonic() - tool.calls()[0].time / 1e9
        assert hung >= seconds, (hung, seconds)
        self.counts["tools_hung"] += 1
        self.counts["max_hang_seconds"] = max(self.counts["max_hang_seconds"], int(seconds))
        self._hung = None
        return False
