"""tests/bus/test_modify_user.py: ModifyUser."""
from pathlib import Path
from typing import Any

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.bus import domain_error
from harness.changing_accounts import (GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit,
                                       read_texts, stored_hash)
from harness.passwords import MARK, NEW, OLD, OLD_HASH, is_hash_of
from harness.stage import ROOT_FLAG_CALLS, ROOT_FLAG_SET, Effects, Stage, refused
from harness.world import file_state

ANONYMOUS = "message: Updating anonymous user!"


def fields(name: str, password: str = "", group: str = "", groups: tuple[str, ...] = (),
           shell: str = "", comment: str = "") -> tuple[Any, ...]:
    """The arguments in their order."""
    return (name, password, group, groups, shell, comment)


def digest_set(name: str, password: str = NEW) -> tuple[str, ...]:
    return ("digest_entry_set", name, password, "0")


def digest_updated(name: str, shown_type: str) -> str:
    return f"message: Updated digest info {name} (usertype={shown_type})!"


def with_new_hash(name: str) -> str:
    return edit(SHADOW_TEXT, f"{name}:{OLD_HASH}:19000:", f"{name}:HASH:TODAY:")


def test_password_of_a_user_of_the_web(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("alice", NEW)) == stage.announced(
        digest_set("alice"), lines=(digest_updated("alice", "ornet"),))

    assert read_texts() == Texts(shadow=with_new_hash("alice"))
    assert is_hash_of(stored_hash("alice"), NEW)
    assert stage.bus.call("AuthUserBasic", "ss", "alice", NEW) == ()


def test_password_of_root(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("root", NEW)) == stage.announced(
        digest_set("root"), *ROOT_FLAG_CALLS,
        lines=(digest_updated("root", "root"), ROOT_FLAG_SET))

    assert read_texts() == Texts(shadow=with_new_hash("root"))
    assert is_hash_of(stored_hash("root"), NEW)


def test_password_of_a_system_user_is_no_matter_of_the_web(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("timer", NEW)) == stage.done(pidof_run=True)

    assert read_texts() == Texts(shadow=with_new_hash("timer"))
    assert is_hash_of(stored_hash("timer"), NEW)


def test_same_password_is_handed_to_the_web_server_once_more(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("alice", OLD)) == stage.announced(
        digest_set("alice", OLD), lines=(digest_updated("alice", "ornet"),))

    assert read_texts() == Texts()


@pytest.mark.parametrize("password", [f" {MARK} ", f"{MARK}:猫\n", MARK.ljust(64, "x")],
                         ids=["blanks", "odd", "64 bytes"])
def test_digest_library_gets_the_password_as_it_came(password: str, stage: Stage) -> None:
    assert stage.succeed("ModifyUser", *fields("bob", password)).calls[0] == digest_set(
        "bob", password)
    assert is_hash_of(stored_hash("bob"), password)


@pytest.mark.parametrize("name, effects", [("alice", "announced"), ("timer", "cfgstore")])
def test_nothing_given_changes_nothing_and_is_announced_by_type(name: str, effects: str,
                                                                stage: Stage) -> None:
    before = [file_state(file) for file in (PASSWD, SHADOW, GROUP)]

    assert stage.call("ModifyUser", *fields(name)) == stage.done(
        signal_sent=effects == "announced", pidof_run=True)

    assert [file_state(file) for file in (PASSWD, SHADOW, GROUP)] == before


def test_nothing_given_for_root_still_sets_the_flag(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("root")) == stage.announced(
        *ROOT_FLAG_CALLS, lines=(ROOT_FLAG_SET,))

    assert read_texts() == Texts()


@pytest.mark.parametrize("name", ["daemon", "nobody"])
def test_nothing_given_for_a_type_that_cannot_change_is_announced_to_nobody(
        name: str, stage: Stage) -> None:
    stage.assert_unmoved(stage.done(), "ModifyUser", *fields(name))


def test_comment(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("alice", comment="Al, room 2")) == stage.announced()

    assert read_texts() == Texts(passwd=edit(PASSWD_TEXT, "Alice Liddell", "Al, room 2"))
    assert stage.bus.call("GetUser", "s", "alice") == (
        True, "users", ["operator"], "Al, room 2", 1000)


