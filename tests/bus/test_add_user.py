"""tests/bus/test_add_user.py: AddUser and AddUidUser."""
import os
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.bus import domain_error, error_of
from harness.changing_accounts import (GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit,
                                       read_texts, stored_hash)
from harness.passwords import MARK, NEW, OLD_HASH, is_hash_of
from harness.stage import Effects, Stage, refused

CAROL = ("carol", NEW, "users", "viewer:operator", "Carol")
CAROL_DIGEST = ("digest_entry_set", "carol", NEW, "0")

# Both methods, the second without a wish for a UID.
both_methods = pytest.mark.parametrize("member, uid", [("AddUser", ()), ("AddUidUser", (-1,))],
                                       ids=["AddUser", "AddUidUser"])


def with_carol(uid: int = 1002, groups: tuple[str, ...] = ("viewer", "operator")) -> Texts:
    group = edit(GROUP_TEXT, "users:x:100:alice", "users:x:100:alice,carol")
    if "viewer" in groups:
        group = edit(group, "viewer:x:101:", "viewer:x:101:carol")
    if "operator" in groups:
        group = edit(group, "operator:x:102:alice", "operator:x:102:alice,carol")
    return Texts(PASSWD_TEXT + f"carol:x:{uid}:100:Carol::/bin/false\n",
                 SHADOW_TEXT + "carol:HASH:TODAY:0:99999:7:0::\n", group)


@both_methods
def test_user_is_added_with_digest_entry_and_announced(member: str, uid: tuple[int, ...],
                                                       stage: Stage) -> None:
    assert stage.call(member, *CAROL, *uid) == stage.announced(CAROL_DIGEST)

    assert read_texts() == with_carol()
    assert is_hash_of(stored_hash("carol"), NEW)
    assert stage.bus.call("GetUser", "s", "carol") == (
        True, "users", ["viewer", "operator"], "Carol", 1002)


@pytest.mark.parametrize("member, uid", [("AddUser", ()), ("AddUidUser", (5000,))],
                         ids=["AddUser", "AddUidUser"])
def test_added_user_is_there_after_a_restart(member: str, uid: tuple[int, ...],
                                             stage: Stage) -> None:
    stage.succeed(member, *CAROL, *uid)
    before = stage.memory()

    stage.restart()

    assert stage.memory() == before
    assert read_texts() == with_carol(*uid)


def test_modes_of_the_files_are_kept_while_their_owner_becomes_the_service(stage: Stage) -> None:
    modes = {PASSWD: 0o604, SHADOW: 0o600, GROUP: 0o640}
    for path, mode in modes.items():
        os.chown(path, 1, 42)
        path.chmod(mode)

    stage.succeed("AddUser", *CAROL)

    for path, mode in modes.items():
        seen = path.stat()
        assert (seen.st_mode & 0o7777, seen.st_uid, seen.st_gid) == (mode, 0, 0), path
    assert not list(Path("/etc").glob("*.tmp"))


def test_asked_uid_is_given(stage: Stage) -> None:
    effects = stage.call("AddUidUser", *CAROL, 5000)

    assert effects == stage.announced(CAROL_DIGEST)
    assert read_texts() == with_carol(uid=5000)


@pytest.mark.parametrize("uid", [1002, 60000])
def test_uid_at_the_limit_is_given(uid: int, stage: Stage) -> None:
    stage.succeed("AddUidUser", *CAROL, uid)

    assert stage.bus.call("GetUser", "s", "carol")[4] == uid


@pytest.mark.parametrize("uid", [0, 1, 500, 999, 60001, 65534, -2, -5, 2**31 - 1, -2**31])
def test_uid_outside_the_range_is_refused(uid: int, stage: Stage) -> None:
    stage.assert_unmoved(
        refused("usermgmt", 17, "Failed to add user 'carol', invalid UID"),
        "AddUidUser", *CAROL, uid)


def test_uid_in_use_is_refused(stage: Stage) -> None:
    stage.assert_unmoved(
        refused("usermgmt", 17, "Failed to add user 'carol', specified UID is unavailable"),
        "AddUidUser", *CAROL, 1001)


@pytest.mark.parametrize("joined, groups", [
    ("", []),
    ("viewer", ["viewer"]),
    ("operator:viewer", ["viewer", "operator"]),
    ("viewer:viewer", ["viewer"]),
    ("users", []),
    ("users:viewer", ["viewer"]),
])
def test_secondary_groups_are_split_at_colons(joined: str, groups: list[str],
                                              stage: Stage) -> None:
    assert stage.call("AddUser", "carol", NEW, "users", joined, "Carol") == stage.announced(
        CAROL_DIGEST)

    assert stage.bus.call("GetUser", "s", "carol")[2] == groups
    assert read_texts() == with_carol(groups=tuple(groups))


def test_group_named_very_often_is_joined_once(stage: Stage) -> None:
    stage.succeed("AddUser", "carol", NEW, "users", ":".join(["viewer"] * 150_000), "Carol")

    assert read_texts() == with_carol(groups=("viewer",))


