"""tests/long/power/test_recovery.py: e2fsck may recover a file system, and repair nothing else."""
import pytest
from recovery import faults_of_recovery

QUIET = """/dev/shm/state: recovering journal
Pass 1: Checking inodes, blocks, and sizes
Pass 2: Checking directory structure
Pass 3: Checking directory connectivity
Pass 4: Checking reference counts
Pass 5: Checking group summary information
/dev/shm/state: 323/5888 files (0.3% non-contiguous), 1671/5888 blocks
e2fsck 1.47.0 (5-Feb-2023)
"""
RECOVERED = """/dev/shm/state: recovering journal
Clearing orphaned inode 36 (uid=0, gid=42, mode=0100640, size=1203)
Truncating orphaned inode 37 (uid=0, gid=0, mode=0100644, size=4096)
Pass 1: Checking inodes, blocks, and sizes
Pass 2: Checking directory structure
Pass 3: Checking directory connectivity
Pass 4: Checking reference counts
Pass 5: Checking group summary information
Free blocks count wrong (4219, counted=4217).
Fix? yes

Free inodes count wrong (5567, counted=5565).
Fix? yes


/dev/shm/state: ***** FILE SYSTEM WAS MODIFIED *****
/dev/shm/state: 323/5888 files (0.3% non-contiguous), 1671/5888 blocks
e2fsck 1.47.0 (5-Feb-2023)
"""
# What it says of damages, each with what it adds to the output above.
DAMAGES = (
    "Free blocks count wrong for group #0 (4219, counted=4217).",
    "Free inodes count wrong for group #0 (5567, counted=5565).",
    "Directories count wrong for group #0 (40, counted=41).",
    "Block bitmap differences:  +1234",
    "Inode bitmap differences:  -36",
    "Inode 36 ref count is 2, should be 1.  Fix? yes",
    "Unattached inode 36",
    "Connect to /lost+found? yes",
    "Entry 'shadow' in /etc (17) has deleted/unused inode 36.  Clear? yes",
    "Inode 36 was part of the orphaned inode list.  FIXED.",
    "Inode 36 passes checks, but checksum does not match inode.  Fix? yes",
    "Journal transaction 140 was corrupt, replay was aborted.",
    "Superblock last mount time is in the future.",
    "/dev/shm/state: Superblock needs_recovery flag is clear, but journal has data.",
)


@pytest.mark.parametrize(("status", "printed"), [(0, QUIET), (1, RECOVERED)])
def test_a_recovery(status: int, printed: str) -> None:
    assert faults_of_recovery(status, printed.encode()) == []


@pytest.mark.parametrize("damage", DAMAGES)
def test_any_other_repair(damage: str) -> None:
    printed = RECOVERED.replace("Fix? yes\n", f"Fix? yes\n{damage}\n", 1)
    assert faults_of_recovery(1, printed.encode()) == [damage]


def test_a_status_that_is_no_recovery() -> None:
    for status in (2, 4, 8, 12, -11):
        assert faults_of_recovery(status, RECOVERED.encode()) == [f"status {status}"]


def test_an_output_that_ends_early() -> None:
    for lines in range(len(RECOVERED.splitlines()) - 2):
        printed = "\n".join(RECOVERED.splitlines()[:lines]).encode()
        assert faults_of_recovery(1, printed) == ["it did not come to its end"]


def test_an_output_that_is_no_text() -> None:
    assert len(faults_of_recovery(1, b"\xff\xfe\n" + RECOVERED.encode())) == 1
