"""tests/bus/test_group_changes.py: AddGroup and RemoveGroup."""
from pathlib import Path

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.changing_accounts import GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit, read_texts
from harness.stage import LOG_ERR, Stage, refused
from harness.world import file_state


def test_group_is_added_and_nobody_learns_of_it(stage: Stage) -> None:
    assert stage.call("AddGroup", "guests") == stage.done()

    assert read_texts() == Texts(group=GROUP_TEXT + "guests::997:\n")
    assert stage.bus.call("GetGroup", "s", "guests") == (997, [])


def test_only_the_group_file_is_written(stage: Stage) -> None:
    before = [file_state(file) for file in (PASSWD, SHADOW)]
    mode = GROUP.stat().st_mode

    stage.succeed("AddGroup", "guests")
    stage.succeed("RemoveGroup", "recorder")

    assert [file_state(file) for file in (PASSWD, SHADOW)] == before
    assert GROUP.stat().st_mode == mode


@pytest.mark.parametrize("name", ["audio", "web_admins", "a.b-c", "host$", "_x", "@x", ".x", "0",
                                  "x" * 200])
def test_name_that_is_accepted(name: str, stage: Stage) -> None:
    assert stage.call("AddGroup", name) == stage.done()
    before = stage.memory()

    stage.restart()

    assert stage.memory() == before
    assert stage.bus.call("GetGroup", "s", name) == (997, [])


INVALID = "group name contains invalid characters"


@pytest.mark.parametrize("name, code, reason", [
    ("users", 7, "group already exists"),
    ("root", 7, "group already exists"),
    ("", 4, "group name must have at least one character"),
    ("-x", 4, "group name cannot begin with '-'"),
    ("-", 4, "group name cannot begin with '-'"),
    ("$host", 4, INVALID),
    ("a$b", 4, INVALID),
    ("a b", 4, INVALID),
    (" root", 4, INVALID),
    ("+x", 4, INVALID),
    ("#x", 4, INVALID),
    ("a,b", 4, INVALID),
    ("a:b", 4, INVALID),
    ("mäuse", 4, INVALID),
    ("a%sb", 4, INVALID),
])
def test_name_that_is_refused(name: str, code: int, reason: str, stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, f"Failed to add group '{name}', {reason}"),
                         "AddGroup", name)


@pytest.mark.parametrize("name, shown", [("a\nb", "a\\x0Ab"), ("a\tb", "a\\x09b")])
def test_name_with_controls_is_refused_and_shown_as_an_escape(name: str, shown: str,
                                                              stage: Stage) -> None:
    expected = refused("usermgmt", 4, f"Failed to add group '{name}', {INVALID}")
    expected.output = [f"warning: Failed to add group '{shown}', {INVALID}"]

    stage.assert_unmoved(expected, "AddGroup", name)


def test_no_gid_below_the_lowest_is_left(stage: Stage, accounts: AccountFiles) -> None:
    stage.stop()
    accounts.write_exactly(PASSWD_TEXT, SHADOW_TEXT, GROUP_TEXT + "last:x:500:\n")
    stage.start()

    stage.assert_unmoved(
        refused("usermgmt", 14, "Failed to add group 'guests', No more available GIDs in the "
                "dynamic system range (500 - 999)"), "AddGroup", "guests")


def test_added_group_can_be_joined_and_removed(stage: Stage) -> None:
    stage.succeed("AddGroup", "guests")
    stage.succeed("ModifyUser", "alice", "", "", ["guests"], "", "")
    assert stage.bus.call("GetGroup", "s", "guests") == (997, ["alice"])

    assert stage.call("RemoveGroup", "guests") == stage.done()

    assert read_texts() == Texts(group=edit(GROUP_TEXT, "operator:x:102:alice", "operator:x:102:"))
    assert stage.bus.call("GetUser", "s", "alice")[2] == []


@pytest.mark.parametrize("name, line", [("timer", "timer:x:998:\n"),
                                        ("recorder", "recorder:x:60005:\n")])
