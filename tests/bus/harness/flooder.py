"""tests/bus/harness/flooder.py: sends the service more than it can take, as the user it runs as.

    flooder.py KIND SEED LARGEST

LARGEST is the most that the bus takes in a message; it throws out who sends more.
Prints a line when its connections stand, waits for a line, then floods until its standard input
ends, and prints as JSON what came of it: the "messages" it began to send, those that the service
"answered" and those that the bus "denied", those "stalled" in the bus, and how often it was
"thrown_out". It writes prebuilt bytes to raw sockets. Most kinds read nothing until the end, and
then no more than it takes to see that they arrived: whoever means harm does not wait for answers.
"""
import array
import errno
import json
import os
import random
import select
import socket
import struct
import sys
import time
from collections import Counter
from typing import Callable

from gi.repository import Gio, GLib

from harness.bus import ACCESS_DENIED, INTERFACE, NAME, PATH
from harness.flood_messages import (BODY_LENGTH_OFFSET, HEAD, TEXT_SIZE, VARIANT, call,
                                    large_answer, large_signal, largest_list, list_call, silent,
                                    text_call)
from harness.sandbox import SYSTEM_BUS
from harness.wire import FIXED_HEADER

CONNECTIONS = 8
# Fewer where more would be under way at once: with many, hardly a message would get through.
UNDER_WAY = 32 << 20
STALLED_CONNECTIONS = 40
MEBIBYTE = 1 << 20
# More than the kernel keeps of what is sent and not read.
SOCKET = MEBIBYTE // 4
LARGE = 16 * MEBIBYTE
# Of a message: where its type and its number stand.
TYPE_OFFSET = 1
SERIAL_OFFSET = 8
# That of the hello.
FIRST_SERIAL = 1
ANSWERS = {Gio.DBusMessageType.METHOD_RETURN, Gio.DBusMessageType.ERROR}
# The header's field for the sender, of what the bus itself says.
FROM_BUS = b"\x07\x01s\0\x14\0\0\0org.freedesktop.DBus\0"
DESCRIPTORS = 16
# So many answers tell that messages of a kind arrive, small ones and large.
MANY, FEW = 10, 1
HEARING_SECONDS = 30.0
# One in so many of a storm's connections waits so long for its answer.
WAITING = 16
ANSWER_SECONDS = 2.0

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
        assert self.socket.recv(1, socket.MSG_PEEK)
        self.serial = FIRST_SERIAL
        self.socket.setblocking(False)
        self.rest = memoryview(b"")
        self.unread = bytearray()

    @property
    def is_used(self) -> bool:
        return self.serial > FIRST_SERIAL

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

    def hear(self) -> bool:
        """Counts answers that are there; False without any. Raises ConnectionError where the bus
        has hung up."""
        try:
            got = self.socket.recv(MEBIBYTE)
        except BlockingIOError:
            return False
        if not got:
            raise ConnectionResetError
        self.unread += got
        self._count_answers()
        return True

    def _count_answers(self) -> None:
        begin = 0
        while len(self.unread) >= begin + FIXED_HEADER:
            body, _, fields = struct.unpack_from("<III", self.unread, begin + BODY_LENGTH_OFFSET)
            end = begin + FIXED_HEADER + (fields + 7) // 8 * 8 + body
            if len(self.unread) < end:
                break
            count_answer(bytes(self.unread[begin:end]))
            begin = end
        del self.unread[:begin]


def count_answer(message: bytes) -> None:
    if message[TYPE_OFFSET] not in ANSWERS:
        return
    if FROM_BUS not in message:
        done["answered"] += 1
    elif ACCESS_DENIED.encode() in message:
        done["denied"] += 1


def finished(seconds: float = 0) -> bool:
    return bool(select.select([sys.stdin], [], [], seconds)[0])


def hear_out(connections: list[Connection], least: int) -> None:
    """Sends nothing more and waits for answers."""
    end = time.monotonic() + HEARING_SECONDS
    while True:
        for connection in connections:
            connection.hear()
        if done["answered"] + done["denied"] >= least or time.monotonic() > end:
            return
        select.select(connections_of(connections), [], [], 0.05)


