"""tests/device/conftest.py: one camera for the whole session, put back to the state after its boot
before every test."""
import subprocess
import sys
from collections.abc import Iterator
from pathlib import Path

import pytest

TREE = Path(__file__).resolve().parents[2]
sys.path[:0] = [str(TREE / "device"), str(TREE / "tests")]

from camera.layer_cache import LayerCache  # noqa: E402  (found through the line above)
from camera.machine import Camera  # noqa: E402
from camera.warm_start import BOOTED, start_camera  # noqa: E402


def pytest_addoption(parser: pytest.Parser) -> None:
    parser.addoption("--build-dir", type=Path, default=TREE / "build",
                     help="where the packages are built, and the camera is kept")


@pytest.fixture(scope="session")
def build_dir(request: pytest.FixtureRequest) -> Path:
    """As ./run has it, with the packages of the tree as it stands."""
    folder: Path = request.config.getoption("--build-dir").resolve()
    done = subprocess.run([TREE / "tools/build_packages", folder / "packages"],
                          capture_output=True, text=True)
    assert done.returncode == 0, done.stderr
    return folder


@pytest.fixture(scope="session")
def packages_dir(build_dir: Path) -> Path:
    return build_dir / "packages"


@pytest.fixture(scope="session")
def layer_cache(request: pytest.FixtureRequest, build_dir: Path) -> LayerCache:
    reporter = request.config.pluginmanager.get_plugin("terminalreporter")
    return LayerCache(build_dir / "camera", reporter.write_line)


@pytest.fixture(scope="session")
def session_camera(packages_dir: Path, layer_cache: LayerCache) -> Iterator[Camera]:
    with start_camera(layer_cache, packages_dir) as camera:
        yield camera


@pytest.fixture
def camera(session_camera: Camera) -> Camera:
    """The camera as it was right after its boot, whatever the test before did to it."""
    session_camera.restore(BOOTED)
    return session_camera
