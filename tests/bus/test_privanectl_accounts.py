"""tests/bus/test_privanectl_accounts.py: the client's commands on users, groups and web logins."""
import hashlib
from pathlib import Path

import pytest

from harness.bus import Bus
from harness.changing_accounts import stored_hash
from harness.passwords import NEW, OLD, is_hash_of
from harness.privanectl import DONE, Run, failed, privanectl, with_password, wrong_usage
from harness.stage import Stage

NOTHING = Run(DONE, "", "")
NO_RESULTS = Run(DONE, "{}\n", "")

USERS = ["root", "daemon", "anonymous", "timer", "alice", "bob", "nobody"]
GROUPS = [("root", 0, []), ("daemon", 1, []), ("users", 100, ["alice"]), ("viewer", 101, []),
          ("operator", 102, ["alice"]), ("admin", 103, ["timer"]), ("timer", 998, []),
          ("nogroup", 65534, []), ("recorder", 60005, [])]


def test_user_list(stage: Stage) -> None:
    lines = "".join(f"{user}\n" for user in USERS)

    assert privanectl("user", "list") == Run(DONE, f"NAME\n{lines}\n7 listed.\n", "")
    assert privanectl("user", "list", "--no-legend") == Run(DONE, lines, "")
    assert privanectl("user", "list", "-j").json == [{"name": user} for user in USERS]


def test_user_show(stage: Stage) -> None:
    assert privanectl("user", "show", "alice") == Run(DONE, """\
            Name: alice
    Has password: yes
   Primary group: users
Secondary groups: operator
         Comment: Alice Liddell
             UID: 1000
""", "")
    assert privanectl("user", "show", "alice", "--json=short") == Run(DONE, (
        '{"name":"alice","has_password":true,"primary_group":"users",'
        '"secondary_groups":["operator"],"comment":"Alice Liddell","uid":1000}\n'), "")


def test_user_without_groups(stage: Stage) -> None:
    assert privanectl("user", "show", "nobody") == Run(DONE, """\
            Name: nobody
    Has password: yes
   Primary group: nogroup
Secondary groups:
         Comment: nobody
             UID: 65534
""", "")


@pytest.mark.parametrize("noun, present", [("user", "alice"), ("group", "users")])
def test_check(noun: str, present: str, stage: Stage) -> None:
    assert privanectl(noun, "check", present) == Run(DONE, "yes\n", "")
    assert privanectl(noun, "check", "missing") == Run(DONE, "no\n", "")
    assert privanectl(noun, "check", present, "--json=short") == Run(DONE, '{"exists":true}\n', "")
    assert privanectl(noun, "check", "missing", "-j").json == {"exists": False}


def test_user_authenticate(stage: Stage) -> None:
    assert with_password(OLD, "user", "authenticate", "alice") == NOTHING
    assert with_password(OLD, "user", "authenticate", "alice", "-j") == NO_RESULTS
    assert with_password(NEW, "user", "authenticate", "alice") == failed(
        "No valid password for user alice (privaneSystemError 7)")


def test_user_add(stage: Stage, bus: Bus) -> None:
    assert with_password(NEW, "user", "add", "carol", "--group=users", "--groups=viewer,operator",
                         "--comment=Carol, née K.") == NOTHING

    has_password, group, groups, comment, uid = bus.call("GetUser", "s", "carol")
    assert (has_password, group, sorted(groups), comment, uid) == (
        True, "users", ["operator", "viewer"], "Carol, née K.", 1002)
    assert is_hash_of(stored_hash("carol"), NEW)
    assert ("digest_entry_set", "carol", NEW, "0") in stage.calls()


def test_user_add_with_uid(stage: Stage, bus: Bus) -> None:
    assert with_password(NEW, "user", "add", "carol", "--group=users", "--uid=2345",
                         "--json=short") == NO_RESULTS
    assert bus.call("GetUser", "s", "carol") == (True, "users", [], "", 2345)
    assert with_password(NEW, "user", "add", "dave", "--group=users", "--uid=2a") == wrong_usage(
        "--uid takes a number, not '2a'")


