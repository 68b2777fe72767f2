"""device/camera/qmp.py: QEMU's control protocol: JSON commands, one at a time, and events."""
import json
import socket
from typing import Any

from .deadline import Deadline
from .errors import CameraError


class Qmp:
    """Talks to QEMU over a connected socket. Events are kept in `events`, oldest first."""

    def __init__(self, connection: socket.socket) -> None:
        self._socket = connection
        self._buffer = b""
        self.events: list[dict[str, Any]] = []

    def greet(self, deadline: Deadline) -> None:
        self._receive(deadline)
        self.execute("qmp_capabilities", deadline)

    def execute(self, command: str, deadline: Deadline, **arguments: Any) -> Any:
        request = {"execute": command, "arguments": arguments}
        self._socket.settimeout(deadline.left())
        self._socket.sendall(json.dumps(request).encode() + b"\n")
        while True:
            message = self._receive(deadline)
            if "event" in message:
                self.events.append(message)
            elif "error" in message:
                raise CameraError(f"QEMU refused {command}: {message['error']['desc']}")
            else:
                return message["return"]

    def monitor(self, line: str, deadline: Deadline) -> None:
        """A command of QEMU's human monitor, which alone has snapshots; an answer is a failure."""
        answer = self.execute("human-monitor-command", deadline, **{"command-line": line})
        if answer.strip():
            raise CameraError(f"QEMU: {line}: {answer.strip()}")

    def wait_for_event(self, name: str, deadline: Deadline) -> dict[str, Any]:
        """The next event of that name that nobody has taken yet; earlier others stay."""
        while True:
            for event in self.events:
                if event["event"] == name:
                    self.events.remove(event)
                    return event
            message = self._receive(deadline)
            if "event" in message:
                self.events.append(message)

    def _receive(self, deadline: Deadline) -> dict[str, Any]:
        while b"\n" not in self._buffer:
            self._socket.settimeout(deadline.left())
            try:
                piece = self._socket.recv(65536)
            except TimeoutError:
                raise deadline.missed() from None
            if not piece:
                raise CameraError("QEMU ended")
            self._buffer += piece
        line, self._buffer = self._buffer.split(b"\n", 1)
        message: dict[str, Any] = json.loads(line)
        return message
