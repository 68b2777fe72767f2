"""tests/device/calls.py: calls of the service from inside the camera, answers as Python values."""
import re
import time
from typing import Any

import pytest
from camera.machine import Camera
from camera.tour import NAME, call
from gi.repository import GLib

# Every account query, with arguments it has an answer for.
QUERIES = {
    "GetUser": ["'root'"], "GetUserList": [], "CheckUser": ["'root'"], "CheckGroup": ["'root'"],
    "GetGroup": ["'privane'"], "GetGroupList": [], "GetGroupListFull": [],
}
OWNER = ["gdbus", "call", "--system", "-d", "org.freedesktop.DBus", "-o", "/org/freedesktop/DBus",
         "-m", "org.freedesktop.DBus.GetConnectionUnixProcessID", NAME]


class BusError(Exception):
    """An error answer: the name of the D-Bus error, and its text."""

    def __init__(self, name: str, text: str) -> None:
        super().__init__(f"{name}: {text}")
        self.name = name
        self.text = text


def ask(camera: Camera, method: str, *arguments: str, user: str = "root") -> tuple[Any, ...]:
    """Calls a method; arguments are written as GVariant text ('name', true, 5)."""
    result = camera.run(call(method, *arguments), user=user)
    if result.status == 0:
        return _value(result.out)
    match = re.fullmatch(r"Error: GDBus\.Error:([\w.]+): (.*)\n", result.err, re.DOTALL)
    assert match, f"gdbus failed in another way: {result}"
    raise BusError(match[1], match[2])


def ask_about_each(camera: Camera, method: str, names: list[str]) -> list[tuple[Any, ...]]:
    """Calls a method with one name after the other, in one command."""
    script = "set -e\n" + "\n".join(call(method, f"'{name}'") for name in names)
    return [_value(line) for line in camera.run(script, timeout=180).check().out.splitlines()]


def owner_pid(camera: Camera) -> int:
    """The process that owns the service's bus name, 0 when nobody does."""
    result = camera.run(OWNER)
    return int(_value(result.out)[0]) if result.status == 0 else 0


def wait_for_owner(camera: Camera, seconds: float = 20) -> int:
    """The process that owns the name, as soon as there is one; asking starts nothing."""
    end = time.monotonic() + seconds
    while time.monotonic() < end:
        if pid := owner_pid(camera):
            return pid
    pytest.fail(f"nobody owns {NAME} after {seconds} s")


def _value(text: str) -> tuple[Any, ...]:
    value: tuple[Any, ...] = GLib.Variant.parse(None, text.strip(), None, None).unpack()
    return value
