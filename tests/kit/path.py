"""tests/kit/path.py: folders of programs for a PATH of a test's own."""
import os
from pathlib import Path


def programs(folder: Path, without: str = "") -> str:
    """A PATH of this machine's programs but one."""
    for place in ("/usr/local/bin", "/usr/local/sbin", "/usr/bin", "/usr/sbin", "/bin", "/sbin"):
        for name in os.listdir(place):
            if name != without and not os.path.lexists(folder / name):
                (folder / name).symlink_to(Path(place) / name)
    return str(folder)


def stand_in(folder: Path, name: str, script: str) -> None:
    """A shell script in the place of a program, where folder comes first in PATH."""
    folder.mkdir(exist_ok=True)
    (folder / name).unlink(missing_ok=True)
    (folder / name).write_text(f"#!/bin/bash\n{script}\n")
    (folder / name).chmod(0o755)
