"""tests/packages/test_install_dependencies.py: tools/install_dependencies before an apt of the test's own.

Nobody is root here, and what is asked of sudo stays in a record, but for apt-get itself.
"""
import os
import pty
import re
import select
import subprocess
from pathlib import Path

import pytest
from conftest import TREE

COMMAND = [TREE / "tools" / "install_dependencies", "build"]

SUDO = """
echo "$*" >>"$record"
case $1 in
    env) exec "$@" ;;
    tee) exec cat >/dev/null ;;
esac"""

# On a terminal it says more, as the real one does.
APT_GET = """
[ ! -t 1 ] || echo "progress of $*"
echo "some words of apt"
exit 0"""

UPDATE = "Updating the lists of Debian packages"
INSTALL = "Installing them"

BY_HAND = "as root: apt-get update && apt-get install --no-install-recommends "


class Machine:
    """One that lacks every package."""

    def __init__(self, folder: Path) -> None:
        self._folder = folder
        self.record = folder / "record"
        self.record.touch()
        self.stand_in("dpkg-query", "exit 1")
        self.stand_in("id", "echo 1000")
        self.stand_in("sudo", SUDO)
        self.stand_in("apt-get", APT_GET)
        self.environment = {**os.environ, "PATH": f"{folder}:{os.environ['PATH']}",
                            "record": str(self.record), "TMPDIR": str(folder)}

    def stand_in(self, name: str, script: str) -> None:
        (self._folder / name).write_text(f"#!/bin/bash\n{script}\n")
        (self._folder / name).chmod(0o755)

    def install(self) -> "subprocess.CompletedProcess[str]":
        return subprocess.run(COMMAND, env=self.environment, capture_output=True, text=True,
                              timeout=60, check=False)

    def install_on_terminal(self) -> tuple[int, str]:
        """The status, and what is seen there."""
        ours, theirs = pty.openpty()
        seen = b""
        with subprocess.Popen(COMMAND, env=self.environment, stdin=theirs, stdout=theirs,
                              stderr=theirs) as started:
            # Our own end of theirs stays open: what is on the way is not lost when it ends.
            while started.poll() is None or select.select([ours], [], [], 0.1)[0]:
                if select.select([ours], [], [], 0.1)[0]:
                    seen += os.read(ours, 4096)
            status = started.returncode
        os.close(theirs)
        os.close(ours)
        return status, seen.decode().replace("\r\n", "\n")

    def leftovers(self) -> set[str]:
        return set(os.listdir(self._folder)) - {"record", "dpkg-query", "id", "sudo", "apt-get"}


@pytest.fixture(name="machine")
def fixture_machine(tmp_path: Path) -> Machine:
    return Machine(tmp_path)


def fail_with(words: str, at: str = "update") -> str:
    """An apt-get that says so on standard error, in one of its steps."""
    return f"""
        case "$*" in *{at}*) echo "E: {words}" >&2; exit 100 ;; esac
        {APT_GET}"""


def test_each_step_is_told_where_nobody_looks_on(machine: Machine) -> None:
    ended = machine.install()
    first, *lines = ended.stdout.splitlines()

    assert (ended.returncode, ended.stderr) == (0, "")
    assert first == "Installing packages needs root; sudo may ask for your password."
    assert re.fullmatch(r"Fetching \d+ Debian packages: .*\bmeson\b.*", lines.pop(1))
    assert lines == [UPDATE, INSTALL]


def test_progress_of_apt_is_shown_on_a_terminal(machine: Machine) -> None:
    status, seen = machine.install_on_terminal()
    shown = seen[seen.index(UPDATE):].splitlines()

    assert status == 0
    assert shown[1:3] == ["progress of update", "some words of apt"]
    assert shown[4].startswith("progress of -y install --no-install-recommends --download-only ")
    assert shown[6] == INSTALL and shown[7].startswith("progress of -y install ")


def test_root_is_asked_for_what_needs_it(machine: Machine) -> None:
    """No daemon is started meanwhile, and the file that forbids it goes again where it is ours."""
    machine.install()
    asked = machine.record.read_text().splitlines()
    apt = "env LC_ALL=C.UTF-8 DEBIAN_FRONTEND=noninteractive apt-get -q"
    policy = "/usr/sbin/policy-rc.d"
    made = [] if os.path.exists(policy) else [f"tee {policy}", f"chmod 755 {policy}"]
    removed = [f"rm -f {policy}"] if made else []

    assert [line.split(" install ")[0] for line in asked] == [
        "true", f"{apt} update", f"{apt} -y", *made, f"{apt} -y", *removed]
    assert machine.leftovers() == set()


