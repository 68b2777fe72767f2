"""tests/bus/harness/fake_authz.py: the test's side of tests/fakes/authz, and what stands in its
place where our own library decides."""
from dataclasses import dataclass
from pathlib import Path

from harness.sandbox import fake_library

DOMAIN = "fake-authz"
CODE = 42

VARIABLE = "FAKE_AUTHZ_DIRECTORY"


@dataclass(frozen=True)
class Check:
    sender: str
    action: str


class OwnAuthz:
    """In the place of the fake: our own library, the installed one or another build of it."""

    def __init__(self, library: Path | None = None) -> None:
        self._library = library

    def environment(self) -> dict[str, str]:
        return {"LD_LIBRARY_PATH": str(self._library.parent)} if self._library else {}

    def forget(self) -> None:
        """It keeps no record."""


class FakeAuthz:
    """An authorization library that allows everything until told otherwise."""

    def __init__(self, directory: Path) -> None:
        self._directory = directory
        self._path = fake_library("authz/libauthz.so.1")
        self.allow()

    def environment(self) -> dict[str, str]:
        return {"LD_LIBRARY_PATH": str(self._path.parent),
                VARIABLE: str(self._directory)}

    @property
    def path(self) -> Path:
        """Of the library itself."""
        return self._path

    def _answer(self, verdict: str) -> None:
        new = self._directory / "verdict.new"
        new.write_bytes(verdict.encode(errors="surrogateescape"))
        new.rename(self._directory / "verdict")

    def allow(self) -> None:
        self._answer("allow")

    def refuse(self, text: str, domain: str = DOMAIN, code: int = CODE) -> None:
        self._answer(f"refuse\n{domain}\n{code}\n{text}")

    def refuse_silently(self) -> None:
        self._answer("refuse-silently")

    def fail_init(self, text: str) -> None:
        """text may hold bytes that are no UTF-8, as Python's surrogate escapes."""
        (self._directory / "init-error").write_bytes(text.encode(errors="surrogateescape"))

    def calls(self) -> list[str]:
        """All calls since the last forget(), as the fake recorded them."""
        record = self._directory / "calls"
        return record.read_text().splitlines() if record.exists() else []

    def checks(self) -> list[Check]:
        words = [call.split() for call in self.calls()]
        return [Check(*line[1:]) for line in words if line[0] == "check"]

    def forget(self) -> None:
        (self._directory / "calls").unlink(missing_ok=True)
