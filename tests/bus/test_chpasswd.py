"""tests/bus/test_chpasswd.py: ChpasswdUser."""
from pathlib import Path

import pytest

from harness.bus import domain_error, error_of
from harness.changing_accounts import SHADOW_TEXT, Texts, edit, read_texts, stored_hash
from harness.passwords import MARK, NEW, OLD, OLD_HASH, is_hash_of
from harness.stage import ROOT_FLAG_CALLS, ROOT_FLAG_SET, Stage, refused


def with_new_hash(name: str) -> Texts:
    return Texts(shadow=edit(SHADOW_TEXT, f"{name}:{OLD_HASH}:19000:", f"{name}:HASH:TODAY:"))


@pytest.mark.parametrize("name", ["alice", "timer"])
def test_password_is_changed_and_nobody_learns_of_it(name: str, stage: Stage) -> None:
    stage.digest.fail(5)

    assert stage.call("ChpasswdUser", name, NEW) == stage.done()

    assert read_texts() == with_new_hash(name)
    assert is_hash_of(stored_hash(name), NEW)
    assert stage.bus.call("AuthUserBasic", "ss", name, NEW) == ()
    error_of(stage.bus.call, "AuthUserBasic", "ss", name, OLD)


def test_password_of_root_sets_the_flag(stage: Stage) -> None:
    assert stage.call("ChpasswdUser", "root", NEW) == stage.done(
        *ROOT_FLAG_CALLS, lines=(ROOT_FLAG_SET,))

    assert read_texts() == with_new_hash("root")
    assert is_hash_of(stored_hash("root"), NEW)


def test_changed_password_holds_after_a_restart(stage: Stage) -> None:
    stage.succeed("ChpasswdUser", "alice", NEW)
    before, texts = stage.memory(), read_texts()

    stage.restart()

    assert (stage.memory(), read_texts()) == (before, texts)
    assert stage.bus.call("AuthUserBasic", "ss", "alice", NEW) == ()


def test_same_password_writes_nothing(stage: Stage) -> None:
    stage.assert_unmoved(stage.done(), "ChpasswdUser", "alice", OLD)


@pytest.mark.parametrize("name", ["alice", "timer", "daemon", "nobody"])
def test_empty_password_is_an_absent_one_and_changes_nothing(name: str, stage: Stage) -> None:
    stage.assert_unmoved(stage.done(), "ChpasswdUser", name, "")


def test_empty_password_of_root_changes_nothing_and_still_sets_the_flag(stage: Stage) -> None:
    stage.assert_unmoved(stage.done(*ROOT_FLAG_CALLS, lines=(ROOT_FLAG_SET,)),
                         "ChpasswdUser", "root", "")


def test_password_where_there_was_none(stage: Stage) -> None:
    stage.succeed("ClearUserFields", "timer", True, False, False)

    assert stage.call("ChpasswdUser", "timer", NEW) == stage.done()
    assert read_texts() == with_new_hash("timer")


@pytest.mark.parametrize("name, password, code, reason", [
    ("nosuch", NEW, 3, "user does not exist"),
    ("nosuch", "", 3, "user does not exist"),
    ("", NEW, 3, "user does not exist"),
    (" root", NEW, 3, "user does not exist"),
    ("+x", NEW, 3, "user does not exist"),
    ("#x", NEW, 3, "user does not exist"),
    ("a,b", NEW, 3, "user does not exist"),
    ("daemon", NEW, 5, "permanent system users cannot be modified"),
    ("anonymous", NEW, 5, "permanent system users cannot be modified"),
    ("nobody", NEW, 5, "invalid user type 'nobody'"),
    ("alice", MARK.ljust(65, "x"), 10, "password too long, max allowed length is 64 characters"),
    ("timer", MARK.ljust(512, "x"), 16, "crypt() failed, Numerical result out of range"),
    ("root", MARK.ljust(512, "x"), 16, "crypt() failed, Numerical result out of range"),
    ("root", MARK.ljust(1 << 20, "x"), 16, "crypt() failed, Numerical result out of range"),
], ids=lambda value: repr(value)[:20])
def test_refusal_leaves_everything_as_it_was(name: str, password: str, code: int, reason: str,
                                             stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, f"Failed to modify user '{name}', {reason}"),
                         "ChpasswdUser", name, password)


def test_flag_of_root_is_not_set_for_a_password_that_cannot_be_written(stage: Stage) -> None:
    folder = Path("/etc/shadow.tmp")
    folder.mkdir()
    try:
        effects = stage.call("ChpasswdUser", "root", NEW)
    finally:
        folder.rmdir()

    assert effects == refused(
        "corefile", 101, "Failed to modify user 'root', unable to sync core files, failed to write "
        "1/3 core file(s) shadow: could not fopen/fileno temporary file '/etc/shadow.tmp': "
        "Is a directory")
    assert read_texts() == Texts()


def test_password_that_cannot_be_written_is_written_with_the_next_change(stage: Stage) -> None:
    """Deliberate: such a change stays in memory, where nobody can log in with it yet."""
    folder = Path("/etc/shadow.tmp")
    folder.mkdir()
    try:
        stage.call("ChpasswdUser", "alice", NEW)
    finally:
        folder.rmdir()
    assert error_of(stage.bus.call, "AuthUserBasic", "ss", "alice", NEW) == domain_error(
        "privaneSystemError", 7, "No valid password for user alice")

    stage.succeed("RemoveUser", "bob")

    assert is_hash_of(stored_hash("alice"), NEW)
    stage.bus.call("AuthUserBasic", "ss", "alice", NEW)
