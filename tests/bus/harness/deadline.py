"""tests/bus/harness/deadline.py: waiting for something to happen, but not for ever."""
import time
from typing import Callable, TypeVar

Result = TypeVar("Result")


def wait_for(what: str, condition: Callable[[], Result | None],
             seconds: float = 5.0) -> Result:
    """The first result of condition() that is true; fails the test when there is none in time."""
    end = time.monotonic() + seconds
    while True:
        result = condition()
        if result:
            return result
        if time.monotonic() > end:
            raise AssertionError(f"not within {seconds} s: {what}")
        time.sleep(0.005)
