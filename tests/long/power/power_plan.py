"""tests/long/power/power_plan.py: the changes of a recording, by chance, and what each must
answer."""
import hashlib
import random
from collections.abc import Callable
from dataclasses import dataclass, replace

# The files that a change may write, in the order in which the service replaces them.
FILES = ("passwd", "shadow", "group", "digest", "parameters", "boot")
# Clearing takes the password first, in a change of its own.
CLEARING_ORDER = ("shadow", "passwd", "group", "digest", "parameters", "boot")

EXISTING_GROUPS = ("video", "audio", "games", "plugdev")
LETTERS = "abcdefghijklmnopqrstuvwxyz"

# The least are one of every kind; the most are what a recording is kept short with.
LEAST_CHANGES, MOST_CHANGES = 20, 40
# As measured: the changes of accounts write most of it to the journal.
WRITES_OF_A_CHANGE = 50


@dataclass(frozen=True)
class Step:
    """A line for the recorder; whether it must be answered with success; the order of its files."""

    line: str
    succeeds: bool = True
    order: tuple[str, ...] = FILES

    @property
    def is_call(self) -> bool:
        return self.line.split()[0] not in ("write", "pause")


class Planner:
    """Makes one step after the other, and knows which accounts there are by then."""

    def __init__(self, seed: str) -> None:
        self._random = random.Random(seed)
        self._count = 0
        self.web_users: list[str] = []
        self.system_users: list[str] = []
        self.groups: list[str] = []

    def steps(self, changes: int) -> list[Step]:
        """Every kind of change at least once, if there are that many."""
        self.web_users, self.system_users, self.groups = [], [], []
        kinds: list[Callable[[], Step]] = [
            self._add_user, self._add_system_user, self._add_group, self._modify_password,
            self._modify_comment, self._modify_groups, self._set_root_password,
            self._set_boot_parameter, self._set_digest, self._chpasswd, self._clear_system_user,
            self._clear_user, self._add_uid_user, self._remove_user, self._delete_digest,
            self._remove_group, self._remove_system_user, self._set_boot_parameter,
            self._set_boot_parameter, self._refused]
        # Changes come more often than what is refused; the rest is for chance alone.
        others = [*kinds[:-1], self._add_user, self._modify_all, self._modify_all,
                  self._set_boot_parameter, self._set_boot_parameter, self._set_digest]
        steps = []
        for number in range(changes):
            if self._random.random() < 0.1:
                steps.append(self._disturbance())
            pool = [kinds[number]] if number < len(kinds) else [*others, kinds[-1]]
            step = self._random.choice(pool)()
            # Another program brings what is replaced to the disk, at any moment.
            watched = self._random.random() < 0.5
            steps.append(replace(step, line=f"watched {step.line}") if watched else step)
        return steps

    def _name(self, prefix: str) -> str:
        self._count += 1
        return prefix + self._word(1, 6) + str(self._count)

    def _word(self, shortest: int, longest: int) -> str:
        length = self._random.randint(shortest, longest)
        return "".join(self._random.choices(LETTERS, k=length))

    def _password(self) -> str:
        return self._word(4, 12).capitalize() + "-" + str(self._random.randint(0, 9999))

    def _comment(self) -> str:
        """Sometimes so long that the file needs another block."""
        longest = self._random.choice((10, 10, 60, 1500))
        return self._word(1, longest)

    def _some_groups(self) -> list[str]:
        return self._random.sample(EXISTING_GROUPS + tuple(self.groups), self._random.randint(1, 3))

    def _add_user(self) -> Step:
        name = self._name("w")
        self.web_users.append(name)
        return call("AddUser", name, self._password(), "users", ":".join(self._some_groups()),
                    self._comment())

    def _add_uid_user(self) -> Step:
        name = self._name("w")
        self.web_users.append(name)
        return Step(f"AddUidUser ({name!r}, {self._password()!r}, 'users', 'video', '', "
                    f"{3000 + self._count})")

    def _add_system_user(self) -> Step:
        name = self._name("s")
        self.system_users.append(name)
        return call("AddSystemUser", name, self._password(), "users", self._some_groups(),
                    "/bin/sh", self._comment())

    def _add_group(self) -> Step:
        name = self._name("g")
        self.groups.append(name)
        return call("AddGroup", name)

    def _modify(self, password: str = "", groups: list[str] | None = None,
                comment: str = "") -> Step:
        users = self.web_users + self.system_users
        if not users:
            return self._add_user()
        return call("ModifyUser", self._random.choice(users), password, "", groups or [], "",
                    comment)

    def _modify_password(self) -> Step:
        return self._modify(password=self._password())

    def _modify_comment(self) -> Step:
        return self._modify(comment=self._comment())

    def _modify_groups(self) -> Step:
        return self._modify(groups=self._some_groups())

    def _modify_all(self) -> Step:
        return self._modify(self._password(), self._some_groups(), self._comment())

    def _set_root_password(self) -> Step:
        method = self._random.choice(("ChpasswdUser", "ModifyUser"))
        if method == "ChpasswdUser":
            return call(method, "root", self._password())
        return call(method, "root", self._password(), "", [], "", "")

    def _chpasswd(self) -> Step:
        users = ["root", *self.web_users, *self.system_users]
        return call("ChpasswdUser", self._random.choice(users), self._password())

    def _clear_system_user(self) -> Step:
        if not self.system_users:
            return self._add_system_user()
        name = self._random.choice(self.system_users)
        return Step(f"ClearUserFields ({name!r}, true, true, true)", order=CLEARING_ORDER)

    def _clear_user(self) -> Step:
        if not self.web_users:
            return self._add_user()
        name = self._random.choice(self.web_users)
        return Step(f"ClearUserFields ({name!r}, false, true, true)")

    def _remove_user(self) -> Step:
        if not self.web_users:
            return self._add_user()
        return call("RemoveUser", self._taken(self.web_users))

    def _remove_system_user(self) -> Step:
        if not self.system_users:
            return self._add_system_user()
        return call("RemoveUser", self._taken(self.system_users))

    def _remove_group(self) -> Step:
        if not self.groups:
            return self._add_group()
        return call("RemoveGroup", self._taken(self.groups))

    def _taken(self, names: list[str]) -> str:
        return names.pop(self._random.randrange(len(names)))

    def _set_digest(self) -> Step:
        lines = [f"{name}:PRIVANE:{hashlib.md5(self._password().encode()).hexdigest()}"
                 for name in self._random.sample(("guest", "visitor", "recorder", "wall"), 2)]
        return call("Digest", [self._random.choice(("set", "create")), "\\n".join(lines)])

    def _delete_digest(self) -> Step:
        return call("Digest", ["delete", self._random.choice(("guest", "visitor", "wall"))])

    def _set_boot_parameter(self) -> Step:
        name = self._random.choice(("COLOUR", "REGION", "MOUNT", "LENS"))
        return call("AddBootblockParam", name, self._word(1, self._random.choice((8, 8, 3000))))

    def _refused(self) -> Step:
        return self._random.choice((
            call("RemoveUser", "nosuch", succeeds=False),
            call("AddGroup", "root", succeeds=False),
            call("AddUser", "nogroup", "Sunny-7", "nosuch", "", "", succeeds=False)))

    def _disturbance(self) -> Step:
        if self._random.random() < 0.3:
            return Step(f"pause {self._random.randint(1, 400)}")
        return Step(f"write other-{self._random.randint(1, 5)} {self._random.randint(1, 20000)}")


def changes_for(states: int) -> int:
    """So many that the disk after each of their writes is about two thirds of the states."""
    changes = states * 2 // 3 // WRITES_OF_A_CHANGE
    return min(max(changes, LEAST_CHANGES), MOST_CHANGES)


def call(method: str, *arguments: str | list[str], succeeds: bool = True) -> Step:
    words = [_literal(word) for word in arguments]
    comma = "," if len(words) == 1 else ""
    return Step(f"{method} ({', '.join(words)}{comma})", succeeds)


def _literal(word: str | list[str]) -> str:
    if isinstance(word, str):
        return f"'{word}'"
    return "[" + ", ".join(f"'{each}'" for each in word) + "]" if word else "@as []"