def test_user_add_for_a_program(stage: Stage, bus: Bus) -> None:
    assert privanectl("user", "add", "--system", "clock", "--group=timer", "--groups=viewer,admin",
                      "--shell=/bin/sh", "--comment=Shows it") == NOTHING

    has_password, group, groups, comment, uid = bus.call("GetUser", "s", "clock")
    assert (has_password, group, sorted(groups), comment) == (
        False, "timer", ["admin", "viewer"], "Shows it")
    assert 500 <= uid <= 999
    assert [line.rpartition(":")[2] for line in Path("/etc/passwd").read_text().splitlines()
            if line.startswith("clock:")] == ["/bin/sh"]


def test_user_that_exists_is_refused_with_domain_and_code(stage: Stage) -> None:
    assert with_password(NEW, "user", "add", "alice", "--group=users") == failed(
        "Failed to add user 'alice', user already exists (usermgmt 6)")


def test_user_modify(stage: Stage, bus: Bus) -> None:
    assert privanectl("user", "modify", "bob", "--comment=Robert", "--groups=viewer") == NOTHING
    assert bus.call("GetUser", "s", "bob") == (True, "users", ["viewer"], "Robert", 1001)
    assert is_hash_of(stored_hash("bob"), OLD)

    assert with_password(NEW, "user", "modify", "bob", "--group=operator", "-j") == NO_RESULTS
    assert bus.call("GetUser", "s", "bob")[1] == "operator"
    assert is_hash_of(stored_hash("bob"), NEW)

    assert privanectl("user", "modify", "timer", "--shell=/bin/sh") == NOTHING
    assert ":/bin/sh\n" in Path("/etc/passwd").read_text().partition("\ntimer:")[2].partition("alice")[0]


def test_user_modify_needs_something_to_change(stage: Stage) -> None:
    before = stage.memory()

    assert privanectl("user", "modify", "bob") == wrong_usage(
        "nothing to change; privanectl user --help tells what can be")
    assert privanectl("user", "modify", "bob", "--comment=") == wrong_usage(
        "an empty --comment changes nothing; see user clear")
    assert stage.memory() == before


@pytest.mark.parametrize("words, password, groups, comment", [
    (("password",), False, ["admin"], "Keeps time"),
    (("groups",), True, [], "Keeps time"),
    (("comment",), True, ["admin"], ""),
    (("comment", "password", "groups"), False, [], ""),
])
def test_user_clear(words: tuple[str, ...], password: bool, groups: list[str], comment: str,
                    stage: Stage, bus: Bus) -> None:
    assert privanectl("user", "clear", "timer", *words) == NOTHING
    assert bus.call("GetUser", "s", "timer") == (password, "timer", groups, comment, 998)


def test_user_clear_knows_what_it_clears(stage: Stage) -> None:
    assert privanectl("user", "clear", "alice", "shell") == wrong_usage(
        "'shell' is nothing that user clear takes")
    assert privanectl("user", "clear", "alice") == wrong_usage(
        "nothing to change; privanectl user --help tells what can be")


def test_user_passwd(stage: Stage) -> None:
    assert with_password(f"{NEW}\nnot this line\n", "user", "passwd", "bob") == NOTHING
    assert is_hash_of(stored_hash("bob"), NEW)
    assert not [call for call in stage.calls() if call[0].startswith("digest")]


def test_user_remove(stage: Stage, bus: Bus) -> None:
    assert privanectl("user", "remove", "bob") == NOTHING
    assert bus.call("CheckUser", "s", "bob") == (False,)
    assert privanectl("user", "remove", "bob") == failed(
        "User deletion failed, user type could not be determined (privaneSystemError 14)")


