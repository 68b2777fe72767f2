"""tests/bus/test_password_check.py: AuthUserBasic."""
from pathlib import Path

import pytest

from harness.accounts import AccountFiles
from harness.bus import domain_error, error_of
from harness.changing_accounts import GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, edit
from harness.fake_authz import FakeAuthz
from harness.passwords import MARK, NEW, OLD, OLD_HASH, crypt
from harness.sandbox import fake_library
from harness.stage import Effects, Stage, refused


def wrong(name: str) -> Effects:
    return refused("privaneSystemError", 7, f"No valid password for user {name}")


def unknown(name: str) -> Effects:
    """Logged twice."""
    effects = refused("privaneSystemError", 5, f"Failed to locate user {name}.")
    effects.output *= 2
    return effects


@pytest.mark.parametrize("name", ["root", "daemon", "anonymous", "timer", "alice", "bob"])
def test_right_password_is_accepted(name: str, stage: Stage) -> None:
    stage.assert_unmoved(stage.done(), "AuthUserBasic", name, OLD)


@pytest.mark.parametrize("password", ["", NEW, OLD.lower(), f"{OLD} ", f" {OLD}", OLD[:-1],
                                      f"{OLD}\n", OLD_HASH, "*", "!", "x"],
                         ids=lambda password: repr(password)[:12])
def test_wrong_password_is_refused(password: str, stage: Stage) -> None:
    stage.assert_unmoved(wrong("alice"), "AuthUserBasic", "alice", password)


@pytest.mark.parametrize("name", ["nosuch", "", " root", "+x", "#x", "a,b", "Alice", "al"])
@pytest.mark.parametrize("password", ["", OLD], ids=["empty", "given"])
def test_unknown_user_is_told_twice_in_the_log(name: str, password: str, stage: Stage) -> None:
    stage.assert_unmoved(unknown(name), "AuthUserBasic", name, password)


def test_unknown_user_with_a_control_in_the_name(stage: Stage) -> None:
    expected = unknown("alice\n")
    expected.output = [r"warning: Failed to locate user alice\x0A."] * 2

    stage.assert_unmoved(expected, "AuthUserBasic", "alice\n", OLD)


def passwd_field(field: str) -> str:
    return edit(PASSWD_TEXT, "alice:x:", f"alice:{field}:")


def shadow_field(field: str) -> str:
    return edit(SHADOW_TEXT, f"alice:{OLD_HASH}:", f"alice:{field}:")


WITHOUT_SHADOW = edit(SHADOW_TEXT, f"alice:{OLD_HASH}:19000:0:99999:7:0::\n", "")


@pytest.mark.parametrize("passwd, shadow", [
    # The passwd file's field, whatever the shadow file holds.
    (passwd_field(OLD_HASH), WITHOUT_SHADOW),
    (passwd_field(OLD_HASH), shadow_field("*")),
    (passwd_field(crypt(OLD, "$6$standardsalt$")), WITHOUT_SHADOW),
    (passwd_field(crypt(OLD, "$1$standard$")), WITHOUT_SHADOW),
    # The shadow file's, for which the field stands.
    (passwd_field("!"), SHADOW_TEXT),
    (PASSWD_TEXT, shadow_field(crypt(OLD, "$6$standardsalt$"))),
    (PASSWD_TEXT, shadow_field(crypt(OLD, "$y$j9T$standardsalt$"))),
], ids=["passwd", "passwd before shadow", "SHA-512", "MD5", "!", "shadow SHA-512", "yescrypt"])
def test_hash_is_found(passwd: str, shadow: str, stage: Stage, accounts: AccountFiles) -> None:
    accounts.write_exactly(passwd, shadow, GROUP_TEXT)

    assert stage.call("AuthUserBasic", "alice", OLD) == stage.done()
    assert stage.call("AuthUserBasic", "alice", NEW) == wrong("alice")


@pytest.mark.parametrize("passwd, shadow", [
    (PASSWD_TEXT, WITHOUT_SHADOW),
    (PASSWD_TEXT, None),
    (passwd_field("!"), WITHOUT_SHADOW),
    (passwd_field("*"), SHADOW_TEXT),
    (passwd_field(""), SHADOW_TEXT),
    (passwd_field("xx"), SHADOW_TEXT),
    (passwd_field("!x"), SHADOW_TEXT),
    (passwd_field("*0"), SHADOW_TEXT),
    (passwd_field("*1"), SHADOW_TEXT),
    (passwd_field("!" + OLD_HASH), SHADOW_TEXT),
    (PASSWD_TEXT, shadow_field("")),
    (PASSWD_TEXT, shadow_field("*")),
    (PASSWD_TEXT, shadow_field("!")),
    (PASSWD_TEXT, shadow_field("!!")),
    (PASSWD_TEXT, shadow_field("x")),
    (PASSWD_TEXT, shadow_field("*0")),
    (PASSWD_TEXT, shadow_field("*1")),
    (PASSWD_TEXT, shadow_field("!" + OLD_HASH)),
    (PASSWD_TEXT, shadow_field(OLD_HASH + "x")),
    (PASSWD_TEXT, shadow_field(OLD_HASH[:-1])),
    (PASSWD_TEXT, shadow_field("$5$standardsalt$")),
    (PASSWD_TEXT, shadow_field("$9$nosuch$")),
], ids=lambda value: None if value is None else repr(
    [line for line in value.splitlines() if line.startswith("alice")][:1])[8:30])
def test_field_that_is_no_hash_of_the_password_is_refused(
        passwd: str, shadow: str | None, stage: Stage, accounts: AccountFiles) -> None:
    accounts.write_exactly(passwd, shadow, GROUP_TEXT)

    for password in (OLD, "", "x", "!", "*", "*0", "*1"):
        assert stage.call("AuthUserBasic", "alice", password) == wrong("alice")


@pytest.mark.parametrize("length", [512, 513, 1 << 20])
def test_password_that_cannot_be_hashed_is_wrong(length: int, stage: Stage) -> None:
    stage.assert_unmoved(wrong("alice"), "AuthUserBasic", "alice", MARK.ljust(length, "x"))


def test_password_of_511_bytes_is_checked(stage: Stage, accounts: AccountFiles) -> None:
    password = MARK.ljust(511, "x")
    accounts.write_exactly(PASSWD_TEXT, shadow_field(crypt(password, "$5$standardsalt$")),
                           GROUP_TEXT)

    assert stage.call("AuthUserBasic", "alice", password) == stage.done()
    assert stage.call("AuthUserBasic", "alice", password[:-1]) == wrong("alice")


def test_files_edited_by_hand_count_at_once(stage: Stage, accounts: AccountFiles) -> None:
    accounts.write_exactly(
        PASSWD_TEXT + "hand:x:70000:70000:::\n",
        SHADOW_TEXT + f"hand:{crypt(NEW, '$5$standardsalt$')}:19000:0:99999:7:::\n", GROUP_TEXT)
    # Neither the database nor its rules have a say: it knows no such user.
    assert stage.bus.call("CheckUser", "s", "hand") == (False,)
    assert stage.call("AuthUserBasic", "hand", NEW) == stage.done()

    accounts.write_exactly(PASSWD_TEXT, SHADOW_TEXT, GROUP_TEXT)
    assert stage.call("AuthUserBasic", "hand", NEW) == unknown("hand")

    accounts.write_exactly(PASSWD_TEXT, shadow_field(crypt(NEW, "$5$standardsalt$")), GROUP_TEXT)
    assert stage.call("AuthUserBasic", "alice", OLD) == wrong("alice")
    assert stage.call("AuthUserBasic", "alice", NEW) == stage.done()


def test_changes_by_the_service_count_at_once(stage: Stage) -> None:
    stage.succeed("AddUser", "carol", OLD, "users", "", "")
    assert stage.call("AuthUserBasic", "carol", OLD) == stage.done()

    stage.succeed("ChpasswdUser", "carol", NEW)
    assert stage.call("AuthUserBasic", "carol", OLD) == wrong("carol")
    assert stage.call("AuthUserBasic", "carol", NEW) == stage.done()

    stage.succeed("RemoveUser", "carol")
    assert stage.call("AuthUserBasic", "carol", NEW) == unknown("carol")


def test_disabled_password_is_wrong(stage: Stage) -> None:
    stage.succeed("ClearUserFields", "timer", True, False, False)

    for password in (OLD, "", "*"):
        assert stage.call("AuthUserBasic", "timer", password) == wrong("timer")


def test_lock_is_free_after_every_outcome(stage: Stage, authz: FakeAuthz) -> None:
    for _ in range(3):
        assert stage.call("AuthUserBasic", "alice", OLD) == stage.done()
        assert stage.call("AuthUserBasic", "alice", NEW) == wrong("alice")
        assert stage.call("AuthUserBasic", "nosuch", NEW) == unknown("nosuch")
        authz.refuse("not for you")
        assert error_of(stage.bus.call, "AuthUserBasic", "ss", "alice", OLD) == domain_error(
            "fake-authz", 42, "Authorization check failed: not for you")
        authz.allow()


def test_user_without_a_password_field_has_no_hash(stage: Stage) -> None:
    # No line of the files gives such a user, so the C library's look-up is replaced.
    stage.stop()
    stage.start(LD_PRELOAD=str(fake_library("hashless_user/libhashless_user.so")))

    stage.assert_unmoved(refused("privaneSystemError", 6, "No valid hash for user alice"),
                         "AuthUserBasic", "alice", OLD)
    stage.assert_unmoved(refused("privaneSystemError", 6, "No valid hash for user alice"),
                         "AuthUserBasic", "alice", "")


def test_missing_passwd_file_knows_no_user(stage: Stage) -> None:
    Path("/etc/passwd").unlink()

    assert stage.call("AuthUserBasic", "alice", OLD) == unknown("alice")
