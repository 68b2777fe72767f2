"""tests/bus/test_reference.py: the installed reference of the interface, and its examples, run."""
import re
import shlex
import subprocess
from pathlib import Path

import pytest

from harness.fake_authz import FakeAuthz
from harness.interface import METHODS
from harness.privanectl import surroundings
from harness.service import Service

MANUAL = Path("/usr/share/man/man5/com.zintor.PrivaneSystem.5")
SERVICE = Path("/usr/share/man/man8/privane_system.8")
PAGE = Path("/usr/share/doc/privane-system/com.zintor.PrivaneSystem.html")


def examples() -> dict[str, str]:
    """Of each method the command that the manual shows."""
    text = MANUAL.read_text().replace("\\-", "-").replace("\\(aq", "'").replace("\\e", "\\")
    return {shlex.split(command)[5]: command
            for command in re.findall(r"^busctl call .*$", text, re.MULTILINE)}


def test_every_method_has_an_example() -> None:
    assert list(examples()) == [method.member for method in METHODS]


@pytest.mark.parametrize("method", METHODS, ids=lambda method: method.member)
def test_example_calls_its_method(method: object, authz: FakeAuthz, service: Service) -> None:
    """The arguments have the types of the method: else the call would not get as far."""
    authz.refuse("not for you")
    authz.forget()

    ended = subprocess.run(shlex.split(examples()[method.member]), capture_output=True, text=True,
                           env=surroundings(), check=False)

    assert (ended.returncode, ended.stdout) == (1, "")
    assert ended.stderr == "Call failed: Authorization check failed: not for you\n"
    (check,) = authz.checks()
    assert check.action.split(".")[:4] == method.action_id.split(".")[:4]


@pytest.mark.parametrize("page", [MANUAL, SERVICE], ids=lambda page: page.name)
@pytest.mark.parametrize("command", [("groff", "-ww", "-man", "-Tutf8", "-z"),
                                     ("man", "--warnings", "-l")], ids=lambda words: words[0])
def test_manual_is_set_without_a_warning(command: tuple[str, ...], page: Path) -> None:
    ended = subprocess.run([*command, str(page)], capture_output=True,
                           env=surroundings(MANWIDTH="100", LC_ALL="C.UTF-8"), check=False)

    assert (ended.returncode, ended.stderr) == (0, b"")


def test_page_is_installed() -> None:
    assert all(f'<h3 id="{method.member}">' in PAGE.read_text() for method in METHODS)
