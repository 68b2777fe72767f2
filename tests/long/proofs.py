"""tests/long/proofs.py: the proofs, how each is started, and how much of each is wanted.

A proof is a command that takes --amount N, --seed S and --figures FILE. It does about N of its unit,
draws everything random from the seed, and writes its counts to FILE as a JSON object, where names that
begin with "max_" are maxima and all others are sums. Of its unit, "max_exhaustive_UNIT" are those that
every start does again, whatever its seed, and "max_known_UNIT" all that there are to do. Exit status 0
tells that nothing failed.
"""
import json
import shlex
import sys
import tempfile
import time
from collections.abc import Sequence
from dataclasses import dataclass
from pathlib import Path

from process_groups import ProcessGroups

TREE = Path(__file__).resolve().parents[2]

Counts = dict[str, int | float]

SECONDS = "seconds"

# Of the seconds that a proof is told, which it may miss a little; all else can be counted out.
LEAST_SHARE = 0.9

# Before the unit: the most of it that a start can do.
KNOWN = "max_known_"

# Between the name of a family of rows and what tells them apart.
OF = ":"


@dataclass(frozen=True)
class Proof:
    """A row. unit is the count by which it is measured. gate is the amount of ./test proof, step that
    of one start in a long run, aim what one night should reach, and full what many should; a row
    without gate or without aim has no part in the one or in the other. pace is how many seconds a
    unit takes, as long as no start has shown it, and patience how many it may: several times what it
    does on two busy cores."""

    name: str
    command: tuple[str, ...]
    unit: str
    pace: float
    patience: float
    gate: int = 0
    step: int = 0
    aim: int = 0
    full: int = 0
    build: str = "build"
    # A proof that keeps both cores busy, or measures time, has the machine to itself.
    cores: int = 1
    # Shows what it is for in one long start only: the longest counts, and once the aim has been
    # reached a start takes the full amount.
    at_once: bool = False
    # Seconds beside those of its units: to make the camera, to record, to start.
    patience_to_start: float = 600

    def limit(self, amount: int) -> float:
        """The seconds after which a start of so many units is given up."""
        return self.patience_to_start + self.patience * amount

    def least(self, amount: int, counts: Counts) -> float:
        """What a start that was told this amount has to count."""
        if self.unit == SECONDS:
            return LEAST_SHARE * amount
        return min(amount, counts.get(KNOWN + self.unit, amount))

    def next_amount(self, done: float) -> int:
        """Of a start in a long run, after so many units."""
        return self.full if self.at_once and done >= self.aim else self.step

    @property
    def family(self) -> str:
        return self.name.split(OF)[0]


@dataclass(frozen=True)
class Outcome:
    passed: bool
    counts: Counts
    output: str
    seconds: float


def on_bus(name: str, build: str = "build", *options: str) -> tuple[str, ...]:
    return ("tests/long/on_bus", f"--build={build}", *options, name)


def fuzzing(target: str) -> Proof:
    """In a long run each target counts for itself, and those that are behind are fuzzed most."""
    step, pace = (100_000, 0.0015) if target in SLOW_TARGETS else (500_000, 0.0003)
    return Proof(f"fuzzing{OF}{target}", ("tests/fuzz/run", "--of=executions", f"--target={target}"),
                 "executions", pace=pace, step=step, aim=10_000_000, full=100_000_000,
                 patience=0.02, build="build-fuzz")


TARGETS = sorted(folder.name for folder in (TREE / "tests/fuzz/corpus").iterdir() if folder.is_dir())

# They execute less than a thousand inputs a second.
SLOW_TARGETS = ("operations", "replies")