@pytest.mark.parametrize("words, at, advice", [
    ("Could not get lock /var/lib/dpkg/lock-frontend. It is held by process 4711 (apt)", "install",
     "Another program is installing packages. Wait until it has ended, and start this again.\n"),
    ("Unable to lock directory /var/lib/apt/lists/", "update",
     "Another program is installing packages. Wait until it has ended, and start this again.\n"),
    ("dpkg was interrupted, you must manually run 'dpkg --configure -a'", "install",
     "An installation was broken off here. Run this as root, and start this again: "
     "dpkg --configure -a\n"),
    ("You don't have enough free space in /var/cache/apt/archives/.", "download-only",
     "The disk is full. Make room, and start this again.\n"),
    ("Failed to fetch http://deb.debian.org/  Temporary failure resolving", "download-only",
     "The packages' servers cannot be reached. See to the network and to what "
     "/etc/apt/sources.list names, and start this again.\n"),
    ("Package 'libubootenv-dev' has no installation candidate", "install",
     "This machine's sources have no such package; those of Debian 12 do. "
     "See to what /etc/apt/sources.list names, and start this again.\n"),
])
def test_failure_says_what_to_do(machine: Machine, words: str, at: str, advice: str) -> None:
    machine.stand_in("apt-get", fail_with(words, at))
    ended = machine.install()
    status, seen = machine.install_on_terminal()

    assert (ended.returncode, status) == (1, 1)
    assert ended.stderr.endswith(f"E: {words}\n{advice}")
    assert seen.endswith(f"E: {words}\n{advice}")
    assert machine.leftovers() == set()


def test_servers_that_only_the_lists_missed_are_told(machine: Machine) -> None:
    """apt-get update warns, and then there is no such package."""
    machine.stand_in("apt-get", f"""
        case "$*" in *update*) echo "W: Failed to fetch http://deb.debian.org/" >&2; exit 0 ;; esac
        {fail_with("Unable to locate package meson", "install")}""")

    assert "The packages' servers cannot be reached." in machine.install().stderr
    assert "The packages' servers cannot be reached." in machine.install_on_terminal()[1]


def test_other_failure_shows_the_command(machine: Machine) -> None:
    machine.stand_in("apt-get", fail_with("something else"))

    assert f"E: something else\nMend what apt says, or run this {BY_HAND}" in machine.install().stderr


def test_sudo_that_refuses(machine: Machine) -> None:
    machine.stand_in("sudo", "echo 'alice is not in the sudoers file.' >&2; exit 1")
    ended = machine.install()

    assert ended.returncode == 1
    assert ended.stderr.startswith("alice is not in the sudoers file.\nsudo does not make you root. "
                                   f"Let somebody run this {BY_HAND}")


def test_machine_without_sudo(machine: Machine, tmp_path: Path) -> None:
    (tmp_path / "sudo").unlink()
    for name in ("bash", "sort", "sed"):
        (tmp_path / name).symlink_to(f"/usr/bin/{name}")
    machine.environment["PATH"] = str(tmp_path)
    ended = machine.install()

    assert ended.returncode == 1
    assert ended.stderr.startswith(
        f"There is no sudo. Run this {BY_HAND.replace('as root', 'as root first')}")


def test_benchmark_on_a_machine_without_sudo(machine: Machine, tmp_path: Path) -> None:
    """It says so before it installs and builds."""
    (tmp_path / "sudo").unlink()
    for name in ("bash", "dirname"):
        (tmp_path / name).symlink_to(f"/usr/bin/{name}")
    ended = subprocess.run([TREE / "bench", "quick"], env={"PATH": str(tmp_path)},
                           capture_output=True, text=True, timeout=60, check=False)

    assert (ended.returncode, ended.stdout, ended.stderr) == (1, "", (
        "bench: needs root for its namespaces, and there is no sudo; start it as root\n"))


def test_nothing_is_done_where_nothing_is_missing(machine: Machine) -> None:
    machine.stand_in("dpkg-query", "printf installed")
    ended = machine.install()

    assert (ended.returncode, ended.stdout, ended.stderr) == (0, "", "")
    assert machine.record.read_text() == ""
