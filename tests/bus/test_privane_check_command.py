"""tests/bus/test_privane_check_command.py: the checker's forms of output, guard and manual."""
import json
import os
import re
import shutil
import subprocess
import tempfile
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.checker import (CHANGES, GOOD_PASSWD, GOOD_SHADOW, LOSS, NOTHING, UNTOLD, UNUSABLE,
                             USAGE, check, write)

MARKER = Path("/etc/privane/accept-account-loss")
MAN = Path("/usr/share/man")
MANUAL = MAN / "man8/privane-check.8"
FILES = (PASSWD, SHADOW, GROUP)


@pytest.fixture(autouse=True)
def good_files(accounts: AccountFiles) -> None:
    write()


def test_json_has_the_same() -> None:
    write(GOOD_PASSWD + "human:*:70000:100::/:/bin/sh\n# \x1b[2J\n")
    found = json.loads(check("--json=pretty").stdout)
    assert found == json.loads(check("--json=short").stdout) == {
        "findings": [
            {"weight": "loss", "kind": "uid-out-of-range", "file": "/etc/passwd", "line": 3,
             "account": "human", "text": "a write drops the user: the UID 70000 is in no range of "
             "this device"},
            {"weight": "change", "kind": "comment", "file": "/etc/passwd", "line": 4,
             "text": "a comment, which a write drops"}],
        "worst": "loss"}
    assert check("--json=off").stdout == check().stdout


def test_no_hash_is_told_and_nothing_that_a_terminal_obeys() -> None:
    write(GOOD_PASSWD + " b\x1b[2Jb:$5$secret$hash:1002:100:\x07:/:/bin/sh\tx\n",
          GOOD_SHADOW + "bob:$5$secret$hash:1:0:99999:7:0::\n")
    done = check()
    assert done.stdout.splitlines() == [
        "/etc/passwd:3: change: fields: 'b\\x1b[2Jb': the name \" b\\x1b[2Jb\" becomes "
        "\"b\\x1b[2Jb\"",
        "/etc/shadow:3: change: no-passwd-line: 'bob': a write drops this line: no user has this "
        "name"]
    assert done.returncode == CHANGES


def test_the_guard_of_the_unit() -> None:
    assert check("--guard").returncode == 0
    write(GOOD_PASSWD + "# a comment\nhuman:*:70000:100::/:/bin/sh\n")
    refused = check("--guard")
    assert refused.stdout.splitlines() == [
        "/etc/passwd:4: loss: uid-out-of-range: 'human': a write drops the user: the UID 70000 is in "
        "no range of this device"]
    assert refused.stderr == (
        "The service is not started: its first change would lose accounts, or might, as told above. "
        f"The maker of a device who wants that makes the file {MARKER}.\n")
    assert refused.returncode == LOSS
    MARKER.parent.mkdir(exist_ok=True)
    MARKER.touch()
    wanted = check("--guard")
    MARKER.unlink()
    assert wanted.returncode == 0
    assert wanted.stderr == f"{MARKER} says that this is wanted.\n"


def test_the_guard_tells_of_losses_alone() -> None:
    """What else keeps the service from working it tells itself when it starts."""
    write(GOOD_PASSWD + "bob:*:1002:100::/:/bin/sh:more\n")
    assert check().returncode == UNUSABLE
    guard = check("--guard")
    assert (guard.returncode, guard.stdout, guard.stderr) == (NOTHING, "", "")

    write(GOOD_PASSWD + "bob:*:1002:100::/:/bin/sh:more\nhuman:*:70000:100::/:/bin/sh\n")
    guard = check("--guard", "--json=short")
    assert [(found["weight"], found["account"]) for found in json.loads(guard.stdout)["findings"]] == [
        ("loss", "human")]
    assert guard.returncode == LOSS


def check_into(path: str, *options: str) -> tuple[int, str]:
    with open(path, "w") as output:
        done = subprocess.run(["/usr/sbin/privane-check", *options], stdout=output,
                              stderr=subprocess.PIPE, text=True, check=False)
    return done.returncode, done.stderr


FULL = ("privane-check: cannot write to standard output: No space left on device\n")


@pytest.mark.parametrize("options", [(), ("--json=short",), ("--json=pretty",)])
def test_what_cannot_be_told_is_a_failure(options: tuple[str, ...]) -> None:
    write(GOOD_PASSWD + "# a comment\n")
    assert check_into("/dev/full", *options) == (UNTOLD, FULL)
    assert check_into("/dev/null", *options) == (CHANGES, "")


def test_the_guard_decides_whoever_listens() -> None:
    """A log that takes nothing keeps no service from starting, and lets none start."""
    assert check_into("/dev/full", "--guard", "--json=short") == (NOTHING, FULL)
    write(GOOD_PASSWD + "human:*:70000:100::/:/bin/sh\n")
    status, errors = check_into("/dev/full", "--guard")
    assert status == LOSS and errors.startswith(FULL)


def test_the_files_of_an_image(tmp_path: Path) -> None:
    (tmp_path / "etc").mkdir()
    for path in FILES:
        shutil.copy2(path, tmp_path / "etc")
    with (tmp_path / "etc" / "group").open("a") as group:
        group.write("big:x:70000:\n")
    assert check(f"--root={tmp_path}").returncode == LOSS
    assert check().returncode == NOTHING
    missing = check("--root=/nosuch")
    assert (missing.returncode, missing.stderr) == (
        USAGE, "privane-check: /nosuch: No such file or directory\n")


DOCUMENT = Path(__file__).parents[2] / "docs" / "images.md"


