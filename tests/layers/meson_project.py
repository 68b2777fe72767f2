"""tests/layers/meson_project.py: what meson.build and meson_options.txt ask for, and what a
configured build would install. Nothing is compiled."""
import json
import re
import subprocess
from dataclasses import dataclass
from pathlib import Path

from conftest import TREE

# Options of who works on the source; a device has none of what they build.
DEVELOPMENT_OPTIONS = {
    "tests": "the unit tests and fakes of the platform libraries",
    "benchmarks": "the clients that measure",
    "fuzzing": "the fuzz targets, which take clang and its sanitizers",
}
DEVELOPMENT_DEPENDENCIES = {"gtest", "gtest_main"}


@dataclass(frozen=True)
class Option:
    default: str
    choices: tuple[str, ...]
    range: tuple[str, ...]


def options() -> dict[str, Option]:
    """Of meson_options.txt."""
    text = (TREE / "meson_options.txt").read_text()
    found = {}
    for name, rest in re.findall(r"^option\('(\w+)', (.*?)\)$", text, re.MULTILINE | re.DOTALL):
        default = re.search(r"value: '?([^',]*)'?,", rest)
        assert default, name
        choices = re.search(r"choices: \[([^\]]*)\]", rest)
        limits = re.search(r"min: (\d+), max: (\d+)", rest)
        found[name] = Option(default[1], tuple(re.findall(r"'([^']+)'", choices[1]) if choices else ()),
                             limits.groups() if limits else ())
    return found


def product_options() -> dict[str, Option]:
    return {name: option for name, option in options().items() if name not in DEVELOPMENT_OPTIONS}


def version() -> str:
    found = re.search(r"^  version: '(.*)',$", (TREE / "meson.build").read_text(), re.MULTILINE)
    assert found
    return found[1]


def dependencies() -> set[str]:
    """What the product is linked with, by the names of pkg-config."""
    files = [file for file in TREE.rglob("meson.build")
             if not file.relative_to(TREE).parts[0].startswith(("bench", "build", "tests"))]
    text = "".join(file.read_text() for file in files)
    return set(re.findall(r"(?:\bdependency|\bfind_library)\(\s*'([^']+)'", text)) \
        - DEVELOPMENT_DEPENDENCIES


def configure(arguments: list[str], folder: Path) -> None:
    done = subprocess.run(["meson", "setup", folder, TREE, *arguments], capture_output=True, text=True)
    assert done.returncode == 0, done.stdout[-2000:] + done.stderr[-2000:]


def introspect(folder: Path, what: str) -> object:
    return json.loads((folder / f"meson-info/intro-{what}.json").read_text())


def values(folder: Path) -> dict[str, str]:
    """Of every option of a configured build, as one writes them."""
    found = introspect(folder, "buildoptions")
    assert isinstance(found, list)
    return {row["name"]: str(row["value"]).lower() if row["type"] == "boolean" else str(row["value"])
            for row in found}


def installed(folder: Path) -> list[str]:
    plan = introspect(folder, "installed")
    assert isinstance(plan, dict)
    return sorted(plan.values())


def stage(files: list[str], folder: Path) -> None:
    """Lays down an empty file for each path of an installation."""
    for file in files:
        place = folder / file.lstrip("/")
        place.parent.mkdir(parents=True, exist_ok=True)
        place.touch()
