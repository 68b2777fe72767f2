"""tests/long/test_long_run.py: the long runner adds up what passed and nothing else, tree by tree."""
import fcntl
import json
import os
import signal
import subprocess
import sys
import time
from dataclasses import replace
from pathlib import Path
from types import ModuleType

import pytest

import proofs
from figures import Figures
from proofs import Outcome, Proof
from samples import await_end, await_it, proof_of, script


# Longer than is needed by what comes to an end of itself.
MINUTES = 10.0
GOOD_STARTS = 5


@pytest.fixture
def runner(tmp_path: Path, monkeypatch: pytest.MonkeyPatch) -> ModuleType:
    module = script("run")
    monkeypatch.setattr(module, "KEPT", tmp_path)
    monkeypatch.setattr(proofs, "build", lambda wanted: None)
    return module


@pytest.fixture
def figures(tmp_path: Path) -> Figures:
    return Figures(tmp_path)


def passed(**counts: int) -> Outcome:
    return Outcome(True, counts, "", 60)


def details(figures: Figures, proof: Proof) -> str:
    return "\n".join(figures.lines((proof,)))


def test_figures_add_up_over_runs_and_trees(tmp_path: Path) -> None:
    proof = proof_of("")
    Figures(tmp_path).add(proof, 3, 2, passed(points=3, max_kib=5), "a")
    Figures(tmp_path).add(proof, 4, 3, passed(points=4, max_kib=2), "b-dirty")
    Figures(tmp_path).add(proof, 1, 4, passed(points=1), "a")
    figures = Figures(tmp_path)
    assert figures.counts(proof) == {"points": 8, "max_kib": 5}
    assert figures.trees(proof) == {"a": 4, "b-dirty": 4}
    assert figures.minutes(proof) == 3
    assert figures.failed() == []
    shown = details(figures, proof)
    assert "3 starts that passed on a: 4, b-dirty (changes in no commit): 4" in shown


def test_what_every_start_repeats_counts_once(figures: Figures) -> None:
    proof = proof_of("")
    for seed, points, exhaustive, tree in ((2, 50, 40, "a"), (3, 60, 40, "a"), (4, 41, 41, "b")):
        figures.add(proof, 1, seed, passed(points=points, max_exhaustive_points=exhaustive,
                                           operations=7), tree)
    assert figures.counts(proof) == {"points": 71, "max_exhaustive_points": 41, "operations": 21}
    assert figures.done(proof) == 71
    assert figures.trees(proof) == {"a": 70, "b": 41}


def test_a_proof_that_is_all_repetition_is_done_once(figures: Figures) -> None:
    proof = proof_of("", aim=368)
    for seed in (2, 3, 4):
        figures.add(proof, 368, seed, passed(cells=368, points=368, max_exhaustive_points=368), "a")
        assert figures.done(proof) == 368


def test_of_what_shows_in_one_long_start_only_the_longest_counts(
        runner: ModuleType, figures: Figures) -> None:
    proof = replace(proof_of("", aim=10), at_once=True)
    for seed, points in ((2, 9), (3, 8)):
        figures.add(proof, 10, seed, Outcome(True, {"points": points}, "", 1), "a")
    assert figures.done(proof) == 9
    assert (proof.next_amount(9), proof.next_amount(10)) == (proof.step, proof.full) == (10, 100)
    assert runner.seconds_of_next(proof, figures) == 1
    figures.add(proof, 10, 4, Outcome(True, {"points": 10}, "", 1), "a")
    assert runner.seconds_of_next(proof, figures) == 10
    assert replace(proof, at_once=False).next_amount(10) == 10


