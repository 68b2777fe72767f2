"""tests/bus/harness/flooder.py: sends the service more than it can take, as the user it runs as.

    flooder.py KIND SEED LARGEST

LARGEST is the most that the bus takes in a message; it throws out who sends more.
Prints a line when its connections stand, waits for a line, then floods until its standard input
ends, and prints as JSON what it did. It writes prebuilt bytes to raw sockets and reads no more than
it must: whoever means harm does not wait for answers.
"""
import array
import json
import os
import random
import select
import socket
import struct
import sys
from collections import Counter
from typing import Callable

from gi.repository import Gio, GLib

from harness.bus import INTERFACE, NAME, PATH
from harness.sandbox import SYSTEM_BUS
from harness.wire import NO_CAPABILITIES

CONNECTIONS = 8
STALLED_CONNECTIONS = 40
MEBIBYTE = 1 << 20
# Of a message without its arguments, at most.
HEAD = 1024
LARGE = 16 * MEBIBYTE
# Of an empty text in a list: its length, its terminator, and padding.
TEXT_SIZE = 8
# Of a byte as a variant in a list: the length and the text of its type, and itself.
VARIANT = b"\x01y\x00\x07"
# How the service refuses arguments that are too large, service/intake.cpp.
TOO_LARGE = b"The arguments of the call are too large"
# Of a message: where its flags, the length of its body and its number stand.
FLAGS_OFFSET = 2
BODY_LENGTH_OFFSET = 4
SERIAL_OFFSET = 8
NO_REPLY_EXPECTED = 1
DESCRIPTORS = 16

done: Counter[str] = Counter()


class Connection:
    """A raw connection that has said hello."""

    def __init__(self) -> None:
        self.socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self.socket.settimeout(30)
        self.socket.connect(SYSTEM_BUS.removeprefix("unix:path="))
        uid = str(os.getuid()).encode().hex().encode()
        self.socket.sendall(b"\0AUTH EXTERNAL " + uid + b"\r\n")
        assert self.socket.recv(4096).startswith(b"OK ")
        # The hello is answered with a signal and the unique name, which nobody reads here.
        self.socket.sendall(b"NEGOTIATE_UNIX_FD\r\n")
        assert self.socket.recv(4096).startswith(b"AGREE_UNIX_FD")
        self.socket.sendall(b"BEGIN\r\n" + call("Hello", None, destination="org.freedesktop.DBus",
                                                path="/org/freedesktop/DBus",
                                                interface="org.freedesktop.DBus"))
        assert self.socket.recv(1)
        self.serial = 1
        self.socket.setblocking(False)
        self.rest = memoryview(b"")
        self.answers = b""

    def number(self, blob: bytes) -> bytearray:
        """The message with the connection's next number."""
        self.serial += 1
        numbered = bytearray(blob)
        struct.pack_into("<I", numbered, SERIAL_OFFSET, self.serial)
        return numbered

    def push(self, blob: bytes) -> bool:
        """Sends what fits of the message, or of the one before; whether a new one was begun."""
        is_new = not self.rest
        if is_new:
            self.rest = memoryview(self.number(blob))
        try:
            while self.rest:
                self.rest = self.rest[self.socket.send(self.rest):]
        except BlockingIOError:
            pass
        return is_new

    def drain(self) -> None:
        """Reads what is there, and counts the calls that the service found too large."""
        try:
            while got := self.socket.recv(MEBIBYTE):
                self.answers += got
                done["found_too_large"] += self.answers.count(TOO_LARGE)
                self.answers = self.answers.rpartition(TOO_LARGE)[2][1 - len(TOO_LARGE):]
        except BlockingIOError:
            pass


def finished(seconds: float = 0) -> bool:
    return bool(select.select([sys.stdin], [], [], seconds)[0])


def blob_of(message: Gio.DBusMessage, body: GLib.Variant | None) -> bytes:
    message.set_serial(1)
    if body is not None:
        message.set_body(body)
    return message.to_blob(NO_CAPABILITIES)


def call(member: str, body: GLib.Variant | None, destination: str = NAME, path: str = PATH,
         interface: str = INTERFACE) -> bytes:
    return blob_of(Gio.DBusMessage.new_method_call(destination, path, interface, member), body)


def silent(blob: bytes) -> bytes:
    """The call, to be left unanswered. The bus lets a caller wait for few answers at a time, and
    leave any number of calls unanswered."""
    changed = bytearray(blob)
    changed[FLAGS_OFFSET] |= NO_REPLY_EXPECTED
    return bytes(changed)


def text_call(size: int) -> bytes:
    return call("GetUser", GLib.Variant("(s)", ("x" * size,)))


def list_call(elements: int) -> bytes:
    return call("Pinsrv", GLib.Variant("(as)", ([""] * elements,)))


def addressed(message: Gio.DBusMessage, size: int) -> bytes:
    message.set_destination(NAME)
    return blob_of(message, GLib.Variant("(s)", ("x" * size,)))


def large_signal(size: int) -> bytes:
    return addressed(Gio.DBusMessage.new_signal(PATH, INTERFACE, "UserDatabaseUpdated"), size)


def large_answer(size: int) -> bytes:
    """A reply to nothing."""
    message = Gio.DBusMessage()
    message.set_message_type(Gio.DBusMessageType.METHOD_RETURN)
    message.set_reply_serial(7)
    return addressed(message, size)


