"""tests/bus/test_privane_check_guard.py: where the account files cannot be judged, the guard lets no service
start that could lose accounts, and keeps none from telling why it does not start."""
import os
import re
import socket
import subprocess
from collections.abc import Callable, Iterator
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.checker import GOOD_GROUP, GOOD_PASSWD, LOSS, NOTHING, UNUSABLE, check, write
from harness.fake_authz import FakeAuthz
from harness.sandbox import fake_library
from harness.service_fixtures import StartService

IN_PASSWD = GOOD_PASSWD.replace(":x:", ":*:")
BIG = "big:x:70000:\n"
BIG_IS_LOST = ("/etc/group:3: loss: gid-out-of-range: 'big': a write drops the group: the GID 70000 is in "
               "no range of this device\n")
NOT_JUDGED = "loss: not-judged: what a write would drop cannot be told: "
REFUSAL = "The service is not started: "


@pytest.fixture(autouse=True)
def good_files(accounts: AccountFiles) -> None:
    write()


@pytest.fixture
def mounted_passwd(tmp_path: Path) -> Iterator[None]:
    over = tmp_path / "passwd"
    over.write_text(IN_PASSWD)
    subprocess.run(["mount", "--bind", over, PASSWD], check=True)
    yield
    subprocess.run(["umount", PASSWD], check=True)


def guard(**environment: str) -> tuple[int, str, bool]:
    """The status, what was told, and whether it said that the service is not started."""
    done = check("--guard", **environment)
    return done.returncode, done.stdout, done.stderr.startswith(REFUSAL)


ALLOWED = (NOTHING, "", False)


def lose_a_group(shadow: str | None = "") -> None:
    write(IN_PASSWD, shadow, GOOD_GROUP + BIG)


@pytest.mark.usefixtures("mounted_passwd")
def test_a_mount_point_hides_no_loss() -> None:
    """A group can be added, though no user can."""
    SHADOW.unlink()
    assert guard() == ALLOWED
    GROUP.write_text(GOOD_GROUP + BIG)
    assert guard() == (LOSS, BIG_IS_LOST, True)


def test_a_missing_shadow_file_hides_no_loss() -> None:
    lose_a_group(None)
    assert guard() == (LOSS, BIG_IS_LOST, True)


def test_a_shadow_link_to_nothing_hides_no_loss() -> None:
    lose_a_group(None)
    SHADOW.symlink_to("nowhere")
    told = guard()
    status = check().returncode
    SHADOW.unlink()
    assert told == (LOSS, BIG_IS_LOST, True)
    assert status == UNUSABLE


def make_folder(path: Path) -> None:
    path.mkdir()


def make_socket(path: Path) -> None:
    with socket.socket(socket.AF_UNIX) as bound:
        bound.bind(str(path))


def make_dangling_link(path: Path) -> None:
    path.symlink_to("nowhere")


def make_circle(path: Path) -> None:
    path.symlink_to(path.name)


def make_nothing(path: Path) -> None:
    pass


def remove(path: Path) -> None:
    if path.is_dir():
        path.rmdir()
    else:
        path.unlink(missing_ok=True)


NO_START = [(make, path) for path in (PASSWD, SHADOW, GROUP)
            for make in (make_folder, make_socket, make_circle, make_dangling_link, make_nothing)
            if path != SHADOW or make not in (make_dangling_link, make_nothing)]


@pytest.mark.parametrize(("make", "path"), NO_START)
def test_a_service_that_cannot_start_says_so_itself(make: Callable[[Path], None], path: Path,
                                                    start: StartService, authz: FakeAuthz) -> None:
    lose_a_group()
    path.unlink()
    make(path)
    told = guard()
    status = check().returncode
    service = start(environment=authz.environment())
    ended = service.wait()
    remove(path)
    assert told == ALLOWED
    assert status == UNUSABLE
    assert ended == 1
    assert re.search(f"could not (open {path.name} file|read '{path.name}' entry 0)",
                     service.output()[-1])


def make_pipe(path: Path) -> None:
    os.mkfifo(path)


def make_device(path: Path) -> None:
    """An empty file to who opens it."""
    path.symlink_to("/dev/null")


@pytest.mark.parametrize("make", (make_pipe, make_device))
@pytest.mark.parametrize("path", (PASSWD, SHADOW, GROUP))
def test_a_file_of_unknown_lines_lets_no_service_start(path: Path,
                                                       make: Callable[[Path], None]) -> None:
    path.unlink()
    make(path)
    told = guard()
    status = check().returncode
    path.unlink()
    assert told == (LOSS, f"{path}: {NOT_JUDGED}it cannot be read as a file\n", True)
    assert status == UNUSABLE


@pytest.mark.parametrize("call", ("open", "fopen"))
@pytest.mark.parametrize("path", (PASSWD, SHADOW, GROUP))
def test_a_read_that_fails_lets_no_service_start(path: Path, call: str) -> None:
    """open(2) reads the lines for the checker, fopen(3) for the service's own reading. Either may
    succeed when the service starts."""
    failing = {"LD_PRELOAD": str(fake_library("failing_read/libfailing_read.so")),
               "FAILING_CALL": call, "FAILING_FILE": str(path)}
    status, told, is_refused = guard(**failing)
    assert (status, is_refused) == (LOSS, True)
    place, _, cause = told.partition(f": {NOT_JUDGED}")
    assert place == (str(path) if call == "open" else "/etc/passwd")
    assert str(path) in cause and "Input/output error" in cause and cause.count("\n") == 1
    assert check(**failing).returncode == UNUSABLE
    assert guard() == ALLOWED
