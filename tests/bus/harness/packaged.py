"""tests/bus/harness/packaged.py: how the packaged unit starts the service."""
from pathlib import Path

UNIT = Path("/usr/lib/systemd/system/privane-system.service")


def environment() -> dict[str, str]:
    """The variables that the installed unit sets."""
    lines = UNIT.read_text().splitlines()
    settings = [line.removeprefix("Environment=") for line in lines
                if line.startswith("Environment=")]
    found = dict(word.split("=", 1) for setting in settings for word in setting.split())
    assert "GLIBC_TUNABLES" in found, found
    return found