def test_a_failure_is_kept_and_named_and_counts_nothing(figures: Figures, tmp_path: Path) -> None:
    proof = proof_of("")
    figures.add(proof, 5, 2, passed(points=5), "a")
    failed = Outcome(False, {"points": 900, "failures": 1}, "what it printed", 1)
    figures.add(proof, 5, 3, failed, "b")
    figures = Figures(tmp_path)
    [log] = figures.failed()
    assert Path(log).read_text() == "what it printed"
    assert figures.done(proof) == 5
    assert figures.counts(proof) == {"points": 5}
    assert figures.trees(proof) == {"a": 5}
    assert figures.next_seed(proof) == 4
    shown = details(figures, proof)
    assert "1 that failed" in shown and "900" not in shown and f"failed: {log}" in shown


def test_the_least_fuzzed_target_is_shown(figures: Figures) -> None:
    load, hashes, alone = proof_of("", name="fuzzing:load"), proof_of("", name="fuzzing:hashes"), \
        proof_of("", name="races")
    for seed, proof, points in ((2, load, 50), (2, hashes, 700), (3, load, 60), (2, alone, 1)):
        figures.add(proof, 1, seed, passed(points=points, executions_load=5), "a")
    shown = "\n".join(figures.lines((load, hashes, alone)))
    assert "fuzzing: 110 points of load, the least of 2" in shown
    assert shown.count("the least of") == 1
    assert "executions load" not in shown


def test_the_table_holds_what_ran_and_what_failed(figures: Figures) -> None:
    proof, other = proof_of(""), proof_of("", name="other")
    figures.add(proof, 3, 2, passed(points=3_000, max_exhaustive_points=2_000, looks=4), "a")
    figures.add(proof, 3, 3, passed(points=2_500, max_exhaustive_points=2_000, looks=4), "b-dirty")
    figures.add(proof, 3, 4, Outcome(False, {"points": 900}, "", 60), "b-dirty")
    assert [*figures.table((proof, other))][2:] == [
        "| `sample` | 3,500 points | 2,000 max exhaustive points, 8 looks | 2 | 1 | 2.0 "
        "| a, b-dirty |",
        "| `other` | 0 points | none | 0 | 0 | 0.0 | no tree |",
        "", "3.0 minutes of proofs in all, 1 failed starts."]


def test_figures_of_the_older_form_are_refused(tmp_path: Path) -> None:
    (tmp_path / "figures.json").write_text('{"races": {"starts": 1}}')
    with pytest.raises(SystemExit, match="--afresh"):
        Figures(tmp_path)


def test_the_proof_furthest_from_its_aim_is_next_and_each_start_has_its_own_seed(
        runner: ModuleType, figures: Figures, tmp_path: Path) -> None:
    def counts_as(name: str) -> str:
        return (f"with open('{tmp_path / 'starts'}', 'a') as out: print('{name}', told.seed, file=out)\n"
                "time.sleep(0.05); count(points=told.amount, failures=0)")
    near, far = (proof_of(counts_as(name), 2, name, aim) for name, aim in (("near", 10), ("far", 40)))
    while figures.done(far) < far.aim:
        runner.work([near, far], 0.1, figures)
    starts = (tmp_path / "starts").read_text().splitlines()
    assert sorted(starts[:5]) == ["far 2", "far 3", "far 4", "far 5", "near 2"]
    assert Figures(tmp_path).done(far) >= 40


def test_nothing_is_begun_that_would_not_end_in_time(
        runner: ModuleType, figures: Figures, capsys: pytest.CaptureFixture[str]) -> None:
    text = "time.sleep(0.05); count(points=told.amount, failures=0)"
    short, long = proof_of(text, name="short", aim=1000), proof_of(text, name="long", pace=0.5)
    started = time.monotonic()
    assert runner.work([short, long], 0.05, figures)
    assert time.monotonic() - started < 30
    assert figures.done(long) == 0 and figures.done(short) > 0
    assert "long is left out: one start takes about 0.1 minutes" in capsys.readouterr().out
    assert not runner.work([long], 0.05, figures)
    assert "no proof was started" in capsys.readouterr().err
    runner.work([long], 0.1, figures)
    assert figures.done(long) >= 10


