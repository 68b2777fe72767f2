"""device/camera/transcript.py: runs commands in the camera as a transcript that a person can
follow, and fails where an answer is not the one it should be."""
import shlex
import textwrap
from collections.abc import Callable, Sequence

from .errors import CameraError
from .machine import Camera
from .root_shell import Result

WIDTH = 100


def sync_journal(camera: Camera) -> None:
    """Waits until the journal holds what was logged so far; its daemon may just be starting."""
    camera.run("for try in {1..50}; do journalctl --sync && exit; sleep 0.2; done; exit 1").check()


class Transcript:
    """Numbered chapters of steps; `write` gets pieces of whole lines."""

    def __init__(self, camera: Camera, write: Callable[[str], object], bold: bool) -> None:
        self.camera = camera
        self._write = write
        self._bold = bold
        self._chapters = 0

    def chapter(self, title: str) -> None:
        self._chapters += 1
        heading = f"{self._chapters}. {title}"
        underline = "=" * len(heading)
        self._write(f"\n\033[1m{heading}\033[0m\n" if self._bold else f"\n{heading}\n{underline}\n")

    def step(self, command: str | Sequence[str], *, user: str = "root", status: int = 0,
             shows: Sequence[str] = (), says: str) -> Result:
        """Runs a command as a user, prints it all, checks its status and what it must show."""
        command = command if isinstance(command, str) else shlex.join(command)
        self._write(f"\n{user}@camera{'#' if user == 'root' else '$'} {_on_lines(command)}\n")
        result = self.camera.run(command, user=user)
        answer = result.out + result.err
        for line in answer.rstrip().splitlines():
            self._write(textwrap.fill(line, WIDTH, subsequent_indent="  ", break_long_words=False,
                                      break_on_hyphens=False) + "\n")
        self._write(f"  -> {says}\n")
        self.expect(result.status == status, result, f"status {status}, not {result.status}")
        for text in shows:
            self.expect(text in answer, result, f"an answer with {text!r}")
        return result

    @staticmethod
    def expect(holds: bool, result: Result, what: str) -> None:
        if not holds:
            raise CameraError(f"the tour stops: this should have given {what}:\n  {result.command}")


def _on_lines(command: str) -> str:
    """Of a long command the rest from its option -m on, in a call of the service the method, is easier
    to read on a line of its own."""
    return command if len(command) < WIDTH else command.replace(" -m ", " \\\n    -m ", 1)
