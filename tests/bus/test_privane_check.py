"""tests/bus/test_privane_check.py: what the checker tells of account files, good and bad."""
import json
import os
import re
import shutil
import subprocess
import time
from collections.abc import Iterator
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles, replace
from harness.sandbox import fake_library
from harness.syslog_socket import SyslogSocket

MARKER = Path("/etc/privane/accept-account-loss")
MAN = Path("/usr/share/man")
MANUAL = MAN / "man8/privane-check.8"
FILES = (PASSWD, SHADOW, GROUP)
NOTHING, CHANGES, USAGE, LOSS, UNUSABLE, UNTOLD = range(6)

GOOD_PASSWD = "root:x:0:0:root:/root:/bin/sh\nalice:x:1001:100:Alice:/home:/bin/false\n"
GOOD_SHADOW = "root:*:19000:0:99999:7:0::\nalice:$5$salt$hash:19000:0:99999:7:0::\n"
GOOD_GROUP = "root:x:0:\nusers:x:100:alice\n"


def check(*options: str, **environment: str) -> subprocess.CompletedProcess[str]:
    return subprocess.run(["/usr/sbin/privane-check", *options], capture_output=True, text=True,
                          check=False, env={**os.environ, **environment})


def write(passwd: str = GOOD_PASSWD, shadow: str | None = GOOD_SHADOW,
          group: str = GOOD_GROUP) -> None:
    """As root's, with modes that nobody minds."""
    replace(PASSWD, passwd, 0o644, 0)
    replace(GROUP, group, 0o644, 0)
    SHADOW.unlink(missing_ok=True)
    if shadow is not None:
        replace(SHADOW, shadow, 0o600, 0)


@pytest.fixture(autouse=True)
def good_files(accounts: AccountFiles) -> None:
    write()


def told(*options: str) -> list[str]:
    return check(*options).stdout.splitlines()


def test_good_files_are_nothing_to_tell_of(syslog: SyslogSocket) -> None:
    done = check()
    assert (done.returncode, done.stdout, done.stderr) == (NOTHING, "", "")
    assert json.loads(check("--json=short").stdout) == {"findings": [], "worst": None}
    assert syslog.texts() == []


def test_it_only_reads(syslog: SyslogSocket) -> None:
    write(GOOD_PASSWD + "# a comment\nhuman:*:70000:100::/:/bin/sh\n")
    before = [(path.read_bytes(), path.stat()) for path in FILES]
    names = sorted(os.listdir("/etc"))
    assert check().returncode == LOSS
    after = [(path.read_bytes(), path.stat()) for path in FILES]
    assert [(text, status.st_ino, status.st_mtime_ns) for text, status in after] == [
        (text, status.st_ino, status.st_mtime_ns) for text, status in before]
    assert sorted(os.listdir("/etc")) == names
    assert syslog.texts() == []


PASSWD_CASES = {
    "uid-out-of-range": ("human:*:70000:100::/:/bin/sh\n",
                         "loss: uid-out-of-range: 'human': a write drops the user: the UID 70000 "
                         "is in no range of this device", LOSS),
    "no-shadow-line": ("bare:x:1002:100::/:/bin/sh\n",
                       "loss: no-shadow-line: 'bare': a write drops the user: its password is in "
                       "the shadow file, which has no line of it", LOSS),
    "no-primary-group": ("lost:*:1002:4242::/:/bin/sh\n",
                         "loss: no-primary-group: 'lost': a write drops the user: no group that is "
                         "kept has its GID 4242", LOSS),
    "comment": ("# a comment\n", "change: comment: a comment, which a write drops", CHANGES),
    "blank-line": ("\n", "change: blank-line: a blank line, which a write drops", CHANGES),
    "malformed-line": ("no entry\n", "change: malformed-line: no entry by the C library's rules; a "
                       "write drops the line", CHANGES),
    "no-line-end": ("bob:*:1002:100::/:/bin/sh",
                    "change: no-line-end: the last line has no end; a write adds it", CHANGES),
    "fields": (" bob:*:1002:100::/:/bin/sh\n",
               "change: fields: 'bob': the name \" bob\" becomes \"bob\"", CHANGES),
    "repeated-id": ("bob:*:1001:100::/:/bin/sh\n",
                    "notice: repeated-id: 'bob': has the UID of line 2", NOTHING),
    "costly-hash": ("bob:$6$rounds=99999999$salt$hash:1002:100::/:/bin/sh\n",
                    "notice: costly-hash: 'bob': each check of the password takes 99999999 rounds, "
                    "in which the service serves nobody else", NOTHING),
    "costly-hash-of-memory": ("bob:$y$jFT$salt$hash:1002:100::/:/bin/sh\n",
                              "notice: costly-hash: 'bob': each check of the password works through "
                              "1024 MiB of memory, in which the service serves nobody else", NOTHING),
    "unknown-hash": ("bob:$argon2id$v=19$hash:1002:100::/:/bin/sh\n",
                     "notice: unknown-hash: 'bob': the method of its hash, $argon2id$, is none of "
                     "crypt(5): whether anybody can log in by it is not known, nor what a check costs",
                     NOTHING),
}


