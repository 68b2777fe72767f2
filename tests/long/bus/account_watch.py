"""tests/long/bus/account_watch.py: whether the account files are whole, agree, and spare root."""
from dataclasses import dataclass
from pathlib import Path

from harness.accounts import GROUP, PASSWD, SHADOW

FIELDS = {PASSWD: 7, SHADOW: 9, GROUP: 4}


def rows(path: Path, content: bytes | None = None) -> list[list[str]]:
    """The lines of a file, each of which must be complete."""
    content = path.read_bytes() if content is None else content
    *lines, rest = content.decode().split("\n")
    split = [line.split(":") for line in lines]
    bad = [line for line, fields in zip(lines, split) if len(fields) != FIELDS[path]]
    assert rest == "" and split and not bad, f"{path} is torn: {bad[:3]} {rest[-80:]!r}"
    names = [fields[0] for fields in split]
    assert "" not in names and len(set(names)) == len(names), f"{path}: {sorted(names)}"
    return split


@dataclass(frozen=True)
class Root:
    """The lines of root."""

    passwd: tuple[str, ...]
    shadow: tuple[str, ...]

    @classmethod
    def of(cls, passwd: list[list[str]], shadow: list[list[str]]) -> "Root":
        """There must be just the one user with the ID 0, in its place."""
        mine = [row for row in passwd if row[0] == "root" or not row[2].strip("0")]
        hidden = [row for row in shadow if row[0] == "root"]
        assert len(mine) == len(hidden) == 1, (mine, hidden)
        assert mine[0][:3] == ["root", "x", "0"], mine
        assert hidden[0][1] == "*" or hidden[0][1].startswith("$5$"), "root's password is broken"
        return cls(tuple(mine[0]), tuple(hidden[0]))


def require_agreement() -> tuple[list[str], list[str], set[int], set[int]]:
    """Fails unless the three files, between two changes, tell of the same users and groups. The
    names of both, the GIDs, and those of primary groups that are missing."""
    passwd, shadow, group = (rows(path) for path in FIELDS)
    users = [row[0] for row in passwd]
    assert sorted(users) == sorted(row[0] for row in shadow)
    assert len({row[2] for row in passwd}) == len(passwd), "a UID twice"
    assert len({row[2] for row in group}) == len(group), "a GID twice"
    members = {member for row in group for member in row[3].split(",")} - {""}
    assert members <= set(users), members - set(users)
    Root.of(passwd, shadow)
    assert [row[2] for row in group if row[0] == "root"] == ["0"]
    gids = {int(row[2]) for row in group}
    return users, [row[0] for row in group], gids, {int(row[3]) for row in passwd} - gids


class Watch:
    """Looks at passwd and shadow whenever one was replaced, also amid a change."""

    def __init__(self) -> None:
        self._seen: tuple[tuple[int, int], ...] = ()
        self.looks = 0
        self.root = Root.of(rows(PASSWD), rows(SHADOW))

    def changed_root(self) -> bool:
        """Whether root's lines are other ones than at the last call; fails where a file is torn."""
        now = tuple((stat.st_ino, stat.st_mtime_ns) for stat in (PASSWD.stat(), SHADOW.stat()))
        if now == self._seen:
            return False
        self._seen = now
        self.looks += 1
        old, self.root = self.root, Root.of(rows(PASSWD), rows(SHADOW))
        return self.root != old
