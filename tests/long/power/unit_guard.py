"""tests/long/power/unit_guard.py: whether the service's unit would start it with the account files
that are left."""
import subprocess
import tempfile
from pathlib import Path

from recorded_run import Version

ACCOUNT_FILES = ("passwd", "shadow", "group")
CHECK_SECONDS = 60


class UnitGuard:
    """Asks the checker for each contents once."""

    def __init__(self, program: Path, folder: Path) -> None:
        self._program = program
        self._folder = folder
        self._known: dict[tuple[tuple[str, bytes], ...], list[str]] = {}

    def faults(self, left: Version, temporaries: dict[str, bytes]) -> list[str]:
        """Why the unit would not start the service; nothing when it would."""
        files = {name: file[3] for name in ACCOUNT_FILES if (file := left[name]) is not None}
        contents = (*files.items(), *sorted(temporaries.items()))
        if contents not in self._known:
            self._known[contents] = self._ask(contents)
        return self._known[contents]

    def _ask(self, contents: tuple[tuple[str, bytes], ...]) -> list[str]:
        with tempfile.TemporaryDirectory(dir=self._folder) as root:
            (Path(root) / "etc").mkdir()
            for name, content in contents:
                (Path(root) / "etc" / name).write_bytes(content)
            done = subprocess.run([self._program, "--guard", f"--root={root}"],
                                  stdin=subprocess.DEVNULL, capture_output=True, text=True,
                                  timeout=CHECK_SECONDS, check=False)
        if done.returncode == 0:
            return []
        return [f"the unit would not start the service: status {done.returncode}: "
                f"{(done.stdout + done.stderr)[:300].strip()}"]