@pytest.mark.parametrize("line", ("carol:x:1O03:100:Carol:/:/bin/sh", "carol:x:4294967296:100:::"))
def test_a_malformed_line_that_looks_like_an_account(line: str) -> None:
    write(GOOD_PASSWD + line + "\n", GOOD_SHADOW + "carol:$5$salt$hash:1:0:99999:7:0::\n")
    done = check("--guard")
    assert done.stdout == ("/etc/passwd:3: loss: malformed-line: 'carol': no entry by the C library's "
                           "rules; a write drops the line\n")
    assert done.returncode == LOSS


@pytest.mark.parametrize("kind", PASSWD_CASES)
def test_a_line_of_passwd(kind: str) -> None:
    line, text, status = PASSWD_CASES[kind]
    write(GOOD_PASSWD + line)
    done = check()
    assert done.stdout.splitlines() == [f"/etc/passwd:3: {text}"]
    assert (done.returncode, done.stderr) == (status, "")


SHADOW_CASES = {
    "ageing": (GOOD_SHADOW.replace(":19000:0:99999:7:0::\n", ":19000:5:99999:7:::\n", 1),
               ["1: change: ageing: 'root': the minimum age \"5\" becomes \"0\"; the inactivity "
                "period \"\" becomes \"0\""]),
    "no-passwd-line": (GOOD_SHADOW + "ghost:*:1:0:99999:7:0::\n",
                       ["3: change: no-passwd-line: 'ghost': a write drops this line: no user has "
                        "this name"]),
    "repeated-shadow-line": (GOOD_SHADOW + "alice:*:1:0:99999:7:0::\n",
                             ["3: change: repeated-shadow-line: 'alice': a write drops this line: "
                              "the user stands in an earlier one, which counts"]),
}


@pytest.mark.parametrize("kind", SHADOW_CASES)
def test_a_line_of_shadow(kind: str) -> None:
    shadow, texts = SHADOW_CASES[kind]
    write(shadow=shadow)
    done = check()
    assert done.stdout.splitlines() == [f"/etc/shadow:{text}" for text in texts]
    assert done.returncode == CHANGES


def test_a_shadow_line_of_a_password_in_passwd() -> None:
    write(GOOD_PASSWD.replace("alice:x", "alice:*"))
    assert told() == ["/etc/shadow:2: change: unused-shadow-line: 'alice': a write drops this line: "
                      "the user's password stands in passwd"]


def test_shadow_lines_in_another_order() -> None:
    write(shadow="".join(reversed(GOOD_SHADOW.splitlines(keepends=True))))
    done = check()
    assert done.stdout == ("/etc/shadow: notice: order: its lines stand in another order than those "
                           "of passwd, which a write gives them\n")
    assert done.returncode == NOTHING


GROUP_CASES = {
    "gid-out-of-range": ("big:x:70000:\n", "loss: gid-out-of-range: 'big': a write drops the group: "
                         "the GID 70000 is in no range of this device", LOSS),
    "repeated-group": ("users:x:101:\n", "loss: repeated-group: 'users': a write drops this line: "
                       "the group stands in an earlier one", LOSS),
    "repeated-id": ("more:x:100:\n", "notice: repeated-id: 'more': has the GID of line 2", NOTHING),
    "fields": ("more:x:101:alice,alice\n",
               "change: fields: 'more': each member is listed once", CHANGES),
    "unknown-member": ("more:x:101:ghost\n", "notice: unknown-member: 'more': lists \"ghost\", who "
                       "has no account: an account of that name would be a member, and the group "
                       "cannot be removed", NOTHING),
}


