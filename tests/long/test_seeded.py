"""tests/long/test_seeded.py: the defects fit the product and their proofs, and only the right failure
counts."""
import ast
import dataclasses
import subprocess
import sys
from pathlib import Path

import pytest

import proofs
from samples import proof_of

SEEDED = Path(__file__).with_name("seeded")
sys.path.insert(0, str(SEEDED))

import seed
from defects import DEFECTS, Defect, Start

STARTS = list(dict.fromkeys(defect.noticed_by for defect in DEFECTS))

# Where a start names tests, the rest of its proof's units are those of other tests.
TABLES, TABLES_COLUMNS = ("authorization_matrix", "policy_matrix"), 8
# Whatever is selected of these goes on for the whole amount.
FLOODS = {"flood", "flood_limited"}


def columns(start: Start) -> int:
    """How many columns of its table its words choose, each a test with the table's fixture."""
    module = ast.parse((proofs.TREE / f"tests/long/bus/{start.proof}.py").read_text())
    names = [found.name for found in module.body if isinstance(found, ast.FunctionDef)
             and found.name.startswith("test_")
             and any(argument.arg == "table" for argument in found.args.args)]
    assert len(names) == TABLES_COLUMNS
    option, wanted = start.words
    assert option == "-k"
    return sum(wanted in name for name in names)


def reach(start: Start) -> int:
    """The units that a start does."""
    if start.proof not in TABLES:
        assert start.proof in FLOODS or "-k" not in start.words, \
            "of that proof nobody knows how much a test does"
        return start.amount
    [table] = proofs.of_gate([start.proof])
    return columns(start) * table.gate // TABLES_COLUMNS


@pytest.mark.parametrize("start", STARTS, ids=lambda start: start.proof)
def test_every_start_can_reach_its_amount(start: Start) -> None:
    [row] = proofs.of_gate([start.proof])
    made_up = dataclasses.replace(proof_of(f"count({row.unit}={reach(start)}, failures=0)"),
                                  unit=row.unit)
    assert proofs.run(made_up, start.amount, 1).passed


def program(proof: proofs.Proof) -> str:
    """What a row starts; of the proofs on the bus, the module. Two rows may start the same."""
    modules = [word for word in proof.command
               if (proofs.TREE / f"tests/long/bus/{word}.py").is_file()]
    return modules[0] if modules else proof.command[0]


def test_every_other_program_has_a_defect_to_notice() -> None:
    programs = {proof.name: program(proof) for proof in proofs.PROOFS}
    noticing = {programs[start.proof] for start in STARTS}
    assert noticing == set(programs.values()) - {programs["seeded_defects"]}


def test_all_patches_are_used_and_fit_the_product() -> None:
    patches = list(SEEDED.glob("*.patch"))
    assert {defect.patch for defect in DEFECTS} == {patch.name for patch in patches}
    for patch in patches:
        subprocess.run(["git", "apply", "--check", str(patch)], cwd=proofs.TREE, check=True)


def test_the_rows_amounts_are_those_of_the_list() -> None:
    [row] = proofs.of_gate(["seeded_defects"])
    assert row.gate <= len(DEFECTS) == row.step == row.aim == row.full


def caught(monkeypatch: pytest.MonkeyPatch, text: str, shown: str) -> bool:
    """Whether a proof that runs this Python text notices."""
    monkeypatch.setattr(proofs, "of_gate", lambda names: [proof_of(text)])
    monkeypatch.setattr(proofs, "build", lambda wanted: None)
    applied: list[tuple[str, ...]] = []
    monkeypatch.setattr(seed, "apply", lambda defect, *options: applied.append(options))
    verdict = seed.is_caught(Defect("made-up.patch", Start("sample", 7), shown), 1)
    assert applied == [(), ("--reverse",)]
    return verdict


@pytest.mark.parametrize("text, is_caught", [
    ("print('root is gone'); count(points=7, failures=1); sys.exit(1)", True),
    ("print('no disk'); count(points=7, failures=1); sys.exit(1)", False),
    ("print('root is gone'); sys.exit(1)", False),
    ("print('root is gone'); count(points=7, failures=0)", False),
])
def test_only_the_failure_that_was_to_come_is_a_catch(monkeypatch: pytest.MonkeyPatch, text: str,
                                                      is_caught: bool) -> None:
    assert caught(monkeypatch, text, r"root is \w+$") == is_caught


@pytest.mark.parametrize("defect", DEFECTS, ids=lambda defect: defect.patch)
def test_what_a_failure_has_to_show_is_said(defect: Defect) -> None:
    assert defect.shown and not seed.re.search(defect.shown, "")
