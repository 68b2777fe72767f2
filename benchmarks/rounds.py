"""benchmarks/rounds.py: visits all candidates in turn, round after round."""
from collections.abc import Callable
from dataclasses import dataclass

Visit = Callable[[], float]


@dataclass(frozen=True)
class Amounts:
    """How much is measured: the whole, or ./bench quick."""

    rounds: int
    calls: int
    slow_calls: int  # those that polkit is asked for
    changes: int
    stock_changes: int
    large_changes: int
    starts: int
    stock_starts: int
    list_calls: int  # of the longest lists
    mixed_calls: int
    pairs: int


FULL = Amounts(rounds=7, calls=1500, slow_calls=400, changes=12, stock_changes=4, large_changes=2,
               starts=11, stock_starts=3, list_calls=30, mixed_calls=20_000, pairs=500)
QUICK = Amounts(rounds=3, calls=200, slow_calls=40, changes=4, stock_changes=2, large_changes=1,
                starts=3, stock_starts=1, list_calls=8, mixed_calls=2_000, pairs=50)


def interleave(candidates: dict[str, Visit], rounds: int,
               after_visit: Callable[[], None]) -> dict[str, list[float]]:
    """What each candidate's visits gave, a figure a round. Every round begins with another one, so
    that none always follows the same."""
    figures: dict[str, list[float]] = {name: [] for name in candidates}
    names = list(candidates)
    for number in range(rounds):
        start = number % len(names)
        for name in names[start:] + names[:start]:
            figures[name].append(candidates[name]())
            after_visit()
    return figures
