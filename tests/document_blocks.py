#!/usr/bin/python3
"""tests/document_blocks.py: the indented blocks of the documents; a test that runs one takes it from here.

    tests/document_blocks.py DOCUMENT START

prints the block for those that are no Python.
"""
import sys
from dataclasses import dataclass
from pathlib import Path

TREE = Path(__file__).resolve().parents[1]


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


def block(document: str, start: str) -> str:
    """The whole block that begins so; of several, the one that is no longer than that."""
    found = [one.text for one in blocks(read(document)) if one.text.startswith(start)]
    (text,) = [text for text in found if text == f"{start}\n"] or found
    return text


if __name__ == "__main__":
    if len(sys.argv) != 3:
        sys.exit("usage: tests/document_blocks.py DOCUMENT START")
    print(block(*sys.argv[1:]), end="")
