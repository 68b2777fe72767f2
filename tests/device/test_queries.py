"""tests/device/test_queries.py: what the account queries answer equals the camera's own files."""
import pytest
from accounts import accept_loss, fingerprint, groups_of, users_of
from calls import QUERIES, BusError, ask, ask_about_each
from camera.machine import Camera
from camera.tour import UNIT
from journal import records

# One account in each hole and at each edge of the ranges, and two that lack what they need.
MORE_GROUPS = """edge499:x:499:
hole1000:x:1000:root
hole60000:x:60000:
nvr60001:x:60001:root,ornet1000
nvr60010:x:60010:
hole60011:x:60011:
"""
MORE_USERS = """perm499:x:499:499:permanent:/:/bin/sh
ornet1000:x:1000:100::/:/bin/false
ornet60000:x:60000:60010:last ornet:/:/bin/false
hole60001:x:60001:100::/:/bin/false
hole65535:x:65535:100::/:/bin/false
nogroup1001:x:1001:1000::/:/bin/false
noshadow:x:1002:100::/:/bin/false
"""


def add_accounts_of_all_kinds(camera: Camera) -> None:
    names = [line.split(":")[0] for line in MORE_USERS.splitlines()]
    shadow = "".join(f"{name}:*:19000:0:99999:7:::\n" for name in names if name != "noshadow")
    added = {"/etc/group": MORE_GROUPS, "/etc/passwd": MORE_USERS, "/etc/shadow": shadow}
    for path, lines in added.items():
        camera.run(f"cat >>{path} <<'END'\n{lines}END").check()
    accept_loss(camera)
    # The files are read at start only.
    camera.run(["systemctl", "restart", UNIT]).check()


@pytest.fixture(params=["the camera's own accounts", "accounts of all kinds"])
def accounts_camera(request: pytest.FixtureRequest, camera: Camera) -> Camera:
    if request.param == "accounts of all kinds":
        add_accounts_of_all_kinds(camera)
    return camera


def test_user_list(accounts_camera: Camera) -> None:
    (names,) = ask(accounts_camera, "GetUserList")
    assert names == [user.name for user in users_of(accounts_camera)]
    assert {"root", "nobody", "cam-web"} <= set(names)


def test_group_lists(accounts_camera: Camera) -> None:
    expected = groups_of(accounts_camera)
    (names,) = ask(accounts_camera, "GetGroupList")
    assert names == [group.name for group in expected]
    full_names, gids, members = ask(accounts_camera, "GetGroupListFull")
    assert full_names == names
    assert gids == [group.gid for group in expected]
    # The order of members is not promised.
    assert list(map(sorted, members)) == [sorted(group.members) for group in expected]


def test_users(camera: Camera) -> None:
    add_accounts_of_all_kinds(camera)
    users = users_of(camera)
    answers = ask_about_each(camera, "GetUser", [user.name for user in users])
    assert answers == [(True, user.group, user.groups, user.comment, user.uid) for user in users]


def test_groups(camera: Camera) -> None:
    add_accounts_of_all_kinds(camera)
    # Those without members look alike, and the full list has shown them all.
    groups = [group for group in groups_of(camera) if group.members or group.gid in (0, 60010)]
    answers = ask_about_each(camera, "GetGroup", [group.name for group in groups])
    assert [gid for gid, _ in answers] == [group.gid for group in groups]
    assert [sorted(of_one) for _, of_one in answers] == [sorted(group.members) for group in groups]
    assert len(groups) >= 5


def test_accounts_without_a_type_are_left_out_with_a_word_in_the_journal(camera: Camera) -> None:
    add_accounts_of_all_kinds(camera)
    (users,), (groups,) = ask(camera, "GetUserList"), ask(camera, "GetGroupList")
    assert {"perm499", "ornet1000", "ornet60000"} <= set(users)
    assert not {"hole60001", "hole65535", "nogroup1001", "noshadow"} & set(users)
    assert {"edge499", "nvr60001", "nvr60010"} <= set(groups)
    assert not {"hole1000", "hole60000", "hole60011"} & set(groups)
    said = records(camera)
    for name in ("hole1000", "hole60000", "hole60011"):
        assert (3, f"Failed to parse group '{name}': unable to determine group type") in said
    for name, reason in {
        "hole60001": "user type for hole60001 could not be determined!",
        "hole65535": "user type for hole65535 could not be determined!",
        "nogroup1001": "no group was found on the system for GID '1000'",
        "noshadow": "no corresponding shadow entry was found for 'noshadow'",
    }.items():
        assert (4, f"Failed to parse user '{name}': {reason}") in said


@pytest.mark.parametrize("method, name, exists", [
    ("CheckUser", "'root'", True),
    ("CheckUser", "'cam-web'", True),
    ("CheckUser", "'nosuch'", False),
    ("CheckUser", "''", False),
    ("CheckGroup", "'privane'", True),
    ("CheckGroup", "'nosuch'", False),
    ("CheckGroup", "''", False),
])
def test_checks(camera: Camera, method: str, name: str, exists: bool) -> None:
    assert ask(camera, method, name) == (exists,)


@pytest.mark.parametrize("method, code, text", [
    ("GetUser", 3, "Could not retrieve user 'nosuch', user does not exist"),
    ("GetGroup", 4, "Group 'nosuch' does not exist"),
])
def test_unknown_names(camera: Camera, method: str, code: int, text: str) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, method, "'nosuch'")
    assert caught.value.name == f"org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code{code}"
    assert caught.value.text == text


def test_queries_leave_the_account_files_alone(camera: Camera) -> None:
    before = fingerprint(camera)
    for method, arguments in QUERIES.items():
        ask(camera, method, *arguments)
    with pytest.raises(BusError):
        ask(camera, "GetUser", "'nosuch'")
    camera.run(["systemctl", "restart", UNIT]).check()
    assert fingerprint(camera) == before