@pytest.mark.parametrize("kind", GROUP_CASES)
def test_a_line_of_group(kind: str) -> None:
    line, text, status = GROUP_CASES[kind]
    write(group=GOOD_GROUP + line)
    done = check()
    assert done.stdout.splitlines() == [f"/etc/group:3: {text}"]
    assert done.returncode == status


def test_the_order_of_members_means_nothing() -> None:
    members = ["alice", "bob", "carol", "dave", "erin"]
    users = "".join(f"{name}:*:{number}:100::/:/bin/sh\n"
                    for number, name in enumerate(members[1:], 2000))
    write(GOOD_PASSWD + users, group=GOOD_GROUP + f"more:x:101:{','.join(reversed(members))}\n")
    assert told() == []


def test_a_blank_before_a_member_means_nothing() -> None:
    """The C library leaves it out."""
    write(GOOD_PASSWD + "bob:*:1002:100::/:/bin/sh\n", group=GOOD_GROUP + "more:x:101:alice, bob\n")
    assert told() == []


def test_of_two_lines_of_a_user_the_one_that_is_kept_is_told_apart() -> None:
    write(GOOD_PASSWD + "bob:*:1002:4242::/:/bin/sh\nbob:*:1002:100::/:/bin/sh\n")
    assert told() == [
        "/etc/passwd:3: loss: no-primary-group: 'bob': a write drops the user: no group that is kept "
        "has its GID 4242",
        "/etc/passwd:4: notice: repeated-name: 'bob': has the name of line 3; a change reaches the "
        "last of them",
        "/etc/passwd:4: notice: repeated-id: 'bob': has the UID of line 3"]


def test_as_many_users_as_there_can_be() -> None:
    """The unit waits for it: the time grows with their number, not with its square."""
    many = range(1000, 60001)
    write("root:x:0:0:root:/root:/bin/sh\n" + "".join(f"u{uid}:x:{uid}:100:::\n" for uid in many),
          "root:*:19000:0:99999:7:0::\n" + "".join(f"u{uid}:*:1:0:99999:7:0::\n" for uid in many))
    begin = time.monotonic()
    assert told() == ["/etc/group:2: notice: unknown-member: 'users': lists \"alice\", who has no "
                      "account: an account of that name would be a member, and the group cannot be "
                      "removed"]
    assert time.monotonic() - begin < 10


def test_a_name_that_stands_twice() -> None:
    write(GOOD_PASSWD + "alice:x:1002:100::/:/bin/sh\n")
    assert told() == ["/etc/passwd:3: notice: repeated-name: 'alice': has the name of line 2; a "
                      "change reaches the last of them"]


def test_a_record_that_cannot_be_written() -> None:
    """The C library reads a colon in the last field, and refuses to write it."""
    write(GOOD_PASSWD + "bob:*:1002:100::/:/bin/sh:more\n")
    done = check()
    assert done.stdout == ("/etc/passwd:3: unusable: unwritable: 'bob': cannot be written, and so no "
                           "change of any account can: Invalid argument\n")
    assert done.returncode == UNUSABLE


def test_no_root() -> None:
    write(GOOD_PASSWD.replace("root:x:0:", "boss:*:0:"), GOOD_SHADOW.split("\n", 1)[1])
    assert told() == ["/etc/passwd: notice: no-root: 'root': no user that is kept has the name root "
                      "and the UID 0"]


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
    assert done.stdout == f"{path}: unusable: missing: No such file or directory\n"
    assert done.returncode == UNUSABLE


def test_a_missing_shadow_file() -> None:
    write(GOOD_PASSWD.replace(":x:", ":*:"), None)
    done = check()
    assert done.stdout == ("/etc/shadow: notice: missing: is not there: passwords stand in passwd\n")
    assert done.returncode == NOTHING


def test_a_file_that_is_none() -> None:
    GROUP.unlink()
    os.mkfifo(GROUP)
    done = check()
    GROUP.unlink()
    assert done.stdout == "/etc/group: unusable: no-file: is no ordinary file\n"
    assert done.returncode == UNUSABLE


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
    assert refused.stdout.splitlines() == [f"/etc/passwd:4: {PASSWD_CASES['uid-out-of-range'][1]}"]
    assert refused.stderr == (
        "The service is not started: its first change would lose what is named above. The maker of "
        f"a device who wants that makes the file {MARKER}.\n")
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