def test_absent_comment_is_an_empty_field(stage: Stage) -> None:
    stage.succeed("AddUser", "carol", NEW, "users", "", "")

    assert read_texts().passwd == PASSWD_TEXT + "carol:x:1002:100:::/bin/false\n"
    assert stage.bus.call("GetUser", "s", "carol") == (True, "users", [], "", 1002)


def test_comment_is_told_as_it_was_given_and_written_on_one_line(stage: Stage) -> None:
    comment = "Carol: 猫\nroot::0:0::/:/bin/sh"

    stage.succeed("AddUser", "carol", NEW, "users", "", comment)

    assert read_texts().passwd == (
        PASSWD_TEXT + "carol:x:1002:100:Carol  猫 root  0 0  / /bin/sh::/bin/false\n")
    assert stage.bus.call("GetUser", "s", "carol")[3] == comment


@pytest.mark.parametrize("password", [
    MARK, f" {MARK} ", f"{MARK}:%s\\", f"{MARK}猫Ω", f"{MARK}\n\t\x7f", MARK.ljust(64, "x")],
    ids=["plain", "blanks", "colon", "UTF-8", "controls", "64 bytes"])
def test_digest_library_gets_the_password_as_it_came(password: str, stage: Stage) -> None:
    effects = stage.call("AddUser", "carol", password, "users", "", "")

    assert effects == stage.announced(("digest_entry_set", "carol", password, "0"))
    assert is_hash_of(stored_hash("carol"), password)
    assert stage.bus.call("AuthUserBasic", "ss", "carol", password) == ()


def test_account_stands_in_the_files_when_the_digest_library_is_called(
        stage: Stage, tmp_path: Path) -> None:
    stage.digest.before_answering(f"cp /etc/passwd /etc/shadow /etc/group {tmp_path}")

    stage.succeed("AddUser", *CAROL)

    for file in (PASSWD, SHADOW, GROUP):
        assert (tmp_path / file.name).read_bytes() == file.read_bytes()


@both_methods
@pytest.mark.parametrize("number", [1, 5, -3, 2**31 - 1, -2**31])
def test_failing_digest_entry_takes_the_account_back(member: str, uid: tuple[int, ...],
                                                     number: int, stage: Stage) -> None:
    stage.digest.fail(number)
    memory = stage.memory()
    before = [file.read_bytes() for file in (PASSWD, SHADOW, GROUP)]

    effects = stage.call(member, *CAROL, *uid)

    text = f"Failed to add digest info for 'carol' (Err {number})"
    assert effects == Effects(domain_error("privaneSystemError", 24, text), ["error"],
                              [CAROL_DIGEST], output=[f"warning: {text}"])
    assert [file.read_bytes() for file in (PASSWD, SHADOW, GROUP)] == before
    assert stage.memory() == memory
    stage.restart()
    assert stage.memory() == memory


def test_user_can_be_added_after_one_was_taken_back(stage: Stage) -> None:
    stage.digest.fail(1)
    error_of(stage.bus.call, "AddUser", "sssss", *CAROL)
    stage.digest.fail(0)

    assert stage.call("AddUser", *CAROL) == stage.announced(CAROL_DIGEST)
    assert read_texts() == with_carol()


def test_account_that_cannot_be_taken_back_is_told(stage: Stage) -> None:
    stage.digest.fail(5)
    memory = stage.memory()
    # A folder in the place of the temporary file makes every later write fail.
    stage.digest.before_answering("mkdir /etc/passwd.tmp")
    try:
        effects = stage.call("AddUser", *CAROL)
    finally:
        Path("/etc/passwd.tmp").rmdir()

    text = "Failed to add digest info for 'carol' (Err 5)"
    assert effects == Effects(
        domain_error("privaneSystemError", 24, f"Could not cleanup user 'carol' {text}"),
        ["error"], [CAROL_DIGEST], output=[f"warning: {text}"])
    # The files keep the account, and the database is the one that was read at the start.
    assert read_texts() == with_carol()
    assert stage.memory() == memory


def test_account_that_cannot_be_written_gets_no_digest_entry(stage: Stage) -> None:
    folder = Path("/etc/passwd.tmp")
    folder.mkdir()
    try:
        effects = stage.call("AddUser", *CAROL)
    finally:
        folder.rmdir()

    expected = refused(
        "corefile", 101, "Failed to add user 'carol', unable to sync core files, failed to write "
        "1/3 core file(s) passwd: could not fopen/fileno temporary file '/etc/passwd.tmp': "
        "Is a directory")
    assert effects == expected
    assert read_texts() == Texts()
    assert stage.bus.call("CheckUser", "s", "carol") == (False,)


