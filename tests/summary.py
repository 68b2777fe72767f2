"""tests/summary.py: counts what the rings reported and prints the line that closes ./test.

    summary.py RESULTS RING...

RESULTS holds JUnit files, one a run, and checks.tsv with one line a check. A ring that left no result
counts as failed: it did not run.
"""
import sys
import xml.etree.ElementTree as ElementTree
from pathlib import Path

# The files that each ring leaves, by pattern; what is counted together stands in one row.
RUNS = {
    "source": ["source.xml", "layers.xml"],
    "unit": ["unit.xml", "unit-sanitizers.xml", "unit-valgrind-*.xml"],
    "bus": ["bus.xml", "bus-policy-file.xml", "bus-kit.xml"],
    "packages": ["packages.xml"],
    "device": ["device.xml"],
    "proof": ["proof.xml"],
    "release": [],  # checks alone
}


def count_run(files):
    """Passed and failed test cases of JUnit files; a skipped one has not passed."""
    passed, failed = 0, []
    for case in (case for file in files for case in ElementTree.parse(file).getroot().iter("testcase")):
        if any(case.find(tag) is not None for tag in ("failure", "error", "skipped")):
            failed.append(f"{case.get('classname', '')}.{case.get('name')}")
        else:
            passed += 1
    return passed, failed


def count_checks(file):
    lines = [line.split("\t") for line in file.read_text().splitlines()] if file.exists() else []
    return (sum(verdict == "ok" for verdict, _ in lines),
            [name for verdict, name in lines if verdict != "ok"])


def main(results, rings):
    rows = {"checks": count_checks(results / "checks.tsv")}
    for pattern in (pattern for ring in rings for pattern in RUNS[ring]):
        run = pattern.removesuffix(".xml").removesuffix("-*")
        rows[run] = count_run(sorted(results.glob(pattern)))
        if rows[run] == (0, []):
            rows[run] = (0, [f"{run} ran no test"])

    for name, (passed, failed) in rows.items():
        print(f"{name:16} {passed:5} passed, {len(failed):3} failed")
        for case in failed:
            print(f"    failed: {case}")
    all_passed = sum(passed for passed, _ in rows.values())
    all_failed = sum(len(failed) for _, failed in rows.values())
    print(f"{all_passed} passed, {all_failed} failed")
    return 1 if all_failed or not all_passed else 0


if __name__ == "__main__":
    sys.exit(main(Path(sys.argv[1]), sys.argv[2:]))
