"""tests/unit/benchmarks/test_report.py: the table of ./bench: nothing is left out of it."""
from pathlib import Path

import pytest

from benchmarks.__main__ import MEASUREMENTS
from benchmarks.figures import Bound, Verdict
from benchmarks.goals import GOALS
from benchmarks.programs import parsed_answer, unit_environment
from benchmarks.report import (BEGIN, END, Results, floor_rows_of, markdown, rows_of, status_of,
                               terminal_lines, with_table)


def results_that_meet_all() -> Results:
    return Results("./bench", "abc1234 and changes", "2026-01-02", "a machine",
                   {goal.number: [float(goal.goal)] for goal in GOALS})


def test_every_goal_is_a_row_with_a_number_of_its_own() -> None:
    numbers = [goal.number for goal in GOALS]
    assert len(set(numbers)) == len(numbers)
    assert {int(number.rstrip("abcd")) for number in numbers} == set(range(1, 26))


def test_every_goal_has_one_measurement() -> None:
    measured = [number for numbers in MEASUREMENTS.values() for number in numbers]
    assert sorted(measured) == sorted(goal.number for goal in GOALS)


def test_a_stretch_goal_lies_beyond_the_goal() -> None:
    for goal in GOALS:
        if goal.stretch is not None:
            assert (goal.stretch < goal.goal) == (goal.bound is Bound.AT_MOST), goal


def test_all_met_is_status_0() -> None:
    assert status_of(results_that_meet_all()) == 0


def test_only_what_has_no_unit_has_slack() -> None:
    assert {goal.number for goal in GOALS if goal.slack == 0} == {"18", "25a", "25b", "25c"}
    assert all((goal.slack == 0) == bool(goal.unit) for goal in GOALS)


@pytest.mark.parametrize("goal", GOALS, ids=lambda goal: goal.number)
def test_each_goal_that_is_missed_or_not_measured_fails_the_run(goal) -> None:
    missed = results_that_meet_all()
    missed.figures[goal.number] = [goal.goal * (1.2 if goal.bound is Bound.AT_MOST else 0.8)]
    assert status_of(missed) == 1
    absent = results_that_meet_all()
    del absent.figures[goal.number]
    absent.reasons[goal.number] = "its program is missing"
    assert status_of(absent) == 1
    row = next(row for row in rows_of(absent) if row.goal is goal)
    assert row.verdict is Verdict.NOT_MEASURED and row.reason == "its program is missing"


def test_an_empty_run_shows_every_goal_as_failed() -> None:
    empty = Results("./bench", "abc1234 and changes", "2026-01-02", "a machine")
    lines = terminal_lines(empty)
    assert sum(line.startswith("failed ") for line in lines) == len(GOALS)
    assert lines[-1] == f"0 goals met, {len(GOALS)} missed, in 0 s"
    assert status_of(empty) == 1


def test_the_table_tells_command_commit_date_and_spread() -> None:
    results = results_that_meet_all()
    results.figures["1"] = [1.2, 1.25, 1.5]
    table = markdown(results)
    assert "`./bench` of abc1234 and changes, 2026-01-02, a machine, 0 s." in table.splitlines()
    assert ("| 1 | GetUser, everything allowed | Ping of the same process | 1.25 (1.2 to 1.5) | <= 1.4 | "
            "<= 1.3 | stretch goal met |") in table
    assert sum(line.startswith("| ") and line[2].isdigit() for line in table.splitlines()) == len(GOALS)


def test_what_the_floor_reaches_is_told_and_decides_nothing() -> None:
    results = results_that_meet_all()
    results.floors = {"12b": [2.0, 2.5, 3.0], "10a": [11.0]}
    assert [(row.goal.number, row.measured.median, row.verdict) for row in floor_rows_of(results)] == [
        ("10a", 11.0, Verdict.MET), ("12b", 2.5, Verdict.MISSED)]
    assert ("| 12b | userdel, 25 users, ext4 | the floor | 2.5 (2 to 3) | >= 3.4 | missed |"
            in markdown(results).splitlines())
    assert "the floor in the place of the service, 12b: 2.5 (2 to 3), >= 3.4: missed" in terminal_lines(results)
    assert status_of(results) == 0


def test_the_floor_stands_where_the_service_does() -> None:
    results = results_that_meet_all()
    results.floors = {"15": [0.5], "12b": [4.0]}
    lines = markdown(results).splitlines()
    assert ("| 15 | the floor: Start to the name, 59,001 users | the accounts daemon | 0.5 | <= 0.45 | "
            "met within the slack |") in lines
    assert "| 12b | userdel, 25 users, ext4 | the floor | 4 | >= 3.4 | stretch goal met |" in lines


def test_the_table_replaces_the_one_between_the_markers() -> None:
    document = f"before\n{BEGIN}\nold\n{END}\nafter\n"
    written = with_table(document, "new")
    assert written == f"before\n{BEGIN}\nnew\n{END}\nafter\n"
    assert with_table(written, "new") == written
    with pytest.raises(ValueError):
        with_table("no markers", "new")


def test_results_survive_being_saved(tmp_path: Path) -> None:
    results = results_that_meet_all()
    results.processor = {"service": [1.0, 2.0, 3.0]}
    results.floors = {"12b": [2.0, 2.5]}
    results.save(tmp_path / "results.json")
    assert Results.load(tmp_path / "results.json") == results


def test_the_environment_is_the_unit_files(tmp_path: Path) -> None:
    unit = tmp_path / "a.service"
    unit.write_text('[Service]\n# Environment=NO=1\nEnvironment=ONE=a=b:c\n'
                    'Environment="TWO=x y" THREE=3\n')
    environment = unit_environment(unit)
    assert environment["ONE"] == "a=b:c"
    assert environment["TWO"] == "x y" and environment["THREE"] == "3"
    assert "NO" not in environment


def test_answers_are_compared_without_the_order_of_lists() -> None:
    assert parsed_answer("(true, 'g', ['b', 'a'], 7)\n") == (True, "g", ["a", "b"], 7)
    assert parsed_answer("(@as [],)") == ([],)
