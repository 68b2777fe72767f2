"""tests/bus/test_example_library.py: the library of the makers' guide, in the place of ours."""
import ctypes
import fcntl
import os
import shutil
import subprocess
from pathlib import Path
from typing import Callable, Iterator

import pytest

from document_blocks import block
from harness.bus import Bus
from harness.fake_authz import FakeAuthz
from harness.fake_folder import together
from harness.passwords import NEW
from harness.sandbox import build_directory
from harness.service import Service
from harness.stage import ROOT_FLAG_SET

TREE = Path(__file__).parents[2]
EXAMPLE = TREE / "docs" / "examples" / "library"
BUILT = build_directory() / "docs" / "examples" / "library" / "libparamcli.so.1"

STORE = Path("/etc/camera/parameters")
FLAG = STORE / "root.System.RootPwdSet"
OUR_STORE = Path("/etc/privane/parameters.conf")

INVALID, NAME, VALUE, FULL, BUSY, FOLDER, WRITE = 1, 2, 3, 4, 5, 6, 11


@pytest.fixture(autouse=True)
def no_store() -> Iterator[None]:
    def remove() -> None:
        shutil.rmtree(STORE.parent, ignore_errors=True)
        STORE.parent.unlink(missing_ok=True)
        OUR_STORE.unlink(missing_ok=True)
    remove()
    yield
    remove()


@pytest.fixture(params=["meson", "make"])
def library(request: pytest.FixtureRequest, tmp_path: Path) -> Path:
    """The folder of the library, built with the tree, and by the guide's commands away from it."""
    if request.param == "meson":
        return BUILT.parent
    folder = shutil.copytree(EXAMPLE, tmp_path / "library")
    commands = block("docs/makers.md", "make install ")
    subprocess.run(["bash", "-euc", commands], cwd=folder, check=True, timeout=60,
                   env={"PATH": os.environ["PATH"], "TREE": str(TREE),
                        "DESTDIR": str(tmp_path / "image")})
    assert (tmp_path / "image/usr/lib/libparamcli.so.1").resolve().name == "libparamcli.so.1.0.0"
    return tmp_path / "image/usr/lib"


def test_service_keeps_its_flag_there(library: Path, start: Callable[..., Service], bus: Bus,
                                      authz: FakeAuthz) -> None:
    service = start(environment=together(authz.environment(), {"LD_LIBRARY_PATH": str(library)}))
    service.wait_registered(bus)
    mapped = Path(f"/proc/{service.pid}/maps").read_text()
    assert str((library / "libparamcli.so.1").resolve()) in mapped

    assert bus.call("ChpasswdUser", "ss", "root", NEW) == ()

    assert FLAG.read_text() == "yes\n"
    assert FLAG.stat().st_mode & 0o7777 == 0o644
    assert sorted(os.listdir(STORE)) == [FLAG.name]
    assert not OUR_STORE.exists()
    assert service.output()[-1] == ROOT_FLAG_SET
    assert service.stop() == 0


def test_failure_is_told_and_the_password_stays_changed(start: Callable[..., Service], bus: Bus,
                                                        authz: FakeAuthz) -> None:
    STORE.parent.write_text("in the way")
    service = start(environment=together(authz.environment(),
                                         {"LD_LIBRARY_PATH": str(BUILT.parent)}))
    service.wait_registered(bus)

    assert bus.call("ChpasswdUser", "ss", "root", NEW) == ()

    assert service.output()[-1] == (
        f"warning: Updating root user failed to sync param! Error: {FOLDER}")
    assert bus.call("AuthUserBasic", "ss", "root", NEW) == ()
    assert service.stop() == 0


def test_exports_are_those_of_the_header() -> None:
    """As of our own: see tests/unit/platform/check_library.py."""
    subprocess.run(["/usr/bin/python3", TREE / "tests/unit/platform/check_library.py", BUILT,
                    TREE / "platform/paramcli/paramcli.h", "libparamcli.so.1"], check=True)


class Block:
    """A caller of the library in this process."""

    def __init__(self) -> None:
        self._library = ctypes.CDLL(str(BUILT))
        # As large as the header says.
        self.bytes = ctypes.create_string_buffer(4096)

    def reset(self) -> "Block":
        self._library.paramcli_reset_options(self.bytes)
        return self

    def set(self, name: str, value: str) -> int:
        error = ctypes.c_int(0)
        self._library.paramcli_set_custom_param(name.encode(), value.encode(), self.bytes,
                                                ctypes.byref(error))
        return error.value

    def sync(self, error: int = 0) -> int:
        slot = ctypes.c_int(error)
        self._library.paramcli_sync(self.bytes, ctypes.byref(slot))
        return slot.value


def test_block_that_was_never_reset_is_refused() -> None:
    assert Block().set("a", "b") == INVALID
    assert Block().sync() == INVALID


@pytest.mark.parametrize("name, value, number", [
    ("", "b", NAME), (".new", "b", NAME), ("#a", "b", NAME), (" a", "b", NAME), ("a ", "b", NAME),
    ("a=b", "b", NAME), ("../a", "b", NAME), ("a\n", "b", NAME), ("a" * 201, "b", NAME),
    ("a", "b\n", VALUE), ("a", "b" * 4086, FULL)])
def test_what_cannot_be_kept_is_refused(name: str, value: str, number: int) -> None:
    block = Block().reset()
    assert block.set(name, value) == number

    assert block.sync() == 0
    assert not STORE.exists()


def test_last_value_counts_and_a_second_parameter_finds_no_room() -> None:
    block = Block().reset()
    assert [block.set("a", "1"), block.set("a", "2"), block.set("b", "3")] == [0, 0, FULL]

    assert block.sync(error=-1) == -1  # left alone
    assert {file.name: file.read_text() for file in STORE.iterdir()} == {"a": "2\n"}
    assert block.set("b", "b" * 4086) == FULL
    assert block.set("b", "b" * 4085) == 0
    assert block.sync() == 0
    assert sorted(os.listdir(STORE)) == ["a", "b"]


def test_lock_of_another_is_waited_for_and_told() -> None:
    block = Block().reset()
    block.set("a", "1")
    block.sync()
    block.set("a", "2")
    folder = os.open(STORE, os.O_RDONLY)
    fcntl.flock(folder, fcntl.LOCK_EX)

    assert block.sync() == BUSY
    assert (STORE / "a").read_text() == "1\n"
    os.close(folder)
    assert block.sync() == 0
    assert (STORE / "a").read_text() == "2\n"


def test_failure_leaves_nothing_behind() -> None:
    (STORE / "a").mkdir(parents=True)
    block = Block().reset()
    block.set("a", "1")

    assert block.sync() == WRITE
    assert sorted(os.listdir(STORE)) == ["a"]
