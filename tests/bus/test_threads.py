"""tests/bus/test_threads.py: the threads of the service are those that the architecture tells."""
import re
from pathlib import Path

from harness.bus import Bus
from harness.service import Service

DOCUMENT = Path(__file__).parents[2] / "docs" / "architecture.md"

# It ends when it has had nothing to do for a while.
FOR_A_WHILE = "pool"


def told() -> list[str]:
    section = DOCUMENT.read_text().partition("| thread of the service |")[2].partition("\n\n")[0]
    return re.findall(r"^\| `(\w+)` \|", section, re.MULTILINE)


def threads(service: Service) -> list[str]:
    return sorted(path.read_text().strip()
                  for path in Path(f"/proc/{service.pid}/task").glob("*/comm"))


def test_threads_are_told(real_service: Service, bus: Bus) -> None:
    bus.call("GetUserList")
    bus.call("RtspreadConfig")

    running = threads(real_service)
    assert len(told()) == 4 and FOR_A_WHILE in told()
    assert {*running, FOR_A_WHILE} == set(told())
    assert running.count("privane_system") == running.count("gdbus") == 1
