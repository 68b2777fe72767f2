"""tests/long/bus/process_secrets.py: what the writable memory of a process holds."""
import array
import mmap
import re
from pathlib import Path

# A name may follow, or a number that says where in a file.
MAPPING = re.compile(r"(?P<begin>[0-9a-f]+)-(?P<end>[0-9a-f]+) (?P<access>\S+) \S+ \S+ \S+ *"
                     r"(?P<name>.*)")
SURROUNDING = 48

# proc(5): /proc/PID/pagemap has a word for each page.
PAGE = mmap.PAGESIZE
ENTRY = array.array("Q")
PRESENT_OR_SWAPPED = 3 << 62


def forms(secret: str) -> set[bytes]:
    """Each half, since what is freed loses its first bytes; as text, and as wide characters."""
    half = len(secret) // 2
    return {part.encode(encoding) for part in (secret[:half], secret[half:])
            for encoding in ("utf-8", "utf-16-le", "utf-32-le")}


def mappings(pid: int) -> list[tuple[int, int, str]]:
    """Begin, end and name of those that can be written."""
    lines = map(MAPPING.match, Path(f"/proc/{pid}/maps").read_text().splitlines())
    return [(int(line["begin"], 16), int(line["end"], 16), line["name"]) for line in lines
            if line and "w" in line["access"]]


def present(pid: int, begin: int, end: int) -> list[tuple[int, int]]:
    """The parts of a mapping that were ever touched; the rest holds nothing."""
    parts: list[tuple[int, int]] = []
    with open(f"/proc/{pid}/pagemap", "rb", buffering=0) as page_map:
        page_map.seek(begin // PAGE * ENTRY.itemsize)
        entries = array.array("Q", page_map.read((end - begin) // PAGE * ENTRY.itemsize))
    for number, entry in enumerate(entries):
        if not entry & PRESENT_OR_SWAPPED:
            continue
        start = begin + number * PAGE
        if parts and parts[-1][1] == start:
            parts[-1] = (parts[-1][0], start + PAGE)
        else:
            parts.append((start, start + PAGE))
    return parts


def find(pid: int, wanted: set[bytes]) -> list[str]:
    """Where any of these stands in the memory that the process can write."""
    found = []
    with open(f"/proc/{pid}/mem", "rb", buffering=0) as memory:
        for mapped, until, name in mappings(pid):
            for begin, end in present(pid, mapped, until):
                memory.seek(begin)
                content = memory.read(end - begin)
                assert len(content) == end - begin, name
                places = map(content.find, wanted)
                found += [f"{name or 'memory'} at {begin + place:#x}: "
                          f"{content[max(0, place - SURROUNDING):place + SURROUNDING]!r}"
                          for place in places if place >= 0]
    return found
