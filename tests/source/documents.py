"""tests/source/documents.py: the documents of the tree, in the parts that tests look at."""
import re
from dataclasses import dataclass
from pathlib import Path

from conftest import TREE

DOCUMENTS = sorted(str(path.relative_to(TREE))
                   for path in (*TREE.glob("*.md"), *(TREE / "docs").rglob("*.md")))

LINK = re.compile(r"\[([^\]]*)\]\(([^)\s]+)\)")
QUOTED = re.compile(r"\bFrom\b[^.:]*?\[[^\]]+\]\(([^)]+)\)[^:]*:$", re.DOTALL)


@dataclass(frozen=True)
class Block:
    """An indented block, and the paragraph of running text that stands before it."""

    line: int
    text: str
    introduction: str


def read(document: str) -> str:
    return (TREE / document).read_text()


def blocks(text: str) -> list[Block]:
    """What is indented by four blanks and is no part of a list."""
    found: list[Block] = []
    introduction: list[str] = []
    lines: list[str] = []
    start = 0
    for number, line in enumerate([*text.splitlines(), "end"], 1):
        if line.startswith("    ") and (lines or not introduction or introduction[-1] == ""):
            start = start or number
            lines.append(line[4:])
        elif not line and lines:
            lines.append("")
        else:
            if lines:
                paragraph = "\n".join(introduction).strip().split("\n\n")[-1]
                found.append(Block(start, "\n".join(lines).rstrip("\n") + "\n", paragraph))
                introduction = introduction if not line else []
            lines, start = [], 0
            introduction.append(line)
    return found


def quotes(document: str) -> list[tuple[str, Path]]:
    """Each block that is said to come from a file, with that file. Parts of the same file that
    follow each other are one block, in which blank lines part them."""
    return [(block.text, (TREE / document).parent / match[1])
            for block in blocks(read(document))
            if (match := QUOTED.search(block.introduction.split("\n\n")[-1]))]


def is_part(text: str, whole: str) -> bool:
    """Whether the paragraphs stand in the file, in their order and form; between two of them more
    may stand there."""
    at = 0
    for paragraph in re.split(r"\n\n+(?=\S)", text.rstrip("\n")):
        at = f"\n{whole}".find(f"\n{paragraph}\n", at)
        if at < 0:
            return False
        at += len(paragraph)
    return True
