"""tests/device/test_layer_cache.py: layers are made once for each key, whole or not at all."""
import os
import subprocess
import sys
from pathlib import Path

import pytest
from camera.layer_cache import LayerCache, files_below, key_of
from camera.paths import DEVICE


@pytest.fixture
def cache(tmp_path: Path) -> LayerCache:
    return LayerCache(tmp_path / "cache")


def touch(folder: Path) -> None:
    (folder / "file").touch()


def test_a_layer_is_made_once(cache: LayerCache) -> None:
    folder = cache.layer("base", "1", "", touch)
    assert (folder / "file").exists()
    assert cache.layer("base", "1", "", lambda work: pytest.fail("made again")) == folder


def test_a_new_layer_replaces_those_of_its_kind_only(cache: LayerCache) -> None:
    base, old = cache.layer("base", "1", "", touch), cache.layer("image", "1", "", touch)
    new = cache.layer("image", "2", "", touch)
    assert (base.exists(), old.exists(), new.exists()) == (True, False, True)


def test_what_fails_half_way_leaves_nothing_and_harms_nothing(cache: LayerCache) -> None:
    def fail(work: Path) -> None:
        touch(work)
        raise KeyboardInterrupt

    kept = cache.layer("image", "1", "", touch)
    with pytest.raises(KeyboardInterrupt):
        cache.layer("image", "2", "", fail)
    assert list(cache.folder.iterdir()) == [kept]


def test_slow_work_is_announced(tmp_path: Path) -> None:
    said: list[str] = []
    cache = LayerCache(tmp_path, said.append)
    cache.layer("base", "1", "making it", touch)
    cache.layer("base", "1", "making it", touch)
    assert said == ["making it"]


def test_a_run_folder_lasts_as_long_as_its_run(cache: LayerCache) -> None:
    with cache.run_folder() as first:
        with cache.run_folder() as second:
            assert first.exists() and second.exists() and first != second
        assert first.exists() and not second.exists()
    assert not first.exists()


def test_the_folder_of_a_killed_run_goes_at_the_next(cache: LayerCache) -> None:
    script = ("import os\n"
              "from pathlib import Path; from camera.layer_cache import LayerCache\n"
              f"with LayerCache(Path({str(cache.folder)!r})).run_folder(): os.kill(os.getpid(), 9)")
    killed = subprocess.run([sys.executable, "-B", "-c", script],
                            env={**os.environ, "PYTHONPATH": str(DEVICE)})
    assert killed.returncode == -9
    (left,) = cache.folder.glob("run-*")
    with cache.run_folder() as ours:
        assert list(cache.folder.glob("run-*")) == [ours] != [left]


def test_the_key_follows_name_content_mode_link_and_texts(tmp_path: Path) -> None:
    keys = set()

    def add_key(*texts: str) -> None:
        key = key_of(files_below(tmp_path), *texts)
        assert key not in keys
        keys.add(key)

    file = tmp_path / "folder" / "a"
    file.parent.mkdir()
    file.write_text("1")
    file.chmod(0o644)
    add_key()
    file.write_text("2")
    add_key()
    file.chmod(0o755)
    add_key()
    file = file.rename(tmp_path / "folder" / "b")
    add_key()
    (tmp_path / "link").symlink_to("folder")
    add_key()
    add_key("text")
    os.utime(file, (0, 0))
    assert key_of(files_below(tmp_path), "text") in keys, "a time alone makes no new image"
