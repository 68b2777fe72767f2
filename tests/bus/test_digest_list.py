"""tests/bus/test_digest_list.py: GetDigestList."""
import os
import socket
from pathlib import Path
from typing import Callable, Iterator

import pytest
from gi.repository import GLib

from harness.bus import Bus, domain_error, error_of
from harness.service import Service
from harness.stage import Stage
from harness.stage_fixtures import DIGEST_FILE as FILE

SHOWN = f"“{FILE}”"

Place = Callable[[Callable[[Path], object]], None]


@pytest.fixture
def place() -> Iterator[Place]:
    """Puts something in the place of the digest file."""
    def put(make: Callable[[Path], object]) -> None:
        FILE.unlink(missing_ok=True)
        make(FILE)
    yield put
    if FILE.is_dir():
        FILE.rmdir()
    elif os.path.lexists(FILE):
        FILE.unlink()


@pytest.mark.parametrize("content, users", [
    (b"", []),
    (b"\n", []),
    (b"alice:realm:0123\n", ["alice"]),
    (b"bob:realm:0123\nalice:realm:0123\n", ["bob", "alice"]),
    (b"alice:realm:0123\nbob:realm:0123", ["alice"]),
    (b"alice:realm:0123", []),
    (b"alice:one:0123\nalice:two:0123\n", ["alice", "alice"]),
    (b"alice:realm:0123\nbob:realm:0123\nalice:realm:0123\n", ["alice", "bob", "alice"]),
    (b":realm:0123\n", [""]),
    (b":\n", [""]),
    (b"alice\nbob:realm:0123\n", ["bob"]),
    (b"alice\n:realm:0123\n", [""]),
    (b"\n\nbob:realm:0123\n\n", ["bob"]),
    (b"alice:\n", ["alice"]),
    (b"# a comment\n# alice:realm:0123\n", ["# alice"]),
    (b" alice :realm:0123\n", [" alice "]),
    (b"alice:realm:0123\r\nbob\r\n", ["alice"]),
    ("jörg:realm:0123\n猫:realm:0123\n".encode(), ["jörg", "猫"]),
    (b"j\xf6rg:realm:0123\n\xff\xfe:r:0\nbob:realm:0123\n",
     ["j\ufffdrg", "\ufffd\ufffd", "bob"]),
    (b"alice:realm:0123\nbo\0b:realm:0123\ncarol:realm:0123\n", ["alice"]),
    (b"alice:realm:0123\nbob:re\0alm:0123\n", ["alice"]),
    (b"x" * (1 << 20) + b":realm:0123\n", ["x" * (1 << 20)]),
    (b"x" * 70000 + b"\n" + b"alice:realm:0123\n", ["alice"]),
    (b"".join(b"user%d:realm:0123\n" % i for i in range(20_000)),
     [f"user{i}" for i in range(20_000)]),
], ids=lambda value: repr(value)[:40])
def test_users_are_the_names_of_complete_lines(content: bytes, users: list[str], service: Service,
                                               bus: Bus, place: Place) -> None:
    place(lambda file: file.write_bytes(content))
    before = service.output()

    assert bus.call("GetDigestList") == (users,)
    assert service.output() == before


def test_file_is_read_anew_at_each_call(service: Service, bus: Bus, place: Place) -> None:
    place(lambda file: file.write_text("alice:realm:0123\n"))
    assert bus.call("GetDigestList") == (["alice"],)

    place(lambda file: file.write_text("bob:realm:0123\n"))
    assert bus.call("GetDigestList") == (["bob"],)


def test_link_is_followed(service: Service, bus: Bus, place: Place, tmp_path: Path) -> None:
    (tmp_path / "real").write_text("alice:realm:0123\n")
    place(lambda file: file.symlink_to(tmp_path / "real"))

    assert bus.call("GetDigestList") == (["alice"],)


def glib_error() -> GLib.Error:
    """What GLib itself has to say about reading the file."""
    try:
        GLib.file_get_contents(str(FILE))
    except GLib.Error as error:
        return error
    raise AssertionError("GLib can read the file")


