"""device/camera/warm_start.py: from packages to a running camera in the shortest time: the layers,
one boot for each image, and from then on the snapshot that was saved after it."""
import os
from collections.abc import Mapping
from pathlib import Path

from .base_layer import make_base
from .image_layer import DISKS, Image, make_image
from .layer_cache import LayerCache
from .machine import Camera, machine_key

BOOTED = "booted"


def start_camera(cache: LayerCache, packages: Path, *, kvm: bool = False,
                 fresh: bool = False) -> Camera:
    """A camera with the packages of a folder, just booted."""
    # Locked until it runs: another run may replace the layers, but not before ours are open.
    with cache.locked():
        if fresh:
            cache.clear()
        image = make_image(cache, make_base(cache), packages)
        warm = {name: image.folder / f"{name}-booted-{machine_key(kvm)}.qcow2" for name in DISKS}
        if not all(path.exists() for path in warm.values()):
            _boot_once(image, warm, kvm)
        cache.say("starting the camera")
        return Camera(image, disks=warm, snapshot=BOOTED, kvm=kvm)


def _boot_once(image: Image, warm: Mapping[str, Path], kvm: bool) -> None:
    image.cache.say("booting the camera for the first time (about a quarter of a minute)")
    with Camera(image, kvm=kvm) as camera:
        camera.save(BOOTED)
        camera.quit()
        for name, path in camera.disks.items():
            os.rename(path, warm[name])
