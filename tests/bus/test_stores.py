"""tests/bus/test_stores.py: what changes leave in our own digest file and parameter file."""
import hashlib
import shutil
from pathlib import Path
from typing import Any, Iterator

import pytest

from harness.accounts import GROUP, PASSWD, SHADOW
from harness.changing_accounts import Texts, read_texts
from harness.passwords import MARK, NEW, OLD
from harness.stage import EMITTED, PIDOF_CALL, ROOT_FLAG_SET, Effects, Stage, refused
from harness.world import file_state

REALM = "PRIVANE"
PARAMETERS = Path("/etc/privane/parameters.conf")
ROOT_FLAG = "root.System.RootPwdSet=yes\n"

# The libraries' own numbers.
NO_FOLDER, NOT_REGULAR = 6, 8


def entry(user: str, password: str, realm: str = REALM) -> str:
    digest = hashlib.md5(f"{user}:{realm}:{password}".encode()).hexdigest()
    return f"{user}:{realm}:{digest}\n"


OTHERS = entry("alice", OLD, "Elsewhere") + entry("bob", OLD)


@pytest.fixture(autouse=True)
def parameters() -> Iterator[Path]:
    """No parameter file at the start of a test."""
    shutil.rmtree(PARAMETERS.parent, ignore_errors=True)
    yield PARAMETERS
    shutil.rmtree(PARAMETERS.parent, ignore_errors=True)


def modify(name: str, password: str = "", comment: str = "") -> tuple[Any, ...]:
    return ("ModifyUser", name, password, "", [], "", comment)


CAROL = ("AddUser", "carol", NEW, "users", "viewer", "Carol")


@pytest.mark.parametrize("call", [CAROL, ("AddUidUser", *CAROL[1:], 5000)],
                         ids=lambda call: call[0])
def test_added_user_is_known_to_the_web_server(call: tuple[Any, ...], stage_with_stores: Stage,
                                               digest_file: Path) -> None:
    stage = stage_with_stores
    digest_file.write_text(OTHERS)
    digest_file.chmod(0o640)

    assert stage.call(*call) == stage.announced()

    assert digest_file.read_text() == OTHERS + entry("carol", NEW)
    assert digest_file.stat().st_mode & 0o7777 == 0o640
    assert stage.bus.call("GetDigestList") == (["alice", "bob", "carol"],)


def test_system_user_is_unknown_to_the_web_server(stage_with_stores: Stage,
                                                  digest_file: Path) -> None:
    digest_file.write_text(OTHERS)

    stage_with_stores.succeed("AddSystemUser", "ftpd", NEW, "users", [], "", "")
    stage_with_stores.succeed(*modify("ftpd", OLD))
    stage_with_stores.succeed("RemoveUser", "ftpd")

    assert digest_file.read_text() == OTHERS


def test_new_password_is_known_to_the_web_server(stage_with_stores: Stage,
                                                 digest_file: Path) -> None:
    stage = stage_with_stores
    digest_file.write_text(OTHERS + entry("alice", OLD))

    assert stage.call(*modify("alice", NEW)) == stage.announced(
        lines=("message: Updated digest info alice (usertype=ornet)!",))

    assert digest_file.read_text() == OTHERS + entry("alice", NEW)
    assert not PARAMETERS.exists()


def test_password_changed_alone_is_unknown_to_the_web_server(stage_with_stores: Stage,
                                                             digest_file: Path) -> None:
    digest_file.write_text(OTHERS)
    before = file_state(digest_file)

    stage_with_stores.succeed("ChpasswdUser", "bob", NEW)
    stage_with_stores.succeed("ChpasswdUser", "root", NEW)
    stage_with_stores.succeed(*modify("bob", comment="Bobby"))

    assert file_state(digest_file) == before


def test_removed_user_is_no_longer_known_to_the_web_server(stage_with_stores: Stage,
                                                           digest_file: Path) -> None:
    stage = stage_with_stores
    digest_file.write_text(OTHERS)

    assert stage.call("RemoveUser", "bob") == stage.announced()

    assert digest_file.read_text() == entry("alice", OLD, "Elsewhere")


def test_user_without_an_entry_can_be_removed(stage_with_stores: Stage, digest_file: Path) -> None:
    assert stage_with_stores.call("RemoveUser", "alice") == stage_with_stores.announced()
    assert digest_file.read_text() == ""


def test_password_of_root_is_known_to_the_web_server_and_marked(stage_with_stores: Stage,
                                                                digest_file: Path) -> None:
    stage = stage_with_stores

    assert stage.call(*modify("root", NEW)) == stage.announced(
        lines=("message: Updated digest info root (usertype=root)!", ROOT_FLAG_SET))

    assert digest_file.read_text() == entry("root", NEW)
    assert PARAMETERS.read_text() == ROOT_FLAG


@pytest.mark.parametrize("call", [modify("root"), ("ChpasswdUser", "root", NEW)],
                         ids=lambda call: call[0])
@pytest.mark.parametrize("before, after", [
    ("", ROOT_FLAG),
    ("root.System.RootPwdSet=no\n", ROOT_FLAG),
    ("# ours\na=b\nroot.System.RootPwdSet=no\nc=d\n", f"# ours\na=b\n{ROOT_FLAG}c=d\n"),
])
def test_flag_of_root_keeps_the_other_parameters(before: str, after: str, call: tuple[Any, ...],
                                                 stage_with_stores: Stage) -> None:
    PARAMETERS.parent.mkdir()
    PARAMETERS.write_text(before)

    stage_with_stores.succeed(*call)

    assert PARAMETERS.read_text() == after


