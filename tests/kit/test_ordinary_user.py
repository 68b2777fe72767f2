"""tests/kit/test_ordinary_user.py: tools/sandbox started by somebody who is not root.

Who that is shows to it by `id -u`, and sudo is what it asks: both are stand-ins here, so that the tests
are the same for root, for whom there may be no sudo. Theirs goes to the real one where root is needed.
"""
import os
import shutil
from pathlib import Path

import pytest

from kit import NO_SANDBOX, sandbox
from path import programs, stand_in

# As sudo does it: with an environment of its own, which tells who asked.
AS_ROOT = """
printf '%s\\n' "$1" "$2" >"$(dirname "$0")/asked"
shift
exec {sudo} env -i -- PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root TERM="$TERM" SUDO_USER=alice \\
    SUDO_UID=1000 "$@"
"""


@pytest.fixture(name="bin_folder")
def fixture_bin_folder(tmp_path: Path) -> Path:
    """First in PATH."""
    folder = tmp_path / "bin"
    stand_in(folder, "id", "echo 1000")
    stand_in(folder, "sudo", AS_ROOT.format(sudo="" if os.getuid() == 0 else shutil.which("sudo")))
    return folder


def by_user(folder: Path, *words: str, **options: str) -> tuple[int, str, str]:
    ended = sandbox(*words, environment={"PATH": f"{folder}:{os.environ['PATH']}", **options})
    return ended.returncode, ended.stdout, ended.stderr


def test_command_runs_as_root_by_sudo(bin_folder: Path) -> None:
    status, output, errors = by_user(bin_folder, "--", "sh", "-c", """
        /usr/bin/id -u; pwd; privanectl user check root; exit 7""")

    assert (status, errors) == (7, "")
    assert output.splitlines()[:2] == ["0", os.getcwd()]
    assert (bin_folder / "asked").read_text().splitlines() == [
        "--", str(Path(__file__).parents[1] / "bus" / "sandbox.sh")]


def test_arguments_come_through_as_they_are(bin_folder: Path) -> None:
    words = ("two words", "", "*", "--", "$HOME", "line\nend")

    assert by_user(bin_folder, "--", "printf", "<%s>", *words) == (
        0, "".join(f"<{word}>" for word in words), "")


def test_environment_is_one_of_its_own(bin_folder: Path) -> None:
    status, output, _ = by_user(bin_folder, "--", "env", TERM="vt52", MINE="yes", LANG="C")
    variables = dict(line.split("=", 1) for line in output.splitlines())

    assert status == 0
    assert not [name for name in variables if name.startswith(("SUDO", "BUS_RING")) or name == "MINE"]
    assert variables["TERM"] == "vt52"
    assert variables["HOME"] == "/root" and variables["LANG"] == "C.UTF-8"
    assert variables["DBUS_SYSTEM_BUS_ADDRESS"] == "unix:path=/run/dbus/system_bus_socket"


def test_records_are_the_users(bin_folder: Path, tmp_path: Path) -> None:
    calls, log = tmp_path / "calls", tmp_path / "log"

    status, _, _ = by_user(bin_folder, f"--calls={calls}", f"--log={log}", "--", "privanectl", "reboot")

    assert status == 0
    assert calls.read_text() == "/sbin/sysflash reboot\n"
    assert {calls.stat().st_uid, log.stat().st_uid} == {os.getuid()}


def test_umask_of_the_user_shuts_nobody_out(bin_folder: Path) -> None:
    """sudo keeps it where it is the stricter one, and polkitd has a user of its own."""
    before = os.umask(0o077)
    try:
        assert by_user(bin_folder, "--", "sh", "-c", "umask") == (0, "0022\n", "")
    finally:
        os.umask(before)


def test_sudo_that_refuses(bin_folder: Path) -> None:
    """Its status is no status of the command's."""
    stand_in(bin_folder, "sudo", "echo 'sudo: a password is required' >&2; exit 1")

    assert by_user(bin_folder, "--", "true") == (
        NO_SANDBOX, "", "sudo: a password is required\n"
        "tools/sandbox: the sandbox ended before the command did, with status 1\n")


def test_machine_without_sudo(tmp_path: Path) -> None:
    folder = tmp_path / "all"
    folder.mkdir()
    path = programs(folder, without="sudo")
    stand_in(folder, "id", "echo 1000")
    ended = sandbox("--", "true", environment={"PATH": path})

    assert (ended.returncode, ended.stderr) == (
        NO_SANDBOX, "tools/sandbox: needs root for its namespaces, and there is no sudo\n")
