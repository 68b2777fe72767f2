"""tests/long/bus/hostile_calls.py: calls with arguments of callers who mean harm.

What the methods are comes from the introspection document that the service itself shows.
"""
import random
from typing import Any, Iterator, Sequence

from gi.repository import Gio, GLib

from harness.bus import INTERFACE, NAME, PATH, Bus
from harness.interface import METHODS
from pipeline import Call

# What is expected of a call is told by its kind.
METHOD, WRONG_SIGNATURE, UNKNOWN, PROPERTIES, STANDARD = (
    "method", "wrong signature", "unknown", "properties", "standard")

# Of so many calls beside those of the methods, one is of each of the other kinds.
OTHERS = (WRONG_SIGNATURE, UNKNOWN, PROPERTIES, STANDARD)
ODD_SHARE = 0.1
SILENT_SHARE = 0.03

INTEGERS = (0, 1, -1, 2, 99, 100, 499, 500, 701, 998, 999, 1000, 1001, 59999, 60000, 60001, 65533,
            65534, 65535, 65536, 999_999, 1_000_000, 2**31 - 1, -2**31, 2**30, -1000)

ACCOUNTS = ("root", "daemon", "clerk", "viewer", "operator", "anonymous", "alice", "bob", "nobody",
            "users", "staff", "nogroup", "privane", "polkitd", "messagebus", "new", "other")
WHITELISTED = ("all", "tcp-udp", "d", "eth0", "wlan10", "/dev/sda", "show-neighbors",
               "show-interfaces", "SOFT_RESET", "ONVIF_HARD_RESET", "lensd", "getty@tty1", "create",
               "set", "delete", "SERNO", "COLOR", "/bin/sh", "/bin/false")
ODD = ("", "+", "-", "#", " ", " root", "root ", "+root", "-root", "+x", "#root", "root:x:0:0", ":",
       ",", "root,alice", "root:alice", "\n", "\r", "\t", "\x01", "\x1b[2J", "\x7f", "\x85", "\\",
       "root\n", "root\nevil:x:0:0::/:/bin/sh", "a\nwarning: forged", "å€", "\N{PILE OF POO}",
       "a\u2028b", "a\u202eb", "\ufeffroot", "\uffff", "%s%n", "%d%d%d%d", "$6$", "*", "!", "x",
       "--", "--help", "; /bin/sh", "$(reboot)", "`id`", "| cat", "$IFS", "'", '"', "~", "?", "[a]")
PATHS = ("/", ".", "..", "../../etc/shadow", "/etc/passwd", "/etc/shadow", "/etc/shadow/", "//",
         "/proc/self/mem", "/proc/self/environ", "/proc/self/fd/0", "/dev/null", "/dev/full",
         "/dev/tty", "/dev/stdin", "/nowhere/at/all", "/etc", "/run/dbus/system_bus_socket",
         "/dev/random", "/dev/zero")
WORDS = (ACCOUNTS, ACCOUNTS, WHITELISTED, ODD, ODD, PATHS)

NAME_CHARACTERS = "abcdefghijklmnopqrstuvwxyz0123456789-@_."
SIGNATURES = ("", "s", "as", "i", "u", "b", "ss", "is", "si", "v", "a{sv}", "(s)", "ay", "o", "g",
              "aas", "d", "x", "ssssss", "sssss", "sbbb", "ii")
LARGE, HUGE = 1 << 12, 1 << 17


def methods_of(bus: Bus) -> dict[str, tuple[str, str]]:
    """The service's methods: for each its signatures, of the arguments and of the answer."""
    (xml,) = bus.send(NAME, PATH, "org.freedesktop.DBus.Introspectable", "Introspect")
    interface = Gio.DBusNodeInfo.new_for_xml(xml).lookup_interface(INTERFACE)
    return {method.name: ("".join(argument.signature for argument in method.in_args),
                          "".join(argument.signature for argument in method.out_args))
            for method in interface.methods}


