"""tests/bus/test_odd_databases.py: changes for which the database has no room, or a record less."""
from pathlib import Path
from typing import Any

import pytest

from harness.accounts import PASSWD, SHADOW, AccountFiles
from harness.bus import domain_error, error_of
from harness.changing_accounts import (GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit,
                                       read_texts)
from harness.passwords import NEW, OLD, OLD_HASH, is_hash_of
from harness.stage import LOG_ERR, Stage, refused


@pytest.mark.parametrize("name, uid, arguments, reason", [
    ("bob", 60000, ("AddUser", "carol", NEW, "users", "", ""), "ornet range (1000 - 60000)"),
    ("timer", 500, ("AddSystemUser", "ftpd", NEW, "users", [], "", ""),
     "dynamic system range (500 - 999)"),
])
def test_range_without_a_uid_beyond_those_in_use(name: str, uid: int, arguments: tuple[Any, ...],
                                                 reason: str, stage: Stage,
                                                 accounts: AccountFiles) -> None:
    stage.stop()
    old = {"bob": "bob:x:1001:", "timer": "timer:x:998:998"}[name]
    accounts.write_exactly(edit(PASSWD_TEXT, old, old.replace(old.split(":")[2], str(uid), 1)),
                           SHADOW_TEXT, GROUP_TEXT)
    stage.start()

    stage.assert_unmoved(
        refused("usermgmt", 13, f"Failed to add user '{arguments[1]}', No more available UIDs in "
                f"the {reason}"), *arguments)


def test_hundredth_user_gets_a_uid(stage: Stage, accounts: AccountFiles) -> None:
    stage.stop()
    names = [f"user{number}" for number in range(97)]
    accounts.write_exactly(
        PASSWD_TEXT + "".join(f"{name}:x:{2000 + i}:100:::/bin/false\n"
                              for i, name in enumerate(names)),
        SHADOW_TEXT + "".join(f"{name}:{OLD_HASH}:19000:0:99999:7:0::\n" for name in names),
        GROUP_TEXT)
    stage.start()

    stage.succeed("AddUser", "carol", NEW, "users", "", "")

    assert stage.bus.call("GetUser", "s", "carol")[4] == 2097


def field_of(name: str) -> str:
    """The password field of the passwd file."""
    (found,) = [line.split(":")[1] for line in PASSWD.read_text().splitlines()
                if line.startswith(f"{name}:")]
    return found


def test_without_a_shadow_file_no_user_can_be_added(stage: Stage, accounts: AccountFiles) -> None:
    stage.stop()
    passwd = PASSWD_TEXT.replace(":x:", f":{OLD_HASH}:")
    accounts.write_exactly(passwd, None, GROUP_TEXT)
    stage.start()
    memory = stage.memory()

    assert stage.call("AddSystemUser", "ftpd", NEW, "users", [], "", "") == refused(
        "corefile", 101, "Failed to add user 'ftpd', unable to sync core files, failed to write "
        "1/3 core file(s) shadow: could not stat() core file at '/etc/shadow': "
        "No such file or directory")

    assert PASSWD.read_text() == passwd
    assert not SHADOW.exists() and not list(Path("/etc").glob("*.tmp"))
    assert stage.bus.call("CheckUser", "s", "ftpd") == (False,)
    assert stage.memory()[0] == memory[0]
    assert stage.call("AuthUserBasic", "alice", OLD) == stage.done()


def test_hash_stays_in_the_file_in_which_it_stood(stage: Stage, accounts: AccountFiles) -> None:
    stage.stop()
    accounts.write_exactly(edit(PASSWD_TEXT, "timer:x:", f"timer:{OLD_HASH}:"),
                           edit(SHADOW_TEXT, f"timer:{OLD_HASH}:19000:0:99999:7:0::\n", ""),
                           GROUP_TEXT)
    stage.start()

    stage.succeed("ModifyUser", "timer", "", "viewer", ["operator"], "/bin/sh", "Clock")
    assert field_of("timer") == OLD_HASH
    stage.succeed("ChpasswdUser", "timer", NEW)

    assert is_hash_of(field_of("timer"), NEW)
    assert "timer" not in SHADOW.read_text()
    assert stage.call("AuthUserBasic", "timer", NEW) == stage.done()


WITHOUT_GROUP = Texts(group=edit(GROUP_TEXT, "timer:x:998:\n", ""))


@pytest.fixture
def groupless(stage: Stage) -> Stage:
    """The group of timer, who is not listed in it, is gone."""
    stage.succeed("RemoveGroup", "timer")
    return stage


def test_user_without_a_group_cannot_be_told(groupless: Stage) -> None:
    assert error_of(groupless.bus.call, "GetUser", "s", "timer") == domain_error(
        "usermgmt", 16, "Could not retrieve user 'timer', no corresponding group for GID '998'")


def test_user_without_a_group_keeps_its_other_rights(groupless: Stage) -> None:
    assert groupless.call("ChpasswdUser", "timer", NEW) == groupless.done()
    assert groupless.call("AuthUserBasic", "timer", NEW) == groupless.done()
    assert groupless.call("RemoveUser", "timer") == groupless.done(pidof_run=True)


def test_user_without_a_group_gets_no_other_one(groupless: Stage) -> None:
    expected = refused("usermgmt", 16, "Failed to modify user 'timer', primary group (998) for "
                       "user does not exist!!")
    expected.syslog = [(LOG_ERR,
                        "Mis-match in user/group DB! (Pri grp '998' missing for 'timer')")]

    assert groupless.call("ModifyUser", "timer", "", "viewer", [], "", "") == expected

    assert read_texts() == WITHOUT_GROUP
    # All that was read at the start is back in memory.
    assert groupless.bus.call("GetUser", "s", "timer")[1] == "timer"


@pytest.mark.parametrize("call", [("ModifyUser", "timer", "", "", ["viewer"], "", ""),
                                  ("ClearUserFields", "timer", False, True, False)],
                         ids=lambda call: call[0])
def test_user_without_a_group_gets_no_secondary_one(call: tuple[Any, ...],
                                                    groupless: Stage) -> None:
    assert groupless.call(*call) == refused(
        "usermgmt", 4, "Failed to modify user 'timer', could not get primary group!")

    assert read_texts() == WITHOUT_GROUP
