"""tests/long/power/test_unit_guard.py: the checker is asked of what is left, temporary files and all."""
from pathlib import Path

import pytest
from recorded_run import Version
from unit_guard import UnitGuard

BUILD = Path(__file__).resolve().parents[3] / "build"

ROOT, ANNA = "root:x:0:0::/root:/bin/sh\n", "anna:x:1000:0::/:/bin/sh\n"
ROOT_SHADOW, ANNA_SHADOW = "root:$5$r:20000::::::\n", "anna:$5$a:20000::::::\n"


LEFT: Version = {name: (0o600, 0, 0, text.encode()) for name, text in (
    ("passwd", ROOT + ANNA), ("shadow", ROOT_SHADOW), ("group", "root:x:0:\n"))}


@pytest.fixture
def guard(tmp_path: Path) -> UnitGuard:
    return UnitGuard(BUILD / "check/privane-check", tmp_path)


def test_an_account_in_part_is_one_that_is_just_made(guard: UnitGuard) -> None:
    temporaries = {"shadow.tmp": (ROOT_SHADOW + ANNA_SHADOW).encode(), "group.tmp": b"root:x:0:anna\n"}
    assert guard.faults(LEFT, temporaries) == []
    (fault,) = guard.faults(LEFT, {})
    assert fault.startswith("the unit would not start the service: status 3: ")
    assert "no-shadow-line: 'anna'" in fault
    assert guard.faults(LEFT, {}) == [fault]
    assert guard.faults(LEFT, temporaries) == []
