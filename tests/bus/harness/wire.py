"""tests/bus/harness/wire.py: a bus connection that keeps messages in the order of their arrival.

GIO hands replies and signals out in different threads, which loses their order; this reads the
socket itself.
"""
import os
import socket
from contextlib import contextmanager
from dataclasses import dataclass
from typing import Any, Iterator, Sequence

from gi.repository import Gio, GLib

from harness.bus import CALL_TIMEOUT, INTERFACE, NAME, PATH, BusError
from harness.sandbox import SYSTEM_BUS

NO_CAPABILITIES = Gio.DBusCapabilityFlags.NONE
FIXED_HEADER = 16

# What a message is, by its type.
KINDS = {Gio.DBusMessageType.METHOD_RETURN: "reply", Gio.DBusMessageType.ERROR: "error",
         Gio.DBusMessageType.SIGNAL: "signal"}


@dataclass(frozen=True)
class Message:
    """A message of the service: its kind, the member of a signal, and what it carries."""

    kind: str
    member: str | None
    body: tuple[Any, ...]
    serial: int
    reply_serial: int
    error_name: str | None = None

    def answer(self) -> tuple[Any, ...] | BusError:
        if self.error_name is not None:
            return BusError(self.error_name, self.body[0] if self.body else "")
        return self.body


@contextmanager
def as_user(uid: int, groups: Sequence[int] = ()) -> Iterator[None]:
    """What is connected meanwhile is, to the other side, the user's; this process goes on as root
    with its real user."""
    old = os.getgroups()
    os.setgroups(groups)
    os.setegid(uid)
    os.seteuid(uid)
    try:
        yield
    finally:
        os.seteuid(0)
        os.setegid(0)
        os.setgroups(old)


class Wire:
    """A connection of the effective user that gets the service's signals."""

    def __init__(self) -> None:
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._socket.settimeout(CALL_TIMEOUT)
        self._socket.connect(SYSTEM_BUS.removeprefix("unix:path="))
        self._buffer = b""
        self._serial = 0
        self._authenticate()
        self.unique_name: str = self._ask_bus("Hello")[0]
        self._ask_bus("AddMatch", GLib.Variant("(s)", (f"type='signal',interface='{INTERFACE}'",)))

    def _authenticate(self) -> None:
        uid = str(os.geteuid()).encode().hex().encode()
        self._socket.sendall(b"\0AUTH EXTERNAL " + uid + b"\r\n")
        answer = self._socket.recv(4096)
        assert answer.startswith(b"OK "), answer
        self._socket.sendall(b"BEGIN\r\n")

    def _send(self, destination: str, path: str, interface: str, member: str,
              body: GLib.Variant | None) -> int:
        message = Gio.DBusMessage.new_method_call(destination, path, interface, member)
        self._serial += 1
        message.set_serial(self._serial)
        if body is not None:
            message.set_body(body)
        self._socket.sendall(message.to_blob(NO_CAPABILITIES))
        return self._serial

    def _ask_bus(self, member: str, body: GLib.Variant | None = None) -> tuple[Any, ...]:
        serial = self._send("org.freedesktop.DBus", "/org/freedesktop/DBus",
                            "org.freedesktop.DBus", member, body)
        while True:
            message = self._receive()
            if message.get_reply_serial() == serial:
                assert message.get_message_type() == Gio.DBusMessageType.METHOD_RETURN, member
                answer = message.get_body()
                return answer.unpack() if answer else ()

    def _fill(self, length: int) -> None:
        while len(self._buffer) < length:
            more = self._socket.recv(1 << 16)
            assert more, "the bus closed the connection"
            self._buffer += more

    def _receive(self) -> Gio.DBusMessage:
        self._fill(FIXED_HEADER)
        length = Gio.DBusMessage.bytes_needed(self._buffer[:FIXED_HEADER])
        self._fill(length)
        blob, self._buffer = self._buffer[:length], self._buffer[length:]
        return Gio.DBusMessage.new_from_blob(blob, NO_CAPABILITIES)

    def send(self, member: str, signature: str = "", *arguments: Any) -> int:
        """Sends a call to the service without waiting for its reply; the call's serial."""
        return self._send(NAME, PATH, INTERFACE, member, GLib.Variant(f"({signature})", arguments))

    def receive(self, seconds: float = CALL_TIMEOUT) -> Message:
        """The next message of the service, waited for; or of the bus, when the service is gone."""
        self._socket.settimeout(seconds)
        try:
            return self._next()
        finally:
            self._socket.settimeout(CALL_TIMEOUT)

    def _next(self) -> Message:
        while True:
            raw = self._receive()
            if raw.get_member() in ("NameAcquired", "NameLost"):
                continue
            body = raw.get_body()
            return Message(KINDS[raw.get_message_type()], raw.get_member(),
                           body.unpack() if body else (), raw.get_serial(),
                           raw.get_reply_serial(), raw.get_error_name())

    def is_silent(self, seconds: float) -> bool:
        """Whether nothing arrives for so long."""
        self._socket.settimeout(seconds)
        try:
            self._fill(len(self._buffer) + 1)
            return False
        except TimeoutError:
            return True
        finally:
            self._socket.settimeout(CALL_TIMEOUT)

    def until_reply(self, serial: int) -> list[Message]:
        """The messages up to and including the reply to a call, in their order."""
        messages = []
        while True:
            messages.append(self.receive())
            if messages[-1].reply_serial == serial:
                return messages

    def close(self) -> None:
        self._socket.close()
