"""tests/bus/test_clear_user_fields.py: ClearUserFields."""
import pytest

from harness.accounts import GROUP, PASSWD, SHADOW
from harness.changing_accounts import (GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, Texts, edit,
                                       read_texts)
from harness.passwords import OLD_HASH
from harness.stage import Stage, refused
from harness.world import file_state


def cleared_timer(password: bool, groups: bool, comment: bool) -> Texts:
    return Texts(
        edit(PASSWD_TEXT, "Keeps time", "") if comment else PASSWD_TEXT,
        edit(SHADOW_TEXT, f"timer:{OLD_HASH}:", "timer:*:") if password else SHADOW_TEXT,
        edit(GROUP_TEXT, "admin:x:103:timer", "admin:x:103:") if groups else GROUP_TEXT)


@pytest.mark.parametrize("password", [False, True], ids=["-", "password"])
@pytest.mark.parametrize("groups", [False, True], ids=["-", "groups"])
@pytest.mark.parametrize("comment", [False, True], ids=["-", "comment"])
def test_what_is_named_is_cleared_and_a_comment_alone_concerns_nobody(
        password: bool, groups: bool, comment: bool, stage: Stage) -> None:
    is_told = password or groups

    assert stage.call("ClearUserFields", "timer", password, groups, comment) == stage.done(
        signal_sent=is_told, pidof_run=is_told)

    assert read_texts() == cleared_timer(password, groups, comment)
    assert stage.bus.call("GetUser", "s", "timer") == (
        not password, "timer", [] if groups else ["admin"], "" if comment else "Keeps time", 998)


def test_nothing_named_touches_no_file(stage: Stage) -> None:
    stage.assert_unmoved(stage.done(), "ClearUserFields", "timer", False, False, False)


def test_nothing_named_succeeds_for_an_unknown_user(stage: Stage) -> None:
    stage.assert_unmoved(stage.done(), "ClearUserFields", "nosuch", False, False, False)


def test_cleared_user_is_the_same_after_a_restart(stage: Stage) -> None:
    stage.succeed("ClearUserFields", "timer", True, True, True)

    stage.restart()

    # No password is written "*", which the file then holds as one that nobody can have.
    assert stage.bus.call("GetUser", "s", "timer") == (True, "timer", [], "", 998)
    assert read_texts() == cleared_timer(True, True, True)


def test_clearing_twice_writes_once(stage: Stage) -> None:
    stage.succeed("ClearUserFields", "timer", True, True, True)
    before = [file_state(file) for file in (PASSWD, SHADOW, GROUP)]

    assert stage.call("ClearUserFields", "timer", True, True, True) == stage.announced()

    assert [file_state(file) for file in (PASSWD, SHADOW, GROUP)] == before


def test_groups_of_a_user_of_the_web(stage: Stage) -> None:
    assert stage.call("ClearUserFields", "alice", False, True, True) == stage.announced()

    assert read_texts() == Texts(
        passwd=edit(PASSWD_TEXT, "Alice Liddell", ""),
        group=edit(GROUP_TEXT, "operator:x:102:alice", "operator:x:102:"))


def test_password_of_a_permanent_user(stage: Stage) -> None:
    assert stage.call("ClearUserFields", "daemon", True, False, False) == stage.announced()

    assert read_texts() == Texts(shadow=edit(SHADOW_TEXT, f"daemon:{OLD_HASH}:", "daemon:*:"))


def test_groups_and_password_of_the_visitor(stage: Stage) -> None:
    stage.succeed("ModifyUser", "anonymous", "", "", ["viewer"], "", "")

    assert stage.call("ClearUserFields", "anonymous", True, True, True) == stage.announced()

    assert read_texts() == Texts(
        edit(PASSWD_TEXT, "Visitor", ""),
        edit(SHADOW_TEXT, f"anonymous:{OLD_HASH}:", "anonymous:*:"), GROUP_TEXT)


@pytest.mark.parametrize("flags", [(True, True, True), (False, False, False)])
def test_empty_name_is_refused(flags: tuple[bool, ...], stage: Stage) -> None:
    stage.assert_unmoved(
        refused("privaneSystemError", 14, "Provided username cannot be NULL/empty"),
        "ClearUserFields", "", *flags)


NOT_DISABLED = "Failed to disable password for  '{name}', password cannot be disabled for user " \
               "type '{type}'"


@pytest.mark.parametrize("name, shown_type", [("alice", "ornet"), ("root", "root"),
                                              ("nobody", "nobody")])
@pytest.mark.parametrize("others", [(False, False), (True, True)])
def test_password_that_may_not_be_disabled_keeps_the_rest_from_being_cleared(
        others: tuple[bool, bool], name: str, shown_type: str, stage: Stage) -> None:
    stage.assert_unmoved(
        refused("usermgmt", 5, NOT_DISABLED.format(name=name, type=shown_type)),
        "ClearUserFields", name, True, *others)


@pytest.mark.parametrize("flags, code, text", [
    ((True, False, False), 3, "Failed to disable password for  'nosuch', user does not exist"),
    ((True, True, True), 3, "Failed to disable password for  'nosuch', user does not exist"),
    ((False, True, False), 3, "Failed to modify user 'nosuch', user does not exist"),
    ((False, True, True), 3, "Failed to modify user 'nosuch', user does not exist"),
    ((False, False, True), 3, "Failed to modify user 'nosuch', user does not exist"),
])
def test_unknown_user_is_refused(flags: tuple[bool, ...], code: int, text: str,
                                 stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", code, text), "ClearUserFields", "nosuch", *flags)


@pytest.mark.parametrize("name, flags, text", [
    ("daemon", (False, True, False), "permanent system users cannot be modified"),
    ("daemon", (False, False, True), "permanent system users cannot be modified"),
    ("anonymous", (False, False, True), "permanent system users cannot be modified"),
    ("root", (False, True, False), "only the password can be modified for root user"),
    ("root", (False, False, True), "only the password can be modified for root user"),
    ("nobody", (False, False, True), "invalid user type 'nobody'"),
])
def test_type_that_may_not_change_is_refused(name: str, flags: tuple[bool, ...], text: str,
                                             stage: Stage) -> None:
    stage.assert_unmoved(refused("usermgmt", 5, f"Failed to modify user '{name}', {text}"),
                         "ClearUserFields", name, *flags)


@pytest.mark.parametrize("others", [(True, False), (False, True), (True, True)])
def test_password_stays_cleared_and_unannounced_when_the_rest_fails(others: tuple[bool, bool],
                                                                    stage: Stage) -> None:
    assert stage.call("ClearUserFields", "daemon", True, *others) == refused(
        "usermgmt", 5, "Failed to modify user 'daemon', permanent system users cannot be modified")

    assert read_texts() == Texts(shadow=edit(SHADOW_TEXT, f"daemon:{OLD_HASH}:", "daemon:*:"))
    assert stage.bus.call("GetUser", "s", "daemon")[0] is False


@pytest.mark.parametrize("name", [" root", "+x", "#x", "a,b", "timer\n", "x" * (1 << 20)],
                         ids=lambda name: repr(name[:10]))
def test_hostile_name_is_unknown(name: str, stage: Stage) -> None:
    before = stage.memory()

    effects = stage.call("ClearUserFields", name, True, True, True)

    expected = refused("usermgmt", 3,
                       f"Failed to disable password for  '{name}', user does not exist")
    assert effects.answer == expected.answer
    assert (effects.messages, effects.calls, effects.signals, effects.syslog) == (
        ["error"], [], set(), [])
    assert len(effects.output) == 1
    assert (stage.memory(), read_texts()) == (before, Texts())
