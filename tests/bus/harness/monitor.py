"""tests/bus/harness/monitor.py: a connection that sees messages of the private bus as they pass."""
from typing import Callable

from gi.repository import Gio, GLib

from harness.wire import Wire

BUS = "org.freedesktop.DBus"


class Monitor(Wire):
    """Sees what any of the rules matches."""

    def __init__(self, *rules: str) -> None:
        super().__init__()
        serial = self._send(BUS, "/org/freedesktop/DBus", f"{BUS}.Monitoring", "BecomeMonitor",
                            GLib.Variant("(asu)", (rules, 0)))
        while self._receive().get_reply_serial() != serial:
            pass

    def until(self, is_last: Callable[[Gio.DBusMessage], bool]) -> list[Gio.DBusMessage]:
        """What was seen up to a message, and not told before."""
        messages = [self._receive()]
        while not is_last(messages[-1]):
            messages.append(self._receive())
        return messages