def flood_with(blobs: list[bytes], chance: random.Random, is_reading: bool = False) -> None:
    """As fast as the bus takes it, on all connections in turn: on each the first blob first, and at
    least one message whole."""
    largest = max(map(len, blobs))
    connections = [Connection() for _ in range(min(CONNECTIONS, UNDER_WAY // largest + 1))]
    start()
    while not finished() or all(connection.rest for connection in connections):
        _, writable, _ = select.select([], connections_of(connections), [], 0.05)
        for connection in connections:
            if connection.socket not in writable:
                continue
            for _ in range(16):
                if not connection.push(chance.choice(blobs) if connection.is_used else blobs[0]):
                    break
                done["messages"] += 1
            while is_reading and connection.hear():
                pass
    hear_out(connections, least_answers(largest))


def least_answers(size: int) -> int:
    """How many must come, of messages of that size."""
    return MANY if size < MEBIBYTE // 2 else FEW


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


def too_large(_: random.Random, largest: int) -> None:
    """Messages that the bus does not take, each on a connection of its own."""
    blob = text_call(max(LARGE, largest))
    start()
    while not finished():
        connection = Connection()
        done["messages"] += 1
        try:
            connection.push(blob)
            while not finished(0.001):
                connection.push(b"")
                connection.hear()
        except ConnectionError:
            done["thrown_out"] += 1
        connection.socket.close()


def lists(chance: random.Random, largest: int) -> None:
    """Lists that just fit, and larger ones."""
    fitting = list_call(30_000)
    larger = list_call(min(250_000, large(largest) // TEXT_SIZE))
    flood_with([fitting, silent(fitting), silent(fitting), larger], chance)


def flood_with_largest_lists(blob: bytes, chance: random.Random) -> None:
    # The service answers few of those that it refuses; enough to see that they arrive.
    flood_with([blob, blob, blob, silent(blob)], chance, is_reading=True)


def text_lists(chance: random.Random, largest: int) -> None:
    """Lists of the shortest texts, as long as a large message can be."""
    # Without the padding of the last one.
    elements = bytes(large(largest) // TEXT_SIZE * TEXT_SIZE - 3)
    flood_with_largest_lists(largest_list("as", elements), chance)


def variant_lists(chance: random.Random, largest: int) -> None:
    """Lists of the elements that cost the receiver most, as long as a large message can be."""
    elements = VARIANT * (large(largest) // len(VARIANT))
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
            except OSError as error:
                # No room, or more descriptors under way than the kernel lets a user have.
                if error.errno not in (errno.EAGAIN, errno.ETOOMANYREFS):
                    raise
    hear_out(connections, MANY)


def stalled(_: random.Random, largest: int) -> None:
    """Messages that begin and never end, while their connections stay; at least one of them is under
    way in the bus."""
    connections = [Connection() for _ in range(STALLED_CONNECTIONS)]
    start()
    blob = text_call(large(largest))[:-1]
    for connection in connections:
        connection.push(blob)
        done["messages"] += 1
    # More than a socket holds: the bus has read of it.
    while not finished(0.01) or all(len(connection.rest) >= len(blob) - SOCKET
                                    for connection in connections):
        for connection in connections:
            if connection.rest:
                connection.push(b"")
    for connection in connections:
        connection.hear()
        done["stalled"] += len(connection.rest) < len(blob) - SOCKET


def storm(chance: random.Random, _: int) -> None:
    """Connections that come, call once, and go; few wait for the answer."""
    blob = text_call(8)
    start()
    while not finished():
        connection = Connection()
        connection.push(blob)
        done["messages"] += 1
        if chance.random() < 1 / WAITING:
            wait_for_answer(connection)
        connection.socket.close()


def wait_for_answer(connection: Connection) -> None:
    end = time.monotonic() + ANSWER_SECONDS
    before = done.total()
    while done.total() == before and time.monotonic() < end and not finished():
        if select.select([connection.socket], [], [], 0.05)[0]:
            connection.hear()


KINDS: dict[str, Callable[[random.Random, int], None]] = {
    kind.__name__: kind for kind in (calls, read_calls, questions, large_calls, large_others,
                                     too_large, lists, text_lists, variant_lists, descriptors,
                                     stalled, storm)}


def main() -> None:
    try:
        KINDS[sys.argv[1]](random.Random(sys.argv[2]), int(sys.argv[3]))
    except ConnectionError:
        done["thrown_out"] += 1
    print(json.dumps(done), flush=True)


if __name__ == "__main__":
    main()