@both_methods
@pytest.mark.parametrize("arguments, code, text", [
    (("alice", NEW, "users", "", ""), 6, "Failed to add user 'alice', user already exists"),
    (("root", NEW, "users", "", ""), 6, "Failed to add user 'root', user already exists"),
    (("", NEW, "users", "", ""), 17, "Failed to add user '', usernames must match"),
    (("carol", NEW, "", "", ""), 4, "Failed to add user 'carol', no primary group specified"),
    (("carol", NEW, "nosuch", "", ""), 4,
     "Failed to add user 'carol', primary group 'nosuch' does not exist"),
    (("carol", NEW, "users", "viewer:nosuch", ""), 4,
     "Failed to add user 'carol', secondary group 'nosuch' does not exist"),
    (("carol", NEW, "users", "viewer::operator", ""), 4,
     "Failed to add user 'carol', secondary group '' does not exist"),
    (("carol", NEW, "users", ":", ""), 4,
     "Failed to add user 'carol', secondary group '' does not exist"),
    (("carol", NEW, "users", ":viewer", ""), 4,
     "Failed to add user 'carol', secondary group '' does not exist"),
    (("carol", NEW, "users", "viewer:", ""), 4,
     "Failed to add user 'carol', secondary group '' does not exist"),
    (("carol", NEW, "users", "viewer,operator", ""), 4,
     "Failed to add user 'carol', secondary group 'viewer,operator' does not exist"),
    (("carol", "", "users", "", ""), 10, "Failed to add user 'carol', missing password"),
    (("carol", MARK.ljust(65, "x"), "users", "", ""), 10,
     "Failed to add user 'carol', password too long, max allowed length is 64 characters"),
    (("a2345678901234x", NEW, "users", "", ""), 3, "Failed to add user 'a2345678901234x', "
     "username too long, max allowed length is 14 characters"),
])
def test_refusal_leaves_everything_as_it_was(
        member: str, uid: tuple[int, ...], arguments: tuple[str, ...], code: int, text: str,
        stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, text), member, *arguments, *uid)


@pytest.mark.parametrize("name", [
    " root", "root ", "+x", "-x", "#x", "a,b", "a:b", "a\nb", "a\tb", "john.doe", "k\u00e4the",
    "猫", "../x", "a%sb", "a'b"])
def test_name_that_could_harm_the_files_is_refused(name: str, stage: Stage) -> None:
    text = f"Failed to add user '{name}', username contains invalid characters"
    expected = refused("usermgmt", 3, text)
    # What ends a line or drives a terminal goes into the log as an escape.
    shown = text.replace("\n", "\\x0A").replace("\t", "\\x09")
    expected.output = [f"warning: {shown}"]

    stage.assert_unmoved(expected, "AddUser", name, NEW, "users", "", "")


def test_name_of_fourteen_characters_is_accepted(stage: Stage) -> None:
    stage.succeed("AddUser", "a2345678901234", NEW, "users", "", "")

    assert stage.bus.call("CheckUser", "s", "a2345678901234") == (True,)


HUGE = "x" * (1 << 20)


@pytest.mark.parametrize("arguments, code, reason", [
    ((HUGE, NEW, "users", "", ""), 3, "username too long, max allowed length is 14 characters"),
    (("carol", MARK + HUGE, "users", "", ""), 10,
     "password too long, max allowed length is 64 characters"),
    (("carol", NEW, HUGE, "", ""), 4, f"primary group '{HUGE}' does not exist"),
    (("carol", NEW, "users", HUGE, ""), 4, f"secondary group '{HUGE}' does not exist"),
    (("carol", NEW, "users", ":" * (1 << 20), ""), 4, "secondary group '' does not exist"),
], ids=["name", "password", "group", "groups", "colons"])
def test_argument_of_a_mebibyte_is_refused(arguments: tuple[str, ...], code: int, reason: str,
                                           stage: Stage) -> None:
    before = stage.memory()

    effects = stage.call("AddUser", *arguments)

    assert effects.answer == domain_error(
        "usermgmt", code, f"Failed to add user '{arguments[0]}', {reason}")
    assert (effects.messages, effects.calls, effects.signals, effects.syslog) == (
        ["error"], [], set(), [])
    assert len(effects.output) == 1 and len(effects.output[0]) < 5000
    assert (stage.memory(), read_texts()) == (before, Texts())


def test_comment_of_a_mebibyte_survives_a_restart(stage: Stage) -> None:
    stage.succeed("AddUser", "carol", NEW, "users", "", HUGE)

    stage.restart()

    assert stage.bus.call("GetUser", "s", "carol")[3] == HUGE


def test_hundred_and_first_user_needs_a_uid_of_its_own(stage: Stage,
                                                      accounts: AccountFiles) -> None:
    stage.stop()
    names = [f"user{number}" for number in range(98)]
    accounts.write_exactly(
        PASSWD_TEXT + "".join(f"{name}:x:{2000 + i}:100:::/bin/false\n"
                              for i, name in enumerate(names)),
        SHADOW_TEXT + "".join(f"{name}:{OLD_HASH}:19000:0:99999:7:0::\n" for name in names),
        GROUP_TEXT)
    stage.start()

    stage.assert_unmoved(
        refused("usermgmt", 13, "Failed to add user 'carol', Max number of ORNET users exceeded "
                "(max=100, current=100)"), "AddUser", *CAROL)
    assert stage.call("AddUidUser", *CAROL, 5000) == stage.announced(CAROL_DIGEST)
