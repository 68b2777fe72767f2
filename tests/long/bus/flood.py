"""tests/long/bus/flood.py: callers without an action try to exhaust memory, files or the loop.

    tests/long/on_bus flood --amount SECONDS --seed S --figures FILE

On a bus with the limits that dbus-daemon has by itself. Each kind of flood of harness/flooder.py,
with messages of up to 16 MB, goes on for so many seconds, from processes of a user whom the bus lets
call and who has no role, and from one whom it does not let call. polkit decides. Meanwhile and
afterwards root calls, who may. The service's memory stays bounded, its descriptors come back to what
they were, and root is answered again within two seconds of the flood's end; after floods of lists
later, as docs/reliability.md tells.
"""
import random
from collections import Counter

import pytest

from flooding import LISTS, check_bus_takes_no_larger_messages, flood, flooded, floods
from harness.bus import Bus
from harness.bus_limits import DEFAULTS, bus_limits
from harness.flooder import KINDS
from harness.service import Service

__all__ = ["flooded"]

# Processor seconds that the lists under way may still take the service and the bus: three times what
# they did. How long that is for who waits, depends on what else the machine does.
WORK_OF_LISTS = 75.0

# What the bus throws out for its size, flood_limited.py has.
TAKEN = [kind for kind in KINDS if kind != "too_large"]


def test_bus_has_its_defaults() -> None:
    assert bus_limits() == DEFAULTS
    check_bus_takes_no_larger_messages()


@pytest.mark.parametrize("kind", TAKEN)
def test_flood(request: pytest.FixtureRequest, kind: str, flooded: Service, bus: Bus, amount: int,
               chance: random.Random, figures: Counter, privane_gid: int) -> None:
    flood(kind, flooded, bus, amount, chance, figures, privane_gid,
          WORK_OF_LISTS if kind in LISTS else None)
    figures["seconds"] += amount / floods(request)  # all of them together are one amount
