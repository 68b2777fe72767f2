"""tests/unit/benchmarks/test_figures.py: medians, ratios, slack and verdicts of ./bench."""
import math

import pytest

from benchmarks.figures import (Bound, Verdict, differences, exit_status, growth_exponents, judge,
                                not_below, ratios, shares, spread, sums)
from benchmarks.rounds import interleave

AT_MOST, AT_LEAST = Bound.AT_MOST, Bound.AT_LEAST


def test_the_median_counts_and_the_spread_is_told() -> None:
    told = spread([9.0, 1.0, 2.0, 3.0, 100.0, 2.5, 2.2])
    assert (told.median, told.low, told.high, told.rounds) == (2.5, 1.0, 100.0, 7)


def test_the_median_of_an_even_number_lies_between() -> None:
    assert spread([1.0, 2.0, 4.0, 9.0]).median == 3.0


@pytest.mark.parametrize("values", [[], [1.0, math.nan], [math.inf]])
def test_no_figures_are_no_spread(values: list[float]) -> None:
    with pytest.raises(ValueError):
        spread(values)


def test_a_ratio_is_taken_within_a_round() -> None:
    assert ratios([2.0, 30.0], [1.0, 10.0]) == [2.0, 3.0]


@pytest.mark.parametrize("over, under", [([1.0], [1.0, 2.0]), ([1.0], [0.0]), ([1.0], [-1.0])])
def test_ratios_of_different_rounds_or_over_nothing_are_refused(over: list[float],
                                                               under: list[float]) -> None:
    with pytest.raises(ValueError):
        ratios(over, under)


def test_parts_are_added_and_taken_off_round_by_round() -> None:
    assert sums([1.0, 2.0], [10.0, 20.0], [100.0, 200.0]) == [111.0, 222.0]
    assert differences([5.0, 7.0], [1.0, 2.0]) == [4.0, 5.0]
    with pytest.raises(ValueError):
        sums([1.0], [1.0, 2.0])
    with pytest.raises(ValueError):
        differences([5.0, 1.0], [1.0, 1.0])


def test_what_ended_too_early_is_refused() -> None:
    assert not_below([0.95, 1.0], 0.95) == [0.95, 1.0]
    with pytest.raises(ValueError):
        not_below([1.0, 0.94], 0.95)


def test_growth_exponents() -> None:
    assert growth_exponents([3.0, 3.0, 3.0], [3.0, 30.0, 300.0], 10) == pytest.approx([0, 1, 2])
    with pytest.raises(ValueError):
        growth_exponents([1.0], [1.0], 1)


def test_shares_are_the_total_together() -> None:
    assert shares(100, [1, 3]) == [25, 75]
    assert shares(10, [1, 1, 1]) == [3, 3, 4]
    for total in (2000, 20_000, 101):
        assert sum(shares(total, [48, 30, 1, 21])) == total


@pytest.mark.parametrize("total, weights", [(10, []), (10, [1, 0]), (10, [1, 30]), (0, [1])])
def test_a_share_of_nothing_is_refused(total: int, weights: list[int]) -> None:
    with pytest.raises(ValueError):
        shares(total, weights)


@pytest.mark.parametrize("value, verdict", [
    (1.03, Verdict.STRETCH),
    (1.031, Verdict.MET),
    (1.08, Verdict.MET),
    (1.081, Verdict.WITHIN_SLACK),
    (1.08 * 1.15, Verdict.WITHIN_SLACK),
    (1.08 * 1.15 + 0.001, Verdict.MISSED),
    (None, Verdict.NOT_MEASURED),
    (math.nan, Verdict.NOT_MEASURED),
    (math.inf, Verdict.NOT_MEASURED),
])
def test_what_may_be_at_most(value: float | None, verdict: Verdict) -> None:
    assert judge(value, AT_MOST, 1.08, 1.03) is verdict


@pytest.mark.parametrize("value, verdict", [
    (12.0, Verdict.STRETCH),
    (11.9, Verdict.MET),
    (10.0, Verdict.MET),
    (9.9, Verdict.WITHIN_SLACK),
    (10 / 1.15, Verdict.WITHIN_SLACK),
    (10 / 1.15 - 0.001, Verdict.MISSED),
])
def test_what_must_be_at_least(value: float, verdict: Verdict) -> None:
    assert judge(value, AT_LEAST, 10, 12) is verdict


def test_sizes_have_no_slack_and_a_goal_may_have_no_stretch() -> None:
    assert judge(31, AT_MOST, 31, None, slack=0) is Verdict.MET
    assert judge(32, AT_MOST, 31, None, slack=0) is Verdict.MISSED
    assert judge(1, AT_MOST, 31, None) is Verdict.MET


@pytest.mark.parametrize("verdicts, status", [
    ([Verdict.STRETCH, Verdict.MET, Verdict.WITHIN_SLACK], 0),
    ([Verdict.MET, Verdict.MISSED], 1),
    ([Verdict.MET, Verdict.NOT_MEASURED], 1),
    ([], 1),
])
def test_the_exit_status(verdicts: list[Verdict], status: int) -> None:
    assert exit_status(verdicts) == status


def test_every_round_visits_all_in_turn_and_begins_with_another_one() -> None:
    visited: list[str] = []
    checks: list[int] = []

    def visit(name: str):
        def visited_now() -> float:
            visited.append(name)
            return float(len(visited))
        return visited_now

    figures = interleave({name: visit(name) for name in "abc"}, 4, lambda: checks.append(len(visited)))
    assert "".join(visited) == "abc" "bca" "cab" "abc"
    assert figures == {"a": [1, 6, 8, 10], "b": [2, 4, 9, 11], "c": [3, 5, 7, 12]}
    assert checks == list(range(1, 13))
