"""tests/source/test_methods.py: no method is missing where all methods are named."""
import re
import shutil
import subprocess
from pathlib import Path

import pytest

from conftest import TREE
from reference.interface import read_interface
from reference.sources import (ACTION_PREFIX, commands, manual_commands, method_rows,
                               policy_actions, signal_of)
from reference.tables import TABLES, methods_table, updated

METHODS = read_interface().methods
NAMES = [method.name for method in METHODS]

every_name = pytest.mark.parametrize("name", NAMES)

# Of an action whose last part stands for an argument what the policy declares for it: polkit knows
# the two modes, and of the units the action above theirs.
DECLARED = {"MODE": (".all", ".tcp-udp"), "UNIT": ("",), "TARGET": ("",)}


def declared(action: str) -> list[str]:
    stem, _, last = action.rpartition(".")
    return [stem + end for end in DECLARED[last]] if last in DECLARED else [action]


def test_method_table_has_the_interfaces_methods_in_order() -> None:
    assert list(method_rows()) == [signal_of(name) for name in NAMES]


def test_policy_declares_the_methods_actions_and_no_other() -> None:
    wanted = [action for method in METHODS for action in declared(method.action)]

    assert policy_actions() == list(dict.fromkeys(wanted))


@every_name
def test_command_calls_it(name: str) -> None:
    assert commands().get(name)


def test_commands_call_no_other() -> None:
    assert set(commands()) == set(NAMES)


@every_name
def test_manual_of_the_client_names_it(name: str) -> None:
    usages = manual_commands().get(name, [])
    starts = [command.split(" --")[0] for command in commands()[name]]

    assert [usage.startswith(start) for usage, start in zip(usages, starts, strict=True)] == (
        [True] * len(starts))


@every_name
def test_document_has_it_with_action_and_command(name: str) -> None:
    action, command = re.search(rf"^\| `{name}` \| `(.+)` \| `(.+)` \|$",
                                (TREE / "docs/methods.md").read_text(), re.MULTILINE).groups()

    assert action.startswith(ACTION_PREFIX)
    assert command.split("`, `") == commands()[name]


@pytest.mark.parametrize("document", TABLES)
def test_table_is_as_the_code_has_it(document: str) -> None:
    assert updated(document) == (TREE / document).read_text(), "run tools/make_tables"


def test_check_tells() -> None:
    ended = subprocess.run([TREE / "tools/make_tables", "--check"], capture_output=True, text=True,
                           check=False)

    assert (ended.returncode, ended.stdout) == (0, "all tables are as the code has them\n")


READ = ("service/com.zintor.PrivaneSystem.xml", "service/method_table.cpp",
        "methods/system/unit_control.h", "methods/system/diagnostics.cpp",
        "client/verb_table.cpp", "client/privanectl.1", "data/com.zintor.privane-system.policy")


@pytest.fixture
def copied(tmp_path: Path) -> Path:
    """A copy of what is read, for a test to break."""
    for path in READ:
        (tmp_path / path).parent.mkdir(parents=True, exist_ok=True)
        shutil.copy(TREE / path, tmp_path / path)
    return tmp_path


def change(root: Path, path: str, old: str, new: str) -> None:
    text = (root / path).read_text()
    assert old in text
    (root / path).write_text(text.replace(old, new))


def test_copy_gives_the_same(copied: Path) -> None:
    assert methods_table(copied) == methods_table()


@pytest.mark.parametrize("path, old, new", [
    ("service/method_table.cpp", '    method<"getuser", handle_get_user>("handle-get-user"),\n',
     ""),
    ("service/method_table.cpp", '<"getuser", ', '<"getusers", '),
    ("methods/system/unit_control.h", '{"startservice", ', '{"beginservice", '),
    ("client/verb_table.cpp", '.method = "GetUser",', '.method = "GetUserList",'),
    ("client/verb_table.cpp", '.verb = "show",', '.verb = "tell",'),
])
def test_table_follows_the_code(path: str, old: str, new: str, copied: Path) -> None:
    change(copied, path, old, new)

    assert methods_table(copied) != methods_table()


def test_missing_parts_are_seen(copied: Path) -> None:
    change(copied, "data/com.zintor.privane-system.policy", "system.getuser\"", "system.getusr\"")
    change(copied, "client/privanectl.1", ".BR GetUser .", ".BR GetUserList .")

    assert policy_actions(copied) != policy_actions()
    assert "GetUser" not in manual_commands(copied)
