"""device/camera/deadline.py: a point in time that waits share, so that none of them is for ever."""
import time

from .errors import CameraError


class Deadline:
    """Ends `seconds` from now; whoever waits asks for what is left, and fails when nothing is."""

    def __init__(self, seconds: float, what: str) -> None:
        self._end = time.monotonic() + seconds
        self._seconds = seconds
        self._what = what

    def left(self) -> float:
        left = self._end - time.monotonic()
        if left <= 0:
            raise self.missed()
        return left

    def missed(self) -> CameraError:
        return CameraError(f"{self._what} took longer than {self._seconds:g} s")
