"""tests/source/test_quotes.py: what documents show of a file stands in that file."""
from pathlib import Path

import pytest

from conftest import TREE
from documents import DOCUMENTS, blocks, is_part, quotes

QUOTES = [(document, text, path) for document in DOCUMENTS for text, path in quotes(document)]


def test_guides_quote_the_examples() -> None:
    shown = [(document, path.name) for document, _, path in QUOTES]

    for name in ("caller.c", "caller.cpp", "caller.py"):
        assert shown.count(("docs/callers.md", name)) >= 3
    assert {name for document, name in shown if document == "docs/errors.md"} == {
        "caller.c", "service_error.hpp", "caller.py"}


@pytest.mark.parametrize("document, text, path", QUOTES,
                         ids=[f"{document}-{number}" for number, (document, _, _) in
                              enumerate(QUOTES)])
def test_quote_stands_in_its_file(document: str, text: str, path: Path) -> None:
    assert is_part(text, path.read_text())


def test_every_block_of_code_names_its_file() -> None:
    """A block that looks like one of a program is a quote."""
    for document in ("docs/callers.md", "docs/errors.md"):
        quoted = [text for text, _ in quotes(document)]
        for block in blocks((TREE / document).read_text()):
            is_code = any(mark in block.text for mark in ("{\n", "def ", "    return "))
            assert block.text in quoted or not is_code, (document, block.line)


def test_all_commands_of_the_examples_are_shown() -> None:
    """Of each program the four functions stand in the guide."""
    shown = "".join(text for document, text, _ in QUOTES if document == "docs/callers.md")

    for start in ("static gboolean {}(", "static bool {}(", "def {}("):
        for name in ("list_users", "check_password", "add_user", "watch"):
            assert f"\n{start.format(name)}" in f"\n{shown}", start.format(name)


FILE = "int a;\n\nint b() {\n    return 1;\n}\n\nint c;\n"


@pytest.mark.parametrize("text, expected", [
    ("int a;\n", True), ("int b() {\n    return 1;\n}\n", True), ("int a;\n\nint c;\n", True),
    ("int c;\n\nint a;\n", False), ("int b() {\n    return 2;\n}\n", False),
    ("int b() {\n", True), ("int b() {\n}\n", False), ("nt a;\n", False), ("int\n", False),
])
def test_parts_are_told(text: str, expected: bool) -> None:
    assert is_part(text, FILE) is expected


def test_blocks_are_found() -> None:
    text = "One. From [a](b.c):\n\n    x\n\n    y\n\nTwo\nlines:\n\n    z\n\n- item\n  more\n"

    assert [(block.text, block.introduction) for block in blocks(text)] == [
        ("x\n\ny\n", "One. From [a](b.c):"), ("z\n", "Two\nlines:")]
