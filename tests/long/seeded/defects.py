"""tests/long/seeded/defects.py: the defects, and which proof has to notice each.

A defect is a patch of this folder. Its proof is started with a seed and for an amount that is enough
for it; the same start has to pass without the defect.
"""
from dataclasses import dataclass


@dataclass(frozen=True)
class Start:
    """A start of a proof, by the name of its row, with what stands behind its command."""

    proof: str
    amount: int
    words: tuple[str, ...] = ()


@dataclass(frozen=True)
class Defect:
    patch: str
    noticed_by: Start


KILLS = Start("kill_points", 4_000)
FAILING = Start("failing_calls", 1_500)

DEFECTS = (
    Defect("no-file-fsync.patch",
           Start("power_cuts", 300, ("--file-system", "ext4-writeback"))),
    Defect("no-directory-fsync.patch", KILLS),
    Defect("rename-before-fsync.patch", KILLS),
    Defect("temporary-file-readable.patch", KILLS),
    Defect("last-wins-shadow-index.patch", KILLS),
    Defect("ignored-read-error.patch", FAILING),
    Defect("missing-utf8-check.patch", Start("fuzzing", 5, ("--target", "tool_arguments"))),
    Defect("forgotten-authorization.patch",
           Start("authorization_matrix", 46, ("-k", "test_refused"))),
)
