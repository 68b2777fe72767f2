"""device/camera/storage_disk.py: the camera's second disk, /dev/sda: its first partition is the boot
block as it comes from the factory, the rest is for recordings."""
import struct
import zlib
from collections.abc import Mapping
from pathlib import Path

from .host_tool import run_tool

STORAGE_RECIPE = Path(__file__)

DISK_SIZE = 512 << 20
BOOT_BLOCK_START = 1 << 20
BOOT_BLOCK_SIZE = 1 << 20
PARTITIONS = f"""label: dos
start={BOOT_BLOCK_START // 512}, size={BOOT_BLOCK_SIZE // 512}, type=da
type=83
"""

# As /etc/fw_env.config of the camera has it: two copies, one behind the other.
COPY_SIZE = 0x4000
FACTORY_PARAMETERS = {"SERNO": "ZC2611000042", "BOARD": "camera-3"}


def make_storage_disk(path: Path) -> None:
    with path.open("wb") as disk:
        disk.truncate(DISK_SIZE)
    run_tool("sh", "-ec", 'printf %s "$1" | sfdisk --quiet "$0"', path, PARTITIONS)
    with path.open("r+b") as disk:
        disk.seek(BOOT_BLOCK_START)
        for number in (1, 0):
            disk.write(boot_environment(FACTORY_PARAMETERS, number))


def boot_environment(parameters: Mapping[str, str], number: int) -> bytes:
    """One copy of a redundant U-Boot environment: the CRC of the text in little-endian order, the
    copy's number, of which the higher one counts, and the text, NUL-terminated "name=value" words up
    to an empty one, padded with NUL bytes."""
    words = [f"{name}={value}\0" for name, value in parameters.items()]
    text = "".join([*words, "\0"]).encode().ljust(COPY_SIZE - 5, b"\0")
    return struct.pack("<IB", zlib.crc32(text), number) + text
