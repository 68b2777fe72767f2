"""tests/bus/test_privane_check_crash.py: what a crash leaves keeps no service from starting, and what looks
like it but is no crash's does."""
from collections.abc import Callable, Iterator
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.checker import (CHANGES, GOOD_GROUP, GOOD_PASSWD, GOOD_SHADOW, LOSS, NOTHING, check,
                             write)

WEB = "bob:x:1002:100::/home:/bin/false\n"
HASH = "bob:$5$salt$hash:19000:0:99999:7:0::\n"
NEW_GROUP = GOOD_GROUP.replace("alice", "alice,bob")

UNFINISHED = ("/etc/passwd:3: change: unfinished-addition: 'bob': a write drops this line: by all that is "
              "left, the user's addition was cut off before there was a line in the shadow file, and can be "
              "made again\n")
LOST = ("loss: no-shadow-line: 'bob': a write drops the user: its password is in the shadow file, which "
        "has no line of it\n")


def temporary(path: Path) -> Path:
    return path.with_name(f"{path.name}.tmp")


@pytest.fixture(autouse=True)
def leftovers(accounts: AccountFiles) -> Iterator[Callable[..., None]]:
    """Makes the temporary files of passwd, shadow and group, those that are given."""
    def make(passwd: str | None = None, shadow: str | None = None, group: str | None = None) -> None:
        for path, text in ((PASSWD, passwd), (SHADOW, shadow), (GROUP, group)):
            temporary(path).unlink(missing_ok=True)
            if text is not None:
                temporary(path).write_text(text)
    make()
    yield make
    make()


# The UIDs that methods give, and those next to them.
GIVEN = (500, 998, 1000, 60000)
NOT_GIVEN = (499, 60001, 65534)


def with_uid(uid: int) -> str:
    return WEB.replace("1002", str(uid))


@pytest.mark.parametrize("line", map(with_uid, GIVEN))
def test_an_addition_that_was_cut_off_after_passwd(line: str, leftovers: Callable[..., None]) -> None:
    write(GOOD_PASSWD + line)
    leftovers(shadow=GOOD_SHADOW + HASH, group=NEW_GROUP)
    done = check()
    assert (done.stdout, done.returncode) == (UNFINISHED, CHANGES)
    guard = check("--guard")
    assert (guard.returncode, guard.stdout, guard.stderr) == (NOTHING, "", "")


# What there is of the three temporary files while and after later changes, which may be cut off in
# turn: at first those of the addition are still there.
LATER = {
    "a change of a group": {"shadow": GOOD_SHADOW + HASH},
    "passwd is begun": {"passwd": "", "shadow": GOOD_SHADOW + HASH, "group": NEW_GROUP},
    "shadow is removed": {"passwd": GOOD_PASSWD, "group": NEW_GROUP},
    "shadow is begun": {"passwd": GOOD_PASSWD, "shadow": "", "group": NEW_GROUP},
    "group is removed": {"passwd": GOOD_PASSWD, "shadow": GOOD_SHADOW},
    "group is begun": {"passwd": GOOD_PASSWD, "shadow": GOOD_SHADOW, "group": ""},
    "the addition again": {"passwd": GOOD_PASSWD + WEB, "shadow": GOOD_SHADOW + HASH, "group": ""},
    "passwd is removed again": {"group": GOOD_GROUP},
    "shadow is removed after a change of a group": {"passwd": GOOD_PASSWD},
}


@pytest.mark.parametrize("state", LATER)
def test_another_crash_after_that(state: str, leftovers: Callable[..., None]) -> None:
    write(GOOD_PASSWD + WEB)
    leftovers(**LATER[state])
    assert check().stdout == UNFINISHED
    assert check("--guard").returncode == NOTHING


def test_without_a_leftover_the_user_is_lost() -> None:
    write(GOOD_PASSWD + WEB)
    guard = check("--guard")
    assert (guard.stdout, guard.returncode) == (f"/etc/passwd:3: {LOST}", LOSS)


# passwd, shadow and group, and the line of passwd.
NO_ADDITIONS = {
    "not the last": (GOOD_PASSWD + WEB + "carol:*:1003:100::/:/bin/sh\n", GOOD_SHADOW, GOOD_GROUP, 3),
    "a password that moves to shadow": (GOOD_PASSWD + WEB, GOOD_SHADOW, NEW_GROUP, 3),
    "a name that stands twice": (GOOD_PASSWD + WEB.replace("x:1002", "*:1003") + WEB, GOOD_SHADOW,
                                 GOOD_GROUP, 4),
    "a UID that stands twice": (GOOD_PASSWD + with_uid(1001), GOOD_SHADOW, GOOD_GROUP, 3),
    "a malformed shadow line": (GOOD_PASSWD + WEB, GOOD_SHADOW + HASH.replace("99999", "many"), GOOD_GROUP,
                                3),
    "a shadow line that is cut": (GOOD_PASSWD + WEB, GOOD_SHADOW + " bob:$5$sa", GOOD_GROUP, 3),
    "no shadow file": (GOOD_PASSWD.replace(":x:", ":*:") + WEB, None, GOOD_GROUP, 3),
    **{f"UID {uid}": (GOOD_PASSWD + with_uid(uid), GOOD_SHADOW, GOOD_GROUP, 3) for uid in NOT_GIVEN},
}


@pytest.mark.parametrize("case", NO_ADDITIONS)
def test_an_account_that_was_there_is_lost(case: str, leftovers: Callable[..., None]) -> None:
    passwd, shadow, group, number = NO_ADDITIONS[case]
    write(passwd, shadow, group)
    leftovers(shadow=GOOD_SHADOW + HASH, group=NEW_GROUP)
    guard = check("--guard")
    assert (guard.stdout, guard.returncode) == (f"/etc/passwd:{number}: {LOST}", LOSS)


@pytest.mark.parametrize("make", (Path.mkdir, lambda path: path.symlink_to("/etc/passwd")))
def test_what_is_no_file_is_no_leftover(make: Callable[[Path], None]) -> None:
    write(GOOD_PASSWD + WEB)
    made = [temporary(path) for path in (PASSWD, SHADOW, GROUP)]
    for path in made:
        make(path)
    guard = check("--guard")
    for path in made:
        if path.is_symlink():
            path.unlink()
        else:
            path.rmdir()
    assert guard.returncode == LOSS
