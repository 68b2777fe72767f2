"""tests/long/bus/flood_limited.py: floods of what is large, on a bus with the limits of the example.

    tests/long/on_bus --bus=data/examples/privane-bus-limits.conf flood_limited \
        --amount SECONDS --seed S --figures FILE

As flood.py, the kinds of lists and of large messages: after all of them root is answered again
within two seconds, and what the service holds meanwhile follows from the limits.
"""
import random
from collections import Counter

import pytest

from flooding import LARGEST, LISTS, check_bus_takes_no_larger_messages, flood, flooded, floods
from harness.bus import Bus
from harness.bus_limits import DEFAULTS, bus_limits
from harness.service import Service

__all__ = ["flooded"]

KINDS = sorted({"large_calls", "too_large", *LISTS})


def test_bus_has_lower_limits() -> None:
    limits = bus_limits()
    assert all(limits[name] < size for name, size in DEFAULTS.items()), limits
    assert LARGEST == limits["max_message_size"]
    check_bus_takes_no_larger_messages()


@pytest.mark.parametrize("kind", KINDS)
def test_flood(request: pytest.FixtureRequest, kind: str, flooded: Service, bus: Bus, amount: int,
               chance: random.Random, figures: Counter, privane_gid: int) -> None:
    flood(kind, flooded, bus, amount, chance, figures, privane_gid)
    figures["seconds"] += amount / floods(request)  # all of them together are one amount
