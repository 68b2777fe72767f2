"""tests/long/bus/account_history.py: the versions that calls make of the files, by the rules."""
import copy
from typing import Any

from harness.account_model import AccountModel
from harness.account_rules import ModelGroup, ModelUser, Outcome, Refused, on_one_line
from harness.accounts import GROUP, PASSWD, SHADOW
from harness.stage_fixtures import DIGEST_FILE
from kept_files import (BOOT_BLOCK, PARAMETERS, Hashes, Version, boot_text, read_version,
                        sort_members)

AGEING = ["0", "99999", "7", "0", "", ""]
ROOT_FLAG = "root.System.RootPwdSet=yes\n"
LOCKED = "*"

Call = tuple[Any, ...]

# What a call that is made again may answer when the first had come far enough.
REPEATED = {("usermgmt", 3), ("usermgmt", 6), ("usermgmt", 7), ("privaneSystemError", 14)}

# Where a call has the clear text of a password.
PASSWORD_AT = {"AddUser": 2, "AddUidUser": 2, "AddSystemUser": 2, "ModifyUser": 2,
               "ChpasswdUser": 2}


def rows(text: str) -> list[list[str]]:
    return [line.split(":") for line in text.splitlines()]


class History:
    """Begins with what is on disk, as the service would load it; version 0 is the disk itself."""

    def __init__(self, hashes: Hashes) -> None:
        self._hashes = hashes
        disk = read_version(hashes)
        self.versions: list[Version] = [disk]
        self._parameters = dict(line.split("=", 1) for line in disk[BOOT_BLOCK].splitlines())
        shadow = {name: (field, day) for name, field, day, *_ in rows(disk[SHADOW])}
        self._group_fields = {name: field for name, field, *_ in rows(disk[GROUP])}
        groups = [ModelGroup(name, int(gid), set(members.split(",")) - {""})
                  for name, _, gid, members in rows(disk[GROUP])]
        gids = {group.gid for group in groups}
        users = [ModelUser(name, int(uid), int(gid), comment, home, shell,
                           self._clear_text(shadow[name][0]))
                 for name, _, uid, gid, comment, home, shell in rows(disk[PASSWD])
                 if name in shadow and int(gid) in gids]
        self._days = {user.name: shadow[user.name][1] for user in users}
        self.model = AccountModel(users, groups)
        self.model.digest = {row[0]: ":".join(row) + "\n" for row in rows(disk[DIGEST_FILE])}

    @staticmethod
    def _clear_text(field: str) -> str | None:
        if field == LOCKED:
            return None
        assert field.startswith("<"), f"no hash of a password that was given: {field}"
        return field[1:-1]

    @property
    def newest(self) -> int:
        return len(self.versions) - 1

    def ghosts(self) -> dict[str, set[str]]:
        """For each group its members without a passwd line."""
        names = {row[0] for row in rows(self.versions[0][PASSWD])}
        found = {row[0]: set(row[3].split(",")) - {""} - names
                 for row in rows(self.versions[0][GROUP])}
        return {group: members for group, members in found.items() if members}

    def shadowless(self) -> set[str]:
        """The names with a passwd line and without one in shadow."""
        in_passwd, in_shadow = ({row[0] for row in rows(self.versions[0][path])}
                                for path in (PASSWD, SHADOW))
        return in_passwd - in_shadow

    def begin(self, call: Call) -> tuple[str, int] | None:
        """Adds the versions that a call makes; None, or domain and code of its refusal."""
        member, *arguments = call
        if member in PASSWORD_AT:
            self._hashes.give(call[1], call[PASSWORD_AT[member]])
        if member == "ClearUserFields" and arguments[1]:
            # The password is cleared and written first, the other fields after that.
            name, _, groups, comment = arguments
            steps = [(member, name, True, False, False), (member, name, False, groups, comment)]
        else:
            steps = [call]
        try:
            for step in steps:
                self._step(*step)
        except Refused as error:
            domain, code, _ = error.args
            return domain, code
        return None

    def _step(self, member: str, *arguments: Any) -> None:
        before = copy.deepcopy((self.model.users, self.model.groups))
        if member == "AddBootblockParam":
            self._parameters[arguments[0]] = arguments[1]
        else:
            self._call_model(member, *arguments)
        self._note_days(before[0])
        version = dict(self.versions[-1])
        if self.model.users != before[0]:
            version[PASSWD], version[SHADOW] = self._passwd(), self._shadow()
        if self.model.groups != before[1]:
            version[GROUP] = self._group()
        version[DIGEST_FILE] = "".join(self.model.digest.values())
        version[BOOT_BLOCK] = boot_text(self._parameters)
        if arguments[0] == "root" and member in ("ModifyUser", "ChpasswdUser"):
            version[PARAMETERS] = ROOT_FLAG
        self.versions.append(version)

    def _call_model(self, member: str, *arguments: Any) -> Outcome:
        outcome = self.model.call(member, *arguments)
        for group in self.model.groups:
            self._group_fields.setdefault(group, "")
        for group in set(self._group_fields) - set(self.model.groups):
            del self._group_fields[group]
        return outcome

    def _note_days(self, before: dict[str, ModelUser]) -> None:
        for name, user in self.model.users.items():
            is_new = name not in before
            if user.password is not None and (is_new or before[name].password != user.password):
                self._days[name] = "TODAY"

    def _passwd(self) -> str:
        return "".join(f"{user.name}:x:{user.uid}:{user.gid}:{on_one_line(user.comment)}:"
                       f"{user.home}:{user.shell}\n" for user in self.model.users.values())

    def _shadow(self) -> str:
        fields = [(user.name, LOCKED if user.password is None else f"<{user.password}>")
                  for user in self.model.users.values()]
        return "".join(":".join([name, field, self._days[name], *AGEING]) + "\n"
                       for name, field in fields)

    def _group(self) -> str:
        return "".join(sort_members(f"{group.name}:{self._group_fields[group.name]}:{group.gid}:"
                                    f"{','.join(group.members)}") + "\n"
                       for group in self.model.groups.values())
