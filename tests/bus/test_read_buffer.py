"""tests/bus/test_read_buffer.py: which calls the service overwrites where they were read.

The methods that carry a password, or a hash, are those whose arguments the interface document
describes so.
"""
import re
from pathlib import Path
from typing import Any, Iterator, Sequence
from xml.etree import ElementTree

import pytest
from gi.repository import Gio, GLib

from harness.bus import INTERFACE, NAME, PATH, Bus
from harness.interface import METHODS, Method
from harness.monitor import Monitor
from harness.service import Service

DOCUMENT = Path(__file__).parents[2] / "service/com.zintor.PrivaneSystem.xml"

SECRET = re.compile(r"password|hash", re.IGNORECASE)
TEXTS = ("s", "as")


def documented_secrets() -> set[str]:
    """The methods with a text argument of whose description, or name, a secret is told."""
    parser = ElementTree.XMLParser(target=ElementTree.TreeBuilder(insert_comments=True))
    (interface,) = ElementTree.parse(DOCUMENT, parser).getroot().findall("interface")
    found, text = set(), ""
    for node in interface:
        if node.tag is ElementTree.Comment:
            text = node.text or ""
        elif node.tag == "method":
            described = {name: line for name, line in re.findall(r"@(\w+): (.*)", text)}
            for argument in node.findall("arg"):
                name = argument.get("name", "")
                if (argument.get("direction") == "in" and argument.get("type") in TEXTS
                        and SECRET.search(f"{name} {described[name]}")):
                    found.add(node.get("name", ""))
    return found


@pytest.fixture
def monitor() -> Iterator[Monitor]:
    listener = Monitor("type='signal',member='Zeros'", "type='method_return'", "type='error'")
    yield listener
    listener.close()


def zeros_behind(monitor: Monitor, bus: Bus, member: str, signature: str,
                 arguments: Sequence[Any], path: str = PATH,
                 interface: str = INTERFACE) -> list[int]:
    """How many zeros were in each message that followed a call, before a later one was answered."""
    def send(message: Gio.DBusMessage) -> int:
        _, serial = bus.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
        return serial
    call = Gio.DBusMessage.new_method_call(NAME, path, interface, member)
    call.set_body(GLib.Variant(f"({signature})", tuple(arguments)))
    call.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
    send(call)
    later = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, "CheckUser")
    later.set_body(GLib.Variant("(s)", ("root",)))
    answered = (bus.unique_name, send(later))
    seen = monitor.until(lambda message: answered == (message.get_destination(),
                                                      message.get_reply_serial()))
    contents = [message.get_body().unpack()[1] for message in seen
                if message.get_member() == "Zeros"]
    assert not any(map(any, contents))
    return list(map(len, contents))


def test_seven_methods_are_documented_to_carry_a_secret() -> None:
    assert documented_secrets() == {"AddSystemUser", "AddUidUser", "AddUser", "AuthUserBasic",
                                    "ChpasswdUser", "Digest", "ModifyUser"}


@pytest.mark.parametrize("method", METHODS, ids=lambda method: method.member)
def test_zeros_follow_the_calls_that_carry_a_secret(
        method: Method, service: Service, bus: Bus, monitor: Monitor) -> None:
    # Refused for its arguments, so that no method runs.
    zeros = zeros_behind(monitor, bus, method.member, method.signature + "x",
                         (*method.arguments, 1))

    assert bool(zeros) == (method.member in documented_secrets())


@pytest.mark.parametrize("member, path, interface", [
    ("AddUser2", PATH, INTERFACE), ("Login", PATH, "org.example.Some"),
    ("AddUser", "/nothing", "org.example.Some"), ("AddUser", "/" + "x" * 9_000, INTERFACE)])
def test_zeros_follow_a_call_that_names_no_method(
        member: str, path: str, interface: str, service: Service, bus: Bus,
        monitor: Monitor) -> None:
    (zeros,) = zeros_behind(monitor, bus, member, "ss", ("alice", "secret"), path, interface)

    assert zeros > len(path) + len("alice" + "secret")


@pytest.mark.parametrize("arguments", [
    ("ss", ("n" * 100_000, "secret")), ("ss", ("n" * 3_000_000, "secret")),
    ("as", (["set", *["x"] * 20_000, "secret"],)), ("av", ([GLib.Variant("s", "secret")] * 500,))])
def test_zeros_are_as_long_as_the_call(arguments: tuple[str, tuple], service: Service, bus: Bus,
                                       monitor: Monitor) -> None:
    call = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, "Digest")
    call.set_body(GLib.Variant(f"({arguments[0]})", arguments[1]))
    call.set_serial(1)

    (zeros,) = zeros_behind(monitor, bus, "Digest", *arguments)

    assert zeros >= len(call.to_blob(Gio.DBusCapabilityFlags.NONE))


def test_no_zeros_follow_a_ping(service: Service, bus: Bus, monitor: Monitor) -> None:
    assert zeros_behind(monitor, bus, "Ping", "", (), PATH, "org.freedesktop.DBus.Peer") == []
