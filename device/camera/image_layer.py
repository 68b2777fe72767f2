"""device/camera/image_layer.py: the quick layer of the camera: our packages, installed the way their
user would, and the camera's own files, on a copy of the base."""
import os
import shutil
from dataclasses import dataclass
from pathlib import Path

from .errors import CameraError
from .host_tool import run_tool
from .layer_cache import LayerCache, files_below, key_of
from .paths import DEVICE
from .storage_disk import STORAGE_RECIPE, make_storage_disk

# The root file system, and the disk with the boot block.
DISKS = ("root", "storage")

# Those of our packages that a camera has; what they need of Debian is in device/packages.
PACKAGES = ("libauthz1-polkit", "libbootparam1", "libdigestentry1", "liblogbackend1",
            "libparamcli1", "librtcclock1", "privane-system", "privane-tools")


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


def make_image(cache: LayerCache, base: Path, packages: Path) -> Image:
    """`packages` is where tools/build_packages has put the packages."""
    installed = [package_file(packages, name) for name in PACKAGES]
    recipe = files_below(DEVICE / "guest")
    recipe += [(path.name, path)
               for path in (*installed, DEVICE / "assemble_image", STORAGE_RECIPE)]
    folder = cache.layer("image", key_of(recipe, base.name),
                         "installing our packages in the camera's image",
                         lambda work: _fill(work, base, installed))
    return Image(cache, folder, base)


def package_file(packages: Path, name: str) -> Path:
    found = list(packages.glob(f"{name}_*.deb"))
    if len(found) != 1:
        raise CameraError(f"{packages} has no package {name}; this makes it: "
                          f"tools/build_packages {packages}")
    return found[0]


def _fill(work: Path, base: Path, installed: list[Path]) -> None:
    root = work / "root"
    root.mkdir()
    # Owners and devices must be right in the image; an ordinary user only pretends them.
    pretend = [] if os.geteuid() == 0 else ["fakeroot"]
    run_tool(*pretend, DEVICE / "assemble_image", base, root, work / "root.img", *installed)
    shutil.rmtree(root)
    make_storage_disk(work / "storage.img")
