"""tests/long/power/mounted_state.py: what the kernel finds on a disk that it mounts as a power cut
left it."""
import io
import subprocess
import tarfile
from collections.abc import Mapping
from pathlib import Path

from recorded_run import File, Version

MOUNT_SECONDS = 60

# In a mount namespace of its own, so that nothing stays mounted whatever happens. The archive is
# whole before the file system is unmounted, which is done when the command ends.
READ_MOUNTED = """
mount -t ext4 -o loop,nosuid,nodev "$1" "$2" || exit
image=$1 folder=$2
shift 2
cd "$folder"
for path; do
    if [ -e "$path" ]; then
        printf '%s\\n' "$path"
    fi
done | tar --create --numeric-owner --files-from=- || exit
cd /
umount "$folder"
"""


class NotMounted(Exception):
    """The kernel refuses the file system, or its files cannot be read."""


def read_mounted(image: Path, folder: Path, paths: Mapping[str, str]) -> Version:
    """The files of these paths by their names. The image is recovered by that; the folder is empty
    before and afterwards. Raises NotMounted."""
    done = subprocess.run(
        ["unshare", "--mount", "--propagation", "private", "sh", "-c", READ_MOUNTED, "sh", image,
         folder, *(path.lstrip("/") for path in paths.values())],
        stdin=subprocess.DEVNULL, capture_output=True, timeout=MOUNT_SECONDS, check=False)
    if done.returncode != 0:
        raise NotMounted(done.stderr.decode(errors="replace").strip()[-300:]
                         or f"status {done.returncode}")
    with tarfile.open(fileobj=io.BytesIO(done.stdout)) as archive:
        found = {member.name: file_of(archive, member) for member in archive}
    return {name: found.get(path.lstrip("/")) for name, path in paths.items()}


def file_of(archive: tarfile.TarFile, member: tarfile.TarInfo) -> File:
    content = archive.extractfile(member)
    if not member.isreg() or content is None:
        raise NotMounted(f"{member.name} is no regular file")
    return member.mode, member.uid, member.gid, content.read()