def flood_with(blobs: list[bytes], chance: random.Random, is_reading: bool = False) -> None:
    """As fast as the bus takes it, on all connections in turn."""
    connections = [Connection() for _ in range(CONNECTIONS)]
    start()
    while not finished():
        _, writable, _ = select.select([], connections_of(connections), [], 0.05)
        for connection in connections:
            if connection.socket not in writable:
                continue
            for _ in range(16):
                if not connection.push(chance.choice(blobs)):
                    break
                done["messages"] += 1
            if is_reading:
                connection.drain()


def connections_of(connections: list[Connection]) -> list[socket.socket]:
    return [connection.socket for connection in connections]


def start() -> None:
    print("ready", flush=True)
    sys.stdin.readline()


def calls(chance: random.Random, _: int) -> None:
    flood_with([text_call(8), silent(text_call(8))], chance)


def read_calls(chance: random.Random, _: int) -> None:
    flood_with([text_call(8)], chance, is_reading=True)


def questions(chance: random.Random, _: int) -> None:
    """What is answered without the main loop, at length, to somebody who does not listen."""
    blobs = [call("Ping", None, interface="org.freedesktop.DBus.Peer"),
             call("Introspect", None, interface="org.freedesktop.DBus.Introspectable"),
             call("NoSuchMethod", None), call("GetUser", None), call("GetUser", None, path="/"),
             call("GetAll", GLib.Variant("(s)", (INTERFACE,)),
                  interface="org.freedesktop.DBus.Properties")]
    flood_with([*blobs, *map(silent, blobs)], chance)


def large(largest: int) -> int:
    """The size of a large text, in a message that the bus takes."""
    return min(LARGE, largest - HEAD)


def large_calls(chance: random.Random, largest: int) -> None:
    blob = text_call(large(largest))
    flood_with([blob, silent(blob)], chance)


def large_others(chance: random.Random, largest: int) -> None:
    flood_with([large_signal(large(largest)), large_answer(large(largest))], chance)


def lists(chance: random.Random, largest: int) -> None:
    """Lists that just fit, and larger ones."""
    larger = min(250_000, large(largest) // TEXT_SIZE)
    flood_with([silent(list_call(size)) for size in (30_000, 30_000, 30_000, larger)], chance)


def largest_list(kind: str, elements: bytes) -> bytes:
    """A call with one list of that kind of elements, as large as the bus takes."""
    head = bytearray(call("Pinsrv", GLib.Variant(f"({kind})", ([],))))
    body = struct.pack("<I", len(elements)) + elements
    struct.pack_into("<I", head, BODY_LENGTH_OFFSET, len(body))
    # Without the length of the empty list.
    return bytes(head[:-4]) + body


def flood_with_largest_lists(blob: bytes, chance: random.Random) -> None:
    # The service answers few of those that it refuses; enough to see that they arrive.
    flood_with([blob, blob, blob, silent(blob)], chance, is_reading=True)


def text_lists(chance: random.Random, largest: int) -> None:
    """Lists of the shortest texts, as long as a message can be."""
    # Without the padding of the last one.
    elements = bytes((largest - HEAD) // TEXT_SIZE * TEXT_SIZE - 3)
    flood_with_largest_lists(largest_list("as", elements), chance)


def variant_lists(chance: random.Random, largest: int) -> None:
    """Lists of the elements that cost the receiver most, as long as a message can be."""
    elements = VARIANT * ((largest - HEAD) // len(VARIANT))
    flood_with_largest_lists(largest_list("av", elements), chance)


def descriptors(chance: random.Random, _: int) -> None:
    """Calls that carry open files."""
    handles = [os.open("/dev/null", os.O_RDONLY)] * DESCRIPTORS
    message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, "GetUser")
    message.set_unix_fd_list(Gio.UnixFDList.new_from_array(list(map(os.dup, handles))))
    message.set_serial(1)
    message.set_body(GLib.Variant("(s)", ("nosuch",)))
    blob = message.to_blob(Gio.DBusCapabilityFlags.UNIX_FD_PASSING)
    blobs = [blob, silent(blob)]
    connections = [Connection() for _ in range(CONNECTIONS)]
    start()
    while not finished(0.0005):
        for connection in connections:
            try:
                connection.socket.sendmsg(
                    [connection.number(chance.choice(blobs))],
                    [(socket.SOL_SOCKET, socket.SCM_RIGHTS, array.array("i", handles))])
                done["messages"] += 1
            except (BlockingIOError, OSError):
                done["blocked"] += 1


def stalled(_: random.Random, largest: int) -> None:
    """Messages that begin and never end, while their connections stay."""
    connections = [Connection() for _ in range(STALLED_CONNECTIONS)]
    start()
    blob = text_call(large(largest))[:-1]
    for connection in connections:
        connection.push(blob)
        done["messages"] += 1
    while not finished(0.01):
        for connection in connections:
            if connection.rest:
                connection.push(b"")


def storm(chance: random.Random, _: int) -> None:
    """Connections that come, call once, and go."""
    blob = text_call(8)
    start()
    while not finished():
        try:
            connection = Connection()
        except OSError:
            done["blocked"] += 1
            continue
        connection.push(blob)
        if chance.random() < 0.5:
            connection.drain()
        connection.socket.close()
        done["messages"] += 1


KINDS: dict[str, Callable[[random.Random, int], None]] = {
    kind.__name__: kind for kind in (calls, read_calls, questions, large_calls, large_others, lists,
                                     text_lists, variant_lists, descriptors, stalled, storm)}


def main() -> None:
    try:
        KINDS[sys.argv[1]](random.Random(sys.argv[2]), int(sys.argv[3]))
    except (ConnectionError, BrokenPipeError):
        # The bus threw us out.
        done["thrown_out"] += 1
    print(json.dumps(done), flush=True)


if __name__ == "__main__":
    main()
