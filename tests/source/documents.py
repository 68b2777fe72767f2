"""tests/source/documents.py: the documents of the tree, in the parts that tests look at."""
import re
from pathlib import Path

from document_blocks import TREE, blocks, read

DOCUMENTS = sorted(str(path.relative_to(TREE))
                   for path in (*TREE.glob("*.md"), *(TREE / "docs").rglob("*.md"),
                                *(TREE / "packaging").rglob("*.md")))

LINK = re.compile(r"\[([^\]]*)\]\(([^)\s]+)\)")
QUOTED = re.compile(r"\bFrom\b[^.:]*?\[[^\]]+\]\(([^)]+)\)[^:]*:$", re.DOTALL)


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
