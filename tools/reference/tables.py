"""tools/reference/tables.py: the tables of documents that are made from the code."""
from pathlib import Path
from typing import Callable, Sequence

from reference.errors import read_domains
from reference.interface import ROOT, Fault, read_interface
from reference.sources import ACTION_PREFIX, commands, method_rows, signal_of

METHODS_HEAD = ("method", "action", "command of `privanectl`")
SHORT_HEAD = ("method", f"action, after `{ACTION_PREFIX}`", "command of `privanectl`")
ERRORS_HEAD = ("error on the bus", "domain and code", "meaning", "methods")


def code(text: str) -> str:
    return f"`{text}`"


def row(cells: Sequence[str]) -> str:
    return f"| {' | '.join(cells)} |\n"


def table(head: Sequence[str], rows: Sequence[Sequence[str]]) -> str:
    return row(head) + f"|{'---|' * len(head)}\n" + "".join(row(cells) for cells in rows)


def method_cells(root: Path) -> list[tuple[str, str, str]]:
    """The methods that the service answers, in the order of its table: name, action, commands."""
    names = {signal_of(method.name): method.name
             for method in read_interface(root / "service/com.zintor.PrivaneSystem.xml").methods}
    verbs = commands(root)
    rows = []
    for signal, action in method_rows(root).items():
        if signal not in names:
            raise Fault(f"the interface document has no method for handle-{signal}")
        name = names[signal]
        rows.append((code(name), action, ", ".join(map(code, verbs.get(name, [])))))
    return rows


def methods_table(root: Path = ROOT) -> str:
    return table(METHODS_HEAD, [(name, code(action), verbs)
                                for name, action, verbs in method_cells(root)])


def short_methods_table(root: Path = ROOT) -> str:
    """The same with what all actions begin with in its head alone."""
    return table(SHORT_HEAD, [(name, code(action.removeprefix(ACTION_PREFIX)), verbs)
                              for name, action, verbs in method_cells(root)])


def errors_table(root: Path = ROOT) -> str:
    """The codes of our own domains, and those of GLib's to expect."""
    methods = read_interface(root / "service/com.zintor.PrivaneSystem.xml").methods
    rows = [(code(f"{domain.bus_prefix}{entry.number}"),
             f"{domain.name} {entry.number}", entry.meaning, ", ".join(entry.methods))
            for domain in read_domains(methods, root) for entry in domain.codes]
    return table(ERRORS_HEAD, rows)


TABLES: dict[str, tuple[Sequence[str], Callable[[Path], str]]] = {
    "README.md": (SHORT_HEAD, short_methods_table),
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
