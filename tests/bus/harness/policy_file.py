"""tests/bus/harness/policy_file.py: the file by which the libauthz without polkit decides."""
from contextlib import contextmanager
from pathlib import Path
from typing import Iterator

from harness.accounts import replace

POLICY = Path("/etc/privane/authz.conf")
EXAMPLE = Path("/usr/share/doc/privane-system/examples/privane-authz-roles.conf")


def role(name: str, *lines: str) -> str:
    return "\n".join((f"[role {name}]", *lines, ""))


@contextmanager
def policy(text: str, mode: int = 0o644) -> Iterator[None]:
    """Another file meanwhile, beside the role of root that is packaged."""
    packaged = POLICY.read_text()
    replace(POLICY, packaged + text, mode, 0)
    try:
        yield
    finally:
        replace(POLICY, packaged, 0o644, 0)


class ExamplePolicy:
    """The packaged example in the file's place."""

    def __init__(self) -> None:
        self._packaged = POLICY.read_text()

    def install(self) -> None:
        replace(POLICY, EXAMPLE.read_text(), 0o644, 0)

    def remove(self) -> None:
        replace(POLICY, self._packaged, 0o644, 0)
