"""tests/bus/harness/modelled_stage.py: a service whose every call is compared with the model.

What is compared is all that came of the call, the three account files and the digest file line by
line, and the database over the bus.
"""
import copy
import unicodedata
from typing import Any, Iterable, Sequence

from harness.account_model import AccountModel
from harness.account_rules import ModelGroup, ModelUser, Outcome, Refused, on_one_line
from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.changing_accounts import GROUP_TEXT, PASSWD_TEXT, SHADOW_TEXT, is_today
from harness.passwords import OLD, OLD_HASH, is_hash_of
from harness.stage import Effects, Stage, refused
from harness.stage_fixtures import DIGEST_FILE
from harness.world import file_state

FILES = (PASSWD, SHADOW, GROUP, DIGEST_FILE)

# The log shows so many bytes of a text.
LOG_BYTES = 4096
MARKS_OF_DIRECTION = {0x061C, 0x200E, 0x200F, *range(0x2028, 0x202F), *range(0x2066, 0x206A)}


def shown(text: str) -> str:
    """A text as the log has it: on one line, and without what a terminal would obey."""
    def one(character: str) -> str:
        if unicodedata.category(character) == "Cc" or ord(character) in MARKS_OF_DIRECTION:
            return "".join(f"\\x{byte:02X}" for byte in character.encode())
        return character
    return "".join(map(one, text))


def read_lines(content: bytes, fields: int) -> list[list[str]]:
    """The fields of each line, every one of which must be complete."""
    *lines, rest = content.split(b"\n")
    rows = [line.decode().split(":") for line in lines]
    assert rest == b"" and {len(row) for row in rows} <= {fields}, rows
    return rows


def matches(line: str, whole: str) -> bool:
    """Whether a line of the log is the whole one, or what the log shows of a long one."""
    if len(whole.encode()) <= LOG_BYTES:
        return line == whole
    start, _, rest = line.rpartition(" [")
    return (whole.startswith(start) and rest.endswith(" more bytes]")
            and LOG_BYTES - 10 < len(start.encode()) < LOG_BYTES + 20)


def compare(effects: Effects, expected: Effects, call: str) -> None:
    for name in Effects.__dataclass_fields__:
        got, wanted = getattr(effects, name), getattr(expected, name)
        if name == "output":
            same = len(got) == len(wanted) and all(map(matches, got, wanted))
        else:
            same = got == wanted
        assert same, f"{call}: {name} is {got!r:.300} and not {wanted!r:.300}"


def model_of(passwd: str, group: str) -> AccountModel:
    """The accounts of files in which everybody has the password OLD but who is locked."""
    users = [ModelUser(name, int(uid), int(gid), comment, home, shell,
                       None if name == "nobody" else OLD)
             for name, _, uid, gid, comment, home, shell in read_lines(passwd.encode(), 7)]
    groups = [ModelGroup(name, int(gid), set(members.split(",")) - {""})
              for name, _, gid, members in read_lines(group.encode(), 4)]
    return AccountModel(users, groups)


