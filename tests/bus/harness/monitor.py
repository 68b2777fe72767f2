"""tests/bus/harness/monitor.py: connections that see all that passes over the private bus."""
import contextlib
import socket
import threading
from dataclasses import dataclass
from typing import Callable

from gi.repository import Gio, GLib

from harness.bus import Bus
from harness.deadline import wait_for
from harness.wire import Wire

BUS = "org.freedesktop.DBus"
CALL, RETURN, ERROR, SIGNAL = (Gio.DBusMessageType.METHOD_CALL, Gio.DBusMessageType.METHOD_RETURN,
                               Gio.DBusMessageType.ERROR, Gio.DBusMessageType.SIGNAL)

# Nothing that is waited for here has a time of its own; other proofs may keep the machine busy.
PATIENCE = 60.0


class Monitor(Wire):
    """Sees what any of the rules matches; without one, everything."""

    def __init__(self, *rules: str) -> None:
        super().__init__()
        serial = self._send(BUS, "/org/freedesktop/DBus", f"{BUS}.Monitoring", "BecomeMonitor",
                            GLib.Variant("(asu)", (rules, 0)))
        while (message := self._receive()).get_reply_serial() != serial:
            pass
        assert message.get_message_type() == RETURN

    def until(self, is_last: Callable[[Gio.DBusMessage], bool]) -> list[Gio.DBusMessage]:
        """What was seen up to a message, and not told before."""
        messages = [self._receive()]
        while not is_last(messages[-1]):
            messages.append(self._receive())
        return messages


@dataclass(frozen=True)
class Seen:
    """Who said what to whom; the arguments as GIO unpacks them."""

    type: Gio.DBusMessageType
    sender: str | None
    destination: str | None
    interface: str | None
    member: str | None
    arguments: tuple[object, ...]
    error_name: str | None

    def are_zeros(self) -> bool:
        """What the service sends itself behind a password, to overwrite what it was read into; a
        number is before them."""
        return (self.type == SIGNAL and self.member == "Zeros" and self.destination == self.sender
                and len(self.arguments) == 2 and not any(self.arguments[1]))


def is_end_of(name: str | None) -> Callable[[Seen], bool]:
    """Whether the bus tells that the owner of a unique name is gone."""
    return lambda seen: seen.member == "NameOwnerChanged" and seen.arguments[::2] == (name, "")


class Record(Monitor):
    """Everything that was said since, kept by a thread of its own."""

    def __init__(self) -> None:
        super().__init__()
        self._seen: list[Seen] = []
        self._socket.settimeout(None)
        self._thread = threading.Thread(target=self._listen, daemon=True)
        self._thread.start()

    def _listen(self) -> None:
        with contextlib.suppress(OSError, AssertionError):  # our end, or that of the bus
            while True:
                message = self._receive()
                body = message.get_body()
                self._seen.append(Seen(
                    message.get_message_type(), message.get_sender(), message.get_destination(),
                    message.get_interface(), message.get_member(),
                    body.unpack() if body else (), message.get_error_name()))

    def mark(self) -> int:
        """The place in the record from which on a later message stands."""
        return len(self._seen)

    def since(self, mark: int) -> list[Seen]:
        return self._seen[mark:]

    def wait_for(self, what: str, mark: int, is_it: Callable[[Seen], bool]) -> Seen:
        """The first such message since the mark."""
        return wait_for(what, lambda: next(filter(is_it, self._seen[mark:]), None), PATIENCE)

    def catch_up(self, bus: Bus) -> None:
        """Returns when all that passed before is in the record."""
        mark = self.mark()
        bus.ask_bus("GetId")
        self.wait_for("the listener", mark, lambda seen: seen.member == "GetId"
                      and seen.sender == bus.unique_name)

    def close(self) -> None:
        self._socket.shutdown(socket.SHUT_RDWR)
        self._thread.join(timeout=5)
        self._socket.close()
