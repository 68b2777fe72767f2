"""tests/bus/test_examples.py: the examples of the callers' guide, run against the service."""
import os
import shutil
import subprocess
from pathlib import Path
from typing import Iterator

import pytest

from document_blocks import block
from harness.accounts import AccountFiles
from harness.bus import Bus
from harness.deadline import wait_for
from harness.fake_authz import FakeAuthz
from harness.passwords import NEW, OLD, OLD_HASH
from harness.privanectl import Run, surroundings
from harness.service import Service

EXAMPLES = Path(__file__).parents[2] / "docs" / "examples" / "callers"
BUILT = Path(os.environ["BUS_RING_BUILD"]) / "docs" / "examples" / "callers"

CALLERS = {"C": [str(BUILT / "caller_c")], "C++": [str(BUILT / "caller_cpp")],
           "Python": ["/usr/bin/python3", str(EXAMPLES / "caller.py")]}

PASSWD = """\
root:x:0:0:root:/root:/bin/sh
alice:x:1000:100::/:/bin/false
"""
SHADOW = f"root:*:19000:0:99999:7:::\nalice:{OLD_HASH}:19000:0:99999:7:::\n"
GROUP = "root:x:0:\nusers:x:100:alice\n"


@pytest.fixture(params=CALLERS)
def caller(request: pytest.FixtureRequest) -> list[str]:
    return CALLERS[request.param]


@pytest.fixture
def camera(account_files: AccountFiles, digest_folder: None, start: object, authz: FakeAuthz,
           bus: Bus) -> Iterator[Service]:
    """The service with an account of its own that logs in over the web."""
    account_files.write(PASSWD, SHADOW, GROUP)
    service = start(environment=authz.environment())
    service.wait_registered(bus)
    yield service
    assert service.stop() == 0


@pytest.fixture
def digest_folder() -> Iterator[None]:
    """Where the web server's digest file goes; empty at the start and the end of the test."""
    folder = Path("/etc/apache2")
    folder.mkdir(exist_ok=True)
    file = folder / "digest_auth_passwd"
    file.unlink(missing_ok=True)
    yield
    file.unlink(missing_ok=True)


def run(caller: list[str], *words: str, stdin: str = "") -> Run:
    ended = subprocess.run([*caller, *words], input=stdin, capture_output=True, text=True,
                           env=surroundings(), timeout=60, check=False)
    return Run(ended.returncode, ended.stdout, ended.stderr)


def users_of(bus: Bus) -> list[str]:
    (users,) = bus.call("GetUserList")
    return users


def test_users_are_listed(caller: list[str], camera: Service, bus: Bus) -> None:
    assert run(caller, "list") == Run(0, "".join(f"{user}\n" for user in users_of(bus)), "")
    assert "alice" in users_of(bus)


def test_password_is_checked(caller: list[str], camera: Service) -> None:
    assert run(caller, "check", "alice", stdin=f"{OLD}\n") == Run(0, "right\n", "")
    assert run(caller, "check", "alice", stdin=f"{NEW}\n") == Run(0, "wrong\n", "")
    assert run(caller, "check", "nobody1", stdin=f"{NEW}\n") == Run(
        1, "", "Failed to locate user nobody1. (privaneSystemError 5)\n")


def test_user_is_added(caller: list[str], camera: Service, bus: Bus) -> None:
    assert run(caller, "add", "bob", "users", stdin=f"{NEW}\n") == Run(0, "added bob\n", "")
    assert bus.call("GetUser", "s", "bob")[:2] == (True, "users")
    assert run(caller, "check", "bob", stdin=f"{NEW}\n") == Run(0, "right\n", "")


def test_errors_are_told_apart(caller: list[str], camera: Service, authz: FakeAuthz) -> None:
    assert run(caller, "add", "alice", "users", stdin=f"{NEW}\n") == Run(
        1, "", "there is such an account already\n")
    assert run(caller, "add", "bob", "nothing", stdin=f"{NEW}\n") == Run(
        1, "", "Failed to add user 'bob', primary group 'nothing' does not exist (usermgmt 4)\n")
    authz.refuse("no", domain="authz", code=1)
    assert run(caller, "list") == Run(1, "", "not allowed: Authorization check failed: no\n")
    authz.refuse("no", domain="some-other domain", code=2)
    assert run(caller, "list") == Run(
        1, "", "Authorization check failed: no (some-other domain 2)\n")


def test_service_that_is_not_there_is_told(caller: list[str], bus: Bus) -> None:
    ended = run(caller, "list")

    assert (ended.status, ended.output) == (1, "")
    assert ended.errors.count("\n") == 1 and "com.zintor.PrivaneSystem" in ended.errors


def test_changes_are_watched(caller: list[str], camera: Service, bus: Bus,
                             tmp_path: Path) -> None:
    users = "".join(f"{user}\n" for user in users_of(bus))
    seen = tmp_path / "seen"
    with seen.open("w") as output:
        watching = subprocess.Popen([*caller, "watch"], stdout=output, env=surroundings())
    try:
        wait_for("the list", lambda: seen.read_text() == users, 20)
        bus.call("RemoveUser", "s", "alice")
        wait_for("the signal", lambda: seen.read_text() == users + "UserDatabaseUpdated\n", 20)
        bus.call("RtspreadConfig")
        wait_for("another", lambda: seen.read_text() == users + "UserDatabaseUpdated\n" * 2, 20)
        assert watching.poll() is None
    finally:
        watching.kill()
        watching.wait(5)


@pytest.mark.parametrize("words", [(), ("list", "more"), ("add", "bob"), ("fly",)])
def test_wrong_usage_is_told(words: tuple[str, ...], caller: list[str]) -> None:
    assert run(caller, *words) == Run(
        2, "", "usage: caller list | check USER | add USER GROUP | watch\n")


def test_guide_builds_them(tmp_path: Path, service: Service, bus: Bus) -> None:
    """With what is installed, and the files of the examples alone."""
    folder = shutil.copytree(EXAMPLES, tmp_path / "callers")
    commands = block("docs/callers.md", "cc -o caller_c") + block("docs/callers.md", "gdbus-codegen ")
    ended = subprocess.run(["bash", "-euc", commands], cwd=folder, text=True, check=False,
                           stdout=subprocess.PIPE, stderr=subprocess.STDOUT)

    assert (ended.returncode, ended.stdout) == (0, "")
    users = "".join(f"{user}\n" for user in users_of(bus))
    for program in ("caller_c", "caller_cpp"):
        assert run([str(folder / program)], "list") == Run(0, users, "")
