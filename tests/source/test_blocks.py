"""tests/source/test_blocks.py: every block of a document is drawn, quoted, or run by a test; where
none runs it, the reason stands here.

A test that runs a block takes all of it from the document, by tests/document_blocks.py; so what a row
names it by need only tell it from the others. What none runs stands here whole: whoever changes it
reads the reason again.
"""
import ast
import re
from dataclasses import dataclass

import pytest

from conftest import TREE
from document_blocks import block
from documents import DOCUMENTS, blocks, quotes, read


@dataclass(frozen=True)
class RunBy:
    """The test that takes the block from the document."""

    test: str


@dataclass(frozen=True)
class NotRun:
    reason: str


@dataclass(frozen=True)
class Drawing:
    """Shows something; there is nothing to run."""


TRANSCRIPTS = RunBy("tests/bus/test_privanectl_transcripts.py")
AUTHORIZATION = RunBy("tests/bus/test_authorization_document.py")
GUIDE = RunBy("tests/bus/test_examples.py")
SIZES = RunBy("tests/packages/test_quality.py")
FRESH = RunBy("tests/release/fresh_machine")
KIT = RunBy("tests/kit/test_testkit.py")
PACKAGES = RunBy("tests/device/test_packages.py")
PROOF = NotRun(
    "it takes a quarter of an hour and more; tests/long/test_gate.py and tests/long/test_long_run.py test what "
    "is started, with proofs of their own")
BITBAKE = NotRun("there is no bitbake, as docs/images.md says; tests/layers reads what it names")
BUILDROOT = NotRun("there is no Buildroot, as docs/images.md says; tests/layers reads what it names")

# Of each document its blocks, by what they begin with, or whole where nothing runs them.
BLOCKS: dict[str, dict[str, RunBy | NotRun | Drawing]] = {
    "README.md": {
        "./run": FRESH,
        "cam-viewer@camera$ gdbus call": RunBy("tests/device/test_run.py"),
        "./test": FRESH,
        "./test proof": PROOF,
        "./bench": NotRun("it takes minutes; its arithmetic is tested by tests/unit/benchmarks"),
        "$ privanectl group list --no-legend": TRANSCRIPTS,
        " caller ": Drawing(),
        "tools/build_packages": RunBy("tests/packages/conftest.py"),
        "meson setup build": RunBy("tests/packages/test_install_from_source.py"),
    },
    "docs/architecture.md": {
        "+---": Drawing(), "caller ": Drawing(), "usermgmt_add_user": Drawing(),
        "log back-end": Drawing(),
    },
    "docs/authorization.md": {
        "polkit.addRule(": AUTHORIZATION,
        "privane-unit-actions ": AUTHORIZATION,
        "[role root]": AUTHORIZATION,
    },
    "docs/callers.md": {"cc -o caller_c": GUIDE, "gdbus-codegen ": GUIDE},
    "docs/errors.md": {"org.gtk.GDBus.UnmappedGError.": Drawing()},
    "docs/makers.md": {
        "libauthz1-policy-file ": SIZES,
        "with libauthz1-polkit: ": SIZES,
        "make install ": RunBy("tests/bus/test_example_library.py"),
    },
    "docs/packages.md": {
        "tools/build_packages [FOLDER]": NotRun(
            "it is the form of the command; the one of the README is run by tests/packages/conftest.py"),
        "dpkg --install privane-system_": PACKAGES,
        "dpkg --install libauthz1-policy-file_": PACKAGES,
    },
    "docs/privanectl.md": {"$ privanectl group list": TRANSCRIPTS},
    "docs/reliability.md": {
        """\
./test proof                        a little of each proof, in minutes
tests/long/run --minutes 90         as much of all of them as fits; goes on where it stopped
tests/long/run --minutes 30 races   of some of them
tests/long/run --show               the figures so far; with --markdown, the table below""": PROOF,
    },
    "docs/testkit.md": {
        "tools/sandbox -- ": KIT, "tools/sandbox --rules=": KIT,
        "tools/sandbox --policy=": KIT, "tools/sandbox --calls=": KIT,
    },
    "docs/security.md": {"anyone on the device": Drawing()},
    "packaging/buildroot/README.md": {
        "make BR2_EXTERNAL=/path/to/privane_system/packaging/buildroot menuconfig": BUILDROOT,
    },
    "packaging/yocto/meta-privane/README.md": {
        "bitbake-layers add-layer /path/to/privane_system/packaging/yocto/meta-privane": BITBAKE,
        """\
INHERIT += "externalsrc"
EXTERNALSRC:pn-privane-system = "/path/to/privane_system\"""": BITBAKE,
        """\
PRIVANE_SYSTEM_SRC_URI = "git://git.example.com/privane_system.git;protocol=https;branch=main"
SRCREV:pn-privane-system = "0123456789abcdef0123456789abcdef01234567\"""": BITBAKE,
        """\
inherit privane-image
IMAGE_INSTALL:append = " privane-system privane-system-tools\"""": BITBAKE,
        'PRIVANE_LIBRARY_PROVIDERS:pn-privane-system = "libparamcli.so.1:acme-parameters"': BITBAKE,
    },
}


