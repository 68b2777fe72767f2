"""tests/device/journal.py: what the service wrote to the camera's journal."""
import json

from camera.machine import Camera
from camera.tour import sync_journal

Record = tuple[int, str]  # priority and text


def records(camera: Camera, *matches: str) -> list[Record]:
    """The records with these journal fields that the service's own process wrote, oldest first."""
    sync_journal(camera)
    shown = camera.run(["journalctl", "-o", "json", "_COMM=privane_system", *matches]).check().out
    entries = [json.loads(line) for line in shown.splitlines()]
    return [(int(entry["PRIORITY"]), entry["MESSAGE"]) for entry in entries]


def started(name: str, path: str) -> list[Record]:
    """What the service says when it starts."""
    return [(5, "message: Initializing user management library"),
            (5, "message: Starting privane_system"),
            (5, f"message: Policy Server now registered with the name '{name}' "
                f"and object '{path}'")]
