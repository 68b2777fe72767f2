"""tests/bus/harness/fake_service.py: a program that owns a name on the private bus and answers."""
import contextlib
import socket
import threading
import time
from pathlib import Path
from typing import Callable

from gi.repository import Gio, GLib

from harness.fake_folder import Call, FakeFolder
from harness.wire import Wire

Answer = Callable[[Gio.DBusMessage], Gio.DBusMessage | None]


class FakeService(Wire):
    """Answers with the function until told otherwise. A call's words are the member, the signature
    and the arguments; one for another object or interface is recorded with that in front. A folder
    gets them as well, as those of the fakes that talk through one."""

    def __init__(self, name: str, path: str, interface: str, answer: Answer,
                 folder: Path | None = None) -> None:
        super().__init__()
        self._target = (path, interface)
        self._folder = FakeFolder(folder) if folder else None
        self._socket.settimeout(None)
        self._answer = answer
        self._calls: list[Call] = []
        self._ask_bus("RequestName", GLib.Variant("(su)", (name, 0)))
        self._thread = threading.Thread(target=self._serve, daemon=True)
        self._thread.start()

    def environment(self) -> dict[str, str]:
        return {}

    def fail(self, name: str, text: str | None) -> None:
        """Every call fails with a D-Bus error; without a text it has no arguments."""
        def answer(call: Gio.DBusMessage) -> Gio.DBusMessage:
            reply = Gio.DBusMessage.new_method_error_literal(call, name, text or "")
            if text is None:
                reply.set_body(GLib.Variant("()", ()))
            return reply
        self._answer = answer

    def reply_with(self, body: GLib.Variant | None) -> None:
        """Every call succeeds with such a body."""
        def answer(call: Gio.DBusMessage) -> Gio.DBusMessage:
            reply = Gio.DBusMessage.new_method_reply(call)
            if body is not None:
                reply.set_body(body)
            return reply
        self._answer = answer

    def never_reply(self) -> None:
        self._answer = lambda call: None

    def vanish_at_a_call(self) -> None:
        def answer(call: Gio.DBusMessage) -> None:
            raise ConnectionAbortedError
        self._answer = answer

    def calls(self) -> list[Call]:
        """All calls since the last forget()."""
        return list(self._calls)

    def forget(self) -> None:
        self._calls.clear()

    def _serve(self) -> None:
        try:
            while True:
                message = self._receive()
                if message.get_message_type() == Gio.DBusMessageType.METHOD_CALL:
                    self._serve_call(message)
        except (OSError, AssertionError):
            self._socket.close()  # ours, or the bus is gone

    def _serve_call(self, call: Gio.DBusMessage) -> None:
        target = (call.get_path(), call.get_interface())
        body = call.get_body()
        words = [*(() if target == self._target else target), call.get_member(),
                 call.get_signature(), *(map(str, body.unpack()) if body else ())]
        self._calls.append(Call(time.monotonic_ns(), tuple(words)))
        if self._folder:
            self._folder.record(self._calls[-1])
        reply = self._answer(call)
        if reply is None:
            return
        self._serial += 1
        reply.set_serial(self._serial)
        self._socket.sendall(reply.to_blob(Gio.DBusCapabilityFlags.NONE))

    def close(self) -> None:
        """Leaves the bus, which then has nobody of that name."""
        if self._thread.is_alive():
            with contextlib.suppress(OSError):  # it may go by itself
                self._socket.shutdown(socket.SHUT_RDWR)
            self._thread.join(timeout=5)
