"""tests/long/test_runner.py: a proof's figures count, and cannot hide a failure; none runs on."""
import shlex
import subprocess
import threading
import time
from pathlib import Path

import pytest

import process_groups
import proofs
from lanes import Lanes
from process_groups import ProcessGroups
from proofs import Outcome, Proof
from samples import SLEEPER, await_end, await_it, proof_of


def test_a_proof_gets_its_amount_and_seed_and_reports() -> None:
    outcome = proofs.run(proof_of("count(points=told.amount, seeds=told.seed, failures=0)"), 7, 3)
    assert outcome.passed
    assert outcome.counts == {"points": 7, "seeds": 3, "failures": 0}


@pytest.mark.parametrize("text", [
    "count(points=7, failures=0); sys.exit(1)",
    "count(points=7, failures=1)",
    "count(points=7)",
    "count(points=0, failures=0)",
    "count(points=6, failures=0)",
    "count(failures=0)",
    "told.figures.write_text('[]')",
    "told.figures.write_text('{')",
    "",
])
def test_a_proof_that_failed_or_counted_too_little_has_not_passed(text: str) -> None:
    assert not proofs.run(proof_of(text), 7, 3).passed


@pytest.mark.parametrize(("counted", "is_enough"), [(2_700, False), (2_999, False), (3_000, True)])
def test_what_can_be_counted_out_is_whole(counted: int, is_enough: bool) -> None:
    proof = proof_of(f"count(points={counted}, failures=0)")
    assert proofs.run(proof, 3_000, 1).passed == is_enough


@pytest.mark.parametrize(("counted", "is_enough"), [(53, False), (54, True), (61, True)])
def test_seconds_may_miss_a_little(counted: int, is_enough: bool) -> None:
    proof = proof_of(f"count(seconds={counted}, failures=0)", unit="seconds")
    assert proofs.run(proof, 60, 1).passed == is_enough


@pytest.mark.parametrize(("counted", "known", "is_enough"), [
    (5, 5, True), (4, 5, False), (5, 9, False), (7, 9, True)])
def test_what_there_is_less_of_than_the_amount_has_to_be_done_whole(
        counted: int, known: int, is_enough: bool) -> None:
    proof = proof_of(f"count(points={counted}, max_known_points={known}, failures=0)")
    assert proofs.run(proof, 7, 3).passed == is_enough


def test_what_a_proof_printed_ends_with_what_repeats_it(tmp_path: Path) -> None:
    proof = proof_of("print('x' * 20_000)\n"
                     f"pathlib.Path('{tmp_path / 'seed'}').write_text(f'{{told.seed}}')")
    outcome = proofs.run(proof, 7, 3)
    (tmp_path / "seed").unlink()
    _, said, again = outcome.output[-8000:].rpartition("\nagain: ")
    assert said and "--figures" not in shlex.split(again)[3:]
    assert subprocess.run(shlex.split(again), stdout=subprocess.DEVNULL).returncode == 0
    assert (tmp_path / "seed").read_text() == "3"


def test_what_a_proof_printed_is_kept() -> None:
    outcome = proofs.run(proof_of("print('seen'); print('also', file=sys.stderr); sys.exit(3)"), 1, 1)
    assert "seen" in outcome.output and "also" in outcome.output
    assert "(exit status 3)" in outcome.output


def test_every_row_names_a_program_of_the_tree_or_of_its_build() -> None:
    for proof in proofs.PROOFS:
        program = proof.command[0]
        assert program.startswith("build") or (proofs.TREE / program).exists(), program
        assert bool(proof.step) == bool(proof.aim) and proof.aim <= proof.full, proof.name
        assert proof.gate > 0 or proof.aim > 0, proof.name


def test_the_gate_does_no_less_of_any_proof_than_was_promised() -> None:
    least = {"kill_points": 2_000, "daemon_kills": 200, "failing_calls": 5_000, "daemon_faults": 200,
             "power_cuts": 3_000, "fuzzing": 10, "bus_fuzzing": 46_000, "authorization_matrix": 368,
             "policy_matrix": 368, "races": 5_000, "races_policy_file": 500, "soak": 60,
             "soak_policy_file": 25, "flood": 10, "flood_limited": 10, "daemon_secrets": 400,
             "seeded_defects": 8}
    gate = {proof.name: proof.gate for proof in proofs.of_gate()}
    assert gate.keys() == least.keys()
    assert [name for name in gate if gate[name] < least[name]] == []


def test_every_row_is_in_the_gate_and_in_a_long_run_by_itself_or_by_its_family() -> None:
    families = {proof.family for proof in proofs.PROOFS}
    assert {proof.family for proof in proofs.of_gate()} == families
    assert {proof.family for proof in proofs.of_long_run()} == families
    assert len({proof.name for proof in proofs.PROOFS}) == len(proofs.PROOFS)


