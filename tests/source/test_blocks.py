"""tests/source/test_blocks.py: every block of a document is drawn, quoted, or run by a test; where
none runs it, the reason stands here."""
from dataclasses import dataclass

import pytest

from conftest import TREE
from documents import DOCUMENTS, blocks, quotes, read


@dataclass(frozen=True)
class RunBy:
    """The test that runs the block, and what shows in it that it does."""

    test: str
    evidence: str


@dataclass(frozen=True)
class NotRun:
    reason: str


@dataclass(frozen=True)
class Drawing:
    """Shows something; there is nothing to run."""


TRANSCRIPTS = RunBy("tests/bus/test_privanectl_transcripts.py", "def test_transcript(")
PACKAGES = RunBy("tests/packages/conftest.py", 'TREE / "tools/build_packages"')
INSTALLS = NotRun(
    "it changes the machine; tests/packages holds what is installed, asked for, excluded and run then")
GUIDE = RunBy("tests/bus/test_examples.py", "def test_guide_builds_them(")

# Of each document its blocks, by what they begin with.
BLOCKS: dict[str, dict[str, RunBy | NotRun | Drawing]] = {
    "README.md": {
        "./run": RunBy("tests/device/test_run.py", 'TREE / "run"'),
        "cam-viewer@camera$ gdbus call": RunBy("tests/device/test_run.py", "readme_transcripts()"),
        "./test": RunBy("tests/release/fresh_machine", '"./run ./test"'),
        "./test proof": NotRun("it takes ten minutes, and is tested by tests/long/test_gate.py"),
        "./bench": NotRun("it takes minutes; its arithmetic is tested by tests/unit/benchmarks"),
        "$ privanectl group list --no-legend": TRANSCRIPTS,
        " caller ": Drawing(),
        "tools/build_packages": PACKAGES,
        "meson setup build": NotRun(
            "it changes the machine; tools/build and tests/bus/run do it into folders of their own, "
            "and device/assemble_image lays the result down as an installation would"),
    },
    "docs/architecture.md": {
        "+---": Drawing(), "caller ": Drawing(), "usermgmt_add_user": Drawing(),
        "log back-end": Drawing(),
    },
    "docs/authorization.md": {
        "polkit.addRule(": RunBy("tests/bus/test_authorization_document.py",
                                 'block("polkit.addRule(")'),
        "privane-unit-actions ": RunBy("tests/bus/test_authorization_document.py",
                                       'block("privane-unit-actions ")'),
        "[role root]": RunBy("tests/bus/test_authorization_document.py", 'block("[role root]")'),
    },
    "docs/callers.md": {"cc -o caller_c": GUIDE, "gdbus-codegen ": GUIDE},
    "docs/errors.md": {"org.gtk.GDBus.UnmappedGError.": Drawing()},
    "docs/makers.md": {
        "libauthz1-policy-file ": RunBy("tests/packages/test_quality.py",
                                        "def test_sizes_as_documented("),
        "with libauthz1-polkit: ": RunBy("tests/packages/test_quality.py",
                                         "def test_what_comes_along_on_an_image_as_documented("),
        "make install ": RunBy("tests/bus/test_example_library.py", "def commands("),
    },
    "docs/packages.md": {
        "tools/build_packages": PACKAGES,
        "dpkg --install privane-system_": INSTALLS,
        "dpkg --install libauthz1-policy-file_": INSTALLS,
    },
    "docs/privanectl.md": {"$ privanectl group list": TRANSCRIPTS},
    "docs/reliability.md": {
        "./test proof": NotRun(
            "it takes ten minutes and more; tests/long/test_gate.py and tests/long/test_long_run.py "
            "test what is started, with proofs of their own"),
    },
    "docs/testkit.md": {
        start: RunBy("tests/kit/test_testkit.py", "def test_guide_is_right(")
        for start in ("tools/sandbox -- ", "tools/sandbox --rules=", "tools/sandbox --policy=",
                      "tools/sandbox --calls=")},
    "docs/security.md": {"anyone on the device": Drawing()},
}


def row_of(document: str, text: str) -> str | None:
    """The longest beginning that fits: one command may begin as another does."""
    fitting = [start for start in BLOCKS.get(document, {})
               if text.startswith(start)]
    return max(fitting, key=len, default=None)


def unquoted(document: str) -> list[str]:
    quoted = {text for text, _ in quotes(document)}
    return [block.text for block in blocks(read(document)) if block.text not in quoted]


@pytest.mark.parametrize("document", DOCUMENTS)
def test_every_block_has_a_row_and_every_row_a_block(document: str) -> None:
    found = [row_of(document, text) for text in unquoted(document)]

    assert None not in found, [text for text in unquoted(document)
                               if row_of(document, text) is None]
    assert sorted(map(str, found)) == sorted(BLOCKS.get(document, {}))


@pytest.mark.parametrize("row", [row for rows in BLOCKS.values() for row in rows.values()
                                 if isinstance(row, RunBy)], ids=lambda row: row.evidence)
def test_test_that_runs_it_is_there(row: RunBy) -> None:
    assert row.evidence in (TREE / row.test).read_text()


def test_reasons_name_what_is_there() -> None:
    reasons = [row.reason for rows in BLOCKS.values() for row in rows.values()
               if isinstance(row, NotRun)]
    named = [word.strip(",.;") for reason in reasons for word in reason.split() if "/" in word]

    assert len(named) >= len(reasons)
    assert [word for word in named if not (TREE / word).exists()] == []
