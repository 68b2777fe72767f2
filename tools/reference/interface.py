"""tools/reference/interface.py: the interface document with its comments, read as gdbus-codegen does.

A comment belongs to the element behind it: a line "NAME:", a line "@ARGUMENT: TEXT" for each
argument, a blank line, and paragraphs. That of a method ends with three paragraphs that begin with
"Action: ", "Errors:" and "Example: ".
"""
import re
import xml.etree.ElementTree as ET
from dataclasses import dataclass
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
DOCUMENT = ROOT / "service" / "com.zintor.PrivaneSystem.xml"

FAILURE = re.compile(r"([\w-]+) (\d+): (.+)")


class Fault(Exception):
    """A document lacks something or has it in a form of its own."""


@dataclass(frozen=True)
class Argument:
    name: str
    signature: str
    text: str


@dataclass(frozen=True)
class Failure:
    domain: str
    code: int
    meaning: str


@dataclass(frozen=True)
class Method:
    name: str
    inputs: tuple[Argument, ...]
    outputs: tuple[Argument, ...]
    paragraphs: tuple[str, ...]
    action: str
    failures: tuple[Failure, ...]
    example: str

    @property
    def signature(self) -> str:
        return "".join(argument.signature for argument in self.inputs)


@dataclass(frozen=True)
class Signal:
    name: str
    arguments: tuple[Argument, ...]
    paragraphs: tuple[str, ...]


@dataclass(frozen=True)
class Interface:
    name: str
    path: str
    brief: str
    paragraphs: tuple[str, ...]
    methods: tuple[Method, ...]
    signals: tuple[Signal, ...]


@dataclass(frozen=True)
class Comment:
    name: str
    arguments: dict[str, str]
    paragraphs: list[str]


def read_comment(text: str | None, name: str) -> Comment:
    """The comment in front of the element of that name."""
    lines = [line.strip() for line in (text or "").strip().splitlines()]
    if not lines or lines[0] != f"{name}:":
        raise Fault(f"{name}: no comment of its own stands in front of it")
    arguments = {}
    rest = lines[1:]
    while rest and rest[0].startswith("@"):
        argument, colon, meaning = rest.pop(0)[1:].partition(": ")
        if not colon or not meaning or argument in arguments:
            raise Fault(f"{name}: a line for @{argument} is in bad form, or there are two")
        arguments[argument] = meaning
    if rest and rest[0]:
        raise Fault(f"{name}: no blank line in front of the text: '{rest[0]}'")
    blocks = "\n".join(rest).strip().split("\n\n")
    return Comment(name, arguments, [" ".join(block.split()) for block in blocks if block.strip()])


def read_arguments(element: ET.Element, comment: Comment, direction: str) -> tuple[Argument, ...]:
    found = []
    for argument in element.findall("arg"):
        name = argument.get("name", "")
        if argument.get("direction", "out") != direction:
            continue
        if name not in comment.arguments:
            raise Fault(f"{comment.name}: no line for @{name}")
        found.append(Argument(name, argument.get("type", ""), comment.arguments[name]))
    return tuple(found)


def take_paragraph(comment: Comment, title: str) -> str:
    """The last paragraph, which must have that title."""
    if not comment.paragraphs or not comment.paragraphs[-1].startswith(title):
        raise Fault(f"{comment.name}: no paragraph '{title}' in its place")
    return comment.paragraphs.pop().removeprefix(title).strip()


def read_failures(name: str, text: str) -> tuple[Failure, ...]:
    if text == "none.":
        return ()
    if not text.endswith("."):
        raise Fault(f"{name}: the errors end without a full stop")
    found = []
    for part in text.removesuffix(".").split("; "):
        match = FAILURE.fullmatch(part)
        if match is None:
            raise Fault(f"{name}: '{part}' is no domain, code and meaning")
        found.append(Failure(match[1], int(match[2]), match[3]))
    return tuple(found)


def read_method(element: ET.Element, comment: Comment) -> Method:
    named = {argument.get("name") for argument in element.findall("arg")}
    if unknown := set(comment.arguments) - named:
        raise Fault(f"{comment.name}: has no argument {', '.join(sorted(unknown))}")
    example = take_paragraph(comment, "Example: ")
    failures = read_failures(comment.name, take_paragraph(comment, "Errors:"))
    action = take_paragraph(comment, "Action: ")
    if not comment.paragraphs:
        raise Fault(f"{comment.name}: nothing tells what it does")
    return Method(comment.name, read_arguments(element, comment, "in"),
                  read_arguments(element, comment, "out"), tuple(comment.paragraphs), action,
                  failures, example)


def read_interface(document: Path = DOCUMENT) -> Interface:
    parser = ET.XMLParser(target=ET.TreeBuilder(insert_comments=True))
    node = ET.parse(document, parser).getroot()
    element = node.find("interface")
    if element is None:
        raise Fault(f"{document}: there is no interface")
    methods, signals, text = [], [], None
    for child in element:
        if child.tag is ET.Comment:
            text = child.text
            continue
        comment = read_comment(text, child.get("name", ""))
        if child.tag == "method":
            methods.append(read_method(child, comment))
        elif child.tag == "signal":
            signals.append(Signal(comment.name, read_arguments(child, comment, "out"),
                                  tuple(comment.paragraphs)))
        else:
            raise Fault(f"{comment.name}: a {child.tag} is not known here")
        text = None
    before = [child.text for child in node if child.tag is ET.Comment]
    own = read_comment(before[-1] if before else None, element.get("name", ""))
    return Interface(own.name, node.get("name", ""), own.arguments["short_description"],
                     tuple(own.paragraphs), tuple(methods), tuple(signals))
