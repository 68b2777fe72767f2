"""tests/long/test_gate.py: the gate fails with any proof, and when all took longer than they may."""
from pathlib import Path
from types import ModuleType

import pytest

import proofs
from samples import proof_of, script

HOLDS = "count(points=told.amount, failures=0)"


@pytest.fixture
def gate(monkeypatch: pytest.MonkeyPatch) -> ModuleType:
    module = script("gate")
    monkeypatch.setattr(module, "end_by_signals", lambda: None)
    monkeypatch.setattr(proofs, "build", lambda wanted: None)
    return module


def run(gate: ModuleType, monkeypatch: pytest.MonkeyPatch, checks: Path,
        *rows: proofs.Proof) -> tuple[int, list[str]]:
    monkeypatch.setattr(proofs, "PROOFS", rows)
    status = gate.main(checks, [])
    return status, checks.read_text().splitlines()


def test_all_that_passed_in_time(gate: ModuleType, monkeypatch: pytest.MonkeyPatch,
                                 tmp_path: Path) -> None:
    assert gate.MOST_MINUTES == 15
    assert run(gate, monkeypatch, tmp_path / "checks", proof_of(HOLDS)) == (
        0, ["ok\tproof sample: 5 points, 0 failures", "ok\t1 proofs within 15 minutes"])


def test_one_that_failed(gate: ModuleType, monkeypatch: pytest.MonkeyPatch,
                         tmp_path: Path) -> None:
    status, lines = run(gate, monkeypatch, tmp_path / "checks", proof_of(HOLDS),
                        proof_of("count(points=4, failures=0)", name="short"))
    assert status == 1
    assert "failed\tproof short: 4 points, 0 failures" in lines


def test_too_long_in_all(gate: ModuleType, monkeypatch: pytest.MonkeyPatch,
                         tmp_path: Path) -> None:
    monkeypatch.setattr(gate, "MOST_MINUTES", 0.01)
    status, lines = run(gate, monkeypatch, tmp_path / "checks", proof_of(f"time.sleep(1); {HOLDS}"))
    assert status == 1
    assert lines[0] == "ok\tproof sample: 5 points, 0 failures"
    assert lines[1].startswith("failed\t1 proofs took 0.0 minutes of at most 0.01")


def test_what_is_built_takes_none_of_its_time(gate: ModuleType, monkeypatch: pytest.MonkeyPatch,
                                              tmp_path: Path) -> None:
    now = [0.0]
    monkeypatch.setattr(gate.time, "monotonic", lambda: now[0])

    def build(wanted: list[proofs.Proof]) -> None:
        now[0] += 3600
    monkeypatch.setattr(proofs, "build", build)
    monkeypatch.setattr(proofs, "run", lambda *_: proofs.Outcome(True, {}, "", 1))
    assert run(gate, monkeypatch, tmp_path / "checks", proof_of(HOLDS))[0] == 0
    assert now == [3600]
