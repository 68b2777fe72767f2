"""tests/device/test_run.py: ./run as a newcomer would start it."""
import os
import re
import subprocess
import sys
import time
from pathlib import Path

import pytest
from camera.errors import CameraError
from camera.machine import Camera
from camera.paths import DEVICE, TREE
from camera.tour import METHODS, NAME, UNIT, Tour
from document_blocks import block
from terminal import Terminal

PROMPT = "root@camera:/#"
# What ./run does on a terminal, without the tour.
ONLY_THE_SHELL = """
import sys
from pathlib import Path
from camera.layer_cache import LayerCache
from camera.warm_start import start_camera
build = Path(sys.argv[1])
with start_camera(LayerCache(build / "camera"), build / "packages") as camera:
    print("still on:", camera.shell.interact(), flush=True)
"""


@pytest.fixture
def shell(build_dir: Path) -> Terminal:
    return Terminal([sys.executable, "-B", "-c", ONLY_THE_SHELL, build_dir],
                    env={**os.environ, "PYTHONPATH": str(DEVICE)})


def readme_transcripts() -> list[str]:
    """The steps of the tour that the README shows."""
    shown = block("README.md", "cam-viewer@camera$ gdbus call")
    return [alike(step) for step in shown.strip().split("\n\n")]


def alike(text: str) -> str:
    """Without what may come out otherwise: the ends of lines depend on the width, IDs and the order of
    Debian's users on the order in which its packages are installed."""
    text = re.sub(r"uid \d+", "uid 993", " ".join(text.split()))
    return re.sub(r"(?<=\(\['root', ).*?(?='cam-web')", "", text)


def test_without_a_terminal(build_dir: Path) -> None:
    done = subprocess.run([TREE / "run", "--build", build_dir], stdin=subprocess.DEVNULL,
                          capture_output=True, text=True, timeout=300)
    assert done.returncode == 0, done.stdout + done.stderr
    assert done.stderr == ""
    for text in ("root@camera# gdbus call", "cam-web@camera$ gdbus call",
                 f"-m {NAME}.GetGroupListFull", "_usermgmt.Code3: Could not retrieve user",
                 "+anna:x:1000:100:Anna at the desk::/bin/false", "UserDatabaseUpdated ()",
                 "powering the camera off"):
        assert text in done.stdout
    steps = readme_transcripts()
    assert len(steps) > 1
    said = alike(done.stdout)
    assert [step for step in steps if step not in said] == []
    interface = (TREE / f"service/{NAME}.xml").read_text()
    methods = re.findall(r'<method name="(\w+)"', interface)
    assert len(methods) == METHODS
    assert [method for method in methods if f"-m {NAME}.{method}" not in done.stdout] == []
    # What was made before is used again.
    for text in ("making the camera's root file system", "booting the camera for the first time"):
        assert text not in done.stdout


def test_on_a_terminal_it_ends_in_a_shell(build_dir: Path) -> None:
    with Terminal([TREE / "run", "--build", build_dir]) as run:
        run.wait_for("leave it with exit or Ctrl-]", seconds=300)  # the whole tour, with a reboot
        run.wait_for(PROMPT)
        run.type(b"exit\n")
        run.wait_for("powering the camera off")
        assert run.process.wait(60) == 0


def test_the_shell_is_a_real_one(shell: Terminal) -> None:
    with shell:
        shell.wait_for(PROMPT)
        shell.type(b"echo $((6 * 7)) $(hostname) $(tty)\n")
        shell.wait_for("42 camera /dev/hvc0")
        # Ctrl-C is for what runs in the camera, not for the camera.
        shell.type(b"sleep 1000\n")
        shell.wait_for("sleep 1000")
        time.sleep(1)
        shell.type(b"\x03")
        shell.wait_for(PROMPT)
        shell.type(b"sleep 1000\n")
        shell.wait_for("sleep 1000")
        # The leave key works whatever is running.
        shell.type(b"\x1d")
        shell.wait_for("still on: True")
        assert shell.process.wait(60) == 0


def test_the_shell_comes_back_after_a_reboot_and_ends_with_the_camera(shell: Terminal) -> None:
    with shell:
        shell.wait_for(PROMPT)
        shell.type(b"touch /run/before; reboot\n")
        shell.wait_for("reboot")
        shell.wait_for(PROMPT)
        shell.wait_for(PROMPT)
        shell.type(b"ls /run/before\n")
        shell.wait_for("No such file or directory")
        shell.type(b"poweroff\n")
        shell.wait_for("still on: False")
        assert shell.process.wait(60) == 0


def test_an_answer_that_is_not_as_it_should_be_ends_the_tour(camera: Camera) -> None:
    camera.run(["systemctl", "mask", "--runtime", "--now", UNIT]).check()
    with pytest.raises(CameraError, match="the tour stops"):
        Tour(camera, len, bold=False).walk()


def test_an_unknown_option_is_refused() -> None:
    done = subprocess.run([TREE / "run", "--bogus"], stdin=subprocess.DEVNULL, capture_output=True,
                          text=True)
    assert done.returncode == 2
    assert "--bogus" in done.stderr


def test_help_needs_nothing() -> None:
    done = subprocess.run([TREE / "run", "--help"], capture_output=True, text=True, check=True)
    assert "./run [--shell | --no-shell]" in done.stdout