def assert_unreadable(service: Service, bus: Bus, code: int, text: str) -> None:
    before = service.output()

    error = error_of(bus.call, "GetDigestList", timeout=5)

    expected = f"Could not open HTTP digest file{text}"
    assert error == domain_error("g-file-error-quark", code, expected)
    assert service.output() == before + [f"warning: {expected}"]


def test_missing_file(service: Service, bus: Bus, place: Place) -> None:
    place(lambda file: None)

    assert_unreadable(service, bus, 4, f"Failed to open file {SHOWN}: No such file or directory")
    assert_unreadable(service, bus, glib_error().code, glib_error().message)


@pytest.mark.parametrize("make, code, text", [
    (lambda file: file.symlink_to("/nosuch"), 4,
     "Failed to open file {}: No such file or directory"),
    (lambda file: file.symlink_to(file), 11,
     "Failed to open file {}: Too many levels of symbolic links"),
    (lambda file: file.symlink_to("/etc/passwd/x"), 5, "Failed to open file {}: Not a directory"),
    (lambda file: file.mkdir(), 1, "Error reading file {}: Is a directory"),
], ids=["dangling link", "link to itself", "below a file", "folder"])
def test_file_that_cannot_be_read_gives_the_error_of_glib(
        make: Callable[[Path], object], code: int, text: str, service: Service, bus: Bus,
        place: Place) -> None:
    place(make)

    assert_unreadable(service, bus, code, text.format(SHOWN))
    assert_unreadable(service, bus, glib_error().code, glib_error().message)


def bind_socket(file: Path) -> None:
    with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as listener:
        listener.bind(str(file))


def test_socket_in_its_place(service: Service, bus: Bus, place: Place) -> None:
    place(bind_socket)

    assert_unreadable(service, bus, glib_error().code, glib_error().message)


def test_fifo_in_its_place_fails_at_once(service: Service, bus: Bus, place: Place) -> None:
    place(os.mkfifo)

    # G_FILE_ERROR_AGAIN
    assert_unreadable(service, bus, 19,
                      f"Error reading file {SHOWN}: Resource temporarily unavailable")


def test_fifo_with_a_silent_writer_fails_at_once(service: Service, bus: Bus, place: Place) -> None:
    place(os.mkfifo)
    writer = os.open(FILE, os.O_RDWR)
    try:
        assert_unreadable(service, bus, 19,
                          f"Error reading file {SHOWN}: Resource temporarily unavailable")
    finally:
        os.close(writer)


def test_endless_device_in_its_place_fails(service: Service, bus: Bus, place: Place) -> None:
    place(lambda file: file.symlink_to("/dev/zero"))

    # G_FILE_ERROR_FAILED
    assert_unreadable(service, bus, 24, f"Error reading file {SHOWN}: File too large")


def make_large(size: int, line: bytes) -> Callable[[Path], object]:
    return lambda file: file.write_bytes(line * (size // len(line)))


def test_file_that_is_larger_than_an_answer_fails(service: Service, bus: Bus, place: Place) -> None:
    place(make_large(33 << 20, b"x" * 1023 + b"\n"))

    assert_unreadable(service, bus, 24, f"Failed to read from file {SHOWN}: File too large")


def test_large_file_with_few_names_is_read(service: Service, bus: Bus, place: Place) -> None:
    place(make_large(31 << 20, b"u:" + b"x" * 65533 + b"\n"))

    (users,) = bus.call("GetDigestList")
    assert users == ["u"] * ((31 << 20) // 65536)


def test_names_that_are_too_large_together_fail(service: Service, bus: Bus, place: Place) -> None:
    place(make_large(30 << 20, b"user:\n"))
    before = service.output()

    error = error_of(bus.call, "GetDigestList", timeout=30)

    assert error.name == "org.gtk.GDBus.UnmappedGError.Quark._g_2dfile_2derror_2dquark.Code24"
    assert error.text.startswith("The reply of ")
    assert error.text.endswith(" bytes is larger than a bus message may be")
    assert service.output() == before + [f"warning: {error.text}"]
    assert bus.call("CheckUser", "s", "root") == (True,)


def test_reading_changes_nothing(stage: Stage, place: Place) -> None:
    place(lambda file: file.write_text("alice:realm:0123\n"))
    expected = stage.done()
    expected.answer = (["alice"],)

    stage.assert_unmoved(expected, "GetDigestList")
