"""tools/reference/tables.py: the tables of documents that are made from the code."""
from pathlib import Path
from typing import Callable, Sequence

from reference.errors import read_domains
from reference.interface import ROOT, Fault, read_interface
from reference.sources import commands, method_rows, signal_of

METHODS_HEAD = ("method", "action", "command of `privanectl`")
ERRORS_HEAD = ("error on the bus", "domain and code", "meaning", "methods")


def code(text: str) -> str:
    return f"`{text}`"


def row(cells: Sequence[str]) -> str:
    return f"| {' | '.join(cells)} |\n"


def table(head: Sequence[str], rows: Sequence[Sequence[str]]) -> str:
    return row(head) + f"|{'---|' * len(head)}\n" + "".join(row(cells) for cells in rows)


def methods_table(root: Path = ROOT) -> str:
    """The methods that the service answers, in the order of its table."""
    names = {signal_of(method.name): method.name
             for method in read_interface(root / "service/com.zintor.PrivaneSystem.xml").methods}
    verbs = commands(root)
    rows = []
    for signal, action in method_rows(root).items():
        if signal not in names:
            raise Fault(f"the interface document has no method for handle-{signal}")
        name = names[signal]
        rows.append((code(name), code(action), ", ".join(map(code, verbs.get(name, [])))))
    return table(METHODS_HEAD, rows)


def errors_table(root: Path = ROOT) -> str:
    """The codes of our own domains, and those of GLib's to expect."""
    methods = read_interface(root / "service/com.zintor.PrivaneSystem.xml").methods
    rows = [(code(f"{domain.bus_prefix}{entry.number}"),
             f"{domain.name} {entry.number}", entry.meaning, ", ".join(entry.methods))
            for domain in read_domains(methods, root) for entry in domain.codes]
    return table(ERRORS_HEAD, rows)


TABLES: dict[str, tuple[Sequence[str], Callable[[Path], str]]] = {
    "docs/methods.md": (METHODS_HEAD, methods_table),
    "docs/errors.md": (ERRORS_HEAD, errors_table),
}


def with_table(text: str, head: Sequence[str], made: str) -> str:
    """The document with the table of that head replaced."""
    before, found, rest = text.partition(row(head))
    if not found:
        raise Fault(f"no table begins with {row(head).strip()}")
    lines = rest.splitlines(keepends=True)
    while lines and lines[0].startswith("|"):
        del lines[0]
    return before + made + "".join(lines)


def updated(document: str, root: Path = ROOT) -> str:
    """The document of that path as it should be."""
    head, make = TABLES[document]
    return with_table((root / document).read_text(), head, make(root))
