"""tools/reference/texts.py: what the forms of the reference have in common."""
import re
import shlex
from typing import Sequence

from reference.interface import Argument, Interface, Method, Signal

# What the examples of the document leave out.
BUS_CALL = "busctl call {0.name} {0.path} {0.name} "

# Behind an example, in front of the commands that ask for its password.
PASSWORD_WARNING = ("All users see the arguments of a running program, and so the password of this "
                    "example. On the terminal it is asked for, and not shown, by")

OPTIONAL = re.compile(r" \[[^]]*\]")

TYPES = {"s": "text", "i": "32-bit number", "u": "32-bit number, not negative",
         "b": "true or false", "as": "list of texts", "ai": "list of numbers",
         "aas": "list of lists of texts"}


def signature(member: Method | Signal) -> str:
    """NAME(inputs) → (outputs), with the types as D-Bus writes them."""
    def listed(arguments: Sequence[Argument]) -> str:
        return ", ".join(f"{argument.signature} {argument.name}" for argument in arguments)
    if isinstance(member, Signal):
        return f"{member.name}({listed(member.arguments)})"
    return f"{member.name}({listed(member.inputs)}) → ({listed(member.outputs)})"


def example(interface: Interface, method: Method) -> str:
    return BUS_CALL.format(interface) + method.example


def arguments(method: Method) -> list[tuple[str, Argument]]:
    return ([("in", argument) for argument in method.inputs]
            + [("out", argument) for argument in method.outputs])


def shows_password(method: Method) -> bool:
    """Whether the example has a password that is not empty."""
    words = shlex.split(method.example)[2:]
    for argument in method.inputs:
        word = words.pop(0)
        if argument.name == "password" and word:
            return True
        if argument.signature == "as":
            del words[:int(word)]
    return False


def asking_commands(commands: Sequence[str]) -> list[str]:
    """The commands as they are written without options that are not needed."""
    return ["privanectl " + OPTIONAL.sub("", command) for command in commands]
