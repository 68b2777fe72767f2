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


DEFECTS: tuple[Defect, ...] = ()
