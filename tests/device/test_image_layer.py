"""tests/device/test_image_layer.py: our packages in the making of the camera's image: which are wanted,
and that who makes it is told why one cannot be installed."""
import shutil
from pathlib import Path

import pytest
from camera.base_layer import make_base
from camera.errors import CameraError
from camera.image_layer import PACKAGES, make_image, package_file
from camera.layer_cache import LayerCache
from dpkg import in_need_of

NEED = r"librtcclock1\S* depends on libnosuch"


@pytest.fixture
def packages(packages_dir: Path, tmp_path: Path) -> Path:
    """A copy, to be spoilt."""
    for name in PACKAGES:
        shutil.copy(package_file(packages_dir, name), tmp_path)
    return tmp_path


@pytest.fixture
def base(layer_cache: LayerCache) -> Path:
    with layer_cache.locked():
        return make_base(layer_cache)


def test_an_image_wants_every_package(layer_cache: LayerCache, base: Path, packages: Path) -> None:
    package_file(packages, "librtcclock1").unlink()
    with layer_cache.locked(), pytest.raises(CameraError, match="has no package librtcclock1"):
        make_image(layer_cache, base, packages)


def test_dpkg_tells_what_a_package_lacks(layer_cache: LayerCache, base: Path, packages: Path) -> None:
    """Nothing that is wanted may be missing in device/packages."""
    in_need_of(package_file(packages, "librtcclock1"), "libnosuch")
    before = set(layer_cache.folder.iterdir())
    with layer_cache.locked(), pytest.raises(CameraError, match=NEED):
        make_image(layer_cache, base, packages)
    assert set(layer_cache.folder.iterdir()) == before