PROOFS: tuple[Proof, ...] = (
    Proof("kill_points", ("build/tests/long/faults/kill_points",), "points",
          gate=13_000, step=50_000, aim=200_000, full=2_000_000, pace=0.003, patience=0.1),
    Proof("failing_calls", ("build/tests/long/faults/failing_calls",), "faults",
          gate=21_000, step=50_000, aim=200_000, full=2_000_000, pace=0.003, patience=0.1),
    # A step holds every boundary, and is all there is to do; what is random goes on in a row of its
    # own, which does not repeat them.
    Proof("daemon_kills", on_bus("daemon_kills"), "points",
          gate=300, step=2_800, aim=2_800, full=2_800, pace=0.14, patience=2),
    Proof(f"daemon_kills{OF}random", (*on_bus("daemon_kills"), "-ktest_kill_at_random"),
          "random_kills", step=1_000, aim=10_000, full=25_000, pace=0.14, patience=2),
    # A step asks for more than there are, so that it does them all.
    Proof("daemon_faults", on_bus("daemon_faults"), "faults",
          gate=200, step=2_800, aim=2_700, full=2_700, pace=0.25, patience=2),
    Proof("power_cuts", ("tests/long/power/power_cuts",), "states",
          gate=3_000, step=6_000, aim=50_000, full=250_000, pace=0.04, patience=0.1, cores=2),
    Proof("fuzzing", ("tests/fuzz/run", "--of=seconds"), SECONDS,
          gate=10, pace=9, patience=40, build="build-fuzz", cores=2),
    *map(fuzzing, TARGETS),
    Proof("bus_fuzzing", on_bus("bus_fuzzing", "build-sanitize"), "calls",
          gate=46_000, step=46_000, aim=460_000, full=1_000_000, pace=0.002, patience=0.05,
          build="build-sanitize"),
    Proof("authorization_matrix", on_bus("authorization_matrix"), "cells",
          gate=368, step=368, aim=368, full=368, pace=0.15, patience=5),
    Proof("policy_matrix", on_bus("policy_matrix", "build", "--authz=policy-file"), "cells",
          gate=368, step=368, aim=368, full=368, pace=0.15, patience=5),
    Proof("races", on_bus("races"), "trials",
          gate=5_000, step=5_000, aim=25_000, full=100_000, pace=0.02, patience=0.2),
    Proof("races_policy_file", on_bus("races", "build", "--authz=policy-file"), "trials",
          gate=500, step=2_500, aim=5_000, full=20_000, pace=0.025, patience=0.3),
    # The full amount takes 8 hours and 20 million calls, at the 530 a second that were measured.
    Proof("soak", on_bus("soak"), SECONDS,
          gate=60, step=1_800, aim=1_800, full=38_000, pace=1.05, patience=3, at_once=True),
    Proof("soak_policy_file", on_bus("soak", "build", "--authz=policy-file"), SECONDS,
          gate=25, step=600, aim=600, full=9_500, pace=1.1, patience=3, at_once=True),
    Proof("flood", on_bus("flood"), SECONDS,
          gate=10, step=20, aim=20, full=600, pace=16, patience=60, cores=2, at_once=True),
    Proof("flood_limited", on_bus("flood_limited", "build",
                                  "--bus=data/examples/privane-bus-limits.conf"), SECONDS,
          gate=10, step=20, aim=20, full=600, pace=8, patience=60, cores=2, at_once=True),
    Proof("daemon_secrets", on_bus("daemon_secrets"), "calls",
          gate=400, step=2_000, aim=2_000, full=20_000, pace=0.03, patience=3),
    Proof("seeded_defects", ("tests/long/seeded/run",), "defects",
          gate=8, step=22, aim=22, full=22, pace=28, patience=600, cores=2),
)


def of_gate(names: Sequence[str] = ()) -> list[Proof]:
    return _named(names, [proof for proof in PROOFS if proof.gate])


def of_long_run(names: Sequence[str] = ()) -> list[Proof]:
    return _named(names, [proof for proof in PROOFS if proof.aim])


def _named(names: Sequence[str], rows: list[Proof]) -> list[Proof]:
    """All of them without a name; a family's name stands for its rows. Ends the program at an
    unknown one."""
    known = {name for proof in rows for name in (proof.name, proof.family)}
    if unknown := set(names) - known:
        sys.exit(f"no such proof: {', '.join(sorted(unknown))}")
    return [proof for proof in rows if {proof.name, proof.family} & set(names) or not names]


def run(proof: Proof, amount: int, seed: int, groups: ProcessGroups | None = None) -> Outcome:
    """One start of a proof. Counts that are missing, or that count too little, make it fail, and so
    does taking too long. Raises Stopped when the groups are stopped meanwhile."""
    with tempfile.TemporaryDirectory() as scratch:
        figures, printed = Path(scratch) / "figures.json", Path(scratch) / "printed"
        started = time.monotonic()
        again = [*proof.command, "--amount", str(amount), "--seed", str(seed)]
        command = [*again, "--figures", str(figures)]
        limit = proof.limit(amount)
        # Not a pipe: who left the group could hold its other end for ever.
        with printed.open("wb") as output:
            status = (groups or ProcessGroups()).run(command, TREE, output, limit)
        seconds = time.monotonic() - started
        end = f"took more than {limit:,.0f} s" if status is None else f"exit status {status}"
        said = printed.read_text(errors="backslashreplace")
        counts = read_counts(figures)
    passed = (status == 0 and counts.get("failures", 1) == 0
              and counts.get(proof.unit, 0) >= proof.least(amount, counts))
    return Outcome(passed, counts, f"{said}({end})\nagain: {shlex.join(again)}\n", seconds)


def read_counts(figures: Path) -> Counts:
    try:
        counts = json.loads(figures.read_text())
    except (OSError, ValueError):
        return {}
    return counts if isinstance(counts, dict) else {}


def described(counts: Counts) -> str:
    return ", ".join(f"{value:,} {name}" for name, value in counts.items()).replace("_", " ")


def build(proofs: list[Proof]) -> None:
    """Brings the build directories of these proofs up to date; ends the program where it cannot."""
    for name in sorted({proof.build for proof in proofs} | {"build"}):
        with tempfile.TemporaryFile() as output:
            if ProcessGroups().run(["tools/build", name], TREE, output) != 0:
                output.seek(0)
                print(output.read().decode(errors="replace")[-4000:], file=sys.stderr)
                sys.exit(f"{name} does not build")
