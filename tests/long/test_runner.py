"""tests/long/test_runner.py: a proof's figures count, add up, and cannot hide a failure."""
import json
import threading
from importlib.machinery import SourceFileLoader
from importlib.util import module_from_spec, spec_from_loader
from pathlib import Path
from types import ModuleType

import pytest

import proofs
from lanes import Lanes
from proofs import Proof


def script(name: str) -> ModuleType:
    """A program of this folder that has no .py in its name."""
    path = Path(__file__).with_name(name)
    loader = SourceFileLoader(f"script_{name}", str(path))
    spec = spec_from_loader(loader.name, loader)
    assert spec is not None
    module = module_from_spec(spec)
    loader.exec_module(module)
    return module


def proof_of(text: str, cores: int = 1, name: str = "sample", aim: int = 100) -> Proof:
    """A proof that runs this Python text; "amount", "seed" and "figures" are what it was told."""
    program = ("import argparse, json, pathlib, sys, time\n"
               "parser = argparse.ArgumentParser()\n"
               "for word in ('amount', 'seed'): parser.add_argument(f'--{word}', type=int)\n"
               "parser.add_argument('--figures', type=pathlib.Path)\n"
               "told = parser.parse_args()\n"
               "def count(**counts): told.figures.write_text(json.dumps(counts))\n" + text)
    return Proof(name, ("/usr/bin/python3", "-c", program), "points", gate=5, step=10, aim=aim,
                 full=10 * aim, cores=cores)


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


def test_what_a_proof_printed_is_kept() -> None:
    outcome = proofs.run(proof_of("print('seen'); print('also', file=sys.stderr); sys.exit(3)"), 1, 1)
    assert "seen" in outcome.output and "also" in outcome.output
    assert "(exit status 3)" in outcome.output


def test_every_row_names_a_program_of_the_tree_or_of_its_build() -> None:
    for proof in proofs.PROOFS:
        program = proof.command[0]
        assert program.startswith("build") or (proofs.TREE / program).exists(), program
        assert 0 < proof.gate and 0 < proof.step and 0 < proof.aim <= proof.full, proof.name


def test_lanes_never_take_more_cores_than_there_are() -> None:
    taken, most, ended = 0, 0, []
    lock = threading.Lock()
    run = proofs.run

    def counting_run(proof: Proof, amount: int, seed: int) -> proofs.Outcome:
        nonlocal taken, most
        with lock:
            taken += proof.cores
            most = max(most, taken)
        outcome = run(proof, amount, seed)
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


@pytest.fixture
def runner(tmp_path: Path, monkeypatch: pytest.MonkeyPatch) -> ModuleType:
    module = script("run")
    monkeypatch.setattr(module, "KEPT", tmp_path)
    return module


def test_figures_add_up_over_runs(runner: ModuleType) -> None:
    proof = proof_of("")
    runner.Figures().add(proof, proofs.Outcome(True, {"points": 3, "max_kib": 5}, "", 1), "a")
    runner.Figures().add(proof, proofs.Outcome(True, {"points": 4, "max_kib": 2}, "", 2), "b")
    row = runner.Figures().row(proof)
    assert row["counts"] == {"points": 7, "max_kib": 5}
    assert (row["starts"], row["seconds"], row["trees"]) == (2, 3, ["a", "b"])
    assert runner.Figures().failed() == []


def test_a_failure_is_kept_and_named(runner: ModuleType) -> None:
    proof = proof_of("")
    runner.Figures().add(proof, proofs.Outcome(False, {}, "what it printed", 1), "a")
    [log] = runner.Figures().failed()
    assert Path(log).read_text() == "what it printed"


def test_the_proof_furthest_from_its_aim_is_next_and_each_start_has_its_own_seed(
        runner: ModuleType, monkeypatch: pytest.MonkeyPatch, tmp_path: Path) -> None:
    text = ("with open('%s', 'a') as out: print(told.seed, file=out)\n" % (tmp_path / "seeds")
            + "time.sleep(0.05); count(points=told.amount, failures=0)")
    near, far = proof_of(text, 2, "near", 10), proof_of(text, 2, "far", 40)
    monkeypatch.setattr(proofs, "build", lambda wanted: None)
    figures = runner.Figures()
    while figures.done(far) < far.aim:
        runner.work([near, far], 0.001, figures)
    assert figures.done(near) <= 20
    seeds = (tmp_path / "seeds").read_text().split()
    assert sorted(seeds[:5], key=int) == ["2", "2", "3", "4", "5"]
    assert json.loads((tmp_path / "figures.json").read_text())["far"]["counts"]["points"] >= 40


def test_a_proof_that_cannot_start_has_failed_and_a_broken_report_is_told() -> None:
    outcomes = []
    missing = Proof("missing", ("/nonexistent/program",), "points", 1, 1, 1, 1)
    with Lanes(lambda proof, outcome: outcomes.append(outcome)) as lanes:
        lanes.start(lambda running: (missing, 1, 1))
    assert [outcome.passed for outcome in outcomes] == [False]

    def report(proof: Proof, outcome: proofs.Outcome) -> None:
        raise OSError("disk full")
    with pytest.raises(OSError, match="disk full"):
        with Lanes(report) as lanes:
            lanes.start(lambda running: (missing, 1, 1))
