"""tests/bus/test_hostile_strings.py: hostile text in every string argument of the account methods.

What each value leads to comes from harness/account_model.py, and harness/modelled_stage.py compares
it after every call.
"""
import shutil
from pathlib import Path
from typing import Any, Callable, Iterator

import pytest

from harness.account_rules import digest_line
from harness.accounts import AccountFiles
from harness.modelled_stage import ModelledStage
from harness.passwords import MARK, NEW, OLD
from harness.stage import Stage

HOSTILE = (
    "", "A" * (1 << 16), ":", ",", "\n", "\r", "\t", "\x01", "\x7f", "\x1b[2J", "\x85", " ",
    " root", "root ", "root\n", "root\r", "+x", "-x", "#x", "+", ".", "..", "../../etc/shadow", "/",
    "%s%n", "\\", "$6$", "å€", "\N{PILE OF POO}", "a\u2028b", "a\u202eb", "\ufeffroot",
    "root\nevil:x:0:0::/:/bin/sh", "a\nwarning: forged", "a:b", "a,b", "x", "*", "!")
# Names of accounts of every type, of which some are a user's, some a group's, and some both.
ACCOUNTS = ("root", "daemon", "anonymous", "nobody", "timer", "alice", "users", "viewer", "nogroup",
            "recorder")
NAMES = HOSTILE + ACCOUNTS

WEB_UIDS = range(1002, 1002 + len(NAMES))
SYSTEM_UIDS = range(997, 997 - len(NAMES), -1)

Enact = Callable[..., ModelledStage]


@pytest.fixture
def enact(stage_with_stores: Stage, accounts: AccountFiles) -> Iterator[Enact]:
    """Makes the modelled stage, which is compared once more after a restart."""
    made: list[ModelledStage] = []

    def enact_with(**users: Any) -> ModelledStage:
        made.append(ModelledStage(stage_with_stores, accounts, **users))
        return made[0]
    yield enact_with
    shutil.rmtree(Path("/etc/privane"), ignore_errors=True)
    for modelled in made:
        modelled.restart()


def placed(arguments: tuple[Any, ...], position: int, value: str) -> tuple[Any, ...]:
    """The arguments with the value in one place; in an array it is the last element."""
    old = arguments[position]
    new = [*old, value] if isinstance(old, list) else value
    return (*arguments[:position], new, *arguments[position + 1:])


# The accepted calls into which each value is put. A name in which "{}" stands is another one for
# each value, so that all that was accepted is still there at the end.
ADDS = {
    "AddUser": ("new{}", NEW, "users", "viewer", "Comment"),
    "AddUidUser": ("new{}", NEW, "users", "viewer", "Comment", 30000),
    "AddSystemUser": ("new{}", NEW, "users", ["viewer"], "/bin/sh", "Comment"),
}


def string_positions(arguments: tuple[Any, ...]) -> list[int]:
    return [index for index, argument in enumerate(arguments) if not isinstance(argument, int)]


@pytest.mark.parametrize("member, position", [
    (member, position) for member, arguments in ADDS.items()
    for position in string_positions(arguments)])
def test_add(member: str, position: int, enact: Enact) -> None:
    modelled = enact()
    for number, value in enumerate(NAMES):
        arguments = placed(ADDS[member], position, value)
        if position != 0:
            arguments = (arguments[0].format(number), *arguments[1:])
        if member == "AddUidUser":
            arguments = (*arguments[:-1], arguments[-1] + number)
        modelled.act(member, *arguments)


def test_name_in_the_group_of_root(enact: Enact) -> None:
    """Of "+x" the C library reads both IDs as 0, of which one is here as it was meant."""
    modelled = enact()
    for value in NAMES:
        modelled.act("AddSystemUser", value, NEW, "root", [], "", "")


@pytest.mark.parametrize("joined", ["{}:viewer", "viewer:{}", "{}:{}"])
def test_group_among_joined_ones(joined: str, enact: Enact) -> None:
    modelled = enact()
    for number, value in enumerate(NAMES):
        modelled.act("AddUser", f"new{number}", NEW, "users", joined.replace("{}", value), "")




@pytest.mark.parametrize("position", range(5))
@pytest.mark.parametrize("kind", ["web", "system"])
def test_modify(kind: str, position: int, enact: Enact) -> None:
    modelled = enact(**{f"{kind}_uids": WEB_UIDS if kind == "web" else SYSTEM_UIDS})
    for value, uid in zip(NAMES, WEB_UIDS if kind == "web" else SYSTEM_UIDS):
        modelled.act("ModifyUser", f"{kind}{uid}",
                    *placed(("", "", [], "", ""), position, value))


@pytest.mark.parametrize("name", ["root", "daemon", "anonymous", "nobody"])
@pytest.mark.parametrize("position", range(5))
def test_modify_others(position: int, name: str, enact: Enact) -> None:
    modelled = enact()
    for value in NAMES:
        modelled.act("ModifyUser", name, *placed(("", "", [], "", ""), position, value))


@pytest.mark.parametrize("position", [0, 3, 4])
def test_modify_visitor_with_groups(position: int, enact: Enact) -> None:
    modelled = enact()
    for value in NAMES:
        modelled.act("ModifyUser", "anonymous",
                    *placed(("", "", ["viewer"], "", ""), position, value))


@pytest.mark.parametrize("kind", ["web", "system", "root", "daemon", "anonymous", "nobody"])
def test_password(kind: str, enact: Enact) -> None:
    uids = {"web": WEB_UIDS, "system": SYSTEM_UIDS}.get(kind, [])
    modelled = enact(**{f"{kind}_uids": uids} if uids else {})
    for number, value in enumerate(NAMES):
        name = f"{kind}{uids[number]}" if uids else kind
        modelled.act("ChpasswdUser", name, value)
        modelled.act("AuthUserBasic", name, value)
        modelled.act("AuthUserBasic", name, f"{value}{MARK}")


# Calls that take a name, with all that comes behind it.
ON_USERS: list[tuple[str, tuple[Any, ...]]] = [
    ("ModifyUser", (NEW, "users", ["operator"], "", "Comment")),
    ("ModifyUser", (NEW, "", [], "", "")),
    ("ChpasswdUser", (NEW,)),
    ("ClearUserFields", (True, True, True)),
    ("ClearUserFields", (False, True, True)),
    ("ClearUserFields", (False, False, True)),
    ("RemoveUser", ()),
    ("AuthUserBasic", (OLD,)),
    ("CheckUser", ()),
    ("GetUser", ()),
]
QUERIES = ("CheckUser", "GetUser", "CheckGroup", "GetGroup")


@pytest.mark.parametrize("member, rest", ON_USERS, ids=lambda value: str(value)[:24])
def test_name(member: str, rest: tuple[Any, ...], enact: Enact) -> None:
    modelled = enact()
    for value in NAMES:
        modelled.act(member, value, *rest)


@pytest.mark.parametrize("member", ["AddGroup", "RemoveGroup", "CheckGroup", "GetGroup"])
def test_group_name(member: str, enact: Enact) -> None:
    modelled = enact()
    # The group timer is the primary one of a user whom nobody could look up without it.
    for value in (name for name in NAMES if (member, name) != ("RemoveGroup", "timer")):
        modelled.act(member, value)


def test_group_that_was_accepted_can_be_used_and_removed(enact: Enact) -> None:
    modelled = enact()
    for number, value in enumerate(HOSTILE):
        modelled.act("AddGroup", value)
        for query in QUERIES:
            modelled.act(query, value)
        modelled.act("AddUser", f"new{number}", NEW, value, "", "")
        modelled.act("ModifyUser", "alice", "", "", [value], "", "")
    modelled.restart()
    for value in HOSTILE:
        # A group that lists a user for whom it is the primary one would stay.
        modelled.act("ModifyUser", f"new{HOSTILE.index(value)}", "", "users", [], "", "")
        modelled.act("RemoveGroup", value)


def test_system_user_that_was_accepted_can_be_changed_and_removed(enact: Enact) -> None:
    modelled = enact()
    for value in HOSTILE:
        modelled.act("AddSystemUser", value, NEW, "users", ["viewer"], "", "")
    modelled.restart()
    for value in HOSTILE:
        for query in QUERIES:
            modelled.act(query, value)
        modelled.act("AuthUserBasic", value, NEW)
        modelled.act("ModifyUser", value, "", "operator", ["viewer", "admin"], "/bin/sh", "Comment")
        modelled.act("ChpasswdUser", value, OLD)
        modelled.act("AuthUserBasic", value, OLD)
    modelled.restart()
    for value in HOSTILE:
        modelled.act("ClearUserFields", value, True, True, True)
        modelled.act("RemoveUser", value)


ALL = digest_line("root", OLD) + digest_line("alice", OLD)


def test_digest_action(enact: Enact) -> None:
    modelled = enact()
    modelled.act("Digest", ["set", ALL])
    for value in NAMES:
        modelled.act("Digest", [value, "root"])
        modelled.act("Digest", [value, value])
        modelled.act("Digest", [value])


@pytest.mark.parametrize("action", ["set", "create", "delete"])
def test_digest_list(action: str, enact: Enact) -> None:
    modelled = enact()
    for value in NAMES:
        modelled.act("Digest", ["set", ALL])
        modelled.act("Digest", [action, value])
        modelled.act("Digest", [action, f"alice:PRIVANE:{value}"])
        modelled.act("Digest", [action, f"{value}\n{digest_line('bob', NEW)}"])
        modelled.act("Digest", [action, digest_line(value, NEW) + digest_line("bob", NEW)])
        modelled.act("Digest", [action, digest_line("bob", NEW), value, value])
