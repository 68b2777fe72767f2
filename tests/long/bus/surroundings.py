"""tests/long/bus/surroundings.py: what lies around the service, for proofs that nothing moved."""
from dataclasses import replace
from typing import Any

from harness.world import Neighbour, World, snapshot


def world(*neighbours: Neighbour) -> World:
    """Without the count of processes: polkitd and the proofs start some. In "/" and "/tmp" only
    names count: there the machine's own folders may be seen, in which others work."""
    seen = snapshot(*neighbours)
    names = {path: dict.fromkeys(seen.folders[path], (0, 0, 0)) for path in ("/", "/tmp")}
    return replace(seen, last_pid=0, folders=seen.folders | names)


def differences(before: World, after: World) -> list[Any]:
    """What is in one of them alone."""
    pairs = [(before.files, after.files), (before.signals, after.signals),
             *((before.folders[path], after.folders[path]) for path in before.folders)]
    return [set(old.items()) ^ set(new.items()) for old, new in pairs if old != new]
