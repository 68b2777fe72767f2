"""benchmarks/report.py: shows a run as a table, and writes it into docs/performance.md.

    report.py RESULTS DOCUMENT

RESULTS is what a run has left; DOCUMENT gets it between its markers.
"""
import json
import sys
from dataclasses import asdict, dataclass, field
from pathlib import Path

from benchmarks.figures import Bound, Spread, Verdict, exit_status, judge, spread
from benchmarks.goals import GOALS, Goal

BEGIN, END = "<!-- begin: written by ./bench -->", "<!-- end: written by ./bench -->"


@dataclass
class Results:
    """A run: the figures of each goal by its number, a value a round, or why there are none."""

    command: str
    commit: str
    date: str
    machine: str
    figures: dict[str, list[float]] = field(default_factory=dict)
    reasons: dict[str, str] = field(default_factory=dict)
    processor: dict[str, list[float]] = field(default_factory=dict)
    # What the floor reaches in the place of the service, by the number of the goal.
    floors: dict[str, list[float]] = field(default_factory=dict)
    seconds: float = 0

    def save(self, file: Path) -> None:
        file.write_text(json.dumps(asdict(self)))

    @classmethod
    def load(cls, file: Path) -> "Results":
        return cls(**json.loads(file.read_text()))


@dataclass(frozen=True)
class Row:
    goal: Goal
    measured: Spread | None
    verdict: Verdict
    reason: str


def row_of(goal: Goal, values: list[float] | None, reason: str) -> Row:
    measured = spread(values) if values else None
    verdict = judge(measured.median if measured else None, goal.bound, goal.goal, goal.stretch, goal.slack)
    return Row(goal, measured, verdict, "" if measured else reason)


def rows_of(results: Results) -> list[Row]:
    """One for every goal, whatever was measured."""
    return [row_of(goal, results.figures.get(goal.number),
                   results.reasons.get(goal.number, "its measurement has not run")) for goal in GOALS]


def floor_rows_of(results: Results) -> list[Row]:
    """How the goal would be judged if the floor stood in the service's place; no verdict of the run."""
    return [row_of(goal, results.floors[goal.number], "") for goal in GOALS
            if goal.number in results.floors]


def floor_sides(goal: Goal) -> tuple[str, str]:
    """What is over what where the floor stands in the service's place: in a bound from above the
    service is what is measured, in one from below what is measured against."""
    if goal.bound is Bound.AT_MOST:
        return f"the floor: {goal.what}", goal.over
    return goal.what, "the floor"


def status_of(results: Results) -> int:
    return exit_status([row.verdict for row in rows_of(results)])


def number_text(value: float) -> str:
    return f"{value:.0f}" if abs(value) >= 100 or value == int(value) else f"{value:.3g}"


def measured_text(row: Row) -> str:
    if row.measured is None:
        return "none"
    unit = f" {row.goal.unit}" if row.goal.unit else ""
    if row.measured.rounds == 1:
        return f"{number_text(row.measured.median)}{unit}"
    return (f"{number_text(row.measured.median)}{unit} ({number_text(row.measured.low)} to "
            f"{number_text(row.measured.high)})")


def goal_text(goal: Goal, value: float | None) -> str:
    return "" if value is None else f"{goal.bound.value} {number_text(value)}"


def terminal_lines(results: Results) -> list[str]:
    lines = []
    for row in rows_of(results):
        goal = row.goal
        verdict = "ok" if row.verdict.passed else "failed"
        over = "" if goal.over == "nothing" else f" / {goal.over}"
        lines.append(f"{verdict:7} {goal.number:4} {measured_text(row):26} "
                     f"{goal_text(goal, goal.goal):8} {goal.what}{over}: {row.verdict.value}"
                     f"{': ' + row.reason if row.reason else ''}")
    for row in floor_rows_of(results):
        lines.append(f"the floor in the place of the service, {row.goal.number}: {measured_text(row)}, "
                     f"{goal_text(row.goal, row.goal.goal)}: {row.verdict.value}")
    for name, spent in results.processor.items():
        lines.append(f"processor time a GetUser, {name}: service {spent[0]:.0f} us, bus {spent[1]:.0f} us, "
                     f"polkitd {spent[2]:.0f} us")
    failed = sum(not row.verdict.passed for row in rows_of(results))
    lines.append(f"{len(GOALS) - failed} goals met, {failed} missed, in {results.seconds:.0f} s")
    return lines


def markdown(results: Results) -> str:
    lines = ["| # | what | over | measured (rounds from, to) | goal | stretch | verdict |",
             "|---|---|---|---|---|---|---|"]
    for row in rows_of(results):
        goal = row.goal
        verdict = f"{row.verdict.value}: {row.reason}" if row.reason else row.verdict.value
        cells = (goal.number, goal.what, "" if goal.over == "nothing" else goal.over, measured_text(row),
                 goal_text(goal, goal.goal), goal_text(goal, goal.stretch), verdict)
        lines.append("| " + " | ".join(cell.replace("|", "/").replace("\n", " ") for cell in cells) + " |")
    lines += ["", f"`{results.command}` of {results.commit}, {results.date}, {results.machine}, "
              f"{results.seconds:.0f} s."]
    lines += ["", "What the floor itself reaches against the same tool, in the same rounds (no goal):", "",
              "| # | what | over | measured (rounds from, to) | goal | verdict if it were the service |",
              "|---|---|---|---|---|---|"]
    lines += [f"| {row.goal.number} | {' | '.join(floor_sides(row.goal))} | {measured_text(row)} | "
              f"{goal_text(row.goal, row.goal.goal)} | {row.verdict.value} |"
              for row in floor_rows_of(results)]
    lines += ["", "Processor time of one GetUser, microseconds (of that machine; no goal):", "",
              "| candidate | daemon | bus | polkitd |", "|---|---|---|---|"]
    lines += [f"| {name} | {spent[0]:.0f} | {spent[1]:.0f} | {spent[2]:.0f} |"
              for name, spent in results.processor.items()]
    return "\n".join(lines)


def with_table(document: str, table: str) -> str:
    """The document with the table in the place of the last one."""
    before, begin, rest = document.partition(BEGIN)
    _, end, after = rest.partition(END)
    if not begin or not end:
        raise ValueError("the document has no markers")
    return f"{before}{BEGIN}\n{table}\n{END}{after}"


if __name__ == "__main__":
    document_path = Path(sys.argv[2])
    document_path.write_text(with_table(document_path.read_text(),
                                        markdown(Results.load(Path(sys.argv[1])))))
