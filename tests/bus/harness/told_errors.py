"""tests/bus/harness/told_errors.py: no test gets an error that the interface document does not tell."""
import re
import sys
from pathlib import Path
from typing import Any, Callable, Iterator

import pytest

from harness.bus import INTERFACE, Bus, BusError, User
from harness.stage import Effects, Stage

sys.path.append(str(Path(__file__).resolve().parents[3] / "tools"))

from reference.interface import read_interface  # noqa: E402 (found by the line above)

DOCUMENT = Path("/usr/share/dbus-1/interfaces") / f"{INTERFACE}.xml"

OWN_NAME = re.compile(r"org\.gtk\.GDBus\.UnmappedGError\.Quark\._(\w+)\.Code(\d+)")

# A refusal without a reason.
OF_ANY_METHOD = ("privaneSystemError", 25)

# Of these a method may give other codes than it names, by what the kernel said.
OF_GLIB = ("g-file-error-quark", "g-exec-error-quark")


def decoded(name: str) -> tuple[str, int] | None:
    """Domain and code; None for an error of the bus or of GDBus."""
    match = OWN_NAME.fullmatch(name)
    if match is None:
        return None
    return re.sub("_(..)", lambda found: chr(int(found[1], 16)), match[1]), int(match[2])


class ToldErrors:
    """What the document tells of each method."""

    def __init__(self) -> None:
        self._told = {method.name: {(failure.domain, failure.code) for failure in method.failures}
                      for method in read_interface(DOCUMENT).methods}
        self._domains = {domain for told in self._told.values() for domain, _ in told}

    def allow(self, member: str, name: str) -> bool:
        """Every other domain is one that a test put there."""
        error = decoded(name)
        if error is None or error[0] not in self._domains or member not in self._told:
            return True
        told = self._told[member] | {OF_ANY_METHOD}
        return error in told or (error[0] in OF_GLIB and error[0] in {name for name, _ in told})


@pytest.fixture(scope="session")
def told_errors() -> ToldErrors:
    return ToldErrors()


@pytest.fixture(autouse=True)
def errors_are_told(told_errors: ToldErrors, monkeypatch: pytest.MonkeyPatch) -> Iterator[None]:
    """Of what Bus, User and Stage call."""
    untold: set[tuple[str, str]] = set()

    def look(member: str, answer: object) -> None:
        if isinstance(answer, BusError) and not told_errors.allow(member, answer.name):
            untold.add((member, answer.name))

    def watched(call: Callable[..., Any]) -> Callable[..., Any]:
        def watch(self: Any, member: str, *arguments: Any, **options: Any) -> Any:
            try:
                result = call(self, member, *arguments, **options)
            except BusError as error:
                look(member, error)
                raise
            look(member, result.answer if isinstance(result, Effects) else None)
            return result
        return watch
    for caller in (Bus, User, Stage):
        monkeypatch.setattr(caller, "call", watched(caller.call))
    yield
    assert untold == set(), "the interface document does not tell these errors"
