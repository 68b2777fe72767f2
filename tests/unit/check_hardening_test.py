#!/usr/bin/python3 -B
# tests/unit/check_hardening_test.py: check_hardening.py asks each machine for what it has:
# check_hardening_test.py CLANG, which compiles for all of them.
import subprocess
import sys
import tempfile
from pathlib import Path

from check_hardening import AARCH64, X86, faults_of_features, machine_of

SOURCE = "int call(int (*function)(void)) { return function() + 1; }\n"

# The machine and the options of two files each, and what is missing in which of them.
CASES = (
    ("x86_64", "-fcf-protection=full", "-fcf-protection=full", []),
    ("x86_64", "-fcf-protection=full", "-fcf-protection=none", [(1, "IBT, SHSTK")]),
    ("x86_64", "-fcf-protection=branch", "-fcf-protection=full", [(0, "SHSTK")]),
    ("aarch64", "", "", []),
    ("aarch64", "-mbranch-protection=none", "", []),
    ("aarch64", "-mbranch-protection=standard", "-mbranch-protection=standard", []),
    ("aarch64", "-mbranch-protection=standard", "", [(1, "BTI, PAC")]),
    ("aarch64", "-mbranch-protection=standard", "-mbranch-protection=bti", [(1, "PAC")]),
    ("aarch64", "-mbranch-protection=pac-ret+leaf", "-mbranch-protection=bti+pac-ret",
     [(0, "BTI")]),
    ("riscv64", "", "", []),
)


def main():
    faults = 0
    with tempfile.TemporaryDirectory() as folder:
        source = Path(folder) / "sample.c"
        source.write_text(SOURCE)
        for machine, first, second, expected in CASES:
            commands = {}
            for number, option in enumerate((first, second)):
                path = Path(folder) / f"{number}.o"
                words = [sys.argv[1], f"--target={machine}-linux-gnu", *option.split(), "-c",
                         str(source), "-o", str(path)]
                subprocess.run(words, check=True)
                commands[path] = " ".join(words)
            told = machine_of(path)
            found = list(faults_of_features(told, commands))
            wanted = [f"{list(commands)[number]}: no {missing}" for number, missing in expected]
            is_named = {"x86_64": told == X86[0], "aarch64": told == AARCH64}.get(machine, True)
            if found != wanted or not is_named:
                print(f"{machine} ({told}), {first} and {second}: {found}, not {wanted}",
                      file=sys.stderr)
                faults += 1
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