def row_of(document: str, text: str) -> str | None:
    """What names the block: all of it, or the longest beginning, since one command may begin as another
    does."""
    rows = BLOCKS.get(document, {})
    whole = text.removesuffix("\n")
    if whole in rows:
        return whole
    fitting = [start for start, row in rows.items()
               if text.startswith(start) and not isinstance(row, NotRun)]
    return max(fitting, key=len, default=None)


def unquoted(document: str) -> list[str]:
    quoted = {text for text, _ in quotes(document)}
    return [found.text for found in blocks(read(document)) if found.text not in quoted]


def taken_by(test: str) -> set[tuple[str, str]]:
    """The document and the start of each block that the test takes: in Python a call of block, elsewhere
    one of the program."""
    text = (TREE / test).read_text()
    if not test.endswith(".py"):
        return set(re.findall(r'document_blocks\.py" (\S+) ([^\s)]+)', text))
    tree = ast.parse(text)
    imports = [node for node in ast.walk(tree) if isinstance(node, ast.ImportFrom)
               and node.module == "document_blocks" and "block" in [name.name for name in node.names]]
    assert imports, f"{test} takes no block"
    calls = [node for node in ast.walk(tree) if isinstance(node, ast.Call)
             and isinstance(node.func, ast.Name) and node.func.id == "block"]
    return {(document.value, start.value) for document, start in (call.args for call in calls)
            if isinstance(document, ast.Constant) and isinstance(start, ast.Constant)}


@pytest.mark.parametrize("document", DOCUMENTS)
def test_every_block_has_a_row_and_every_row_a_block(document: str) -> None:
    found = [row_of(document, text) for text in unquoted(document)]

    assert None not in found, [text for text in unquoted(document)
                               if row_of(document, text) is None]
    assert sorted(map(str, found)) == sorted(BLOCKS.get(document, {}))


@pytest.mark.parametrize("document, start, row", [
    (document, start, row) for document, rows in BLOCKS.items() for start, row in rows.items()
    if isinstance(row, RunBy)])
def test_test_takes_the_block(document: str, start: str, row: RunBy) -> None:
    assert (document, start) in taken_by(row.test)
    assert block(document, start) in unquoted(document)


def test_what_no_test_runs_is_compared_whole() -> None:
    start = "./test proof"
    assert row_of("README.md", f"{start}\n") == start
    assert row_of("README.md", f"{start} --fast\n") == "./test"
    assert row_of("docs/reliability.md", f"{start}\n") is None


def test_reasons_name_what_is_there() -> None:
    reasons = [row.reason for rows in BLOCKS.values() for row in rows.values()
               if isinstance(row, NotRun)]
    named = [word.strip(",.;") for reason in reasons for word in reason.split() if "/" in word]

    assert len(named) >= len(reasons)
    assert [word for word in named if not (TREE / word).exists()] == []