def test_a_family_stands_for_its_rows_and_a_row_for_itself() -> None:
    targets = [f"fuzzing:{target}" for target in proofs.TARGETS]
    assert len(targets) >= 12
    assert [proof.name for proof in proofs.of_long_run(["fuzzing"])] == targets
    assert [proof.name for proof in proofs.of_long_run(["fuzzing:load"])] == ["fuzzing:load"]
    [gate] = proofs.of_gate(["fuzzing"])
    assert gate.unit == "seconds" and "--of=seconds" in gate.command
    with pytest.raises(SystemExit, match="no such proof: fuzzing:load"):
        proofs.of_gate(["fuzzing:load"])
    with pytest.raises(SystemExit, match="no such proof: fuzz"):
        proofs.of_long_run(["fuzz"])


def test_a_long_run_soaks_in_whole_and_takes_small_steps_of_all_else() -> None:
    for proof in proofs.of_long_run():
        minutes = proof.step * proof.pace / 60
        assert minutes > 30 if proof.name == "soak" else minutes < 12, proof.name


def test_every_row_waits_long_enough_and_not_for_ever() -> None:
    for proof in proofs.PROOFS:
        assert 600 < proof.limit(proof.gate or proof.step) <= 8 * 3600, proof.name
        for amount in (proof.gate, proof.step):
            assert proof.limit(amount) > 2 * proof.pace * amount, proof.name
    assert proof_of("").limit(1000) == 70


def test_a_proof_that_takes_too_long_is_killed_with_its_group_and_has_failed(
        monkeypatch: pytest.MonkeyPatch) -> None:
    monkeypatch.setattr(process_groups, "LAST_SECONDS", 0.5)
    started = time.monotonic()
    outcome = proofs.run(proof_of(SLEEPER, patience_to_start=2), 7, 3)
    assert 2 < time.monotonic() - started < 30
    assert not outcome.passed
    assert outcome.counts["points"] == 7
    assert "(took more than 2 s)" in outcome.output
    [said] = [line for line in outcome.output.splitlines() if line.startswith("so far")]
    for pid in said.split()[2:]:
        await_end(int(pid))


def test_what_a_proof_leaves_running_ends_with_it() -> None:
    text = ("process = subprocess.Popen(['sleep', '600'])\n"
            "print('left', process.pid)\n"
            "count(points=7, failures=0)\n")
    outcome = proofs.run(proof_of(text), 7, 3)
    assert outcome.passed
    [pid] = [line.split()[1] for line in outcome.output.splitlines() if line.startswith("left ")]
    await_end(int(pid))


def test_lanes_never_take_more_cores_than_there_are() -> None:
    taken, most, ended = 0, 0, []
    lock = threading.Lock()
    run = proofs.run

    def counting_run(proof: Proof, amount: int, seed: int, groups: ProcessGroups) -> Outcome:
        nonlocal taken, most
        with lock:
            taken += proof.cores
            most = max(most, taken)
        outcome = run(proof, amount, seed, groups)
        with lock:
            taken -= proof.cores
        return outcome

    text = "time.sleep(0.05); count(points=1, failures=0)"
    rows = [proof_of(text, cores, f"{cores} {number}") for number in range(4) for cores in (1, 2)]
    proofs.run = counting_run
    try:
        with Lanes(lambda proof, outcome: ended.append(proof.name)) as lanes:
            for row in rows:
                lanes.start(lambda running, row=row: (row, 1, 1))
    finally:
        proofs.run = run
    assert sorted(ended) == sorted(row.name for row in rows)
    assert most == 2


def test_lanes_that_an_exception_leaves_end_what_runs_and_report_nothing(
        monkeypatch: pytest.MonkeyPatch, tmp_path: Path) -> None:
    monkeypatch.setattr(process_groups, "LAST_SECONDS", 0.5)
    pids = tmp_path / "pids"
    tells = f"pathlib.Path('{pids}').write_text(f'{{os.getpid()}} {{deaf.pid}}\\n')"
    sleeper = proof_of(SLEEPER.replace("time.sleep", tells + "; time.sleep"))
    reported = []
    with pytest.raises(KeyboardInterrupt):
        with Lanes(lambda proof, outcome: reported.append(proof)) as lanes:
            assert lanes.start(lambda running: (sleeper, 1, 1))
            await_it(lambda: pids.exists() and pids.read_text().endswith("\n"))
            raise KeyboardInterrupt
    assert reported == []
    for pid in pids.read_text().split():
        await_end(int(pid))


def test_lanes_start_nothing_when_nothing_is_chosen() -> None:
    with Lanes(lambda proof, outcome: None) as lanes:
        assert not lanes.start(lambda running: None)


def test_a_proof_that_cannot_start_has_failed_and_a_broken_report_is_told() -> None:
    outcomes = []
    missing = Proof("missing", ("/nonexistent/program",), "points", pace=1, patience=1)
    with Lanes(lambda proof, outcome: outcomes.append(outcome)) as lanes:
        lanes.start(lambda running: (missing, 1, 1))
    assert [outcome.passed for outcome in outcomes] == [False]

    def report(proof: Proof, outcome: Outcome) -> None:
        raise OSError("disk full")
    with pytest.raises(OSError, match="disk full"):
        with Lanes(report) as lanes:
            lanes.start(lambda running: (missing, 1, 1))
