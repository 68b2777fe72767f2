"""tests/bus/test_privane_check_files.py: what the checker tells of the account files themselves."""
import os
import shutil
import subprocess
from collections.abc import Iterator
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.checker import (CHANGES, GOOD_PASSWD, GSHADOW, NOTHING, UNUSABLE, check, told,
                             write)
from harness.sandbox import fake_library

FILES = (PASSWD, SHADOW, GROUP)


@pytest.fixture(autouse=True)
def good_files(accounts: AccountFiles) -> None:
    write()


def test_owners_and_modes() -> None:
    os.chown(SHADOW, 0, 42)
    os.chown(PASSWD, 12, 34)
    os.chmod(SHADOW, 0o644)
    os.chmod(GROUP, 0o664)
    assert told() == [
        "/etc/passwd: change: owner: belongs to 12:34; a write gives it to root",
        "/etc/shadow: change: group-of-file: belongs to the group 42; a write gives it to the group "
        "root, and who reads it by that group no longer can",
        "/etc/shadow: notice: open-to-others: has mode 0644: everybody may read the hashes",
        "/etc/group: notice: open-to-others: has mode 0664: others than root may write it"]


def test_a_symbolic_link() -> None:
    shutil.move(PASSWD, "/etc/passwd.elsewhere")
    PASSWD.symlink_to("passwd.elsewhere")
    done = check()
    PASSWD.unlink()
    assert done.stdout == ("/etc/passwd: change: symbolic-link: is a symbolic link; a write puts a "
                           "file in its place, and what it leads to stays old\n")
    assert done.returncode == CHANGES


MOUNTED = ("/etc/passwd: unusable: mount-point: is mounted over another file, which no write can "
           "replace; mount its folder instead\n")


@pytest.fixture
def mounted(tmp_path: Path) -> Iterator[None]:
    over = tmp_path / "passwd"
    over.write_text(GOOD_PASSWD)
    subprocess.run(["mount", "--bind", over, PASSWD], check=True)
    yield
    subprocess.run(["umount", PASSWD], check=True)


# A kernel that tells mount points, and an older one.
KERNELS = ({}, {"LD_PRELOAD": str(fake_library("old_statx/libold_statx.so"))})


@pytest.mark.parametrize("kernel", KERNELS, ids=("new", "old"))
@pytest.mark.usefixtures("mounted")
def test_a_file_that_is_mounted_over_another(kernel: dict[str, str]) -> None:
    done = check(**kernel)
    assert done.stdout == MOUNTED
    assert done.returncode == UNUSABLE


@pytest.mark.parametrize("kernel", KERNELS, ids=("new", "old"))
def test_a_file_of_an_image_that_is_mounted_over_another(kernel: dict[str, str],
                                                         tmp_path: Path) -> None:
    root = tmp_path / "an image"
    (root / "var" / "etc").mkdir(parents=True)
    (root / "etc").symlink_to("var/etc")
    for path in FILES:
        shutil.copy2(path, root / "etc")
    assert check(f"--root={root}", **kernel).returncode == NOTHING
    subprocess.run(["mount", "--bind", PASSWD, root / "var/etc/passwd"], check=True)
    try:
        done = check(f"--root={root}", **kernel)
    finally:
        subprocess.run(["umount", root / "var/etc/passwd"], check=True)
    assert (done.stdout, done.returncode) == (MOUNTED, UNUSABLE)


def test_mounts_that_cannot_be_known() -> None:
    """An old kernel, and no /proc."""
    hidden = subprocess.run(["unshare", "--mount", "sh", "-c",
                             "mount -t tmpfs none /proc && exec privane-check"],
                            capture_output=True, text=True, check=False,
                            env={**os.environ, **KERNELS[1]})
    assert hidden.stdout.splitlines() == [
        f"{path}: notice: mounts-unknown: may be mounted over another file, which no write could "
        "replace: Failed to open file “/proc/self/mountinfo”: No such file or directory"
        for path in FILES]
    assert hidden.returncode == NOTHING


@pytest.mark.parametrize("path", (PASSWD, GROUP))
def test_a_missing_file(path: Path) -> None:
    path.unlink()
    done = check()
    assert done.stdout == f"{path}: unusable: missing: is not there\n"
    assert done.returncode == UNUSABLE


MISSING_SHADOW = ("/etc/shadow: unusable: missing: is not there: passwords stand in passwd, and no user "
                  "can be changed\n")


def test_a_missing_shadow_file() -> None:
    write(GOOD_PASSWD.replace(":x:", ":*:"), None)
    done = check()
    assert (done.stdout, done.returncode) == (MISSING_SHADOW, UNUSABLE)


def test_a_file_that_is_none() -> None:
    GROUP.unlink()
    os.mkfifo(GROUP)
    done = check()
    GROUP.unlink()
    assert done.stdout == (
        "/etc/group: unusable: no-file: is no ordinary file\n"
        "/etc/group: loss: not-judged: what a write would drop cannot be told: it cannot be read as a "
        "file\n")
    assert done.returncode == UNUSABLE


def test_a_link_in_a_circle() -> None:
    GROUP.unlink()
    GROUP.symlink_to("group")
    done = check()
    GROUP.unlink()
    assert done.stdout.splitlines() == [
        "/etc/group: change: symbolic-link: is a symbolic link; a write puts a file in its place, and "
        "what it leads to stays old",
        "/etc/group: unusable: unreadable: Too many levels of symbolic links"]
    assert done.returncode == UNUSABLE


def test_a_gshadow_file() -> None:
    GSHADOW.write_text("root:*::\n")
    done = check()
    guard = check("--guard")
    GSHADOW.unlink()
    assert done.stdout == ("/etc/gshadow: notice: gshadow: is there, and is not kept in step with the "
                           "group file: a device has none\n")
    assert (done.returncode, guard.returncode, guard.stdout) == (NOTHING, NOTHING, "")


def test_a_gshadow_file_is_told_last() -> None:
    GSHADOW.symlink_to("nowhere")
    os.chmod(GROUP, 0o666)
    kinds = [line.split(": ")[2] for line in told()]
    GSHADOW.unlink()
    assert kinds == ["open-to-others", "gshadow"]