def test_an_image_whose_folder_is_somebody_elses() -> None:
    """By the command of the guide for who is not root."""
    (command,) = re.findall(r"`(unshare [^`]+)`", DOCUMENT.read_text())
    with tempfile.TemporaryDirectory(dir="/tmp") as root:
        (Path(root) / "etc").mkdir()
        for path in FILES:
            shutil.copy2(path, Path(root) / "etc")
        with (Path(root) / "etc/group").open("a") as group:
            group.write("big:x:70000:\n")
        for path in (root, *map(str, Path(root).rglob("*"))):
            os.chown(path, 701, 701)
        words = [word.replace("build/check/", "/usr/sbin/").replace("FOLDER", root)
                 for word in command.split()]
        done = subprocess.run(["setpriv", "--reuid=701", "--regid=701", "--clear-groups", *words],
                              capture_output=True, text=True, check=False)
    assert done.stdout == ("/etc/group:3: loss: gid-out-of-range: 'big': a write drops the group: the GID "
                           "70000 is in no range of this device\n")
    assert (done.returncode, done.stderr) == (LOSS, "")


def test_a_link_leads_out_of_no_image(tmp_path: Path) -> None:
    """To the sandbox's own file, which is good, from an image that has no such file."""
    (tmp_path / "etc").mkdir()
    for path in FILES:
        shutil.copy2(path, tmp_path / "etc")
    assert check(f"--root={tmp_path}").returncode == NOTHING
    outside = Path("/etc/passwd.outside")
    outside.write_text(GOOD_PASSWD)
    (tmp_path / "etc/passwd").unlink()
    (tmp_path / "etc/passwd").symlink_to("../" * len(tmp_path.parts) + "etc/passwd.outside")
    done = check(f"--root={tmp_path}")
    outside.unlink()
    assert "/etc/passwd: unusable: missing: leads to no file\n" in done.stdout
    assert done.returncode == UNUSABLE


def test_no_code_of_an_image_is_run(tmp_path: Path) -> None:
    """The C library converts messages by modules, which it would look for in the image."""
    (tmp_path / "etc").mkdir()
    for path in (PASSWD, GROUP):
        shutil.copy2(path, tmp_path / "etc")
    (tmp_path / "etc/shadow").symlink_to("shadow")
    for folder in ("usr/lib/gconv", "usr/lib64/gconv", f"usr/lib/{os.uname().machine}-linux-gnu/gconv"):
        (tmp_path / folder).mkdir(parents=True)
        (tmp_path / folder / "gconv-modules").write_text("module ANSI_X3.4-1968// INTERNAL NOSUCH 1\n"
                                                         "module INTERNAL ANSI_X3.4-1968// NOSUCH 1\n")
    done = subprocess.run(["strace", "-e", "trace=chroot,openat,open", "/usr/sbin/privane-check",
                           "--json=short", f"--root={tmp_path}"], capture_output=True, text=True,
                          check=False)
    before, chroot, inside = done.stderr.partition(f'chroot("{tmp_path}") ')
    assert "gconv" in before and chroot
    assert "exited with 4" in inside and "gconv" not in inside
    texts = {found["kind"]: found["text"] for found in json.loads(done.stdout)["findings"]}
    assert texts["unreadable"] == "Too many levels of symbolic links"


def test_json_is_valid_whatever_a_name_holds() -> None:
    write(GOOD_PASSWD + "a\x1fb\u009bc:*:70000:100::/:/bin/sh\n")
    done = check("--json=short")
    assert json.loads(done.stdout)["findings"][0]["account"] == "a\x1fb\u009bc"
    assert "\x1f" not in done.stdout and "\u009b" not in done.stdout


def test_the_manual_is_set_without_a_warning() -> None:
    done = subprocess.run(["groff", "-ww", "-man", "-Tutf8", "-z", MANUAL], capture_output=True,
                          check=False)
    assert (done.returncode, done.stderr) == (0, b"")


def test_the_manual_has_what_the_help_has() -> None:
    text = MANUAL.read_text().replace("\\-", "-")
    help_text = check("--help").stdout
    options = set(re.findall(r"--[a-z]+(?==|  )", help_text)) - {"--help"}
    statuses = re.findall(r"\b([0-9]) ", help_text.partition("Exit status:")[2])

    assert options == {"--guard", "--json", "--root"}
    assert options <= set(re.findall(r"--[a-z]+", text))
    assert statuses == re.findall(r"^\.B ([0-9])$", text, re.MULTILINE) == [
        str(status) for status in range(6)]


@pytest.mark.parametrize("page", ["man8/privane-check.8", "man1/privanectl.1"])
def test_the_manuals_name_no_page_of_ours_that_is_not_there(page: str) -> None:
    named = re.findall(r"^\.BR (privane\S*) \(([1-8])\)", (MAN / page).read_text(), re.MULTILINE)

    assert named
    assert [name for name, section in named
            if not (MAN / f"man{section}" / f"{name}.{section}".replace("\\-", "-")).exists()] == []


def test_only_root_may_look(accounts: AccountFiles) -> None:
    done = subprocess.run(["setpriv", "--reuid=701", "--clear-groups", "/usr/sbin/privane-check"],
                          capture_output=True, text=True, check=False)
    assert (done.returncode, done.stdout, done.stderr) == (
        USAGE, "", "privane-check: only root may read the files\n")


@pytest.mark.parametrize(("words", "text"), (
    (["--json=long"], "--json is short, pretty or off"),
    (["word"], "no arguments are known"),
    (["--nosuch"], "Unknown option --nosuch")))
def test_usage(words: list[str], text: str) -> None:
    done = check(*words)
    assert (done.returncode, done.stdout, done.stderr) == (USAGE, "", f"privane-check: {text}\n")