def test_group_is_removed_and_nobody_learns_of_it(name: str, line: str, stage: Stage) -> None:
    # timer is the primary group of a user whom it does not list.
    assert stage.call("RemoveGroup", name) == stage.done()

    assert read_texts() == Texts(group=edit(GROUP_TEXT, line, ""))
    assert stage.bus.call("CheckGroup", "s", name) == (False,)


def test_removed_group_stays_away_after_a_restart(stage: Stage) -> None:
    stage.succeed("RemoveGroup", "recorder")
    before = stage.memory()

    stage.restart()

    assert stage.memory() == before


@pytest.mark.parametrize("name, code, reason", [
    ("nosuch", 7, "group does not exist"),
    ("", 7, "group does not exist"),
    (" root", 7, "group does not exist"),
    ("a,b", 7, "group does not exist"),
    ("root", 11, "group type 'root' with GID 0 cannot be deleted"),
    ("users", 11, "group type 'permanent system' with GID 100 cannot be deleted"),
    ("nogroup", 11, "group type 'nobody' with GID 65534 cannot be deleted"),
])
def test_group_that_cannot_be_removed(name: str, code: int, reason: str, stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, f"Failed to delete group '{name}', {reason}"),
                         "RemoveGroup", name)


@pytest.mark.parametrize("member", ["AddGroup", "RemoveGroup"])
def test_name_of_a_mebibyte(member: str, stage: Stage) -> None:
    name = " " + "x" * (1 << 20)
    before = stage.memory()

    effects = stage.call(member, name)

    expected = (refused("usermgmt", 4, f"Failed to add group '{name}', {INVALID}")
                if member == "AddGroup" else
                refused("usermgmt", 7, f"Failed to delete group '{name}', group does not exist"))
    assert effects.answer == expected.answer
    assert (effects.messages, effects.calls, effects.signals, effects.syslog) == (
        ["error"], [], set(), [])
    assert len(effects.output) == 1 and len(effects.output[0]) < 5000
    assert (stage.memory(), read_texts()) == (before, Texts())


def test_primary_group_of_a_listed_member_is_refused(stage: Stage, accounts: AccountFiles) -> None:
    stage.stop()
    accounts.write_exactly(PASSWD_TEXT, SHADOW_TEXT,
                           edit(GROUP_TEXT, "timer:x:998:", "timer:x:998:timer"))
    stage.start()

    stage.assert_unmoved(
        refused("usermgmt", 8, "Failed to delete group 'timer', primary group for user 'timer'"),
        "RemoveGroup", "timer")


def test_group_with_a_member_who_is_no_user_is_refused(stage: Stage,
                                                       accounts: AccountFiles) -> None:
    stage.stop()
    accounts.write_exactly(PASSWD_TEXT, SHADOW_TEXT,
                           edit(GROUP_TEXT, "recorder:x:60005:", "recorder:x:60005:ghost"))
    stage.start()
    expected = refused("usermgmt", 16,
                       "Failed to delete group 'recorder', user/group database out of sync")
    expected.syslog = [(LOG_ERR, "User/group DB mismatch (user 'ghost' not in grp 'recorder'!")]

    stage.assert_unmoved(expected, "RemoveGroup", "recorder")


@pytest.mark.parametrize("member, name, action", [("AddGroup", "guests", "add"),
                                                  ("RemoveGroup", "recorder", "delete")])
def test_group_file_that_cannot_be_written(member: str, name: str, action: str,
                                           stage: Stage) -> None:
    folder = Path("/etc/group.tmp")
    folder.mkdir()
    try:
        stage.assert_unmoved(
            refused("corefile", 101, f"Failed to {action} group '{name}', unable to sync core "
                    "files, failed to write 1/3 core file(s) group: could not fopen/fileno "
                    "temporary file '/etc/group.tmp': Is a directory"), member, name)
    finally:
        folder.rmdir()
    assert stage.call(member, name) == stage.done()
