"""tools/reference/page.py: the reference as one HTML page, which needs nothing beside it."""
from html import escape
from typing import Iterator, Mapping, Sequence

from reference.errors import Domain
from reference.interface import Interface, Method
from reference.texts import (PASSWORD_WARNING, TYPES, arguments, asking_commands, example,
                             shows_password, signature)

HEAD = """\
<!DOCTYPE html>
<html lang="en">
<head>
<meta charset="utf-8"/>
<title>{name}</title>
<style>
body {{ max-width: 60em; margin: 2em auto; padding: 0 1em; font: 16px/1.5 sans-serif; }}
code, pre {{ font: 14px/1.4 monospace; }}
pre {{ padding: .6em; background: #f2f2f2; overflow-x: auto; }}
table {{ border-collapse: collapse; }}
th, td {{ padding: .2em .8em .2em 0; text-align: left; vertical-align: top; }}
h3 {{ margin-top: 2.5em; }}
nav {{ columns: 14em; }}
nav a {{ display: block; }}
</style>
</head>
<body>
<h1>{name}</h1>
<p>{brief}. Version {version}.</p>
<p>On the system bus: name and interface <code>{name}</code>, object <code>{path}</code>.</p>
"""


def paragraphs(texts: Sequence[str]) -> str:
    return "".join(f"<p>{escape(text)}</p>\n" for text in texts)


def table(head: Sequence[str], rows: Sequence[Sequence[str]]) -> str:
    """The cells are HTML."""
    lines = ["<table>", "<tr>" + "".join(f"<th>{escape(cell)}</th>" for cell in head) + "</tr>"]
    lines += ["<tr>" + "".join(f"<td>{cell}</td>" for cell in row) + "</tr>" for row in rows]
    return "\n".join([*lines, "</table>\n"])


def code(text: str) -> str:
    return f"<code>{escape(text)}</code>"


def method_entry(interface: Interface, method: Method, commands: Sequence[str]) -> Iterator[str]:
    yield f'<h3 id="{method.name}">{method.name}</h3>\n<pre>{escape(signature(method))}</pre>\n'
    yield paragraphs(method.paragraphs)
    if rows := [(escape(direction), code(argument.name),
                 f"{code(argument.signature)} {escape(TYPES[argument.signature])}",
                 escape(argument.text)) for direction, argument in arguments(method)]:
        yield table(("", "argument", "type", "meaning"), rows)
    yield f"<p>Action: {code(method.action)}</p>\n"
    if method.failures:
        yield table(("error", "code", "meaning"),
                    [(f'<a href="#{failure.domain}">{escape(failure.domain)}</a>',
                      str(failure.code), escape(failure.meaning)) for failure in method.failures])
    else:
        yield "<p>No errors of its own.</p>\n"
    yield f"<pre>{escape(example(interface, method))}</pre>\n"
    if shows_password(method):
        asking = ", ".join(map(code, asking_commands(commands)))
        yield f"<p><strong>Warning:</strong> {escape(PASSWORD_WARNING)} {asking}.</p>\n"
    yield "".join(f"<pre>{escape(f'privanectl {command}')}</pre>\n" for command in commands)


def domain_entry(domain: Domain) -> str:
    rows = [(str(entry.number), escape(entry.meaning),
             ", ".join(f'<a href="#{name}">{name}</a>' for name in entry.methods))
            for entry in domain.codes]
    return (f'<h3 id="{domain.name}">{escape(domain.name)}</h3>\n'
            f"<p>About {escape(domain.about)}. On the bus: "
            f"{code(domain.bus_prefix)} and the code.</p>\n"
            + table(("code", "meaning", "methods"), rows))


def make(interface: Interface, domains: Sequence[Domain], commands: Mapping[str, Sequence[str]],
         version: str) -> str:
    members = [*interface.methods, *interface.signals]
    parts = [HEAD.format(name=interface.name, path=interface.path, brief=escape(interface.brief),
                         version=escape(version)),
             paragraphs(interface.paragraphs), "<nav>\n",
             *(f'<a href="#{member.name}">{member.name}</a>\n' for member in members),
             "</nav>\n<h2>Methods</h2>\n"]
    for method in interface.methods:
        parts += method_entry(interface, method, commands[method.name])
    parts.append("<h2>Signals</h2>\n")
    for signal in interface.signals:
        parts.append(f'<h3 id="{signal.name}">{signal.name}</h3>\n'
                     f"<pre>{escape(signature(signal))}</pre>\n{paragraphs(signal.paragraphs)}")
    parts.append("<h2>Errors</h2>\n")
    parts += (domain_entry(domain) for domain in domains)
    return "".join([*parts, "</body>\n</html>\n"])
