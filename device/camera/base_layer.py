"""device/camera/base_layer.py: the slow layer of the camera, made once: Debian's root file system,
the kernel with the modules the camera needs, and the initrd."""
import gzip
import os
import shutil
from pathlib import Path

from .host_tool import run_tool
from .layer_cache import LayerCache, key_of
from .paths import DEVICE

SUITE = "bookworm"

# The kernel's package is fetched but not installed: it would make an initrd that nobody needs.
FETCH_KERNEL = r"""chroot "$1" sh -ec '
    cd /root
    apt-get -q download -o APT::Sandbox::User=root \
        $(apt-cache depends linux-image-amd64 | sed -n "s/.*Depends: //p" | head -n 1)
    mv linux-image-*.deb kernel.deb'"""


def make_base(cache: LayerCache) -> Path:
    """A folder with root.tar, vmlinuz, initrd.img, and modules/ to lay over the root."""
    recipe = [DEVICE / "packages", DEVICE / "modules", DEVICE / "initrd-init", Path(__file__)]
    return cache.layer("base", key_of((path.name, path) for path in recipe),
                       "making the camera's root file system (about half a minute)", _fill)


# Where root makes it, a package's script would end processes of this machine by the path of their
# program, such as polkitd. An ordinary user's mmdebstrap has PIDs of its own by itself.
OWN_PIDS = ("unshare", "--pid", "--fork", "--kill-child", "--mount-proc", "--")


def _fill(work: Path) -> None:
    kernel = work / "kernel.deb"
    apart = OWN_PIDS if os.geteuid() == 0 else ()
    run_tool(*apart, "mmdebstrap", "--quiet", "--variant=minbase",
             f"--include={','.join(_lines('packages'))}",
             "--dpkgopt=path-exclude=/usr/share/man/*",
             "--dpkgopt=path-exclude=/usr/share/locale/*",
             "--dpkgopt=path-exclude=/usr/share/doc/*",
             # The examples of the service are for its users; dpkg heeds the last that fits.
             "--dpkgopt=path-include=/usr/share/doc/privane-system/*",
             '--aptopt=Acquire::Languages "none"',
             f"--customize-hook={FETCH_KERNEL}",
             f"--customize-hook=download /root/kernel.deb '{kernel}'",
             '--customize-hook=rm "$1"/root/kernel.deb',
             SUITE, work / "root.tar")
    unpacked = work / "kernel"
    unpacked.mkdir()
    run_tool("sh", "-ec", 'dpkg-deb --fsys-tarfile "$0" | tar -x -C "$1" --wildcards '
             '"./boot/vmlinuz-*" "./lib/modules/*"', kernel, unpacked)
    kernel.unlink()
    (image,) = unpacked.glob("boot/vmlinuz-*")
    image.rename(work / "vmlinuz")
    modules = unpacked / "lib/modules" / image.name.removeprefix("vmlinuz-")
    run_tool("depmod", "-b", unpacked, modules.name)
    _make_initrd(work, modules)
    _pick_modules(work / "modules", modules)
    shutil.rmtree(unpacked)


def _make_initrd(work: Path, modules: Path) -> None:
    """busybox and the modules that the root disk needs, named in the order to load them."""
    tree = work / "initrd"
    for folder in ("bin", "dev", "modules", "root"):
        (tree / folder).mkdir(parents=True)
    run_tool("tar", "-x", "-C", tree, "--strip-components=2", "-f", work / "root.tar",
             "./usr/bin/busybox")
    shutil.copy(DEVICE / "initrd-init", tree / "init")
    for number, module in enumerate(_with_needed(modules, "initrd")):
        shutil.copy(module, tree / "modules" / f"{number:02}-{module.name}")
    archive = work / "initrd.cpio"
    run_tool("sh", "-ec", 'cd "$0" && find . | sort | cpio --quiet -o -H newc -R 0:0 >"$1"',
             tree, archive)
    (work / "initrd.img").write_bytes(gzip.compress(archive.read_bytes(), 1, mtime=0))
    archive.unlink()
    shutil.rmtree(tree)


def _pick_modules(root: Path, modules: Path) -> None:
    """A tree to lay over the root with the modules of both stages, and the lists modprobe reads."""
    target = root / "usr/lib/modules" / modules.name
    target.mkdir(parents=True)
    for module in _with_needed(modules, "initrd", "root"):
        copy = target / module.relative_to(modules)
        copy.parent.mkdir(parents=True, exist_ok=True)
        shutil.copy(module, copy)
    for name in ("modules.builtin", "modules.builtin.modinfo", "modules.order"):
        shutil.copy(modules / name, target / name)
    # depmod looks below /lib, which is a link in the camera.
    (root / "lib").symlink_to("usr/lib")
    run_tool("depmod", "-b", root, modules.name)
    (root / "lib").unlink()


def _with_needed(modules: Path, *stages: str) -> list[Path]:
    """The files of the listed modules and of all they need, what is needed first."""
    wanted = [name for stage, name in map(str.split, _lines("modules")) if stage in stages]
    shown = run_tool("modprobe", "-d", modules.parents[2], "-S", modules.name,
                     "-a", "--show-depends", *wanted)
    lines = [line.split() for line in shown.splitlines()]
    return list(dict.fromkeys(Path(words[1]) for words in lines if words[0] == "insmod"))


def _lines(name: str) -> list[str]:
    lines = (DEVICE / name).read_text().splitlines()
    return [line for line in lines if line and not line.startswith("#")]
