"""tools/reference/manual.py: the reference as a manual page."""
from typing import Iterator, Mapping, Sequence

from reference.errors import Domain
from reference.interface import Interface, Method
from reference.texts import (PASSWORD_WARNING, arguments, asking_commands, example,
                             shows_password, signature)

HEAD = """\
.\\" Made from the comments of the interface document.
.TH {name} 5 "" "privane\\-system {version}" "D\\-Bus interfaces"
.SH NAME
{name} \\- {brief}
.SH SYNOPSIS
.nf
bus        the system bus
name       {name}
object     {path}
interface  {name}
.fi
.SH DESCRIPTION
"""

TAIL = """\
.SH SEE ALSO
.BR privanectl (1),
.BR busctl (1),
.BR polkit (8)
"""

ESCAPES = str.maketrans({"\\": "\\e", "-": "\\-", "'": "\\(aq", "→": "\\(->", "…": "..."})


def escape(text: str) -> str:
    """A line of running text; a dot or quote at its start is no request."""
    line = text.translate(ESCAPES)
    return f"\\&{line}" if line.startswith((".", "\\(aq")) else line


def paragraphs(texts: Sequence[str]) -> str:
    return ".PP\n".join(f"{escape(text)}\n" for text in texts)


def tagged(tag: str, text: str) -> str:
    return f".TP\n.B {escape(tag)}\n{escape(text)}\n"


def method_entry(interface: Interface, method: Method, commands: Sequence[str]) -> Iterator[str]:
    yield f".SS {method.name}\n.nf\n.B {escape(signature(method))}\n.fi\n.PP\n"
    yield paragraphs(method.paragraphs)
    for direction, argument in arguments(method):
        yield tagged(f"{direction} {argument.signature} {argument.name}", argument.text)
    yield tagged("Action", method.action)
    for failure in method.failures:
        yield tagged(f"Error {failure.domain} {failure.code}", failure.meaning)
    yield ".TP\n.B Example\n.nf\n" + escape(example(interface, method)) + "\n.fi\n"
    if shows_password(method):
        yield tagged("Warning", f"{PASSWORD_WARNING} {', '.join(asking_commands(commands))}.")
    for command in commands:
        yield tagged("Command", f"privanectl {command}")


def make(interface: Interface, domains: Sequence[Domain], commands: Mapping[str, Sequence[str]],
         version: str) -> str:
    parts = [HEAD.format(name=interface.name, path=interface.path, brief=escape(interface.brief),
                         version=version), paragraphs(interface.paragraphs), ".SH METHODS\n"]
    for method in interface.methods:
        parts += method_entry(interface, method, commands[method.name])
    parts.append(".SH SIGNALS\n")
    for signal in interface.signals:
        parts.append(f".SS {signal.name}\n.nf\n.B {escape(signature(signal))}\n.fi\n.PP\n")
        parts.append(paragraphs(signal.paragraphs))
    parts.append(".SH ERRORS\n")
    for domain in domains:
        parts.append(f".SS {escape(domain.name)}\n")
        parts.append(escape(f"{domain.about[0].upper()}{domain.about[1:]}. On the bus: "
                            f"{domain.bus_prefix}N, with the code for N.") + "\n")
        parts += (tagged(str(code.number), code.meaning) for code in domain.codes)
    return "".join([*parts, TAIL])
