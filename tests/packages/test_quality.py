"""tests/packages/test_quality.py: what lintian says, that hardening is kept, and that what is written
of the packages is true."""
import os
import re
import subprocess
from pathlib import Path

from check_hardening import faults_of_file
from conftest import TREE
from deb import Deb
from document_blocks import block

PROGRAMS = {"usr/sbin/privane_system", "usr/sbin/privane-check", "usr/bin/privanectl"}
LIBRARIES = ("authz", "bootparam", "digestentry", "logbackend", "paramcli", "rtcclock")

# Sizes as documented may be off by this much before somebody has to write them anew.
TOLERANCE = 0.1


def test_lintian_finds_nothing(packages_dir: Path) -> None:
    (changes,) = packages_dir.glob("*.changes")
    done = subprocess.run(["lintian", "--fail-on", "error,warning", "--tag-display-limit", "0",
                           "--allow-root", changes], capture_output=True, text=True)
    assert done.returncode == 0 and done.stdout == "", done.stdout + done.stderr


def test_each_override_is_explained() -> None:
    """A comment stands right above each."""
    files = list((TREE / "packaging/debian").glob("*.lintian-overrides"))
    assert len(files) == 2
    for file in files:
        before = ""
        for line in file.read_text().splitlines():
            if not line.startswith("#"):
                assert before.startswith("#"), f"{file.name}: {line}"
            before = line


def test_programs_and_libraries_stay_hardened(packages: dict[str, Deb], tmp_path: Path,
                                              triplet: str) -> None:
    seen = set()
    for name, deb in packages.items():
        root = tmp_path / name
        deb.extract(root)
        for path in root.rglob("*"):
            if path.is_symlink() or not path.is_file() or path.read_bytes()[:4] != b"\x7fELF":
                continue
            place = str(path.relative_to(root))
            assert list(faults_of_file(path, place in PROGRAMS)) == [], f"{name}: {place}"
            symbols = subprocess.run(["nm", path], check=True, capture_output=True, text=True)
            assert symbols.stdout == "", f"{name}: {place} is not stripped"
            seen.add(place)
    expected = PROGRAMS | {f"usr/lib/{triplet}/lib{name}.so.1.0.0" for name in LIBRARIES}
    assert seen == expected


def test_no_path_of_the_building_machine(packages: dict[str, Deb], packages_dir: Path,
                                         tmp_path: Path) -> None:
    seen = 0
    for name, deb in packages.items():
        root = tmp_path / name
        deb.extract(root)
        for path in (path for path in root.rglob("*") if path.is_file() and not path.is_symlink()):
            assert os.fsencode(packages_dir) not in path.read_bytes(), path
            seen += 1
    assert seen > 50


def test_an_unchanged_tree_is_not_built_again(packages_dir: Path, packages: dict[str, Deb]) -> None:
    before = {deb.path: deb.path.stat().st_mtime_ns for deb in packages.values()}
    subprocess.run([TREE / "tools/build_packages", packages_dir], check=True)
    assert {path: path.stat().st_mtime_ns for path in before} == before


def shown_sizes(packages_dir: Path) -> str:
    return subprocess.run([TREE / "tools/installed_sizes", packages_dir], check=True,
                          capture_output=True, text=True).stdout


def test_sizes_as_documented(packages_dir: Path, packages: dict[str, Deb]) -> None:
    line = re.compile(r"^ *((?:lib|privane-)\S+) +(\d+) KiB  (.*)$", re.MULTILINE)
    measured = {name: (int(size), needs)
                for name, size, needs in line.findall(shown_sizes(packages_dir))}
    told = block("docs/makers.md", "libauthz1-policy-file ")
    documented = {name: (int(size), needs) for name, size, needs in line.findall(told)}
    assert len(documented) == len(told.splitlines())
    assert set(measured) == set(documented) == set(packages)
    for name, (size, needs) in measured.items():
        assert documented[name][1] == needs
        assert abs(documented[name][0] - size) <= TOLERANCE * size, (name, size)


def test_what_comes_along_on_an_image_as_documented(packages_dir: Path) -> None:
    line = re.compile(r"^ *with (libauthz1-\S+): (\d+) KiB of ours, (\d+) MiB of Debian's$",
                      re.MULTILINE)
    shown = shown_sizes(packages_dir)
    measured = {name: sizes for name, *sizes in line.findall(shown)}
    told = block("docs/makers.md", "with libauthz1-polkit: ")
    documented = {name: sizes for name, *sizes in line.findall(told)}
    assert len(documented) == len(told.splitlines())
    assert set(measured) == set(documented) == {"libauthz1-polkit", "libauthz1-policy-file"}
    for name, sizes in measured.items():
        for size, written in zip(map(int, sizes), map(int, documented[name])):
            assert abs(written - size) <= TOLERANCE * size, (name, size)

    along = [set(names.split(", ")) for names in re.findall(r"^    ([^ ].*)$", shown, re.MULTILINE)]
    assert len(along) == 2
    listed = re.search(r"Debian's are (.*?), and with polkit (.*?)\.\n\n",
                       (TREE / "docs/makers.md").read_text(), re.DOTALL)
    assert listed
    without, more = (set(re.split(r",\s+", names)) for names in listed.groups())
    assert (along[0], along[1]) == (without | more, without)
