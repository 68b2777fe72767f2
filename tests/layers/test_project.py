"""tests/layers/test_project.py: what the tests of both layers know about the project, and the reading
of it."""
import re
from pathlib import Path

import pytest

import meson_project
from conftest import TREE


def test_development_options_are_off_and_give_a_device_nothing() -> None:
    options = meson_project.options()

    assert all(options[name].default == "false" for name in meson_project.DEVELOPMENT_OPTIONS)
    assert all(meson_project.DEVELOPMENT_OPTIONS.values())
    installing = [file for name in ("tests", "benchmarks", "docs/examples")
                  for file in (TREE / name).rglob("meson.build")
                  if re.search(r"\binstall(?:_\w+\(|: true)", file.read_text())]
    assert installing == []


def test_every_option_is_read() -> None:
    text = (TREE / "meson_options.txt").read_text()

    assert len(meson_project.options()) == text.count("option(") > 8


def test_every_dependency_is_read() -> None:
    assert {"glib-2.0", "libcrypt", "zlib"} <= meson_project.dependencies()
    assert not meson_project.dependencies() & meson_project.DEVELOPMENT_DEPENDENCIES


@pytest.mark.parametrize("argument, fault", [
    ("-Dauthz=other", 'Value "other" .*for combo option'),
    ("-Dauthz_deadline_ms=0", "New value 0 is less than minimum value 1"),
    ("-Dno_such_option=1", 'Unknown options: "no_such_option"')])
def test_meson_refuses_what_it_has_not(argument: str, fault: str, tmp_path: Path) -> None:
    with pytest.raises(AssertionError, match=fault):
        meson_project.configure([argument], tmp_path)