def test_other_users_set_no_flag(stage_with_stores: Stage) -> None:
    for call in (CAROL, modify("alice", NEW), modify("timer", NEW), ("ChpasswdUser", "bob", NEW),
                 ("ClearUserFields", "timer", True, True, True), ("RemoveUser", "bob"),
                 ("AddGroup", "guests"), ("RemoveGroup", "guests")):
        stage_with_stores.succeed(*call)

    assert not PARAMETERS.exists()


def test_lists_are_carried_out(stage_with_stores: Stage, digest_file: Path) -> None:
    stage = stage_with_stores
    digest_file.write_text(OTHERS)
    both = entry("bob", NEW) + entry("dave", NEW)

    assert stage.call("Digest", ["create", both]) == stage.done()
    assert digest_file.read_text() == entry("alice", OLD, "Elsewhere") + both

    assert stage.call("Digest", ["set", entry("dave", OLD)]) == stage.done()
    assert digest_file.read_text().endswith(entry("dave", OLD))

    assert stage.call("Digest", ["delete", "bob\ndave\n"]) == stage.done()
    assert digest_file.read_text() == entry("alice", OLD, "Elsewhere")


@pytest.mark.parametrize("request_words", [["create", f"dave:{MARK}"], ["delete", "a:b:c"]])
def test_list_that_the_library_refuses_is_answered_as_done(
        request_words: list[str], stage_with_stores: Stage, digest_file: Path) -> None:
    digest_file.write_text(OTHERS)

    assert stage_with_stores.call("Digest", request_words) == stage_with_stores.done()
    assert digest_file.read_text() == OTHERS


@pytest.fixture(params=[NO_FOLDER, NOT_REGULAR], ids=["no folder", "a link"])
def broken_digest_file(request: pytest.FixtureRequest, digest_file: Path) -> Iterator[int]:
    """A digest file that the library refuses, and the number with which it does."""
    digest_file.unlink()
    if request.param == NO_FOLDER:
        shutil.rmtree(digest_file.parent)
        yield NO_FOLDER
    else:
        digest_file.symlink_to("/etc/shadow")
        yield NOT_REGULAR
        digest_file.unlink()


def test_user_who_would_not_be_known_to_the_web_server_is_taken_back(
        broken_digest_file: int, stage_with_stores: Stage) -> None:
    stage = stage_with_stores
    text = f"Failed to add digest info for 'carol' (Err {broken_digest_file})"
    before = [file.read_bytes() for file in (PASSWD, SHADOW, GROUP)]

    assert stage.call(*CAROL) == refused("privaneSystemError", 24, text)

    assert [file.read_bytes() for file in (PASSWD, SHADOW, GROUP)] == before


@pytest.mark.parametrize("name", ["alice", "root"])
def test_password_that_would_not_be_known_to_the_web_server_is_told(
        name: str, broken_digest_file: int, stage_with_stores: Stage) -> None:
    text = f"Failed to update digest info for '{name}' (Err {broken_digest_file})"

    assert stage_with_stores.call(*modify(name, NEW)) == refused("privaneSystemError", 24, text)
    assert not PARAMETERS.exists()


def test_user_whom_the_web_server_would_still_know_is_told(broken_digest_file: int,
                                                           stage_with_stores: Stage) -> None:
    text = f"Failed to delete digest info for 'alice' (Err {broken_digest_file})"

    assert stage_with_stores.call("RemoveUser", "alice") == refused(
        "privaneSystemError", 24, text)
    assert stage_with_stores.bus.call("CheckUser", "s", "alice") == (False,)


def test_flag_that_cannot_be_stored_is_only_logged(stage_with_stores: Stage) -> None:
    stage = stage_with_stores
    PARAMETERS.mkdir(parents=True)

    assert stage.call(*modify("root")) == Effects(
        (), ["UserDatabaseUpdated", "reply"], [PIDOF_CALL],
        stage.announced().signals,
        [f"warning: Updating root user failed to sync param! Error: {NOT_REGULAR}", EMITTED,
         *stage.done(pidof_run=True).output])


def test_whole_life_of_a_user(stage_with_stores: Stage, digest_file: Path) -> None:
    stage = stage_with_stores
    digest_file.write_text(OTHERS)
    stage.succeed(*CAROL)
    stage.bus.call("AuthUserBasic", "ss", "carol", NEW)
    stage.succeed("ModifyUser", "carol", OLD, "viewer", ["operator"], "", "C")
    stage.bus.call("AuthUserBasic", "ss", "carol", OLD)
    assert digest_file.read_text() == OTHERS + entry("carol", OLD)

    stage.restart()

    assert stage.bus.call("GetUser", "s", "carol") == (True, "viewer", ["operator"], "C", 1002)
    stage.succeed("ClearUserFields", "carol", False, True, True)
    assert stage.bus.call("GetUser", "s", "carol") == (True, "viewer", [], "", 1002)
    stage.succeed("RemoveUser", "carol")

    assert read_texts() == Texts()
    assert digest_file.read_text() == OTHERS


def test_no_clear_text_is_left_in_a_file(stage_with_stores: Stage) -> None:
    for call in (CAROL, modify("alice", NEW), modify("root", NEW), ("ChpasswdUser", "bob", NEW),
                 ("AddSystemUser", "ftpd", NEW, "users", [], "", "")):
        stage_with_stores.succeed(*call)

    written = [file for folder in ("/etc", "/run")
               for file in Path(folder).rglob("*") if file.is_file() and not file.is_symlink()]
    assert PASSWD in written and PARAMETERS in written
    assert not [file for file in written if MARK.encode() in file.read_bytes()]
