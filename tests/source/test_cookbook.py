"""tests/source/test_cookbook.py: the roles of the cookbook are those of the examples, of actions that
are declared, and none that amounts to root."""
import re
import xml.etree.ElementTree as ET

import pytest

from conftest import TREE
from documents import read

EXAMPLES = TREE / "data" / "examples"
PREFIX = "com.zintor.privane-system."
NAME = re.compile(r"`([\w.-]+)`")

COOKBOOK = read("docs/cookbook.md")


def told() -> dict[str, tuple[str, list[str]]]:
    """Of each role of the table its group and its actions."""
    found = re.findall(r"^\| \[(\w+)\]\(([^)]*)\) \| `([\w-]+)` \| [^|]+ \| ([^|]+) \|$", COOKBOOK,
                       re.MULTILINE)
    assert all(path.endswith(f"/60-privane-{role}.rules") for role, path, _, _ in found)
    return {role: (group, NAME.findall(actions)) for role, _, group, actions in found}


def policy_roles() -> dict[str, tuple[str, list[str]]]:
    text = (EXAMPLES / "privane-authz-roles.conf").read_text()
    found = re.findall(r"^\[role (\w+)\]\ngroups=(.*)\nactions=(.*)$", text, re.MULTILINE)
    return {role: (group, [action.removeprefix(PREFIX) for action in actions.split(";")])
            for role, group, actions in found}


def declared() -> set[str]:
    root = ET.parse(TREE / "data/com.zintor.privane-system.policy").getroot()
    return {action.attrib["id"].removeprefix(PREFIX) for action in root.iter("action")}


def amounting_to_root() -> set[str]:
    """As docs/authorization.md names them, and the five that are asked for any unit."""
    text = read("docs/authorization.md").partition("These actions amount to root")[2]
    return {*NAME.findall(text.partition(".")[0]), "startservice", "stopservice",
            "restartservice", "reloadservice", "setdefaulttarget"}


ROLES = told()
every_role = pytest.mark.parametrize("role", ROLES)


def test_every_example_has_a_row() -> None:
    files = {path.stem.removeprefix("60-privane-") for path in EXAMPLES.glob("*.rules")}

    assert {*ROLES, "units"} == files == set(policy_roles())


@every_role
def test_rules_and_policy_file_grant_what_is_told(role: str) -> None:
    group, actions = ROLES[role]
    rules = (EXAMPLES / f"60-privane-{role}.rules").read_text()
    listed = re.findall(r'"([^"]+)"', rules.partition("var granted = [")[2].partition("];")[0])

    assert listed == actions == sorted(set(actions))
    assert re.findall(r'isInGroup\("([^"]+)"\)', rules) == [group] == [f"privane-{role}"]
    assert policy_roles()[role] == (group, actions)


@every_role
def test_actions_are_declared(role: str) -> None:
    assert set(ROLES[role][1]) <= declared()


@every_role
def test_no_role_amounts_to_root(role: str) -> None:
    assert set(ROLES[role][1]) & amounting_to_root() == set()


def test_what_amounts_to_root_is_named() -> None:
    section = COOKBOOK.partition("\n## What amounts to root\n")[2]
    units = {"startservice", "stopservice", "restartservice", "reloadservice", "setdefaulttarget"}

    assert set(NAME.findall(section)) == amounting_to_root() - units
    assert len(amounting_to_root()) == 8 + 5


def test_groups_are_made() -> None:
    lines = (EXAMPLES / "privane-roles.sysusers.conf").read_text().splitlines()

    assert {line for line in lines if not line.startswith("#")} == {
        f"g privane-{role} -" for role in policy_roles()}
