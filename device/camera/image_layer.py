"""device/camera/image_layer.py: the quick layer of the camera: the service, installed the way its
user would, and the camera's own files, on a copy of the base."""
import os
import shutil
from dataclasses import dataclass
from pathlib import Path

from .host_tool import run_tool
from .layer_cache import LayerCache, files_below, key_of
from .paths import DEVICE
from .storage_disk import STORAGE_RECIPE, make_storage_disk

# The root file system, and the disk with the boot block.
DISKS = ("root", "storage")


@dataclass(frozen=True)
class Image:
    """The disk images, and the kernel that boots them."""

    cache: LayerCache
    folder: Path
    base: Path

    @property
    def kernel(self) -> Path:
        return self.base / "vmlinuz"

    @property
    def initrd(self) -> Path:
        return self.base / "initrd.img"

    def disk_from_beside(self, name: str) -> str:
        """A disk as seen from any folder beside its own: it stays true when the tree is moved."""
        return f"../{self.folder.name}/{name}.img"


def make_image(cache: LayerCache, base: Path, build: Path) -> Image:
    """`build` is the Meson build folder, already built."""
    installed = cache.folder / "installed"
    shutil.rmtree(installed, ignore_errors=True)
    run_tool("meson", "install", "-C", build, "--no-rebuild", "--quiet", "--destdir", installed)
    recipe = [*files_below(installed), *files_below(DEVICE / "guest")]
    recipe += [(path.name, path) for path in (DEVICE / "assemble_image", STORAGE_RECIPE)]
    folder = cache.layer("image", key_of(recipe, base.name),
                         "installing the service in the camera's image",
                         lambda work: _fill(work, base, installed))
    return Image(cache, folder, base)


def _fill(work: Path, base: Path, installed: Path) -> None:
    root = work / "root"
    root.mkdir()
    # Owners and devices must be right in the image; an ordinary user only pretends them.
    pretend = [] if os.geteuid() == 0 else ["fakeroot"]
    run_tool(*pretend, DEVICE / "assemble_image", base, installed, root, work / "root.img")
    shutil.rmtree(root)
    make_storage_disk(work / "storage.img")
