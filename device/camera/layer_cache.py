"""device/camera/layer_cache.py: the folder where what the camera is made of is kept: layers, each
under a key of all it depends on, and the folders of running cameras."""
import fcntl
import hashlib
import os
import shutil
import tempfile
from collections.abc import Callable, Iterable, Iterator
from contextlib import contextmanager
from pathlib import Path


class LayerCache:
    def __init__(self, folder: Path, say: Callable[[str], None] = lambda text: None) -> None:
        """`say` gets a line before everything that takes long."""
        self.folder = folder.resolve()
        self.say = say
        folder.mkdir(parents=True, exist_ok=True)

    @contextmanager
    def locked(self) -> Iterator[None]:
        """Two runs at once make a layer once: the second waits here for the first."""
        with open(self.folder / "lock", "w") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX)
            yield

    def layer(self, kind: str, key: str, doing: str, fill: Callable[[Path], None]) -> Path:
        """The folder of a layer, filled when it is not there; older ones of its kind go. Only with
        the cache locked."""
        folder = self.folder / f"{kind}-{key}"
        if folder.exists():
            return folder
        self.say(doing)
        # Under another name until it is whole; what a killed run left under such a name goes now.
        for abandoned in self.folder.glob(f"making-{kind}-*"):
            shutil.rmtree(abandoned)
        work = Path(tempfile.mkdtemp(prefix=f"making-{kind}-", dir=self.folder))
        try:
            fill(work)
            for old in self.folder.glob(f"{kind}-*"):
                shutil.rmtree(old)
            work.rename(folder)
        except BaseException:
            shutil.rmtree(work, ignore_errors=True)
            raise
        return folder

    def clear(self) -> None:
        """Forgets every layer; running cameras keep the files they have open."""
        for pattern in ("base-*", "image-*"):
            for folder in self.folder.glob(pattern):
                shutil.rmtree(folder, ignore_errors=True)

    @contextmanager
    def run_folder(self) -> Iterator[Path]:
        """A folder for as long as a camera runs; those of runs that were killed go first."""
        for old in self.folder.glob("run-*"):
            _remove_if_abandoned(old)
        folder = Path(tempfile.mkdtemp(prefix="run-", dir=self.folder))
        with open(folder / "lock", "w") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX)
            try:
                yield folder
            finally:
                shutil.rmtree(folder, ignore_errors=True)


def key_of(files: Iterable[tuple[str, Path]], *others: str) -> str:
    """Names, modes and contents of files, and texts, as one short word."""
    total = hashlib.sha256()
    for name, path in sorted(files):
        content = os.readlink(path).encode() if path.is_symlink() else path.read_bytes()
        mode = path.lstat().st_mode
        total.update(f"{name}\0{mode:o}\0{len(content)}\0".encode() + content)
    for other in others:
        total.update(f"{len(other)}\0{other}".encode())
    return total.hexdigest()[:16]


def files_below(folder: Path) -> list[tuple[str, Path]]:
    """Every file and link below a folder, with its name as seen from there."""
    paths = [path for path in folder.rglob("*") if path.is_symlink() or path.is_file()]
    return [(str(path.relative_to(folder)), path) for path in paths]


def _remove_if_abandoned(folder: Path) -> None:
    try:
        with open(folder / "lock") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)
            shutil.rmtree(folder, ignore_errors=True)
    except OSError:
        pass  # in use, or just being made
