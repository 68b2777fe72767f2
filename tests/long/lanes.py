"""tests/long/lanes.py: runs proofs side by side, no more at once than there are cores."""
import signal
import sys
import threading
from collections.abc import Set
from typing import Callable

import proofs
from process_groups import ProcessGroups, Stopped

CORES = 2

Choice = tuple[proofs.Proof, int, int]


def end_by_signals() -> None:
    """Lets a signal leave the block of the lanes, and with it the program, in order. Further ones
    change nothing: what it takes then is seconds."""
    signals = (signal.SIGHUP, signal.SIGINT, signal.SIGTERM)

    def end(number: int, _: object) -> None:
        for each in signals:
            signal.signal(each, signal.SIG_IGN)
        sys.exit(128 + number)

    for each in signals:
        signal.signal(each, end)


class Lanes:
    """A context manager, which waits at its end for what still runs, and ends it where it is left by
    an exception. report gets each proof and its outcome, never two at the same time, and nothing of
    those that were ended; what it raises is raised at the end."""

    def __init__(self, report: Callable[[proofs.Proof, proofs.Outcome], None]) -> None:
        self._report = report
        self._changed = threading.Condition()
        self._running: set[proofs.Proof] = set()
        self._groups = ProcessGroups()
        self._broken: Exception | None = None

    def __enter__(self) -> "Lanes":
        return self

    def __exit__(self, kind: type[BaseException] | None, *_: object) -> None:
        try:
            if kind is None:
                self._wait()
        finally:
            self._groups.stop()
            self._wait()
        if self._broken is not None and kind is None:
            raise self._broken

    def _wait(self) -> None:
        with self._changed:
            self._changed.wait_for(lambda: not self._running)

    def _fits(self, proof: proofs.Proof) -> bool:
        taken = sum(running.cores for running in self._running)
        return proof not in self._running and proof.cores <= CORES - taken

    def start(self, choose: Callable[[Set[proofs.Proof]], Choice | None]) -> bool:
        """Waits until there is room for the proof that is chosen beside those that run, and starts
        it. choose returns the proof, the amount and the seed, or None, after which nothing starts
        and False is returned; it is asked again after each end."""
        with self._changed:
            while choice := choose(self._running):
                if self._fits(choice[0]):
                    self._running.add(choice[0])
                    threading.Thread(target=self._run, args=choice).start()
                    return True
                self._changed.wait()
        return False

    def _run(self, proof: proofs.Proof, amount: int, seed: int) -> None:
        outcome = None
        try:
            outcome = proofs.run(proof, amount, seed, self._groups)
        except Stopped:
            pass
        except OSError as error:
            outcome = proofs.Outcome(False, {}, f"{proof.name} did not start: {error}\n", 0)
        with self._changed:
            try:
                if outcome is not None:
                    self._report(proof, outcome)
            except Exception as error:
                self._broken = error
            finally:
                self._running.remove(proof)
                self._changed.notify_all()
