"""tests/bus/harness/account_model.py: what a call makes of the accounts, worked out by the rules.

Nothing of the service is asked or read here.
"""
import re
from typing import Any, Callable, Sequence

from harness.account_rules import (ANYBODY, DEFAULT_SHELL, GROUP_NAME, GROUP_RANGES,
                                   LONGEST_CLEAR_TEXT, REALM, TOLD_ON_THE_BUS, TOLD_TO_CFGSTORE,
                                   ModelGroup, ModelUser, Outcome, digest_line, is_digest_user,
                                   on_one_line, own, require_line, require_ornet_name,
                                   require_ornet_password, require_type, size, type_of, unwritable,
                                   usermgmt, with_action)


class AccountModel:
    """The databases in the order of their entries, and the web server's file."""

    def __init__(self, users: Sequence[ModelUser], groups: Sequence[ModelGroup]) -> None:
        self.users = {user.name: user for user in users}
        self.groups = {group.name: group for group in groups}
        self.digest: dict[str, str] = {}

    def call(self, member: str, *arguments: Any) -> Outcome:
        methods: dict[str, Callable[..., Outcome]] = {
            "AddUser": self._add_user, "AddUidUser": self._add_user,
            "AddSystemUser": self._add_system_user, "ModifyUser": self._modify_user,
            "ClearUserFields": self._clear_user_fields, "ChpasswdUser": self._chpasswd_user,
            "RemoveUser": self._remove_user, "AddGroup": self._add_group,
            "RemoveGroup": self._remove_group, "Digest": self._digest,
            "AuthUserBasic": self._auth_user_basic, "GetUser": self._get_user,
            "GetGroup": self._get_group,
            "CheckUser": lambda name: Outcome((name in self.users,)),
            "CheckGroup": lambda name: Outcome((name in self.groups,))}
        return methods[member](*arguments)

    def read_again(self) -> None:
        """A start of the service: the files know less than the database did."""
        for user in self.users.values():
            user.comment = on_one_line(user.comment)
            user.has_password = True

    def _announce(self, told: str, *lines: str) -> Outcome:
        return Outcome((), list(lines), told in TOLD_ON_THE_BUS, told in TOLD_TO_CFGSTORE)

    def _require_groups(self, primary: str, others: Sequence[str]) -> None:
        for kind, name in [("primary", primary)] * bool(primary) + [
                ("secondary", name) for name in others]:
            if name not in self.groups:
                raise usermgmt(4, f"{kind} group '{name}' does not exist")

    def _secondary(self, user: ModelUser) -> list[str]:
        return [group.name for group in self.groups.values()
                if user.name in group.members and group.gid != user.gid]

    def _join(self, name: str, groups: Sequence[str]) -> None:
        for group in groups:
            self.groups[group].members.add(name)

    def _set_digest(self, name: str, password: str) -> None:
        self.digest[name] = digest_line(name, password)

    # Adding.

    def _add(self, name: str, password: str, primary: str, groups: Sequence[str], shell: str,
             comment: str, uid: int, is_ornet: bool) -> None:
        if not name:
            raise usermgmt(17, "usernames must match")
        if name in self.users:
            raise usermgmt(6, "user already exists")
        if not primary:
            raise usermgmt(4, "no primary group specified")
        if is_ornet:
            require_ornet_name(name)
            require_ornet_password(password)
        self._require_groups(primary, groups)
        if size(password) > LONGEST_CLEAR_TEXT:
            raise usermgmt(16, "crypt() failed, Numerical result out of range")
        uids = [user.uid for user in self.users.values()]
        if is_ornet and uid == ANYBODY:
            uid = max([999] + [number for number in uids if 1000 <= number <= 60000]) + 1
        elif uid == ANYBODY:
            uid = min([1000] + [number for number in uids if 500 <= number <= 999]) - 1
        elif uid in uids:
            raise usermgmt(17, "specified UID is unavailable")
        require_line(name, shell, len(self.users))
        if "," in name:
            joined = [index for index, group in enumerate(self.groups)
                      if group in (primary, *groups)]
            raise unwritable("group", joined[0])
        self.users[name] = ModelUser(name, uid, self.groups[primary].gid, comment, "",
                                     shell or DEFAULT_SHELL, password or None, bool(password))
        self._join(name, [primary, *groups])

    def _add_user(self, name: str, password: str, primary: str, joined: str, comment: str,
                  uid: int = ANYBODY) -> Outcome:
        with_action("add user", name, self._add, name, password, primary,
                    joined.split(":") if joined else [], "", comment, uid, True)
        self._set_digest(name, password)
        return self._announce("ornet")

    def _add_system_user(self, name: str, password: str, primary: str, groups: Sequence[str],
                         shell: str, comment: str) -> Outcome:
        with_action("add user", name, self._add, name, password, primary, groups, shell, comment,
                    ANYBODY, False)
        return self._announce("dynamic system")

    # Changing.

    def _modify(self, name: str, password: str = "", primary: str = "", groups: Sequence[str] = (),
                shell: str = "", comment: str = "") -> None:
        """What empties a field is not done here."""
        if name not in self.users:
            raise usermgmt(3, "user does not exist")
        user = self.users[name]
        if not any((password, primary, groups, shell, comment)):
            return
        require_type(user, bool(groups), not any((primary, groups, shell, comment)))
        if user.type == "ornet":
            if password:
                require_ornet_password(password)
            if shell:
                raise usermgmt(12, "no shell login allowed for ORNET users")
        self._require_groups(primary, groups)
        require_line(name, shell, list(self.users).index(name))
        if size(password) > LONGEST_CLEAR_TEXT:
            raise usermgmt(16, "crypt() failed, Numerical result out of range")
        if primary and self.groups[primary].gid != user.gid:
            self._leave([group.name for group in self.groups.values() if group.gid == user.gid],
                        name)
            user.gid = self.groups[primary].gid
            self._join(name, [primary])
        if groups:
            self._leave(self._secondary(user), name)
            self._join(name, [group for group in groups if self.groups[group].gid != user.gid])
        if password:
            user.password, user.has_password = password, True
        user.comment = comment or user.comment
        user.shell = shell or user.shell

    def _leave(self, groups: Sequence[str], name: str) -> None:
        for group in groups:
            self.groups[group].members.discard(name)

    def _modify_user(self, name: str, password: str, primary: str, groups: Sequence[str],
                     shell: str, comment: str) -> Outcome:
        if not name:
            raise own(14, "Provided username cannot be NULL/empty")
        if name not in self.users:
            raise own(14, "User modification failed, user type could not be determined")
        kind = self.users[name].type
        with_action("modify user", name, self._modify, name, password, primary, groups, shell,
                    comment)
        lines = ["message: Updating anonymous user!"] if name == "anonymous" else []
        if password and kind in ("ornet", "root"):
            self._set_digest(name, password)
            lines.append(f"message: Updated digest info {name} (usertype={kind})!")
        if kind == "root":
            lines.append("message: Updating root user!")
        return self._announce("everybody" if name == "anonymous" else kind, *lines)

    def _clear(self, name: str, groups: bool, comment: bool) -> None:
        if name not in self.users:
            raise usermgmt(3, "user does not exist")
        user = self.users[name]
        require_type(user, groups, False)
        if groups:
            self._leave(self._secondary(user), name)
        if comment:
            user.comment = ""

    def _disable(self, name: str) -> None:
        if name not in self.users:
            raise usermgmt(3, "user does not exist")
        user = self.users[name]
        if user.type not in ("permanent", "dynamic system"):
            raise usermgmt(5, f"password cannot be disabled for user type '{user.type}'")
        user.password, user.has_password = None, False

    def _clear_user_fields(self, name: str, password: bool, groups: bool,
                           comment: bool) -> Outcome:
        if not name:
            raise own(14, "Provided username cannot be NULL/empty")
        if password:
            with_action("disable password for ", name, self._disable, name)
        if groups or comment:
            with_action("modify user", name, self._clear, name, groups, comment)
        return self._announce("everybody" if password or groups else "none")

    def _chpasswd_user(self, name: str, password: str) -> Outcome:
        with_action("modify user", name, self._modify, name, password)
        is_root = self.users[name].type == "root"
        return Outcome((), ["message: Updating root user!"] if is_root else [])

    def _delete(self, name: str) -> None:
        kind = self.users[name].type
        if kind not in ("dynamic system", "ornet"):
            raise usermgmt(11, f"cannot delete '{name}' with user type '{kind}'")
        self._leave(list(self.groups), name)
        del self.users[name]

    def _remove_user(self, name: str) -> Outcome:
        if name not in self.users:
            raise own(14, "User deletion failed, user type could not be determined")
        kind = self.users[name].type
        with_action("delete user", name, self._delete, name)
        if kind == "ornet":
            self.digest.pop(name, None)
        return self._announce(kind)

    # Groups.

    def _add_group(self, name: str) -> Outcome:
        text = f"Failed to add group '{name}', "
        if name in self.groups:
            raise usermgmt(7, text + "group already exists")
        if not name:
            raise usermgmt(4, text + "group name must have at least one character")
        if name.startswith("-"):
            raise usermgmt(4, text + "group name cannot begin with '-'")
        if not GROUP_NAME.fullmatch(name):
            raise usermgmt(4, text + "group name contains invalid characters")
        taken = [group.gid for group in self.groups.values() if 500 <= group.gid <= 999]
        self.groups[name] = ModelGroup(name, min([1000] + taken) - 1)
        return Outcome()

    def _remove_group(self, name: str) -> Outcome:
        text = f"Failed to delete group '{name}', "
        if name not in self.groups:
            raise usermgmt(7, text + "group does not exist")
        group = self.groups[name]
        kind = type_of(group.gid, GROUP_RANGES)
        if kind not in ("dynamic system", "permanent system nvr"):
            raise usermgmt(11, text + f"group type '{kind}' with GID {group.gid} "
                           "cannot be deleted")
        del self.groups[name]
        return Outcome()

    # The web server's file, and what changes nothing.

    def _digest(self, words: Sequence[str]) -> Outcome:
        if len(words) < 2:
            raise own(24, "Invalid parameters digest management")
        action, users = words[:2]
        if action not in ("set", "create", "delete"):
            raise own(24, f"Invalid action '{users}' to digest management")
        lines = users.split("\n")
        lines = lines[:-1] if not lines[-1] else lines
        entry = re.compile(f"(?P<name>[^:]*):{REALM}:[0-9a-f]{{32}}")
        entries = [entry.fullmatch(line) for line in lines]
        names = [match["name"] if match else line if action == "delete" else ""
                 for match, line in zip(entries, lines)]
        if all(map(is_digest_user, names)):
            for name, line in zip(names, lines):
                if action == "delete":
                    self.digest.pop(name, None)
                else:
                    self.digest[name] = line + "\n"
        return Outcome()

    def _auth_user_basic(self, name: str, password: str) -> Outcome:
        if name not in self.users:
            raise own(5, f"Failed to locate user {name}.")
        if self.users[name].password != password:
            raise own(7, f"No valid password for user {name}")
        return Outcome()

    def _get_user(self, name: str) -> Outcome:
        if name not in self.users:
            raise usermgmt(3, f"Could not retrieve user '{name}', user does not exist")
        return Outcome(self.bus_form(self.users[name]))

    def _get_group(self, name: str) -> Outcome:
        if name not in self.groups:
            raise usermgmt(4, f"Group '{name}' does not exist")
        return Outcome((self.groups[name].gid, sorted(self.groups[name].members)))

    def bus_form(self, user: ModelUser) -> tuple[Any, ...]:
        (primary,) = [group.name for group in self.groups.values() if group.gid == user.gid]
        return (user.has_password, primary, self._secondary(user), user.comment, user.uid)
