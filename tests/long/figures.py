"""tests/long/figures.py: what all starts of the proofs have shown, kept in a file."""
import json
import sys
from collections.abc import Iterable, Iterator, Sequence
from pathlib import Path
from typing import Any

from proofs import OF, Counts, Outcome, Proof, described

# 1 is the gate's.
FIRST_SEED = 2

# A tree of that name is not what any commit holds.
CHANGED = "-dirty"

# Of one fuzz target, which has a row of its own.
TARGET = "executions_"

# Before the unit: what every start repeats, and of which the largest counts, once.
EXHAUSTIVE = "max_exhaustive_"

Start = dict[str, Any]


def added_up(starts: Iterable[Start]) -> Counts:
    """Maxima are the largest of any start, all others are sums; but what every start repeats is in
    them once."""
    sums: Counts = {}
    for start in starts:
        for name, value in start["counts"].items():
            if name.startswith("max_"):
                sums[name] = max(sums.get(name, 0), value)
            else:
                repeated = start["counts"].get(EXHAUSTIVE + name, 0)
                sums[name] = sums.get(name, 0) + value - repeated
    return {name: value + sums.get(EXHAUSTIVE + name, 0) for name, value in sums.items()}


class Figures:
    """Every start by itself, so that what counts can be told from what failed, and one tree from
    another. Only starts that passed count."""

    def __init__(self, folder: Path) -> None:
        self._folder = folder
        self._file = folder / "figures.json"
        self._starts: list[Start] = (json.loads(self._file.read_text())
                                     if self._file.exists() else [])
        if not isinstance(self._starts, list):
            sys.exit(f"{self._file} has an older form, whose sums hold those of failed starts; "
                     "tests/long/run --afresh forgets them")

    def _of(self, proof: Proof, passed: bool) -> list[Start]:
        return [start for start in self._starts
                if start["proof"] == proof.name and start["passed"] == passed]

    def next_seed(self, proof: Proof) -> int:
        """A failed start has had its seed as well: it can be repeated by hand."""
        seeds = [start["seed"] for start in self._starts if start["proof"] == proof.name]
        return max(seeds, default=FIRST_SEED - 1) + 1

    def add(self, proof: Proof, amount: int, seed: int, outcome: Outcome, tree: str) -> None:
        start = {"proof": proof.name, "tree": tree, "amount": amount, "seed": seed,
                 "passed": outcome.passed, "seconds": outcome.seconds, "counts": outcome.counts}
        if not outcome.passed:
            log = self._folder / f"{proof.name}-{seed}.log"
            log.write_text(outcome.output)
            start["log"] = str(log)
        self._starts.append(start)
        new = self._file.with_suffix(".new")
        new.write_text("[\n" + ",\n".join(json.dumps(each) for each in self._starts) + "\n]\n")
        new.rename(self._file)

    def counts(self, proof: Proof) -> Counts:
        """Over all trees."""
        return added_up(self._of(proof, passed=True))

    def done(self, proof: Proof) -> float:
        amounts = [start["counts"].get(proof.unit, 0) for start in self._of(proof, passed=True)]
        return max(amounts, default=0) if proof.at_once else self.counts(proof).get(proof.unit, 0)

    def trees(self, proof: Proof) -> Counts:
        """How much of its unit the proof has done on each, in the order of the first start."""
        starts = self._of(proof, passed=True)
        return {tree: added_up(start for start in starts if start["tree"] == tree)[proof.unit]
                for tree in dict.fromkeys(start["tree"] for start in starts)}

    def seconds_of(self, proof: Proof, amount: int) -> float:
        """How long a start of so much should take, by the slowest so far."""
        paces = [start["seconds"] / start["amount"] for start in self._of(proof, passed=True)]
        return max(paces, default=proof.pace) * amount

    def minutes(self, proof: Proof) -> float:
        return sum(start["seconds"] for start in self._of(proof, passed=True)) / 60

    def failed(self, proof: Proof | None = None) -> list[str]:
        """The logs of the failed starts."""
        return [start["log"] for start in self._starts if not start["passed"]
                and (proof is None or start["proof"] == proof.name)]

    def lines(self, proofs: Sequence[Proof]) -> Iterator[str]:
        yield f"{'proof':23} {'done':>12} {'aim':>12} {'full':>12} {'unit':12} {'minutes':>8}"
        for proof in proofs:
            yield (f"{proof.name:23} {self.done(proof):12,.0f} {proof.aim:12,} {proof.full:12,} "
                   f"{proof.unit:12} {self.minutes(proof):8.1f}")
            yield from (f"    {line}" for line in self._details(proof))
        yield from self._least_of_families(proofs)
        yield self._sum()
        yield from (f"failed: {log}" for log in self.failed())

    def table(self, proofs: Sequence[Proof]) -> Iterator[str]:
        """The same, in Markdown."""
        yield "| proof | done | counts of all starts | starts | failed | minutes | on |"
        yield "|---|---|---|---|---|---|---|"
        for proof in proofs:
            cells = (f"`{proof.name}`", f"{self.done(proof):,.0f} {proof.unit.replace('_', ' ')}",
                     described(self._others(proof)) or "none",
                     f"{len(self._of(proof, passed=True)):,}", f"{len(self.failed(proof)):,}",
                     f"{self.minutes(proof):,.1f}", ", ".join(self.trees(proof)) or "no tree")
            yield f"| {' | '.join(cells)} |"
        yield ""
        yield f"{self._sum()}."

    def _sum(self) -> str:
        seconds = sum(start["seconds"] for start in self._starts)
        return f"{seconds / 60:,.1f} minutes of proofs in all, {len(self.failed())} failed starts"

    def _least_of_families(self, proofs: Sequence[Proof]) -> Iterator[str]:
        """Of those rows that count the same of different things."""
        for family in dict.fromkeys(proof.family for proof in proofs if OF in proof.name):
            rows = [proof for proof in proofs if proof.family == family]
            if len({proof.unit for proof in rows}) == 1 < len(rows):
                least = min(rows, key=self.done)
                yield (f"{family}: {self.done(least):,.0f} {least.unit} of "
                       f"{least.name.split(OF)[1]}, the least of {len(rows)}")

    def _others(self, proof: Proof) -> Counts:
        """All but what the row itself is measured by."""
        return {name: value for name, value in self.counts(proof).items()
                if name != proof.unit and not name.startswith(TARGET)}

    def _details(self, proof: Proof) -> Iterator[str]:
        if others := self._others(proof):
            yield described(others)
        trees = [f"{tree}{' (changes in no commit)' if CHANGED in tree else ''}: {amount:,.0f}"
                 for tree, amount in self.trees(proof).items()]
        yield (f"{len(self._of(proof, passed=True))} starts that passed on "
               f"{', '.join(trees) or 'no tree'}")
        if failed := self.failed(proof):
            yield f"{len(failed)} that failed, of which nothing counts"
