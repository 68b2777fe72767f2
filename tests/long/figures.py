"""tests/long/figures.py: what all starts of the proofs have shown, kept in a file."""
import json
import sys
from collections import Counter
from collections.abc import Iterator
from pathlib import Path
from typing import Any

from proofs import Counts, Outcome, Proof, described

# 1 is the gate's.
FIRST_SEED = 2

# A tree of that name is not what any commit holds.
CHANGED = "-dirty"

# Of the fuzz targets, each by itself.
TARGET = "executions_"


class Figures:
    """Every start by itself, so that what counts can be told from what failed, and one tree from
    another. Only starts that passed count."""

    def __init__(self, folder: Path) -> None:
        self._folder = folder
        self._file = folder / "figures.json"
        self._starts: list[dict[str, Any]] = (json.loads(self._file.read_text())
                                              if self._file.exists() else [])
        if not isinstance(self._starts, list):
            sys.exit(f"{self._file} has an older form, whose sums hold those of failed starts; "
                     "tests/long/run --afresh forgets them")

    def _of(self, proof: Proof, passed: bool) -> list[dict[str, Any]]:
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
        sums: Counts = {}
        for start in self._of(proof, passed=True):
            for name, value in start["counts"].items():
                before = sums.get(name, 0)
                sums[name] = max(before, value) if name.startswith("max_") else before + value
        return sums

    def done(self, proof: Proof) -> float:
        return self.counts(proof).get(proof.unit, 0)

    def trees(self, proof: Proof) -> Counter[str]:
        """How much of its unit the proof has done on each, in the order of the first start."""
        done: Counter[str] = Counter()
        for start in self._of(proof, passed=True):
            done[start["tree"]] += start["counts"][proof.unit]
        return done

    def minutes(self, proof: Proof) -> float:
        return sum(start["seconds"] for start in self._of(proof, passed=True)) / 60

    def failed(self, proof: Proof | None = None) -> list[str]:
        """The logs of the failed starts."""
        return [start["log"] for start in self._starts if not start["passed"]
                and (proof is None or start["proof"] == proof.name)]

    def lines(self, proofs: tuple[Proof, ...]) -> Iterator[str]:
        yield f"{'proof':21} {'done':>12} {'aim':>12} {'full':>12} {'unit':8} {'minutes':>8}"
        for proof in proofs:
            yield (f"{proof.name:21} {self.done(proof):12,.0f} {proof.aim:12,} {proof.full:12,} "
                   f"{proof.unit:8} {self.minutes(proof):8.1f}")
            yield from (f"    {line}" for line in self._details(proof))
        seconds = sum(start["seconds"] for start in self._starts)
        yield f"{seconds / 60:.1f} minutes of proofs in all, {len(self.failed())} failed starts"
        yield from (f"failed: {log}" for log in self.failed())

    def _details(self, proof: Proof) -> Iterator[str]:
        counts = self.counts(proof)
        targets = {name.removeprefix(TARGET): value for name, value in counts.items()
                   if name.startswith(TARGET)}
        shown = {name: value for name, value in counts.items() if not name.startswith(TARGET)}
        if shown:
            yield described(shown)
        if targets:
            least = min(targets, key=lambda name: targets[name])
            yield (f"{targets[least]:,} executions of {least}, the least of {len(targets)} targets")
        trees = [f"{tree}{' (changes in no commit)' if CHANGED in tree else ''}: {amount:,.0f}"
                 for tree, amount in self.trees(proof).items()]
        yield (f"{len(self._of(proof, passed=True))} starts that passed on "
               f"{', '.join(trees) or 'no tree'}")
        if failed := self.failed(proof):
            yield f"{len(failed)} that failed, of which nothing counts"
