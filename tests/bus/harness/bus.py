"""tests/bus/harness/bus.py: calls over the bus, as this process and as other users."""
import json
import os
import subprocess
from dataclasses import dataclass
from pathlib import Path
from typing import Any, Callable, Sequence

from gi.repository import Gio, GLib

from harness.sandbox import PYTHON, SYSTEM_BUS

NAME = "com.zintor.PrivaneSystem"
PATH = "/com/zintor/PrivaneSystem"
INTERFACE = "com.zintor.PrivaneSystem"

# What send_alone() sends.
KINDS = {"call": Gio.DBusMessageType.METHOD_CALL, "signal": Gio.DBusMessageType.SIGNAL,
         "reply": Gio.DBusMessageType.METHOD_RETURN, "error": Gio.DBusMessageType.ERROR}

# Longer than anything takes that does not wait for a deadline of its own.
CALL_TIMEOUT = 10.0

# What its replies say, as GLib writes values: polkit, that something is allowed, and the bus, that
# root has a connection.
ALLOWED = "((true, false, @a{ss} {}),)"
OF_ROOT = "({'UnixUserID': <uint32 0>},)"

UNKNOWN_METHOD = "org.freedesktop.DBus.Error.UnknownMethod"
ACCESS_DENIED = "org.freedesktop.DBus.Error.AccessDenied"


@dataclass(unsafe_hash=True)
class BusError(Exception):
    """An error reply: its D-Bus name, and its text as it was sent."""

    name: str
    text: str


def error_of(call: Callable[..., Any], *arguments: Any, **options: Any) -> BusError:
    """The error reply of a call that must fail."""
    try:
        reply = call(*arguments, **options)
    except BusError as error:
        return error
    raise AssertionError(f"{arguments} was answered with {reply!r:.200}")


def domain_error(domain: str, code: int, text: str) -> BusError:
    """The error as a caller sees a GError of an unregistered domain."""
    escaped = "".join(c if c.isascii() and c.isalnum() else f"_{ord(c):02x}" for c in domain)
    return BusError(f"org.gtk.GDBus.UnmappedGError.Quark._{escaped}.Code{code}", text)


class Bus:
    """A connection of this process."""

    def __init__(self, address: str = SYSTEM_BUS) -> None:
        flags = (Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT
                 | Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION)
        self.connection = Gio.DBusConnection.new_for_address_sync(address, flags, None, None)
        self.connection.set_exit_on_close(False)

    @property
    def unique_name(self) -> str:
        return self.connection.get_unique_name()

    def close(self) -> None:
        self.connection.close_sync(None)

    def send(self, destination: str, path: str, interface: str, member: str,
             arguments: GLib.Variant | None = None, timeout: float = CALL_TIMEOUT) -> Any:
        """The reply's values, or BusError with the error's name and text as they were sent."""
        message = Gio.DBusMessage.new_method_call(destination, path, interface, member)
        if arguments is not None:
            message.set_body(arguments)
        reply, _ = self.connection.send_message_with_reply_sync(
            message, Gio.DBusSendMessageFlags.NONE, int(timeout * 1000), None)
        body = reply.get_body()
        if reply.get_message_type() == Gio.DBusMessageType.ERROR:
            raise BusError(reply.get_error_name(), body.unpack()[0] if body else "")
        return body.unpack() if body else ()

    def call(self, member: str, signature: str = "", *arguments: Any,
             timeout: float = CALL_TIMEOUT, destination: str = NAME) -> Any:
        """Calls a method of the service; signature is that of its arguments, bare."""
        return self.send(destination, PATH, INTERFACE, member,
                         GLib.Variant(f"({signature})", arguments), timeout)

    def send_alone(self, kind: str, destination: str, member: str,
                   serials: Sequence[int] = (1,), says: str = ALLOWED) -> None:
        """Sends messages to which no answer is expected, one for each number of a message that a
        reply pretends to answer, and waits until the bus has dealt with them."""
        for serial in serials:
            message = Gio.DBusMessage.new_signal(PATH, INTERFACE, member)
            message.set_message_type(KINDS[kind])
            message.set_flags(Gio.DBusMessageFlags.NO_REPLY_EXPECTED)
            message.set_destination(destination)
            if kind in ("reply", "error"):
                message.set_reply_serial(serial)
                message.set_body(GLib.Variant.parse(None, says))
            if kind == "error":
                message.set_error_name(f"{INTERFACE}.Error")
            self.connection.send_message(message, Gio.DBusSendMessageFlags.NONE)
        self.ask_bus("GetId")

    def ask_bus(self, member: str, signature: str = "", *arguments: Any) -> Any:
        return self.send("org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                         member, GLib.Variant(f"({signature})", arguments))

    def owner(self, name: str = NAME) -> str | None:
        """The unique name of a name's owner."""
        try:
            return self.ask_bus("GetNameOwner", "s", name)[0]
        except BusError:
            return None

    def queue(self, name: str = NAME) -> list[str]:
        """The unique names of the owner and of those that wait for the name."""
        return self.ask_bus("ListQueuedOwners", "s", name)[0]

    def pid_of(self, name: str) -> int:
        return self.ask_bus("GetConnectionUnixProcessID", "s", name)[0]

    def match_rules(self, name: str = NAME) -> int:
        """How many the connection has with the bus."""
        (told,) = self.send("org.freedesktop.DBus", "/org/freedesktop/DBus",
                            "org.freedesktop.DBus.Debug.Stats", "GetConnectionStats",
                            GLib.Variant("(s)", (name,)))
        rules: int = told["MatchRules"]
        return rules


class User:
    """A process of another user that makes calls when told to; harness/user_process.py."""

    def __init__(self, uid: int, gid: int, groups: Sequence[int] = ()) -> None:
        self.uid = uid
        listed = ",".join(str(group) for group in groups)
        self._process = subprocess.Popen(
            ["setpriv", f"--reuid={uid}", f"--regid={gid}",
             f"--groups={listed}" if groups else "--clear-groups", "--",
             PYTHON, str(Path(__file__).with_name("user_process.py"))],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True,
            env={**os.environ, "PYTHONPATH": str(Path(__file__).parent.parent)})
        self.unique_name: str = self._exchange({"ask": "name"})

    def _exchange(self, request: dict[str, Any]) -> Any:
        assert self._process.stdin is not None and self._process.stdout is not None
        print(json.dumps(request), file=self._process.stdin, flush=True)
        line = self._process.stdout.readline()
        if not line:
            raise RuntimeError(f"the process of the user {self.uid} has ended")
        answer = json.loads(line)
        if "error" in answer:
            raise BusError(*answer["error"])
        if "local" in answer:
            raise GLib.Error(*answer["local"])
        return answer["reply"]

    def call(self, member: str, signature: str = "", *arguments: Any,
             timeout: float = CALL_TIMEOUT, destination: str = NAME) -> Any:
        reply = self._exchange({"ask": "call", "member": member, "signature": signature,
                                "arguments": arguments, "timeout": timeout,
                                "destination": destination})
        return tuple(reply)

    def send_alone(self, kind: str, destination: str, member: str,
                   serials: Sequence[int] = (1,), says: str = ALLOWED) -> None:
        """As Bus.send_alone()."""
        self._exchange({"ask": "send", "kind": kind, "destination": destination,
                        "member": member, "serials": list(serials), "says": says})

    def request_name(self, name: str) -> int:
        """The bus's answer: 1 is primary owner."""
        return self._exchange({"ask": "own", "name": name})

    def close(self) -> None:
        assert self._process.stdin is not None
        self._process.stdin.close()
        self._process.wait(timeout=5)
