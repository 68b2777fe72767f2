"""device/camera/image_layer.py: the quick layer of the camera: the service, installed the way its
user would, and the camera's own files, on a copy of the base."""
import os
import shutil
from dataclasses import dataclass
from pathlib import Path

from .host_tool import run_tool
from .layer_cache import LayerCache, files_below, key_of
from .paths import DEVICE


@dataclass(frozen=True)
class Image:
    """A disk image, and the kernel that boots it."""

    cache: LayerCache
    folder: Path
    base: Path

    @property
    def kernel(self) -> Path:
        return self.base / "vmlinuz"

    @property
    def initrd(self) -> Path:
        return self.base / "initrd.img"

    @property
    def disk_from_beside(self) -> str:
        """The disk as seen from any folder beside its own: it stays true when the tree is moved."""
        return f"../{self.folder.name}/root.img"


def make_image(cache: LayerCache, base: Path, build: Path) -> Image:
    """`build` is the Meson build folder, already built."""
    installed = cache.folder / "installed"
    shutil.rmtree(installed, ignore_errors=True)
    run_tool("meson", "install", "-C", build, "--no-rebuild", "--quiet", "--destdir", installed)
    recipe = [*files_below(installed), *files_below(DEVICE / "guest")]
    recipe.append(("assemble_image", DEVICE / "assemble_image"))
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
