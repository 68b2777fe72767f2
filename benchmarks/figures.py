"""benchmarks/figures.py: the arithmetic of the benchmark: ratios, their spread, and the verdict."""
import math
import statistics
from collections.abc import Sequence
from dataclasses import dataclass
from enum import Enum

# How far a ratio may lie beyond its goal before it counts as missed: two runs differ by that much.
SLACK = 0.15


class Bound(Enum):
    AT_MOST = "<="
    AT_LEAST = ">="


class Verdict(Enum):
    STRETCH = "stretch goal met"
    MET = "met"
    WITHIN_SLACK = "met within the slack"
    MISSED = "missed"
    NOT_MEASURED = "not measured"

    @property
    def passed(self) -> bool:
        return self not in (Verdict.MISSED, Verdict.NOT_MEASURED)


@dataclass(frozen=True)
class Spread:
    """What the rounds gave: the figure that counts, and how far apart they lie."""

    median: float
    low: float
    high: float
    rounds: int


def spread(values: Sequence[float]) -> Spread:
    if not values or not all(math.isfinite(value) for value in values):
        raise ValueError(f"no figures: {values}")
    return Spread(statistics.median(values), min(values), max(values), len(values))


def ratios(over: Sequence[float], under: Sequence[float]) -> list[float]:
    """One a round: both sides of a round saw the same machine."""
    if len(over) != len(under):
        raise ValueError(f"{len(over)} rounds over {len(under)}")
    if any(value <= 0 for value in under):
        raise ValueError("a duration that is not positive")
    return [one / other for one, other in zip(over, under)]


def sums(*parts: Sequence[float]) -> list[float]:
    """Of each round, the parts one after the other."""
    return [sum(values) for values in zip(*parts, strict=True)]


def differences(whole: Sequence[float], part: Sequence[float]) -> list[float]:
    """Of each round, what the whole takes beyond the part. It must be something: a part that takes
    longer than the whole was not a part of it."""
    left = [one - other for one, other in zip(whole, part, strict=True)]
    if any(value <= 0 for value in left):
        raise ValueError("the part takes longer than the whole")
    return left


def not_below(values: Sequence[float], least: float) -> list[float]:
    """The values, of which a smaller one would tell that nothing has happened."""
    if any(value < least for value in values):
        raise ValueError(f"{min(values):g} is less than the least that it takes, {least:g}")
    return list(values)


def growth_exponents(small: Sequence[float], large: Sequence[float], factor: float) -> list[float]:
    """The e of each round for which the time grew by factor to the power of e: 1 is linear."""
    if factor <= 1:
        raise ValueError(f"no growth: {factor}")
    return [math.log(ratio) / math.log(factor) for ratio in ratios(large, small)]


def shares(total: int, weights: Sequence[int]) -> list[int]:
    """How many of a total each weight gets: together exactly the total, and none gets nothing."""
    if not weights or min(weights) <= 0:
        raise ValueError(f"no weights: {weights}")
    borders = [total * sum(weights[:end]) // sum(weights) for end in range(len(weights) + 1)]
    counts = [end - start for start, end in zip(borders, borders[1:])]
    if min(counts) <= 0:
        raise ValueError(f"{total} are too few for {weights}")
    return counts


def judge(value: float | None, bound: Bound, goal: float, stretch: float | None,
          slack: float = SLACK) -> Verdict:
    """No value is no pass. A goal of 0 has no slack."""
    if value is None or not math.isfinite(value):
        return Verdict.NOT_MEASURED

    def holds(limit: float) -> bool:
        return value <= limit if bound is Bound.AT_MOST else value >= limit

    if stretch is not None and holds(stretch):
        return Verdict.STRETCH
    if holds(goal):
        return Verdict.MET
    widened = goal * (1 + slack) if bound is Bound.AT_MOST else goal / (1 + slack)
    return Verdict.WITHIN_SLACK if holds(widened) else Verdict.MISSED


def exit_status(verdicts: Sequence[Verdict]) -> int:
    """0 where there are goals and none is missed."""
    return 0 if verdicts and all(verdict.passed for verdict in verdicts) else 1
