"""tools/reference/errors.py: the domains of errors on the bus and their codes, from the headers."""
import re
from dataclasses import dataclass
from pathlib import Path

from reference.interface import ROOT, Fault, Method

BUS_NAME = "org.gtk.GDBus.UnmappedGError.Quark._"

ENUMERATOR = re.compile(r"^ +(\w+) = (\d+),?\s+(?://|/\*) (.*?)(?: \*/)?$", re.MULTILINE)
ENUMERATORS = re.compile(r"^ +\w+ = \d+,?", re.MULTILINE)


@dataclass(frozen=True)
class Code:
    number: int
    meaning: str
    methods: tuple[str, ...] = ()


@dataclass(frozen=True)
class Domain:
    name: str
    about: str
    codes: tuple[Code, ...]

    @property
    def bus_prefix(self) -> str:
        """Of the name of the D-Bus error; the number stands behind it."""
        return f"{BUS_NAME}{escaped(self.name)}.Code"


# Of each domain of our own: what it is about, and the header and the enum that have its codes.
HEADERS = {
    "privaneSystemError": ("the methods themselves", "service/request.h", "privane_error"),
    "usermgmt": ("the rules of users and groups", "usermgmt/usermgmt.h", "usermgmt_error"),
    "corefile": ("reading and writing the account files", "usermgmt/core_file.h",
                 "corefile_error"),
    "authz": ("refusals", "platform/authz/authz.h", "authz_error"),
}

# GLib has more codes; these are the ones to expect.
OF_GLIB = (
    Domain("g-file-error-quark", "GLib's, of files", (
        Code(1, "the path is a folder"),
        Code(2, "the file may not be read"),
        Code(4, "there is no such file"),
        Code(19, "reading would have to wait"),
        Code(24, "another failure, or an answer that no message can carry"))),
    Domain("g-exec-error-quark", "GLib's, of starting a program", (
        Code(3, "the program may not be run"),
        Code(8, "the program is not there"),
        Code(19, "another failure"))),
)


def escaped(domain: str) -> str:
    """As GDBus writes it: letters and digits as they are, others as "_" and two digits."""
    return "".join(c if c.isascii() and c.isalnum() else f"_{ord(c):02x}" for c in domain)


def read_codes(header: Path, name: str) -> tuple[Code, ...]:
    """The enumerators of an enum, each with the comment behind it."""
    _, found, rest = header.read_text().partition(f"enum {name} {{\n")
    if not found:
        raise Fault(f"{header}: there is no enum {name}")
    body = rest.partition("};\n")[0]
    codes = tuple(Code(int(number), text) for _, number, text in ENUMERATOR.findall(body))
    if len(codes) != len(ENUMERATORS.findall(body)) or not codes:
        raise Fault(f"{header}: an enumerator of {name} has no comment behind it")
    return codes


def read_domains(methods: tuple[Method, ...], root: Path = ROOT) -> tuple[Domain, ...]:
    """All domains, each code with the methods that name it."""
    own = (Domain(name, about, read_codes(root / header, enum))
           for name, (about, header, enum) in HEADERS.items())
    domains = []
    for domain in (*own, *OF_GLIB):
        codes = tuple(
            Code(code.number, code.meaning,
                 tuple(method.name for method in methods
                       if any((failure.domain, failure.code) == (domain.name, code.number)
                              for failure in method.failures)))
            for code in domain.codes)
        domains.append(Domain(domain.name, domain.about, codes))
    known = {(domain.name, code.number) for domain in domains for code in domain.codes}
    for method in methods:
        for failure in method.failures:
            if (failure.domain, failure.code) not in known:
                raise Fault(f"{method.name}: there is no {failure.domain} {failure.code}")
    return tuple(domains)
