"""tests/bus/test_add_system_user.py: AddSystemUser."""
from pathlib import Path

import pytest

from harness.changing_accounts import (GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit,
                                       read_texts, stored_hash)
from harness.passwords import MARK, NEW, is_hash_of
from harness.stage import PIDOF_CALL, Stage, refused

FTPD = ("ftpd", NEW, "users", ["viewer", "operator"], "/bin/sh", "File server")

WITH_FTPD = Texts(
    PASSWD_TEXT + "ftpd:x:997:100:File server::/bin/sh\n",
    SHADOW_TEXT + "ftpd:HASH:TODAY:0:99999:7:0::\n",
    edit(edit(edit(GROUP_TEXT, "users:x:100:alice", "users:x:100:alice,ftpd"),
              "viewer:x:101:", "viewer:x:101:ftpd"),
         "operator:x:102:alice", "operator:x:102:alice,ftpd"))


def test_user_is_added_and_only_cfgstore_learns_of_it(stage: Stage) -> None:
    assert stage.call("AddSystemUser", *FTPD) == stage.done(pidof_run=True)

    assert read_texts() == WITH_FTPD
    assert is_hash_of(stored_hash("ftpd"), NEW)
    assert stage.bus.call("GetUser", "s", "ftpd") == (
        True, "users", ["viewer", "operator"], "File server", 997)


def test_added_user_is_there_after_a_restart(stage: Stage) -> None:
    stage.succeed("AddSystemUser", *FTPD)
    before = stage.memory()

    stage.restart()

    assert stage.memory() == before
    assert read_texts() == WITH_FTPD


def test_failing_digest_library_has_no_say(stage: Stage) -> None:
    stage.digest.fail(5)

    assert stage.call("AddSystemUser", *FTPD) == stage.done(pidof_run=True)


def test_empty_values_are_absent_ones(stage: Stage) -> None:
    stage.succeed("AddSystemUser", "ftpd", "", "users", [], "", "")

    assert read_texts() == Texts(
        PASSWD_TEXT + "ftpd:x:997:100:::/bin/false\n",
        SHADOW_TEXT + "ftpd:*:0:0:99999:7:0::\n",
        edit(GROUP_TEXT, "users:x:100:alice", "users:x:100:alice,ftpd"))
    assert stage.bus.call("GetUser", "s", "ftpd") == (False, "users", [], "", 997)


@pytest.mark.parametrize("name", ["a.b", "sshd_x", "a-b", "x" * 32, "käthe", "ftpd "])
def test_name_has_no_rules_of_its_own(name: str, stage: Stage) -> None:
    stage.succeed("AddSystemUser", name, NEW, "users", ["viewer"], "", "")
    before = stage.memory()

    stage.restart()

    assert stage.memory() == before
    assert stage.bus.call("GetUser", "s", name) == (True, "users", ["viewer"], "", 997)


def test_each_user_gets_the_next_lower_uid(stage: Stage) -> None:
    for name in ("ftpd", "ntpd"):
        stage.succeed("AddSystemUser", name, NEW, "users", [], "", "")

    assert [stage.bus.call("GetUser", "s", name)[4] for name in ("ftpd", "ntpd")] == [997, 996]


@pytest.mark.parametrize("arguments, code, text", [
    (("timer", NEW, "users", [], "", ""), 6, "Failed to add user 'timer', user already exists"),
    (("", NEW, "users", [], "", ""), 17, "Failed to add user '', usernames must match"),
    (("ftpd", NEW, "", [], "", ""), 4, "Failed to add user 'ftpd', no primary group specified"),
    (("ftpd", NEW, "nosuch", [], "", ""), 4,
     "Failed to add user 'ftpd', primary group 'nosuch' does not exist"),
    (("ftpd", NEW, "users", ["viewer", "nosuch"], "", ""), 4,
     "Failed to add user 'ftpd', secondary group 'nosuch' does not exist"),
    (("ftpd", NEW, "users", [""], "", ""), 4,
     "Failed to add user 'ftpd', secondary group '' does not exist"),
    (("ftpd", NEW, "users", ["viewer:operator"], "", ""), 4,
     "Failed to add user 'ftpd', secondary group 'viewer:operator' does not exist"),
    (("ftpd", MARK.ljust(512, "x"), "users", [], "", ""), 16,
     "Failed to add user 'ftpd', crypt() failed, Numerical result out of range"),
    (("ftpd", MARK.ljust(1 << 20, "x"), "users", [], "", ""), 16,
     "Failed to add user 'ftpd', crypt() failed, Numerical result out of range"),
])
def test_refusal_leaves_everything_as_it_was(arguments: tuple[object, ...], code: int, text: str,
                                             stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, text), "AddSystemUser", *arguments)


def unwritable(name: str, file: str, index: int) -> str:
    return (f"Failed to add user '{name}', unable to sync core files, failed to write 1/3 core "
            f"file(s) {file}: could not write entry #{index} to /etc/{file}.tmp: Invalid argument")


@pytest.mark.parametrize("name, file, index", [
    (" root", "passwd", 7),
    ("\troot", "passwd", 7),
    ("+x", "passwd", 7),
    ("-x", "passwd", 7),
    ("#x", "passwd", 7),
    ("a:b", "passwd", 7),
    ("a\nb", "passwd", 7),
    ("ftpd\nevil::0:0:::", "passwd", 7),
    # The third group, users, would be the first to list it.
    ("a,b", "group", 2),
])
def test_name_that_would_not_survive_the_files_is_refused(name: str, file: str, index: int,
                                                          stage: Stage) -> None:
    text = unwritable(name, file, index)
    expected = refused("corefile", 101, text)
    shown = text.replace("\n", "\\x0A").replace("\t", "\\x09")
    expected.output = [f"warning: {shown}"]

    stage.assert_unmoved(expected, "AddSystemUser", name, NEW, "users", ["viewer"], "", "")


@pytest.mark.parametrize("shell", ["/bin/sh:x", "/bin/sh\nevil::0:0:::/bin/sh"])
def test_shell_that_would_not_survive_the_files_is_refused(shell: str, stage: Stage) -> None:
    stage.assert_unmoved(refused("corefile", 101, unwritable("ftpd", "passwd", 7)),
                         "AddSystemUser", "ftpd", NEW, "users", [], shell, "")


def test_later_write_is_not_harmed_by_a_refused_name(stage: Stage) -> None:
    for name in ("a,b", " root", "#x"):
        stage.call("AddSystemUser", name, NEW, "users", ["viewer"], "", "")

    assert stage.call("AddSystemUser", *FTPD) == stage.done(pidof_run=True)
    assert read_texts() == WITH_FTPD


def test_pidof_is_run_after_the_account_was_written(stage: Stage, tmp_path: Path) -> None:
    stage.pidof.before_answering(f"cp /etc/passwd {tmp_path}/passwd")

    assert stage.succeed("AddSystemUser", *FTPD).calls == [PIDOF_CALL]
    assert (tmp_path / "passwd").read_text() == WITH_FTPD.passwd
