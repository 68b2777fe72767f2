"""tests/long/bus/pipeline.py: bus connections that send many calls before the first is answered."""
import itertools
import select
import socket
from contextlib import suppress
from dataclasses import dataclass, field
from typing import Any, Callable, Iterable, Sequence

from gi.repository import Gio, GLib

from harness.bus import INTERFACE, NAME, PATH, BusError
from harness.wire import FIXED_HEADER, NO_CAPABILITIES, Wire

# What the service lets wait of one sender is 16 and of four senders 64; with fewer on each of six
# connections no call is one too many.
WINDOW = 8

# Longer than the service waits for polkit: then it says itself that it did.
ANSWER_SECONDS = 40.0

RETURN, ERROR = Gio.DBusMessageType.METHOD_RETURN, Gio.DBusMessageType.ERROR
NO_REPLY = Gio.DBusMessageFlags.NO_REPLY_EXPECTED


@dataclass(frozen=True)
class Call:
    """A method call, to be sent. kind is its maker's name for what is expected of it."""

    kind: str
    member: str
    signature: str = ""
    arguments: Sequence[Any] = ()
    path: str = PATH
    interface: str | None = INTERFACE
    wants_reply: bool = True

    def message(self) -> Gio.DBusMessage:
        message = Gio.DBusMessage.new_method_call(NAME, self.path, self.interface, self.member)
        if self.signature:
            message.set_body(GLib.Variant(f"({self.signature})", tuple(self.arguments)))
        if not self.wants_reply:
            message.set_flags(NO_REPLY)
        return message

    def __str__(self) -> str:
        shown = ", ".join(f"{argument!r:.120}" for argument in self.arguments)
        return f"{self.kind}: {self.path} {self.interface}.{self.member}({self.signature}: {shown})"


@dataclass(frozen=True)
class Answer:
    """A reply: its bare signature, or the error's name and text."""

    signature: str
    error: BusError | None
    message: Gio.DBusMessage = field(repr=False, compare=False)


def _answer(message: Gio.DBusMessage) -> Answer:
    signature = message.get_signature() or ""
    if message.get_message_type() == RETURN:
        return Answer(signature, None, message)
    body = message.get_body().unpack() if signature == "s" else ("",)
    return Answer(signature, BusError(message.get_error_name(), body[0]), message)


class Pipeline(Wire):
    """A connection of the effective user, which gets no signals of the service."""

    def _ask_bus(self, member: str, body: GLib.Variant | None = None) -> tuple[Any, ...]:
        return super()._ask_bus(member, body) if member != "AddMatch" else ()

    def __init__(self) -> None:
        self.outstanding: dict[int, Call] = {}
        self._unheard: list[int] = []  # calls without an answer, behind the last one that had one
        super().__init__()

    @property
    def waiting(self) -> int:
        """How many calls the service may still have before it."""
        return len(self.outstanding) + len(self._unheard)

    def fileno(self) -> int:
        return self._socket.fileno()

    def start(self, call: Call) -> None:
        message = call.message()
        self._serial += 1
        message.set_serial(self._serial)
        if call.wants_reply:
            self.outstanding[self._serial] = call
        else:
            self._unheard.append(self._serial)
        self._socket.sendall(message.to_blob(NO_CAPABILITIES))

    def end_with(self, blob: bytes) -> None:
        """Sends these bytes as the last ones, and returns when the bus has read them and closed the
        connection: the bus drops unread what comes right before an end."""
        self._socket.settimeout(ANSWER_SECONDS)
        with suppress(BrokenPipeError, ConnectionResetError):  # it had read enough
            self._socket.sendall(blob)
            self._socket.shutdown(socket.SHUT_WR)
            while self._socket.recv(1 << 16):
                pass
        self.close()

    def arrived(self) -> list[tuple[Call, Answer]]:
        """The answers that one read brings."""
        more = self._socket.recv(1 << 20)
        assert more, f"the bus closed the connection on {[*map(str, self.outstanding.values())]}"
        self._buffer += more
        pairs, begin = [], 0
        while len(self._buffer) - begin >= FIXED_HEADER:
            length = Gio.DBusMessage.bytes_needed(self._buffer[begin:begin + FIXED_HEADER])
            if len(self._buffer) - begin < length:
                break
            message = Gio.DBusMessage.new_from_blob(self._buffer[begin:begin + length],
                                                    NO_CAPABILITIES)
            begin += length
            answered = message.get_reply_serial()
            call = self.outstanding.pop(answered, None)
            self._unheard = [serial for serial in self._unheard if serial > answered]
            if message.get_message_type() in (RETURN, ERROR):
                assert call is not None, "an answer to nothing, or a second one"
                pairs.append((call, _answer(message)))
        self._buffer = self._buffer[begin:]
        return pairs


def exchange(lines: Sequence[Pipeline], calls: Iterable[Call],
             on_answer: Callable[[Call, Answer], None]) -> int:
    """Makes the calls, in turn over the connections, and tells each answer as it comes; how many
    calls were made. Every call must be answered in time."""
    made = 0
    for line, call in zip(itertools.cycle(lines), calls):
        while line.outstanding and line.waiting >= WINDOW:
            _await(lines, on_answer)
        line.start(call)
        made += 1
        _take(lines, 0, on_answer)
    while any(line.outstanding for line in lines):
        _await(lines, on_answer)
    return made


def _take(lines: Sequence[Pipeline], seconds: float,
          on_answer: Callable[[Call, Answer], None]) -> bool:
    ready, _, _ = select.select(lines, (), (), seconds)
    for line in ready:
        for call, answer in line.arrived():
            on_answer(call, answer)
    return bool(ready)


def _await(lines: Sequence[Pipeline], on_answer: Callable[[Call, Answer], None]) -> None:
    if _take(lines, ANSWER_SECONDS, on_answer):
        return
    oldest = [str(next(iter(line.outstanding.values()))) for line in lines if line.outstanding]
    raise AssertionError(f"not answered within {ANSWER_SECONDS} s: {oldest}")