def test_shell_of_a_system_user(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("timer", shell="/bin/sh")) == stage.done(pidof_run=True)

    assert read_texts() == Texts(passwd=edit(PASSWD_TEXT, "/var/lib/timer:/usr/sbin/nologin",
                                             "/var/lib/timer:/bin/sh"))


def test_primary_group(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("alice", group="viewer")) == stage.announced()

    assert read_texts() == Texts(
        passwd=edit(PASSWD_TEXT, "alice:x:1000:100:", "alice:x:1000:101:"),
        group=edit(edit(GROUP_TEXT, "users:x:100:alice", "users:x:100:"),
                   "viewer:x:101:", "viewer:x:101:alice"))
    assert stage.bus.call("GetUser", "s", "alice")[1:3] == ("viewer", ["operator"])


def test_secondary_groups(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("alice", groups=("viewer", "admin"))) == (
        stage.announced())

    assert read_texts() == Texts(group=edit(edit(edit(
        GROUP_TEXT, "viewer:x:101:", "viewer:x:101:alice"),
        "operator:x:102:alice", "operator:x:102:"), "admin:x:103:timer", "admin:x:103:alice,timer"))
    assert stage.bus.call("GetUser", "s", "alice")[2] == ["viewer", "admin"]


def test_primary_group_among_the_secondary_ones_stays_the_primary_one(stage: Stage) -> None:
    stage.succeed("ModifyUser", *fields("alice", groups=("users", "viewer")))

    assert read_texts() == Texts(group=edit(edit(
        GROUP_TEXT, "viewer:x:101:", "viewer:x:101:alice"),
        "operator:x:102:alice", "operator:x:102:"))
    assert stage.bus.call("GetUser", "s", "alice")[1:3] == ("users", ["viewer"])


def test_everything_at_once(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("timer", NEW, "viewer", ("operator",), "/bin/sh",
                                            "Clock")) == stage.done(pidof_run=True)

    assert read_texts() == Texts(
        edit(PASSWD_TEXT, "timer:x:998:998:Keeps time:/var/lib/timer:/usr/sbin/nologin",
             "timer:x:998:101:Clock:/var/lib/timer:/bin/sh"),
        with_new_hash("timer"),
        edit(edit(edit(GROUP_TEXT, "viewer:x:101:", "viewer:x:101:timer"),
                  "operator:x:102:alice", "operator:x:102:alice,timer"),
             "admin:x:103:timer", "admin:x:103:"))


def test_changed_user_is_the_same_after_a_restart(stage: Stage) -> None:
    stage.succeed("ModifyUser", *fields("timer", NEW, "viewer", ("operator",), "/bin/sh", "Clock"))
    before, texts = stage.memory(), read_texts()

    stage.restart()

    assert (stage.memory(), read_texts()) == (before, texts)


def test_groups_of_the_visitor_concern_everybody(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("anonymous", groups=("viewer",))) == (
        stage.announced(lines=(ANONYMOUS,)))

    assert read_texts() == Texts(group=edit(GROUP_TEXT, "viewer:x:101:", "viewer:x:101:anonymous"))


def test_password_and_shell_of_the_visitor_change_with_its_groups(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("anonymous", NEW, "", ("viewer",), "/bin/sh")) == (
        stage.announced(lines=(ANONYMOUS,)))

    assert read_texts() == Texts(
        edit(PASSWD_TEXT, "Visitor::/bin/false", "Visitor::/bin/sh"), with_new_hash("anonymous"),
        edit(GROUP_TEXT, "viewer:x:101:", "viewer:x:101:anonymous"))


def test_nothing_given_for_the_visitor_concerns_everybody(stage: Stage) -> None:
    assert stage.call("ModifyUser", *fields("anonymous")) == stage.announced(lines=(ANONYMOUS,))
    assert read_texts() == Texts()


@pytest.mark.parametrize("name", ["anonymous2", "Anonymous", "anonymou", "xanonymous"])
def test_name_like_the_visitor_s_is_another_user_s(name: str, stage: Stage) -> None:
    stage.succeed("AddSystemUser", name, NEW, "users", [], "", "")

    assert stage.call("ModifyUser", *fields(name, groups=("viewer",))) == stage.done(
        pidof_run=True)