class Generator:
    """Arguments for a signature, and calls of every kind."""

    def __init__(self, chance: random.Random, methods: dict[str, tuple[str, str]]) -> None:
        self._chance = chance
        self._methods = methods
        self._accepted = {method.member: method.arguments for method in METHODS}
        self._makers = {"s": self.word, "i": self._integer, "b": self._flag, "as": self._words,
                        "u": lambda: abs(self._integer()), "x": self._integer, "v": self._variant,
                        "ay": lambda: self._chance.randbytes(4), "o": lambda: PATH,
                        "g": lambda: "as", "d": self._chance.random, "(s)": lambda: (self.word(),),
                        "aas": lambda: [self._words(), []], "a{sv}": lambda: {"": self._variant()}}

    def _integer(self) -> int:
        if self._chance.random() < 0.2:
            return self._chance.randint(-2**31, 2**31 - 1)
        return self._chance.choice(INTEGERS)

    def _flag(self) -> bool:
        return self._chance.random() < 0.5

    def _variant(self) -> Any:
        return GLib.Variant("s", self.word())

    def word(self) -> str:
        choice = self._chance.random()
        if choice < 0.70:
            return self._chance.choice(self._chance.choice(WORDS))
        if choice < 0.85:
            return "".join(self._chance.choices(NAME_CHARACTERS, k=self._chance.randint(1, 70)))
        if choice < 0.97:
            return "".join(chr(self._chance.choice((self._chance.randint(1, 0x2ff),
                                                    self._chance.randint(0xe000, 0x10ffff))))
                           for _ in range(self._chance.randint(1, 20)))
        length = HUGE if choice > 0.998 else LARGE
        return self._chance.choice(ODD + ACCOUNTS) * self._chance.randint(1, length // 4)

    def _words(self) -> list[str]:
        choice = self._chance.random()
        count = 1000 if choice < 0.01 else self._chance.randint(0, 3 if choice < 0.9 else 40)
        return [self.word() for _ in range(count)]

    def _arguments(self, types: Sequence[str]) -> list[Any]:
        return [self._makers[one]() for one in types]

    def method(self, member: str) -> Call:
        """A call with the right signature: half of them start from arguments that are accepted,
        of which up to two are changed."""
        types = split(self._methods[member][0])
        arguments = self._arguments(types)
        if self._flag():
            kept = self._chance.sample(range(len(types)),
                                       max(0, len(types) - self._chance.randint(0, 2)))
            for index in kept:
                arguments[index] = self._accepted[member][index]
        return Call(METHOD, member, "".join(types), arguments,
                    wants_reply=self._chance.random() >= SILENT_SHARE)

    def other(self, kind: str) -> Call:
        makers = {WRONG_SIGNATURE: self._wrong_signature, UNKNOWN: self._unknown,
                  PROPERTIES: self._properties, STANDARD: self._standard}
        return makers[kind]()

    def _wrong_signature(self) -> Call:
        member = self._chance.choice([*self._methods])
        wrong = [one for one in SIGNATURES if one != self._methods[member][0]]
        signature = self._chance.choice(wrong)
        return Call(WRONG_SIGNATURE, member, signature, self._arguments(split(signature)))

    def _unknown(self) -> Call:
        member = self._chance.choice([*self._methods])
        arguments = (self._methods[member][0], self._arguments(split(self._methods[member][0])))
        return self._chance.choice((
            Call(UNKNOWN, "GetEverything", *arguments),
            Call(UNKNOWN, member.lower(), *arguments),
            Call(UNKNOWN, member, *arguments, path="/"),
            Call(UNKNOWN, member, *arguments, path=PATH + "/more"),
            Call(UNKNOWN, member, *arguments, interface=INTERFACE + "2"),
            Call(UNKNOWN, member, *arguments, interface="org.freedesktop.DBus.Properties"),
            Call(UNKNOWN, member, *arguments, interface="org.freedesktop.DBus")))

    def _properties(self) -> Call:
        interface = self._chance.choice((INTERFACE, "", "no.such.Interface", self.word()))
        properties = "org.freedesktop.DBus.Properties"
        return self._chance.choice((
            Call(PROPERTIES, "Get", "ss", (interface, self.word()), interface=properties),
            Call(PROPERTIES, "Set", "ssv", (interface, self.word(), GLib.Variant("i", 1)),
                 interface=properties),
            Call(PROPERTIES, "GetAll", "s", (interface,), interface=properties)))

    def _standard(self) -> Call:
        peer = "org.freedesktop.DBus.Peer"
        path = self._chance.choice((PATH, "/", "/com"))
        return self._chance.choice((
            Call(STANDARD, "Ping", interface=peer, path=path),
            Call(STANDARD, "GetMachineId", interface=peer, path=path),
            Call(STANDARD, "Introspect", interface="org.freedesktop.DBus.Introspectable",
                 path=path)))

    def calls(self, order: Sequence[str]) -> Iterator[Call]:
        """A call of each method named, with others strewn in."""
        for member in order:
            yield self.method(member)
            if self._chance.random() < ODD_SHARE:
                yield self.other(self._chance.choice(OTHERS))

    def broken(self) -> bytes:
        """A message of which some bytes were changed, or which ends in its middle."""
        member = self._chance.choice([*self._methods])
        types = self._methods[member][0]
        call = Call("broken", member, types, self._arguments(split(types)))
        message = call.message()
        message.set_serial(1)
        blob = bytearray(message.to_blob(Gio.DBusCapabilityFlags.NONE))
        for _ in range(self._chance.randint(0, 4)):
            blob[self._chance.randrange(len(blob))] = self._chance.randrange(256)
        if self._flag():
            del blob[self._chance.randrange(len(blob)):]
        return bytes(blob)


def split(signature: str) -> list[str]:
    """The complete types of a signature of this module."""
    types, rest = [], signature
    while rest:
        whole = next(one for one in ("a{sv}", "(s)", "aas", "as", "ai", "ay", rest[0])
                     if rest.startswith(one))
        types.append(whole)
        rest = rest[len(whole):]
    return types
