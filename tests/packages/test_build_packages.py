"""tests/packages/test_build_packages.py: what tools/build_packages says where it cannot build them."""
import os
import shutil
import subprocess
from pathlib import Path

from conftest import TREE

HOW = "build_packages: run first: tools/install_dependencies build package\n"


def refusal(folder: Path, path: str) -> str:
    ended = subprocess.run([TREE / "tools" / "build_packages", folder / "packages"],
                           env={**os.environ, "PATH": path}, capture_output=True, text=True,
                           timeout=60, check=False)
    assert (ended.returncode, ended.stdout) == (1, ""), ended
    assert sorted(os.listdir(folder / "packages")) == ["lock"]
    return ended.stderr


def test_unmet_dependencies_are_named_up_front(tmp_path: Path) -> None:
    """dpkg itself judges, on a machine that has nothing installed."""
    (tmp_path / "dpkg").mkdir()
    (tmp_path / "dpkg" / "status").touch()
    command = tmp_path / "dpkg-checkbuilddeps"
    command.write_text("#!/bin/sh\n"
                       f'exec {shutil.which("dpkg-checkbuilddeps")} --admindir={tmp_path}/dpkg "$@"\n')
    command.chmod(0o755)
    first, second = refusal(tmp_path, f"{tmp_path}:{os.environ['PATH']}").splitlines(keepends=True)

    assert first.lower().startswith("build_packages: unmet build dependencies: ")
    assert {"debhelper-compat", "meson", "libubootenv-dev"} <= set(first.split())
    assert second == HOW


def test_machine_without_dpkg_dev(tmp_path: Path) -> None:
    programs = tmp_path / "programs"
    programs.mkdir()
    for name in ("bash", "cat", "dirname", "find", "flock", "mkdir", "realpath", "sha256sum", "sort",
                 "tr", "xargs"):
        (programs / name).symlink_to(str(shutil.which(name)))
    said = refusal(tmp_path, str(programs))

    assert "dpkg-checkbuilddeps: command not found" in said and said.endswith(HOW)
