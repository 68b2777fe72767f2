"""tests/long/power/boot_copies.py: reads the two copies of a boot environment as U-Boot does."""
import struct
import zlib

COPY_SIZE = 0x4000
HEADER = struct.Struct("<IB")


def active_parameters(region: bytes) -> bytes | None:
    """The parameters of the valid copy that counts; None when neither is valid."""
    copies = [_valid_copy(region[start:start + COPY_SIZE]) for start in (0, COPY_SIZE)]
    first, second = copies
    if first is None or second is None:
        only = first or second
        return only[1] if only else None
    # The number of a copy wraps round from 255 to 0.
    if (first[0], second[0]) == (255, 0):
        return second[1]
    if (first[0], second[0]) == (0, 255):
        return first[1]
    return second[1] if second[0] > first[0] else first[1]


def _valid_copy(copy: bytes) -> tuple[int, bytes] | None:
    if len(copy) < COPY_SIZE:
        return None
    checksum, number = HEADER.unpack_from(copy)
    text = copy[HEADER.size:]
    if zlib.crc32(text) != checksum or b"\0\0" not in text:
        return None
    return number, text[:text.index(b"\0\0")]
