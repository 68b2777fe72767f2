"""tests/bus/harness/fake_systemd.py: a stand-in for systemd's manager on the private bus."""
from pathlib import Path

from gi.repository import Gio, GLib

from harness.fake_service import FakeService

NAME = "org.freedesktop.systemd1"
PATH = "/org/freedesktop/systemd1"
INTERFACE = "org.freedesktop.systemd1.Manager"

JOB = GLib.Variant("(o)", ("/org/freedesktop/systemd1/job/42",))
NO_CHANGES = GLib.Variant("(a(sss))", ([],))


def _succeed(call: Gio.DBusMessage) -> Gio.DBusMessage:
    reply = Gio.DBusMessage.new_method_reply(call)
    reply.set_body(NO_CHANGES if call.get_member() == "SetDefaultTarget" else JOB)
    return reply


class FakeSystemd(FakeService):
    """Answers as systemd does until told otherwise."""

    def __init__(self, folder: Path | None = None) -> None:
        super().__init__(NAME, PATH, INTERFACE, _succeed, folder)
