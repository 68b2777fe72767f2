"""tests/device/test_host_tool.py: a tool that makes the camera ends in order when ./run is ended."""
import os
import signal
import subprocess
import sys
import time
from pathlib import Path

import pytest
from camera.base_layer import OWN_PIDS
from camera.paths import DEVICE

SECONDS = 20

RUN = """\
import signal, sys
from camera.host_tool import run_tool
signal.signal(signal.SIGTERM, lambda *_: sys.exit(3))
run_tool(*sys.argv[1:])
"""

# As mmdebstrap does, it takes its things away when it is told to end.
TOOL = """\
trap 'echo >ended; exit 1' TERM
echo >begun
sleep 60 &
wait
"""


@pytest.mark.parametrize("apart", [(), OWN_PIDS], ids=["beside us", "among PIDs of its own"])
def test_a_tool_that_is_left_takes_its_things_away(tmp_path: Path, apart: tuple[str, ...]) -> None:
    run = subprocess.Popen([sys.executable, "-B", "-c", RUN, *apart, "sh", "-c", TOOL], cwd=tmp_path,
                           env={**os.environ, "PYTHONPATH": str(DEVICE)})
    end = time.monotonic() + SECONDS
    while not (tmp_path / "begun").exists():
        assert time.monotonic() < end
        time.sleep(0.01)
    run.send_signal(signal.SIGTERM)
    assert run.wait(SECONDS) == 3
    assert (tmp_path / "ended").exists()
