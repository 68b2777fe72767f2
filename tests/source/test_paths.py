"""tests/source/test_paths.py: the files, folders and headings that documents name are there."""
import re
import subprocess
from pathlib import Path

import pytest

from conftest import TREE
from documents import DOCUMENTS, LINK, blocks, read

# A word between backquotes, and one with a slash in a block.
NAMED = re.compile(r"`([\w.][\w./-]*)`")
SHOWN = re.compile(r"(?<![\w./-])([\w-]+/[\w./-]*\w/?|[\w-]+/)(?![\w./*-])")
FILE_ENDINGS = (".cpp", ".h", ".py", ".xml", ".conf", ".service", ".rules", ".policy", ".md", ".build",
                ".in", ".sh", ".txt")


def tracked() -> set[str]:
    listed = subprocess.run(["git", "ls-files", "--cached", "--others", "--exclude-standard"],
                            cwd=TREE, check=True, capture_output=True, text=True).stdout
    return set(listed.splitlines())


FILES = tracked()
FOLDERS = {str(parent) for file in FILES for parent in Path(file).parents}
NAMES = {Path(file).name.removesuffix(".in") for file in FILES}
TOP = {file.split("/")[0] for file in FILES if "/" in file}

# What documents name that only a build, an installation or the device has.
ELSEWHERE = {"privane-roles.conf", "local.conf"}


def is_there(path: str) -> bool:
    path = path.rstrip("/")
    return path in FILES or path in FOLDERS


def fault_of(name: str) -> str | None:
    """Why a name between backquotes cannot stand; None where it can, or names nothing of ours."""
    top, slash, rest = name.partition("/")
    if slash and top in TOP:
        return None if is_there(name) or "NAME" in name else f"there is no {name}"
    if not slash and Path(name).suffix in FILE_ENDINGS and name not in ELSEWHERE:
        return None if name in NAMES else f"there is no {name} anywhere"
    return None


@pytest.mark.parametrize("document", DOCUMENTS)
def test_named_files_are_there(document: str) -> None:
    text = read(document)
    shown = [name for block in blocks(text) for name in SHOWN.findall(block.text)]
    faults = {fault for name in [*NAMED.findall(text), *shown] if (fault := fault_of(name))}

    assert faults == set()


@pytest.mark.parametrize("name, there", [
    ("service/main.cpp", True), ("service/", True), ("service", True), ("docs/methods.md", True),
    ("service/nothing.cpp", False), ("docs/none/", False), ("main.cpp", True), ("none.cpp", False),
    ("yes/no", True), ("GetUser", True), ("tests/fuzz/NAME_fuzz.cpp", True)])
def test_names_are_judged(name: str, there: bool) -> None:
    assert (fault_of(name) is None) is there


def anchors(document: str) -> set[str]:
    """As the usual renderers name headings."""
    return {re.sub(r"[^\w -]", "", heading.lower()).strip().replace(" ", "-")
            for heading in re.findall(r"^#+ (.+)$", read(document), re.MULTILINE)}


def link_fault(document: str, target: str) -> str | None:
    path, _, anchor = target.partition("#")
    aim = document
    if path:
        resolved = ((TREE / document).parent / path).resolve()
        if not resolved.is_relative_to(TREE):
            return f"{target} leads out of the tree"
        aim = str(resolved.relative_to(TREE))
        if not is_there(aim):
            return f"there is no {target}"
    if anchor and (not aim.endswith(".md") or anchor not in anchors(aim)):
        return f"there is no heading {target}"
    return None


@pytest.mark.parametrize("document", DOCUMENTS)
def test_links_lead_somewhere(document: str) -> None:
    targets = {target for _, target in LINK.findall(read(document))
               if not target.startswith(("https://", "http://"))}

    assert {fault for target in targets if (fault := link_fault(document, target))} == set()


@pytest.mark.parametrize("target, there", [
    ("methods.md", True), ("none.md", False), ("../README.md", True), ("../none", False),
    ("../../other", False), ("errors.md#decoding", True), ("errors.md#none", False),
    ("#methods", True), ("#none", False)])
def test_links_are_judged(target: str, there: bool) -> None:
    assert (link_fault("docs/methods.md", target) is None) is there


def test_every_document_is_reached_from_the_readme() -> None:
    reached, waiting = {"README.md"}, ["README.md"]
    while waiting:
        document = waiting.pop()
        for _, target in LINK.findall(read(document)):
            path = ((TREE / document).parent / target.partition("#")[0]).resolve()
            name = str(path.relative_to(TREE)) if path.is_relative_to(TREE) else ""
            if name in DOCUMENTS and name not in reached:
                reached.add(name)
                waiting.append(name)

    assert reached == set(DOCUMENTS)