@pytest.mark.parametrize("uid, calls, lines", [
    (999, (), ()),
    (1002, (digest_set("anonymous"),), (digest_updated("anonymous", "ornet"),)),
], ids=["dynamic system", "ornet"])
def test_visitor_of_another_type_concerns_everybody_too(
        uid: int, calls: tuple[tuple[str, ...], ...], lines: tuple[str, ...], stage: Stage,
        accounts: AccountFiles) -> None:
    stage.stop()
    accounts.write_exactly(edit(PASSWD_TEXT, "anonymous:x:300:", f"anonymous:x:{uid}:"),
                           SHADOW_TEXT, GROUP_TEXT)
    stage.start()

    assert stage.call("ModifyUser", *fields("anonymous", NEW)) == stage.announced(
        *calls, lines=(ANONYMOUS, *lines))


def test_failing_digest_library_leaves_the_change_and_announces_nothing(stage: Stage) -> None:
    stage.digest.fail(9)

    effects = stage.call("ModifyUser", *fields("alice", NEW, comment="Al"))

    text = "Failed to update digest info for 'alice' (Err 9)"
    assert effects == Effects(domain_error("privaneSystemError", 24, text), ["error"],
                              [digest_set("alice")], output=[f"warning: {text}"])
    assert read_texts() == Texts(edit(PASSWD_TEXT, "Alice Liddell", "Al"), with_new_hash("alice"))
    assert is_hash_of(stored_hash("alice"), NEW)
    assert stage.bus.call("GetUser", "s", "alice")[3] == "Al"


def test_failing_digest_library_keeps_the_flag_of_root_from_being_set(stage: Stage) -> None:
    stage.digest.fail(-1)

    effects = stage.call("ModifyUser", *fields("root", NEW))

    text = "Failed to update digest info for 'root' (Err -1)"
    assert effects == Effects(domain_error("privaneSystemError", 24, text), ["error"],
                              [digest_set("root")], output=[f"warning: {text}"])
    assert read_texts() == Texts(shadow=with_new_hash("root"))


def test_failing_digest_library_is_not_asked_without_a_password(stage: Stage) -> None:
    stage.digest.fail(9)

    assert stage.call("ModifyUser", *fields("alice", comment="Al")) == stage.announced()
    assert stage.call("ModifyUser", *fields("root")) == stage.announced(
        *ROOT_FLAG_CALLS, lines=(ROOT_FLAG_SET,))


def test_new_hash_stands_in_the_file_when_the_digest_library_is_called(stage: Stage,
                                                                       tmp_path: Path) -> None:
    stage.digest.before_answering(f"cp /etc/shadow {tmp_path}/shadow")

    stage.succeed("ModifyUser", *fields("alice", NEW))

    assert (tmp_path / "shadow").read_bytes() == Path("/etc/shadow").read_bytes()


EMPTY_NAME = "Provided username cannot be NULL/empty"
UNKNOWN_TYPE = "User modification failed, user type could not be determined"


def test_empty_name_is_refused(stage: Stage) -> None:
    stage.assert_unmoved(refused("privaneSystemError", 14, EMPTY_NAME),
                         "ModifyUser", *fields("", NEW))


@pytest.mark.parametrize("name", ["nosuch", " root", "root ", "+x", "#x", "a,b", "alice\n", "Alice",
                                  "x" * (1 << 20)], ids=lambda name: repr(name[:10]))
def test_unknown_user_has_no_type(name: str, stage: Stage) -> None:
    stage.assert_unmoved(refused("privaneSystemError", 14, UNKNOWN_TYPE),
                         "ModifyUser", *fields(name, NEW))


def test_unknown_visitor_is_told_before_its_type_is_looked_up(stage: Stage,
                                                              accounts: AccountFiles) -> None:
    stage.stop()
    accounts.write_exactly(edit(PASSWD_TEXT, "anonymous:", "visitor:"),
                           edit(SHADOW_TEXT, "anonymous:", "visitor:"), GROUP_TEXT)
    stage.start()
    expected = refused("privaneSystemError", 14, UNKNOWN_TYPE)
    expected.output.insert(0, ANONYMOUS)

    stage.assert_unmoved(expected, "ModifyUser", *fields("anonymous", NEW))


