"""tests/bus/test_core_dump.py: a crash leaves no image of the memory, which may hold passwords."""
import os
import signal
import subprocess
from pathlib import Path

import pytest

from harness.bus import Bus
from harness.deadline import wait_for
from harness.fake_authz import FakeAuthz
from harness.service_fixtures import StartService


def dumping(folder: Path) -> list[str]:
    """In front of a program that may leave an image of any size in this folder."""
    return ["prlimit", "--core=unlimited:unlimited", "--", "env", f"--chdir={folder}"]


def crash(pid: int) -> bool:
    """Whether the end of this child left an image of its memory, by the kernel's word."""
    os.kill(pid, signal.SIGSEGV)
    _, status = os.waitpid(pid, 0)
    assert os.WTERMSIG(status) == signal.SIGSEGV
    return os.WCOREDUMP(status)


@pytest.fixture
def folder(tmp_path: Path) -> Path:
    folder = tmp_path / "cores"
    folder.mkdir()
    return folder


def test_other_program_leaves_an_image(folder: Path) -> None:
    program = subprocess.Popen([*dumping(folder), "sleep", "60"])
    wait_for("the program", lambda: os.readlink(f"/proc/{program.pid}/exe").endswith("sleep"))

    assert crash(program.pid)


@pytest.mark.parametrize("arguments", [("-n",), ()], ids=["foreground", "daemon"])
def test_service_leaves_none(arguments: tuple[str, ...], start: StartService, authz: FakeAuthz,
                             bus: Bus, folder: Path) -> None:
    service = start(arguments, environment=authz.environment(), wrapper=dumping(folder))
    service.wait_registered(bus)
    limits = Path(f"/proc/{service.pid}/limits").read_text()
    assert "Max core file size        unlimited            unlimited" in limits

    assert not crash(service.pid)
    service.status = -signal.SIGSEGV
    assert list(folder.iterdir()) == []
