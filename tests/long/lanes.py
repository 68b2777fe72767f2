"""tests/long/lanes.py: runs proofs side by side, no more at once than there are cores."""
import threading
from collections.abc import Set
from typing import Callable

import proofs

CORES = 2


class Lanes:
    """A context manager, which waits at its end for what still runs. report gets each proof and its
    outcome, never two at the same time; what it raises is raised at the end."""

    def __init__(self, report: Callable[[proofs.Proof, proofs.Outcome], None]) -> None:
        self._report = report
        self._changed = threading.Condition()
        self._running: set[proofs.Proof] = set()
        self._broken: Exception | None = None

    def __enter__(self) -> "Lanes":
        return self

    def __exit__(self, *_: object) -> None:
        with self._changed:
            self._changed.wait_for(lambda: not self._running)
        if self._broken is not None:
            raise self._broken

    def _fits(self, proof: proofs.Proof) -> bool:
        taken = sum(running.cores for running in self._running)
        return proof not in self._running and proof.cores <= CORES - taken

    def start(self, choose: Callable[[Set[proofs.Proof]], tuple[proofs.Proof, int, int]]) -> None:
        """Waits until there is room for the proof that is chosen beside those that run, and starts
        it. choose returns the proof, the amount and the seed; it is asked again after each end."""
        with self._changed:
            self._changed.wait_for(lambda: self._fits(choose(self._running)[0]))
            proof, amount, seed = choose(self._running)
            self._running.add(proof)
            threading.Thread(target=self._run, args=(proof, amount, seed)).start()

    def _run(self, proof: proofs.Proof, amount: int, seed: int) -> None:
        try:
            outcome = proofs.run(proof, amount, seed)
        except OSError as error:
            outcome = proofs.Outcome(False, {}, f"{proof.name} did not start: {error}\n", 0)
        with self._changed:
            try:
                self._report(proof, outcome)
            except Exception as error:
                self._broken = error
            finally:
                self._running.remove(proof)
                self._changed.notify_all()
