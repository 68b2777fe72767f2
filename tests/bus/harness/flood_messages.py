"""tests/bus/harness/flood_messages.py: the messages of harness/flooder.py, built once."""
import struct

from gi.repository import Gio, GLib

from harness.bus import INTERFACE, NAME, PATH
from harness.wire import NO_CAPABILITIES

# Of a message: where its flags and the length of its body stand.
FLAGS_OFFSET = 2
BODY_LENGTH_OFFSET = 4
NO_REPLY_EXPECTED = 1
# Of a message without its arguments, at most.
HEAD = 1024
# Of an empty text in a list: its length, its terminator, and padding.
TEXT_SIZE = 8
# Of a byte as a variant in a list: the length and the text of its type, and itself.
VARIANT = b"\x01y\x00\x07"


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


def largest_list(kind: str, elements: bytes) -> bytes:
    """A call with one list of that kind of elements."""
    head = bytearray(call("Pinsrv", GLib.Variant(f"({kind})", ([],))))
    body = struct.pack("<I", len(elements)) + elements
    struct.pack_into("<I", head, BODY_LENGTH_OFFSET, len(body))
    # Without the length of the empty list.
    return bytes(head[:-4]) + body
