"""tests/bus/test_remove_user.py: RemoveUser."""
from pathlib import Path

import pytest

from harness.bus import domain_error
from harness.changing_accounts import (GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit,
                                       read_texts)
from harness.passwords import NEW, OLD_HASH
from harness.stage import Effects, Stage, refused

ALICE_DIGEST = ("digest_entry_delete", "alice", "0")

WITHOUT_ALICE = Texts(
    edit(PASSWD_TEXT, "alice:x:1000:100:Alice Liddell:/home/alice:/bin/false\n", ""),
    edit(SHADOW_TEXT, f"alice:{OLD_HASH}:19000:0:99999:7:0::\n", ""),
    edit(edit(GROUP_TEXT, "users:x:100:alice", "users:x:100:"),
         "operator:x:102:alice", "operator:x:102:"))

WITHOUT_TIMER = Texts(
    edit(PASSWD_TEXT, "timer:x:998:998:Keeps time:/var/lib/timer:/usr/sbin/nologin\n", ""),
    edit(SHADOW_TEXT, f"timer:{OLD_HASH}:19000:0:99999:7:0::\n", ""),
    edit(GROUP_TEXT, "admin:x:103:timer", "admin:x:103:"))


def test_user_of_the_web_goes_with_its_digest_entry_and_everybody_learns_of_it(
        stage: Stage) -> None:
    assert stage.call("RemoveUser", "alice") == stage.announced(ALICE_DIGEST)

    assert read_texts() == WITHOUT_ALICE
    assert stage.bus.call("CheckUser", "s", "alice") == (False,)


def test_system_user_goes_and_only_cfgstore_learns_of_it(stage: Stage) -> None:
    assert stage.call("RemoveUser", "timer") == stage.done(pidof_run=True)

    assert read_texts() == WITHOUT_TIMER


def test_removed_user_stays_away_after_a_restart(stage: Stage) -> None:
    stage.succeed("RemoveUser", "alice")
    before = stage.memory()

    stage.restart()

    assert stage.memory() == before
    assert read_texts() == WITHOUT_ALICE


def test_removed_user_can_be_added_again(stage: Stage) -> None:
    stage.succeed("RemoveUser", "bob")
    stage.succeed("AddUser", "bob", NEW, "users", "", "")

    # The highest UID in use is alice's.
    assert stage.bus.call("GetUser", "s", "bob") == (True, "users", [], "", 1001)


@pytest.mark.parametrize("number", [1, 7, -3])
def test_failing_digest_library_leaves_the_user_deleted_and_unannounced(number: int,
                                                                        stage: Stage) -> None:
    stage.digest.fail(number)

    effects = stage.call("RemoveUser", "alice")

    text = f"Failed to delete digest info for 'alice' (Err {number})"
    assert effects == Effects(domain_error("privaneSystemError", 24, text), ["error"],
                              [ALICE_DIGEST], output=[f"warning: {text}"])
    assert read_texts() == WITHOUT_ALICE
    assert stage.bus.call("CheckUser", "s", "alice") == (False,)


def test_failing_digest_library_has_no_say_over_a_system_user(stage: Stage) -> None:
    stage.digest.fail(5)

    assert stage.call("RemoveUser", "timer") == stage.done(pidof_run=True)


def test_user_is_gone_from_the_files_when_the_digest_library_is_called(stage: Stage,
                                                                       tmp_path: Path) -> None:
    stage.digest.before_answering(f"cp /etc/passwd {tmp_path}/passwd")

    stage.succeed("RemoveUser", "alice")

    assert (tmp_path / "passwd").read_text() == WITHOUT_ALICE.passwd


UNKNOWN_TYPE = "User deletion failed, user type could not be determined"


@pytest.mark.parametrize("name", ["nosuch", "", " root", "+x", "#x", "a,b", "alice\n", "Alice",
                                  "x" * (1 << 20)],
                         ids=lambda name: repr(name[:10]))
def test_unknown_user_has_no_type(name: str, stage: Stage) -> None:
    stage.assert_unmoved(refused("privaneSystemError", 14, UNKNOWN_TYPE), "RemoveUser", name)


@pytest.mark.parametrize("name, shown_type", [
    ("root", "root"), ("daemon", "permanent"), ("anonymous", "permanent"), ("nobody", "nobody")])
def test_type_that_may_not_be_deleted(name: str, shown_type: str, stage: Stage) -> None:
    stage.assert_unmoved(
        refused("usermgmt", 11, f"Failed to delete user '{name}', cannot delete '{name}' with user "
                f"type '{shown_type}'"), "RemoveUser", name)


def test_user_that_cannot_be_written_away_keeps_its_digest_entry(stage: Stage) -> None:
    memory = stage.memory()
    folder = Path("/etc/group.tmp")
    folder.mkdir()
    try:
        effects = stage.call("RemoveUser", "alice")
    finally:
        folder.rmdir()

    assert effects == refused(
        "corefile", 101, "Failed to delete user 'alice', unable to sync core files, failed to "
        "write 1/3 core file(s) group: could not fopen/fileno temporary file '/etc/group.tmp': "
        "Is a directory")
    assert read_texts() == Texts()
    assert stage.memory() == memory
    assert stage.call("RemoveUser", "alice") == stage.announced(ALICE_DIGEST)
