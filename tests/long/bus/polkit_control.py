"""tests/long/bus/polkit_control.py: polkitd gone, replaced, or answering nonsense."""
import contextlib
import os
import pwd
import signal
import socket
import subprocess
import threading
from contextlib import contextmanager
from pathlib import Path
from typing import Iterator

from gi.repository import Gio, GLib

from harness.bus import Bus
from harness.deadline import wait_for
from harness.polkit import ANSWER_SECONDS, POLICIES, actions
from harness.sandbox import STATE, polkitd_pid
from harness.wire import NO_CAPABILITIES, as_user
from pipeline import Pipeline

NAME = "org.freedesktop.PolicyKit1"
PROGRAMS = (Path("/usr/lib/polkit-1/polkitd"), Path("/usr/libexec/polkitd"))
POLICY = POLICIES / "com.zintor.privane-system.policy"

PROPERTIES = GLib.Variant("(a{sv})", ({
    "BackendName": GLib.Variant("s", "nonsense"), "BackendVersion": GLib.Variant("s", "0"),
    "BackendFeatures": GLib.Variant("u", 0)},))


class PolkitControl:
    """The sandbox's polkitd."""

    def __init__(self, bus: Bus) -> None:
        self._bus = bus

    def owner(self) -> str | None:
        return self._bus.owner(NAME)

    def end(self) -> None:
        os.kill(polkitd_pid(), signal.SIGKILL)
        wait_for("polkitd's end", lambda: self.owner() is None, ANSWER_SECONDS)

    def start(self, *arguments: str) -> None:
        """Returns when it is the owner of the name."""
        old = self.owner()
        program = next(path for path in PROGRAMS if path.exists())
        started = subprocess.Popen([program, "--no-debug", *arguments], stdout=subprocess.DEVNULL,
                                   stderr=subprocess.DEVNULL)
        (STATE / "polkitd.pid").write_text(f"{started.pid}\n")
        wait_for("the new polkitd", lambda: self.owner() not in (None, old),
                 ANSWER_SECONDS)

    def replace_hanging(self) -> None:
        """A new one takes the name of one that is stopped, which then is killed."""
        old = polkitd_pid()
        self.start("--replace")
        os.kill(old, signal.SIGKILL)

    @contextmanager
    def absent(self) -> Iterator[None]:
        self.end()
        try:
            yield
        finally:
            self.start()

    @contextmanager
    def knowing_no_action(self) -> Iterator[None]:
        """Our .policy file is not there."""
        def count() -> int:
            return sum(name.startswith("com.zintor.") for name in actions(self._bus))
        aside = POLICY.with_suffix(".aside")
        POLICY.rename(aside)
        try:
            wait_for("actions to go", lambda: count() == 0, ANSWER_SECONDS)
            yield
        finally:
            aside.rename(POLICY)
            wait_for("actions to come back", lambda: count() > 0, ANSWER_SECONDS)


class NonsensePolkit(Pipeline):
    """Owns polkit's name, and answers each question with the body that it was made with; without
    one, with bytes that are no message, for which the bus throws it out."""

    def __init__(self, body: GLib.Variant | None) -> None:
        with as_user(pwd.getpwnam("polkitd").pw_uid):  # to whom alone the bus gives the name
            super().__init__()
        self._body = body
        self.questions = 0
        self._socket.settimeout(None)
        self._ask_bus("RequestName", GLib.Variant("(su)", (NAME, 0)))
        self._thread = threading.Thread(target=self._serve, daemon=True)
        self._thread.start()

    def _serve(self) -> None:
        with contextlib.suppress(OSError, AssertionError):  # our end, or we were thrown out
            while True:
                message = self._receive()
                if message.get_message_type() == Gio.DBusMessageType.METHOD_CALL:
                    self._reply(message)

    def _reply(self, call: Gio.DBusMessage) -> None:
        is_question = call.get_member() == "CheckAuthorization"
        self.questions += is_question
        body = self._body if is_question else PROPERTIES
        if body is None:
            self._socket.sendall(bytes(range(256)))
            return
        reply = Gio.DBusMessage.new_method_reply(call)
        reply.set_body(body)
        self._serial += 1
        reply.set_serial(self._serial)
        self._socket.sendall(reply.to_blob(NO_CAPABILITIES))

    def close(self) -> None:
        with contextlib.suppress(OSError):
            self._socket.shutdown(socket.SHUT_RDWR)
        self._thread.join(timeout=5)
        self._socket.close()
