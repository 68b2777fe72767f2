"""tools/reference/texts.py: what the forms of the reference have in common."""
from typing import Sequence

from reference.interface import Argument, Interface, Method, Signal

# What the examples of the document leave out.
BUS_CALL = "busctl call {0.name} {0.path} {0.name} "

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