def test_user_announce(stage: Stage) -> None:
    assert privanectl("user", "announce") == NOTHING
    assert stage.wire.until_reply(stage.send("CheckUser", ""))[0].member == "UserDatabaseUpdated"


def test_group_list(stage: Stage) -> None:
    assert privanectl("group", "list") == Run(DONE, """\
NAME       GID MEMBERS
root         0
daemon       1
users      100 alice
viewer     101
operator   102 alice
admin      103 timer
timer      998
nogroup  65534
recorder 60005

9 listed.
""", "")
    assert privanectl("group", "list", "--json=pretty").json == [
        {"name": name, "gid": gid, "members": members} for name, gid, members in GROUPS]


def test_group_names(stage: Stage) -> None:
    names = [name for name, _, _ in GROUPS]

    assert privanectl("group", "list", "--names", "--no-legend") == Run(
        DONE, "".join(f"{name}\n" for name in names), "")
    assert privanectl("group", "list", "--names", "-j").json == [{"name": name} for name in names]


def test_group_show(stage: Stage) -> None:
    assert privanectl("group", "show", "users") == Run(DONE, """\
   Name: users
    GID: 100
Members: alice
""", "")
    assert privanectl("group", "show", "viewer", "-j").json == {
        "name": "viewer", "gid": 101, "members": []}
    assert privanectl("group", "show", "missing").status == 1


def test_group_add_and_remove(stage: Stage, bus: Bus) -> None:
    assert privanectl("group", "add", "helpers") == NOTHING
    assert bus.call("CheckGroup", "s", "helpers") == (True,)
    assert privanectl("group", "remove", "helpers", "-j") == NO_RESULTS
    assert bus.call("CheckGroup", "s", "helpers") == (False,)
    assert privanectl("group", "remove", "helpers") == failed(
        "Failed to delete group 'helpers', group does not exist (usermgmt 7)")


def test_digest_list(stage: Stage, digest_file: Path) -> None:
    digest_file.write_text("alice:PRIVANE:00\nbob:PRIVANE:11\n")

    assert privanectl("digest", "list") == Run(DONE, "NAME\nalice\nbob\n\n2 listed.\n", "")
    assert privanectl("digest", "list", "-j").json == [{"name": "alice"}, {"name": "bob"}]
    digest_file.unlink()
    assert privanectl("digest", "list") == failed(
        "Could not open HTTP digest fileFailed to open file “/etc/apache2/digest_auth_passwd”: "
        "No such file or directory (g-file-error-quark 4)")


def test_digest_changes_reach_the_file(stage_with_stores: Stage, digest_file: Path) -> None:
    expected = hashlib.md5(f"alice:PRIVANE:{NEW}".encode()).hexdigest()

    assert with_password(NEW, "digest", "set", "alice") == NOTHING
    assert digest_file.read_text() == f"alice:PRIVANE:{expected}\n"

    lines = f"bob:PRIVANE:{'b' * 32}\ncarol:PRIVANE:{'c' * 32}\n"
    assert privanectl("digest", "import", stdin=lines) == NOTHING
    assert digest_file.read_text() == f"alice:PRIVANE:{expected}\n{lines}"

    assert privanectl("digest", "delete", "alice", "carol", "-j") == NO_RESULTS
    assert digest_file.read_text() == f"bob:PRIVANE:{'b' * 32}\n"


def test_digest_refuses_what_is_no_list(stage: Stage) -> None:
    assert privanectl("digest", "import") == failed("The list is empty")
    assert privanectl("digest", "import", stdin="a\0b") == failed("The list is no UTF-8 text")
    assert privanectl("digest", "import", stdin="x" * (1024 * 1024 + 1)) == failed(
        "The list is longer than 1048576 bytes")
    assert with_password(NEW, "digest", "set", "a:b") == wrong_usage(
        "no web login can be named 'a:b'")
    assert stage.calls() == []
