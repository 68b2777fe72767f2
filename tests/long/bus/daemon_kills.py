"""tests/long/bus/daemon_kills.py: proof: no kill of the service costs an account.

The service is killed right before each call on the file system that a change makes, on files in
three states, and at random moments under load. One point is one kill, judged, with the start after
it and the killed call made again. One in ten is a random one, and all that are left when every
boundary was struck.
"""
import random
from collections import Counter
from typing import Iterator

import pytest

from daemon_kill_points import CHANGES, LEFTOVERS, KillPoints, Point
from harness.accounts import AccountFiles
from harness.bus import Bus
from harness.fake_authz import FakeAuthz
from harness.service_fixtures import StartService
from harness.syslog_socket import SyslogSocket
from kill_load import KillLoad
from killed_service import REMOVALS, KilledService
from temporary_watch import TemporaryWatch

# The random kills begin so often with the files as they were at first.
KILLS_BETWEEN_FRESH = 20

# Of the random kills, those that leave calls unanswered. And kills until one came between the files
# of a change, however few are asked for.
LEAST_SHARE_UNDER_WAY = 0.5
MOST_KILLS_UNTIL_BETWEEN_FILES = 100


@pytest.fixture
def killed(start: StartService, bus: Bus, authz: FakeAuthz, syslog: SyslogSocket,
           accounts: AccountFiles) -> KilledService:
    return KilledService(start, bus, authz, syslog, accounts)


@pytest.fixture
def watch(killed: KilledService) -> Iterator[TemporaryWatch]:
    """Somebody else looks at every temporary file of a file that is not everybody's."""
    watching = TemporaryWatch()
    yield watching
    watching.close()


def chosen(points: list[Point], most: int, chance: random.Random) -> list[Point]:
    """All where there is room; else those around which a file changes, then every boundary in one
    of the states, then the others."""
    if len(points) <= most:
        return points
    chance.shuffle(points)
    seen: set[tuple[str, str, int]] = set()
    ranks = {}
    for point in points:
        boundary = (point.change, point.call, point.number)
        ranks[point] = 0 if point.changes_a_file and point.state == "clean" else (
            2 if boundary in seen else 1)
        seen.add(boundary)
    return sorted(points, key=lambda point: ranks[point])[:most]


def test_what_a_start_warns_of_is_a_known_leftover() -> None:
    """Which of the changes leave lines of an account that is gone."""
    assert {CHANGES[change][0] for change, lines in LEFTOVERS.items()
            if "still a line in shadow" in lines} == set(REMOVALS)


def test_kill_at_every_boundary(killed: KilledService, watch: TemporaryWatch, amount: int,
                                chance: random.Random, figures: Counter[str]) -> None:
    kills = KillPoints(killed)
    all_points = kills.all_points()
    points = chosen(all_points, amount - max(1, amount // 10), chance)
    left: dict[str, set[str]] = {}
    for point in points:
        leftovers = kills.strike(point)
        left.setdefault(point.change, set()).update(leftovers)
        figures["points"] += 1
        figures["max_exhaustive_points"] += 1
    assert points
    figures["max_boundary_points"] = len(all_points)
    for change, lines in left.items():
        assert lines <= LEFTOVERS.get(change, set()), (change, lines)
    if len(points) == len(all_points):
        assert left == {change: LEFTOVERS.get(change, set()) for change in left}
    watch.require_nothing_read()


def test_kill_at_random(killed: KilledService, watch: TemporaryWatch, amount: int,
                        chance: random.Random, figures: Counter[str]) -> None:
    load = KillLoad(killed, chance, figures)
    try:
        wanted = amount - figures["max_exhaustive_points"]
        while (kills := figures["random_kills"]) < wanted or (
                not figures["kills_between_files"] and kills < MOST_KILLS_UNTIL_BETWEEN_FILES):
            if kills % KILLS_BETWEEN_FRESH == 0:
                load.begin_afresh()
            load.strike()
            figures["points"] += 1
            figures["random_kills"] += 1
    finally:
        load.close()
    assert figures["calls"] > 0
    assert figures["kills_between_files"] > 0
    assert figures["kills_with_calls_under_way"] >= LEAST_SHARE_UNDER_WAY * kills
    watch.require_nothing_read()
