"""tests/device/accounts.py: the account files of the camera as the service must see them."""
from dataclasses import dataclass

from camera.change_tour import DIGEST_FILE, FILES
from camera.machine import Camera

USER_RANGES = ((0, 0), (1, 499), (500, 999), (1000, 60000), (65534, 65534))
GROUP_RANGES = ((0, 0), (1, 499), (500, 999), (65534, 65534), (60001, 60010))
# By it the maker of a device accepts that a start with these files will lose some.
LOSS_MARKER = "/etc/privane/accept-account-loss"
# Temporary files of a rewriting, and whatever else is named after one of them.
LIST_BESIDE = f"ls -dA /etc/passwd* /etc/shadow* /etc/group* {DIGEST_FILE.rpartition('/')[0]}/*"


def accept_loss(camera: Camera) -> None:
    camera.run(["install", "-D", "-m", "644", "/dev/null", LOSS_MARKER]).check()


@dataclass(frozen=True)
class Group:
    name: str
    gid: int
    members: list[str]


@dataclass(frozen=True)
class User:
    name: str
    uid: int
    group: str
    groups: list[str]
    comment: str


def groups_of(camera: Camera) -> list[Group]:
    """The groups whose GID has a type, in the order of the file."""
    groups = []
    for name, _, gid, members in _lines(camera, "/etc/group"):
        if _has_type(int(gid), GROUP_RANGES):
            groups.append(Group(name, int(gid), members.split(",") if members else []))
    return groups


def users_of(camera: Camera) -> list[User]:
    """The users with a typed UID, a shadow line and a known group, in the order of the file."""
    groups = groups_of(camera)
    name_of = {group.gid: group.name for group in groups}
    shadowed = {fields[0] for fields in _lines(camera, "/etc/shadow")}
    users = []
    for name, password, uid, gid, comment, _, _ in _lines(camera, "/etc/passwd"):
        assert password == "x", "the camera keeps all passwords in the shadow file"
        if name in shadowed and int(gid) in name_of and _has_type(int(uid), USER_RANGES):
            listing = [group.name for group in groups if name in group.members]
            others = [group for group in listing if group != name_of[int(gid)]]
            users.append(User(name, int(uid), name_of[int(gid)], others, comment))
    return users


def fingerprint(camera: Camera) -> str:
    """Content, inode, times, owner and mode of the account files, and what lies beside them."""
    names = " ".join(FILES)
    return camera.run(f"sha256sum {names}; stat -c '%n %i %y %z %U %G %a %s' {names}; "
                      f"{LIST_BESIDE}").check().out


def contents(camera: Camera) -> dict[str, bytes]:
    """What stands in each of the files."""
    return {path: camera.read_file(path) for path in FILES}


def access(camera: Camera) -> str:
    """Owner and mode of each of the files, and what lies beside them; a lock may."""
    return camera.run(f"stat -c '%n %U:%G %a' {' '.join(FILES)}; "
                      f"{LIST_BESIDE} | grep -v '[.]lock$'").check().out


def lines_with(camera: Camera, name: str) -> dict[str, int]:
    """The number of lines in each of the files that have a name as a word."""
    shown = camera.run(["grep", "-cw", name, *FILES]).out
    return {path: int(count) for path, count in (line.split(":") for line in shown.splitlines())}


def _lines(camera: Camera, path: str) -> list[list[str]]:
    return [line.split(":") for line in camera.read_file(path).decode().splitlines()]


def _has_type(number: int, ranges: tuple[tuple[int, int], ...]) -> bool:
    return any(low <= number <= high for low, high in ranges)
