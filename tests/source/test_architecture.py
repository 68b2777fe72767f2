"""tests/source/test_architecture.py: who uses whom in the sources is what the document tells."""
import re
from pathlib import Path

import pytest

from conftest import TREE

FOLDERS = ("service", "methods", "usermgmt", "platform", "client", "check", "output")

DAEMON, FRAME, INTAKE, BINDING = "the daemon", "the frame", "the intake", "the binding"

SERVICE_PARTS = {"main": DAEMON, "method_table": DAEMON, "quit_signals": DAEMON,
                 "intake": INTAKE, "read_buffer": INTAKE}


def part_of(path: str) -> str:
    """The part that a source belongs to; a header without a folder is generated."""
    folder, _, rest = path.partition("/")
    if not rest:
        return BINDING
    if folder == "service":
        return SERVICE_PARTS.get(rest.partition(".")[0], FRAME)
    return f"{folder}/{rest.split('/')[0]}" if "/" in rest else folder


def uses(tree: Path) -> dict[str, set[str]]:
    found: dict[str, set[str]] = {}
    for folder in FOLDERS:
        for source in (tree / folder).rglob("*"):
            if source.suffix not in (".cpp", ".h"):
                continue
            part = part_of(str(source.relative_to(tree)))
            others = map(part_of, re.findall(r'^#include "([^"]+)"', source.read_text(),
                                             re.MULTILINE))
            found.setdefault(part, set()).update(other for other in others if other != part)
    return found


def told() -> dict[str, set[str]]:
    text = (TREE / "docs/architecture.md").read_text()
    rows = re.findall(r"^\| (.+) \| (.+) \|$", text.partition("| part | uses |\n")[2]
                      .partition("\n\n")[0], re.MULTILINE)
    return {part.strip("`"): set() if used == "nothing of ours" else
            {name.strip("`") for name in used.split(", ")} for part, used in rows if part != "---"}


def test_document_tells_who_uses_whom() -> None:
    assert told() == uses(TREE)


def test_nobody_uses_a_part_above() -> None:
    """Taken away one after the other, parts that use no other leave nothing."""
    left = {part: set(used) for part, used in told().items()} | {BINDING: set()}
    while lowest := [part for part, used in left.items() if not used]:
        left = {part: used - set(lowest) for part, used in left.items() if part not in lowest}
    assert left == {}


def test_an_include_is_seen(tmp_path: Path) -> None:
    (tmp_path / "methods/system").mkdir(parents=True)
    (tmp_path / "methods/system/a.cpp").write_text(
        '#include "usermgmt/usermgmt.h"\n#include "service/method.h"\n#include "x_binding.h"\n'
        '#include "service/method_table.h"\n#include <glib.h>\n#include "methods/system/a.h"\n')

    assert uses(tmp_path) == {"methods/system": {"usermgmt", FRAME, BINDING, DAEMON}}


@pytest.mark.parametrize("library", re.findall(
    r"`(lib\w+)\.so\.1`", (TREE / "docs/architecture.md").read_text()))
def test_shared_library_is_built(library: str) -> None:
    built = "".join(file.read_text() for file in (TREE / "platform").rglob("meson.build"))

    assert re.search(rf"shared_library\(\s*'{library.removeprefix('lib')}',", built)


def test_all_shared_libraries_are_told() -> None:
    built = "".join(file.read_text() for file in (TREE / "platform").rglob("meson.build"))
    named = re.findall(r"`lib(\w+)\.so\.1`", (TREE / "docs/architecture.md").read_text())

    assert set(re.findall(r"shared_library\(\s*'(\w+)',", built)) == set(named)
