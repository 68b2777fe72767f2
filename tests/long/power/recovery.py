"""tests/long/power/recovery.py: whether e2fsck did no more than recover.

A file system whose power was cut has a journal to replay, and inodes that were open while they had
no name, which mounting clears. Anything else that e2fsck has to repair was broken by the cut.
"""
import re

CLEAN, CORRECTED = 0, 1

# All that it may print. The counts of the whole file system are written when it is unmounted, and
# worked out again when it is mounted; those of a group are in the journal, and must be right.
EXPECTED = re.compile("|".join((
    r"",
    r"e2fsck \d\S* \(\S+\)",
    r"\S+: recovering journal",
    r"(Clearing|Truncating) orphaned inode \d+ \(uid=\d+, gid=\d+, mode=0\d+, size=\d+\)",
    r"Pass [1-5]: Checking [a-z, ]+",
    r"Free (blocks|inodes) count wrong \(\d+, counted=\d+\)\.",
    r"Fix\? yes",
    r"\S+: \*{5} FILE SYSTEM WAS MODIFIED \*{5}",
    r"\S+: \d+/\d+ files \(\d+\.\d% non-contiguous\), \d+/\d+ blocks",
)))
# Its last line, which is missing when it gave up.
SUMMARY = re.compile(r"^\S+: \d+/\d+ files ", re.MULTILINE)


def faults_of_recovery(status: int, printed: bytes) -> list[str]:
    """What is wrong by the exit status and the output of e2fsck -f -y; nothing when all is well."""
    text = printed.decode(errors="replace")
    faults = [line for line in text.splitlines() if not EXPECTED.fullmatch(line.strip())]
    if status not in (CLEAN, CORRECTED):
        faults.append(f"status {status}")
    if not SUMMARY.search(text):
        faults.append("it did not come to its end")
    return faults