@pytest.mark.parametrize(("longest_wait", "is_first"), [(1, True), (600, False)])
def test_no_core_idles_beside_a_long_start(
        runner: ModuleType, figures: Figures, tmp_path: Path, monkeypatch: pytest.MonkeyPatch,
        longest_wait: int, is_first: bool) -> None:
    monkeypatch.setattr(runner, "LONGEST_WAIT", longest_wait)

    def ends_as(name: str, seconds: float) -> str:
        return (f"time.sleep({seconds}); count(points=told.amount, failures=0)\n"
                f"with open('{tmp_path / 'ends'}', 'a') as out: print('{name}', file=out)\n")
    long = proof_of(ends_as("long", 3), name="long", pace=0.8)
    wide = proof_of(ends_as("wide", 0), 2, "wide")
    small = proof_of(ends_as("small", 0), name="small")
    runner.work([long, wide, small], 9 / 60, figures)
    ends = (tmp_path / "ends").read_text().splitlines()
    assert (ends[0] == "small") == is_first
    assert "wide" in ends


def test_how_long_a_start_takes_is_what_the_slowest_took(
        runner: ModuleType, figures: Figures) -> None:
    proof = proof_of("count(points=told.amount, failures=0)", pace=1000)
    assert figures.seconds_of(proof, 10) == 10_000
    figures.add(proof, 10, 2, Outcome(True, {"points": 10}, "", 1), "a")
    figures.add(proof, 10, 3, Outcome(True, {"points": 10}, "", 3), "a")
    figures.add(proof, 10, 4, Outcome(False, {"points": 10}, "", 99), "a")
    assert figures.seconds_of(proof, 20) == 6
    runner.work([proof], 2.9 / 60, figures)
    assert figures.done(proof) == 20
    runner.work([proof], 3.5 / 60, figures)
    assert figures.done(proof) >= 30


@pytest.mark.parametrize("text", [
    "count(points=told.amount, failures=1); sys.exit(1)",
    "sys.exit(125)",
])
def test_a_proof_that_fails_always_is_left_alone_and_the_others_go_on(
        runner: ModuleType, figures: Figures, tmp_path: Path, text: str,
        capsys: pytest.CaptureFixture[str]) -> None:
    bad = proof_of(text, 2, "bad", 1000)
    # Ends the work itself, however slow the machine is.
    good = proof_of(f"count(points=told.amount, failures=int(told.seed > {1 + GOOD_STARTS}))", 2,
                    "good", 1000)
    runner.work([bad], MINUTES, figures)
    assert len(figures.failed()) == runner.MOST_FAILURES
    assert figures.done(bad) == 0
    assert f"bad failed {runner.MOST_FAILURES} times and is left alone" in capsys.readouterr().out
    assert not runner.work([bad, good], MINUTES, figures)
    assert len(figures.failed()) == 3 * runner.MOST_FAILURES
    assert figures.done(good) == GOOD_STARTS * good.step


def test_a_tree_that_changed_since_it_was_built_is_told(
        runner: ModuleType, figures: Figures, monkeypatch: pytest.MonkeyPatch) -> None:
    states = iter(["a", "a", "a-dirty"])
    monkeypatch.setattr(runner, "state_of_tree", lambda: next(states, "a-dirty"))
    proof = proof_of("time.sleep(0.05); count(points=told.amount, failures=0)", aim=20)
    while figures.done(proof) < 20:
        runner.work([proof], 0.1, figures)
    trees = list(figures.trees(proof))
    assert trees[:2] == ["a", "a changed to a-dirty"]
    assert "a changed to a-dirty (changes in no commit): " in details(figures, proof)