class ModelledStage:
    """The stage with our own stores, with more users of the web and of the system, whose UIDs are
    web_uids and system_uids, and who are named web1000 and system997 after them."""

    def __init__(self, stage: Stage, files: AccountFiles, web_uids: Sequence[int] = (),
                 system_uids: Sequence[int] = ()) -> None:
        self.stage = stage
        extra = [(f"web{uid}", uid) for uid in web_uids]
        extra += [(f"system{uid}", uid) for uid in system_uids]
        passwd = PASSWD_TEXT + "".join(f"{name}:x:{uid}:100:::/bin/false\n" for name, uid in extra)
        shadow = SHADOW_TEXT + "".join(f"{name}:{OLD_HASH}:19000:0:99999:7:0::\n"
                                       for name, _ in extra)
        self.model = model_of(passwd, GROUP_TEXT)
        # Clear text, shadow field and day of each user as they were last seen.
        self._seen = {name: (user.password, OLD_HASH if user.password else "*", "19000")
                      for name, user in self.model.users.items()}
        self._told: dict[str, ModelUser] = {}
        self._group_fields = {name: "x" for name in self.model.groups}
        stage.stop()
        files.write_exactly(passwd, shadow, GROUP_TEXT)
        stage.start()
        self.check()

    def act(self, member: str, *arguments: Any) -> None:
        """Makes a call and compares what came of it."""
        call = f"{member}{arguments!r:.200}"
        before = [file_state(file) for file in FILES]
        users = copy.deepcopy(self.model.users)
        try:
            outcome = self.model.call(member, *arguments)
        except Refused as error:
            effects = self.stage.call(member, *arguments)
            expected = self._refusal(member, arguments, error)
            # A password that was cleared stays so when the other fields cannot be.
            is_untouched = self.model.users == users
            assert is_untouched == ([file_state(file) for file in FILES] == before), call
        else:
            effects = self.stage.call(member, *arguments)
            expected = self._success(outcome)
        if member == "GetGroup" and isinstance(effects.answer, tuple):
            gid, members = effects.answer
            effects.answer = (gid, sorted(members))
        compare(effects, expected, call)
        self.check()

    def _success(self, outcome: Outcome) -> Effects:
        effects = self.stage.done(signal_sent=outcome.signal_sent, pidof_run=outcome.pidof_run,
                                  lines=tuple(map(shown, outcome.lines)))
        effects.answer = outcome.answer
        return effects

    def _refusal(self, member: str, arguments: tuple[Any, ...], error: Refused) -> Effects:
        domain, code, text = error.args
        effects = refused(domain, code, text)
        line = f"warning: {shown(text)}"
        effects.output = [line] * (2 if member == "AuthUserBasic" and code == 5 else 1)
        if member == "ModifyUser" and arguments[0] == "anonymous":
            effects.output.insert(0, "message: Updating anonymous user!")
        return effects

    def restart(self) -> None:
        """The service knows from the files what it knew before."""
        self._check_users(self.model.users)
        self.stage.restart()
        self.model.read_again()
        self.check()
        self._check_users(self.model.users)

    def check(self) -> None:
        """The files, the lists of names and the groups, and the users that changed, and root."""
        self._check_passwd()
        self._check_shadow()
        self._check_group()
        assert DIGEST_FILE.read_text() == "".join(self.model.digest.values())
        self._check_users([name for name, user in self.model.users.items()
                           if user != self._told.get(name) or name == "root"])
        self._told = copy.deepcopy(self.model.users)
        bus = self.stage.bus
        assert bus.call("GetUserList") == (list(self.model.users),)
        names, gids, members = bus.call("GetGroupListFull")
        groups = self.model.groups.values()
        assert names == [group.name for group in groups]
        assert gids == [group.gid for group in groups]
        assert list(map(set, members)) == [group.members for group in groups]
        assert list(map(len, members)) == [len(group.members) for group in groups]

    def _check_users(self, names: Iterable[str]) -> None:
        for name in names:
            answer = self.stage.bus.call("GetUser", "s", name)
            assert answer == self.model.bus_form(self.model.users[name]), name

    def _check_passwd(self) -> None:
        rows = read_lines(PASSWD.read_bytes(), 7)
        assert rows == [[user.name, "x", str(user.uid), str(user.gid), on_one_line(user.comment),
                         user.home, user.shell] for user in self.model.users.values()]
        assert [row for row in rows if row[0] == "root" or int(row[2]) == 0] == [
            ["root", "x", "0", "0", "root", "/root", "/bin/sh"]]

    def _check_shadow(self) -> None:
        rows = read_lines(SHADOW.read_bytes(), 9)
        assert [row[0] for row in rows] == list(self.model.users)
        for name, field, day, *ageing in rows:
            password = self.model.users[name].password
            if name in self._seen and self._seen[name][0] == password:
                assert (password, field, day) == self._seen[name]
            elif password is None:
                assert field == "*", name
            else:
                assert field.startswith("$5$") and is_hash_of(field, password), name
                assert is_today(day), name
            assert ageing == ["0", "99999", "7", "0", "", ""], name
        self._seen = {name: (self.model.users[name].password, field, day)
                      for name, field, day, *_ in rows}

    def _check_group(self) -> None:
        rows = read_lines(GROUP.read_bytes(), 4)
        assert [[name, field, gid, set(members.split(",")) - {""}]
                for name, field, gid, members in rows] == [
            [group.name, self._group_fields.get(group.name, ""), str(group.gid), group.members]
            for group in self.model.groups.values()]
        assert all(len(set(row[3].split(","))) == len(row[3].split(",")) for row in rows)

