"""tests/source/test_changelog.py: the newest entry is of the version that is built, and counts right."""
import re

from conftest import TREE
from documents import read
from reference.interface import read_interface

CHANGELOG = read("CHANGELOG.md")


def test_newest_entry_is_of_this_version() -> None:
    (version,) = re.findall(r"^  version: '([\d.]+)',$", (TREE / "meson.build").read_text(),
                            re.MULTILINE)
    entries = re.findall(r"^## ([\d.]+), (unreleased|\d{4}-\d\d-\d\d)$", CHANGELOG, re.MULTILINE)

    assert entries[0][0] == version
    assert [released for _, released in entries[1:] if released == "unreleased"] == []
    assert len(entries) == len(re.findall("^## ", CHANGELOG, re.MULTILINE))


def test_methods_and_libraries_are_counted() -> None:
    libraries = [path for path in (TREE / "platform").glob("*/*.h")
                 if path.stem == path.parent.name]

    assert f"The {len(read_interface().methods)} methods" in CHANGELOG
    assert len(libraries) == 6 and "Six libraries" in CHANGELOG