def sample_run(folder: Path, *words: str, text: str = "") -> subprocess.Popen[str]:
    """tests/long/run as a process, with figures of its own and one made-up proof."""
    row = repr(proof_of(text))
    program = ("import sys\n"
               f"sys.path.insert(0, {str(Path(__file__).parent)!r})\n"
               "import pathlib, proofs\n"
               "from proofs import Proof\n"
               "from samples import script\n"
               f"proofs.PROOFS = ({row},)\n"
               "proofs.build = lambda wanted: None\n"
               "run = script('run')\n"
               f"run.KEPT = pathlib.Path({str(folder)!r})\n"
               "sys.exit(run.main())\n")
    return subprocess.Popen([sys.executable, "-B", "-c", program, *words], text=True,
                            stdout=subprocess.PIPE, stderr=subprocess.STDOUT)


@pytest.mark.parametrize(("text", "minutes", "status"), [
    ("time.sleep(0.3); count(points=told.amount, failures=0)", "0.02", 0),
    ("sys.exit(1)", "0.02", 1),
    ("count(points=told.amount, failures=0)", "0.00001", 1),
])
def test_the_exit_status_is_that_of_this_run_s_own_starts(
        tmp_path: Path, figures: Figures, text: str, minutes: str, status: int) -> None:
    figures.add(proof_of(""), 1, 2, Outcome(False, {}, "", 0.1), "a")
    with sample_run(tmp_path, "--minutes", minutes, text=text) as run:
        assert run.wait(60) == status
    with sample_run(tmp_path, "--show") as run:
        assert run.wait(60) == 0


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM, signal.SIGHUP])
def test_a_signal_to_the_runner_ends_its_proofs_which_then_do_not_count(
        tmp_path: Path, number: signal.Signals) -> None:
    pids = tmp_path / "pids"
    text = ("child = subprocess.Popen(['sleep', '600'])\n"
            f"new = pathlib.Path('{pids}.new')\n"
            "new.write_text(f'{os.getpid()} {child.pid}')\n"
            f"new.rename('{pids}')\n"
            "time.sleep(600)\n")
    with sample_run(tmp_path, "--minutes", "5", text=text) as run:
        await_it(pids.exists)
        run.send_signal(number)
        assert run.wait(60) == 128 + number
    for pid in pids.read_text().split():
        await_end(int(pid))
    assert not (tmp_path / "figures.json").exists()


def test_a_second_run_ends_at_once_and_says_why(tmp_path: Path) -> None:
    held = tmp_path / "held"
    text = f"pathlib.Path('{held}').touch(); time.sleep(600)"
    with sample_run(tmp_path, "--minutes", "5", text=text) as first:
        await_it(held.exists)
        for words in (("--minutes", "5"), ("--afresh",)):
            with sample_run(tmp_path, *words) as second:
                said = second.communicate(timeout=60)[0]
            assert second.returncode == 1
            assert f"another tests/long/run, process {first.pid}, works on the figures" in said
        with sample_run(tmp_path, "--show") as show:
            assert "0 failed starts" in show.communicate(timeout=60)[0]
        first.terminate()
    with (tmp_path / "lock").open() as lock:
        fcntl.flock(lock, fcntl.LOCK_EX | fcntl.LOCK_NB)


def test_afresh_forgets_all_but_the_lock(tmp_path: Path, figures: Figures) -> None:
    figures.add(proof_of(""), 1, 2, Outcome(False, {}, "", 1), "a")
    (tmp_path / "lock").touch()
    before = os.stat(tmp_path / "lock").st_ino
    with sample_run(tmp_path, "--afresh") as run:
        assert run.wait(60) == 0
    assert os.listdir(tmp_path) == ["lock"]
    assert os.stat(tmp_path / "lock").st_ino == before


def test_the_file_of_figures_holds_every_start(figures: Figures, tmp_path: Path) -> None:
    proof = proof_of("")
    figures.add(proof, 3, 2, passed(points=3), "a")
    figures.add(proof, 3, 3, Outcome(False, {"points": 3}, "", 1), "a")
    starts = json.loads((tmp_path / "figures.json").read_text())
    assert [(start["seed"], start["passed"]) for start in starts] == [(2, True), (3, False)]
