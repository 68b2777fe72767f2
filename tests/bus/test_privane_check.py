"""tests/bus/test_privane_check.py: what the checker tells of the lines of account files, good and bad."""
import json
import os
import time

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.checker import (CHANGES, GOOD_GROUP, GOOD_PASSWD, GOOD_SHADOW, LOSS, NOTHING, UNUSABLE,
                             check, told, write)
from harness.syslog_socket import SyslogSocket

FILES = (PASSWD, SHADOW, GROUP)


@pytest.fixture(autouse=True)
def good_files(accounts: AccountFiles) -> None:
    write()


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
    "a line of the old form": (GOOD_SHADOW.replace("99999:7:0::\n", "99999\n", 1),
                               ["1: change: ageing: 'root': the warning period \"\" becomes \"7\"; "
                                "the inactivity period \"\" becomes \"0\""]),
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
    assert done.stdout == ("/etc/shadow: change: order: its lines stand in another order than those "
                           "of passwd, which a write gives them\n")
    assert done.returncode == CHANGES


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
        "last of them, a check of a password the first",
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


TWICE = ("/etc/passwd:3: notice: repeated-name: 'alice': has the name of line 2; a change reaches the last "
         "of them, a check of a password the first")
SECOND_ALICE = GOOD_PASSWD + "alice:x:1002:100::/:/bin/sh\n"
ALICES_LINE = GOOD_SHADOW.splitlines(keepends=True)[1]


def test_a_name_that_stands_twice() -> None:
    """Each of the two is written with a shadow line."""
    write(SECOND_ALICE)
    done = check()
    assert done.stdout.splitlines() == [
        TWICE, "/etc/shadow: change: added-shadow-line: 'alice': a write adds a line of the user, whose "
        "name stands twice in passwd"]
    assert done.returncode == CHANGES


def test_a_name_that_stands_twice_in_both_files() -> None:
    write(SECOND_ALICE, GOOD_SHADOW + ALICES_LINE)
    done = check()
    assert (done.stdout.splitlines(), done.returncode) == ([TWICE], NOTHING)

    write(SECOND_ALICE, GOOD_SHADOW + ALICES_LINE.replace("salt", "other") + ALICES_LINE)
    assert told() == [
        TWICE, "/etc/shadow:3: change: fields: 'alice': the password field becomes another",
        "/etc/shadow:4: change: repeated-shadow-line: 'alice': a write drops this line: the user stands "
        "in an earlier one, which counts"]


def test_the_order_of_a_name_that_stands_twice() -> None:
    order = "/etc/shadow: change: order: its lines stand in another order than those of passwd, which a write " \
            "gives them"
    passwd = GOOD_PASSWD + "bob:x:1002:100::/:/bin/sh\nalice:x:1003:100::/:/bin/sh\n"
    twice = TWICE.replace(":3:", ":4:")
    bobs = ALICES_LINE.replace("alice", "bob")
    write(passwd, GOOD_SHADOW + ALICES_LINE + bobs)
    done = check()
    assert (done.stdout.splitlines(), done.returncode) == ([twice, order], CHANGES)
    write(passwd, GOOD_SHADOW + bobs + ALICES_LINE)
    assert told() == [twice]
    write(passwd, GOOD_SHADOW + bobs)
    assert [line.split(": ")[2] for line in told()] == ["repeated-name", "added-shadow-line"]


def test_a_shadow_line_is_of_the_name_that_needs_it() -> None:
    """The last of two has its password in passwd."""
    write(GOOD_PASSWD + "alice:*:1002:100::/:/bin/sh\n")
    assert told() == [TWICE]


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
