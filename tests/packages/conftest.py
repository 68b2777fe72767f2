"""tests/packages/conftest.py: the packages of the tree, built once for the session."""
import re
import subprocess
import sys
from pathlib import Path

import pytest
from deb import Deb

TREE = Path(__file__).resolve().parents[2]
sys.path[:0] = [str(TREE / "tests"), str(TREE / "tests/unit")]

from document_blocks import block  # noqa: E402  (found through the line above)


@pytest.fixture(scope="session")
def packages_dir() -> Path:
    folder = TREE / "build/packages"
    done = subprocess.run(["bash", "-euc", block("README.md", "tools/build_packages")], cwd=TREE,
                          capture_output=True, text=True)
    assert done.returncode == 0, done.stderr
    return folder


@pytest.fixture(scope="session")
def packages(packages_dir: Path) -> dict[str, Deb]:
    """By name, without those of debug symbols."""
    debs = {path.name.split("_")[0]: Deb(path) for path in packages_dir.glob("*.deb")}
    return {name: deb for name, deb in debs.items() if not name.endswith("-dbgsym")}


@pytest.fixture(scope="session")
def version() -> str:
    """The project's."""
    found = re.search(r"^  version: '(.*)',$", (TREE / "meson.build").read_text(), re.MULTILINE)
    assert found
    return found[1]


@pytest.fixture(scope="session")
def triplet() -> str:
    """The folder of this machine's libraries."""
    return subprocess.run(["dpkg-architecture", "-qDEB_HOST_MULTIARCH"], check=True,
                          capture_output=True, text=True).stdout.strip()