ONLY_PASSWORD = "only the password can be modified for root user"
NOT_PERMANENT = "permanent system users cannot be modified"


@pytest.mark.parametrize("arguments, code, reason", [
    (fields("root", comment="x"), 5, ONLY_PASSWORD),
    (fields("root", NEW, comment="x"), 5, ONLY_PASSWORD),
    (fields("root", NEW, shell="/bin/sh"), 5, ONLY_PASSWORD),
    (fields("root", group="users"), 5, ONLY_PASSWORD),
    (fields("root", groups=("users",)), 5, ONLY_PASSWORD),
    (fields("root", MARK.ljust(512, "x")), 16, "crypt() failed, Numerical result out of range"),
    (fields("root", MARK.ljust(1 << 20, "x")), 16, "crypt() failed, Numerical result out of range"),
    (fields("daemon", NEW), 5, NOT_PERMANENT),
    (fields("daemon", groups=("users",)), 5, NOT_PERMANENT),
    (fields("nobody", NEW), 5, "invalid user type 'nobody'"),
    (fields("nobody", comment="x"), 5, "invalid user type 'nobody'"),
    (fields("alice", shell="/bin/sh"), 12, "no shell login allowed for ORNET users"),
    (fields("alice", MARK.ljust(65, "x")), 10,
     "password too long, max allowed length is 64 characters"),
    (fields("alice", NEW, group="nosuch"), 4, "primary group 'nosuch' does not exist"),
    (fields("alice", NEW, groups=("viewer", "nosuch")), 4,
     "secondary group 'nosuch' does not exist"),
    (fields("alice", groups=("",)), 4, "secondary group '' does not exist"),
    (fields("alice", groups=("viewer::operator",)), 4,
     "secondary group 'viewer::operator' does not exist"),
], ids=lambda value: repr(value)[:40])
def test_refusal_leaves_everything_as_it_was(arguments: tuple[Any, ...], code: int, reason: str,
                                             stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, f"Failed to modify user '{arguments[0]}', "
                                 f"{reason}"), "ModifyUser", *arguments)


@pytest.mark.parametrize("arguments", [fields("anonymous", NEW), fields("anonymous", comment="x"),
                                       fields("anonymous", shell="/bin/sh")],
                         ids=lambda value: repr(value)[:40])
def test_visitor_without_groups_is_refused(arguments: tuple[Any, ...], stage: Stage) -> None:
    expected = refused("usermgmt", 5, f"Failed to modify user 'anonymous', {NOT_PERMANENT}")
    expected.output.insert(0, ANONYMOUS)

    stage.assert_unmoved(expected, "ModifyUser", *arguments)


def test_root_password_of_511_bytes_is_accepted(stage: Stage) -> None:
    password = MARK.ljust(511, "x")

    assert stage.succeed("ModifyUser", *fields("root", password)).calls == [
        digest_set("root", password), *ROOT_FLAG_CALLS, ("/bin/pidof", "cfgstore")]
    assert is_hash_of(stored_hash("root"), password)


@pytest.mark.parametrize("shell", ["/bin/sh:x", "/bin/sh\nevil::0:0:::/bin/sh"])
def test_shell_that_would_not_survive_the_files_is_refused(shell: str, stage: Stage) -> None:
    stage.assert_unmoved(
        refused("corefile", 101, "Failed to modify user 'timer', unable to sync core files, failed "
                "to write 1/3 core file(s) passwd: could not write entry #3 to /etc/passwd.tmp: "
                "Invalid argument"), "ModifyUser", *fields("timer", NEW, shell=shell))


def test_user_that_cannot_be_written_gets_no_digest_entry(stage: Stage) -> None:
    folder = Path("/etc/shadow.tmp")
    folder.mkdir()
    try:
        effects = stage.call("ModifyUser", *fields("root", NEW))
    finally:
        folder.rmdir()

    assert effects == refused(
        "corefile", 101, "Failed to modify user 'root', unable to sync core files, failed to write "
        "1/3 core file(s) shadow: could not fopen/fileno temporary file '/etc/shadow.tmp': "
        "Is a directory")
    assert read_texts() == Texts()
