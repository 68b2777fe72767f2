"""tests/bus/test_privane_check_crash.py: what a crash leaves keeps no service from starting, and what looks
like it but is no crash's does."""
from collections.abc import Callable, Iterator
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.checker import (CHANGES, GOOD_GROUP, GOOD_PASSWD, GOOD_SHADOW, LOSS, NOTHING, check,
                             write)

WEB, SYSTEM = "bob:x:1002:100::/home:/bin/false\n", "bob:x:998:100::/home:/bin/false\n"
HASH = "bob:$5$salt$hash:19000:0:99999:7:0::\n"
NEW_GROUP = GOOD_GROUP.replace("alice", "alice,bob")

UNFINISHED = ("/etc/passwd:3: change: unfinished-addition: 'bob': a write drops this line: the user's "
              "addition was cut off before there was a line in the shadow file, and can be made again\n")
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


@pytest.mark.parametrize("line", (WEB, SYSTEM))
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


# passwd and group.
NO_ADDITIONS = {
    "not the last": (GOOD_PASSWD + WEB + "carol:*:1003:100::/:/bin/sh\n", GOOD_GROUP),
    "a password that moves to shadow": (GOOD_PASSWD + WEB, NEW_GROUP),
    "a UID that no method gives": (GOOD_PASSWD + WEB.replace("1002", "499"), GOOD_GROUP),
}


@pytest.mark.parametrize("case", NO_ADDITIONS)
def test_an_account_that_was_there_is_lost(case: str, leftovers: Callable[..., None]) -> None:
    passwd, group = NO_ADDITIONS[case]
    write(passwd, group=group)
    leftovers(shadow=GOOD_SHADOW + HASH, group=NEW_GROUP)
    guard = check("--guard")
    assert (guard.stdout, guard.returncode) == (f"/etc/passwd:3: {LOST}", LOSS)


def test_what_is_no_file_is_no_leftover(leftovers: Callable[..., None]) -> None:
    write(GOOD_PASSWD + WEB)
    for path in (PASSWD, SHADOW, GROUP):
        temporary(path).mkdir()
    guard = check("--guard")
    for path in (PASSWD, SHADOW, GROUP):
        temporary(path).rmdir()
    assert guard.returncode == LOSS
