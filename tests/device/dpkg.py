"""tests/device/dpkg.py: packages for the camera, and what its dpkg says of them."""
import hashlib
import subprocess
from collections.abc import Iterable
from pathlib import Path

from camera.machine import Camera

# Of the camera, where packages are put.
FOLDER = "/root/packages"
SECONDS = 300
# What makes a version a higher one.
HIGHER = "+1"


def put_packages(camera: Camera, files: Iterable[Path]) -> None:
    camera.run(["mkdir", "-p", FOLDER]).check()
    for file in files:
        camera.put_file(f"{FOLDER}/{file.name}", file.read_bytes())


def run_beside_packages(camera: Camera, command: str) -> str:
    """A command of the shell that names packages as they lie in their folder; what it said."""
    result = camera.run(f"cd {FOLDER} && {command}", timeout=SECONDS).check()
    return result.out + result.err


def statuses(camera: Camera) -> dict[str, str]:
    """Of each package of ours that dpkg knows, how much of it is there."""
    shown = camera.run(["dpkg-query", "-W", "-f",
                        r"${Maintainer}|${Package}|${db:Status-Status}\n"]).check().out
    rows = [line.split("|") for line in shown.splitlines()]
    return {name: status for maintainer, name, status in rows
            if maintainer.startswith("Privane System maintainers")}


def versions(camera: Camera, names: Iterable[str]) -> set[str]:
    shown = camera.run(["dpkg-query", "-W", "-f", r"${Version}\n", *names]).check().out
    return set(shown.splitlines())


def altered(camera: Camera, names: Iterable[str]) -> set[str]:
    """Files of packages that are not as they were installed. What the camera leaves out of packages is
    no such file."""
    result = camera.run(["dpkg", "--verify", *names])
    paths = {line.split()[-1] for line in result.out.splitlines()}
    left_out = ("/usr/share/man/", "/usr/share/doc/")
    missing = {line.split()[-1] for line in result.out.splitlines() if line.startswith("missing ")}
    return paths - {path for path in missing if path.startswith(left_out)}


def package_version(file: Path) -> str:
    return subprocess.run(["dpkg-deb", "-f", file, "Version"], check=True, capture_output=True,
                          text=True).stdout.strip()


def upgraded(file: Path, folder: Path) -> Path:
    """A package with a higher version, by which its programs and libraries end."""
    tree = folder / file.stem
    subprocess.run(["dpkg-deb", "--raw-extract", file, tree], check=True)
    version = package_version(file) + HIGHER
    _set_field(tree, "Version", version)
    sums = []
    for line in (tree / "DEBIAN/md5sums").read_text().splitlines():
        path = tree / line.split(maxsplit=1)[1]
        if path.read_bytes().startswith(b"\x7fELF"):
            with path.open("ab") as program:
                program.write(version.encode())
        sums.append(f"{hashlib.md5(path.read_bytes()).hexdigest()}  {path.relative_to(tree)}\n")
    (tree / "DEBIAN/md5sums").write_text("".join(sums))
    target = folder / file.name.replace(package_version(file), version)
    _pack(tree, target)
    return target


def in_need_of(file: Path, missing: str) -> None:
    """Makes the package depend on another one alone."""
    tree = file.with_suffix(".tree")
    subprocess.run(["dpkg-deb", "--raw-extract", file, tree], check=True)
    _set_field(tree, "Depends", missing)
    _pack(tree, file)


def _set_field(tree: Path, name: str, value: str) -> None:
    control = tree / "DEBIAN/control"
    lines = control.read_text().splitlines()
    assert [line for line in lines if line.startswith(f"{name}: ")]
    control.write_text("".join(f"{name}: {value}\n" if line.startswith(f"{name}: ") else f"{line}\n"
                               for line in lines))


def _pack(tree: Path, target: Path) -> None:
    subprocess.run(["dpkg-deb", "--root-owner-group", "--build", tree, target], check=True,
                   stdout=subprocess.DEVNULL)
