"""tests/long/seeded/seed.py: applies one defect after the other and starts the proof of each.

Started by tests/long/seeded/run, on the view of the tree that may be broken.
"""
import argparse
import dataclasses
import json
import re
import subprocess
import sys
from pathlib import Path

HERE = Path(__file__).resolve().parent
sys.path.insert(0, str(HERE.parent))

import proofs
from defects import DEFECTS, Defect, Start


def apply(defect: Defect, *options: str) -> None:
    subprocess.run(["git", "apply", *options, str(HERE / defect.patch)], cwd=proofs.TREE, check=True)


def run(start: Start, seed: int) -> proofs.Outcome:
    [proof] = proofs.of_gate([start.proof])
    proofs.build([proof])
    started = dataclasses.replace(proof, command=(*proof.command, *start.words))
    return proofs.run(started, start.amount, seed)


def passes_undamaged(start: Start, seed: int) -> bool:
    outcome = run(start, seed)
    if not outcome.passed:
        print(f"{start.proof} fails without any defect:\n{outcome.output[-4000:]}")
    return outcome.passed


def why_unnoticed(defect: Defect, outcome: proofs.Outcome) -> str:
    """Empty where the proof ran, and told of the very thing that is wrong."""
    if outcome.passed or outcome.counts.get("failures", 0) == 0:
        return "went unnoticed"
    if not re.search(defect.shown, outcome.output, re.MULTILINE):
        return f"made the proof fail for something else than {defect.shown!r}"
    return ""


def is_caught(defect: Defect, seed: int) -> bool:
    apply(defect)
    try:
        outcome = run(defect.noticed_by, seed)
    finally:
        apply(defect, "--reverse")
    why = why_unnoticed(defect, outcome)
    if why:
        print(f"{defect.patch} {why}:\n{outcome.output[-4000:]}")
    else:
        print(f"{defect.patch}: {defect.noticed_by.proof} noticed, "
              f"{outcome.counts['failures']:,} failures, {outcome.seconds:.0f} s", flush=True)
    return not why


def main() -> int:
    parser = argparse.ArgumentParser(usage=__doc__)
    parser.add_argument("--amount", type=int, required=True)
    parser.add_argument("--seed", type=int, required=True)
    parser.add_argument("--figures", type=Path)
    options = parser.parse_args()

    defects = DEFECTS[:options.amount]
    # Before any defect, so that what was built once serves them all.
    sound = {start: passes_undamaged(start, options.seed)
             for start in dict.fromkeys(defect.noticed_by for defect in defects)}
    verdicts = [sound[defect.noticed_by] and is_caught(defect, options.seed) for defect in defects]
    figures = json.dumps({"defects": len(verdicts), "max_exhaustive_defects": len(verdicts),
                          "failures": verdicts.count(False)})
    print(figures)
    if options.figures:
        options.figures.write_text(figures + "\n")
    return 0 if verdicts and all(verdicts) else 1


if __name__ == "__main__":
    sys.exit(main())
