"""tests/packages/deb.py: a built package, taken apart."""
import re
import subprocess
import tarfile
from dataclasses import dataclass
from pathlib import Path


@dataclass(frozen=True)
class Deb:
    path: Path

    def field(self, name: str) -> str:
        return _output("dpkg-deb", "-f", str(self.path), name).strip()

    def relations(self, name: str) -> set[str]:
        """A field of relations to other packages; only those among our own keep their versions."""
        return {_without_foreign_versions(one) for one in self.field(name).split(", ") if one}

    def contents(self) -> dict[str, str]:
        """Each file and link by its path, as its mode and owner, or as what it leads to."""
        with subprocess.Popen(["dpkg-deb", "--fsys-tarfile", self.path],
                              stdout=subprocess.PIPE) as process:
            with tarfile.open(fileobj=process.stdout, mode="r|") as archive:
                return {entry.name.removeprefix("."): _kind(entry) for entry in archive
                        if not entry.isdir()}

    def folders(self) -> set[str]:
        """Folders that are not as root alone may write them."""
        lines = _output("dpkg-deb", "-c", str(self.path)).splitlines()
        return {line for line in lines
                if line.startswith("d") and not line.startswith("drwxr-xr-x root/root ")}

    def control(self, folder: Path) -> dict[str, str]:
        """The files beside the contents, by their names."""
        target = folder / self.path.stem
        subprocess.run(["dpkg-deb", "-e", self.path, target], check=True)
        return {path.name: path.read_text() for path in target.iterdir()}

    def extract(self, folder: Path) -> None:
        subprocess.run(["dpkg-deb", "-x", self.path, folder], check=True)


OURS = re.compile(r"privane-|lib(authz|bootparam|digestentry|logbackend|paramcli|rtcclock)1")


def _without_foreign_versions(relation: str) -> str:
    return " | ".join(one if OURS.match(one) else one.split(" (")[0]
                      for one in relation.split(" | "))


def _kind(entry: tarfile.TarInfo) -> str:
    if entry.issym():
        return f"-> {entry.linkname}"
    assert entry.isreg(), entry
    return f"{entry.mode:o} {entry.uname}:{entry.gname}"


def _output(*command: str) -> str:
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout
