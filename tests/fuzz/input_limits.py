#!/usr/bin/python3
"""tests/fuzz/input_limits.py: how long the inputs of each fuzz target get.

As a program, a test: no file of the corpus is longer, since the engine would cut it, and what it is
there for might be gone.
"""
import sys
import tempfile
from collections.abc import Iterator
from pathlib import Path

CORPUS = Path(__file__).resolve().parent / "corpus"

# Bytes of an input; a long one costs the time of many short ones. The default holds several lines
# of every file at once; the others have a limit of ours, or of the C library's, to get past.
MAX_INPUT = 400
MAX_INPUTS = {
    "boot_block": 512,  # two copies
    "digest_list": 640,  # a name of 255 bytes, in an entry
    "group_lines": 1152,  # the C library's first buffer for a line
    "hashes": 576,  # a password of 512 bytes
    "log_records": 1088,  # above 4096 bytes once escaped
    "operations": 200,  # the files and six operations
    "parameters": 4608,  # more than the 4096 bytes of a full block
    "passwd_lines": 1152,
    "policy_file": 640,  # a name of 256 bytes, twice
    "replies": 560,  # seven parts
    "shadow_lines": 1152,
}


def limit_of(target: str) -> int:
    return MAX_INPUTS.get(target, MAX_INPUT)


def faults_of(corpus: Path) -> Iterator[str]:
    targets = sorted(folder for folder in corpus.iterdir() if folder.is_dir())
    for name in sorted(set(MAX_INPUTS) - {folder.name for folder in targets}):
        yield f"{name}: a limit, and no corpus"
    for folder in targets:
        inputs = sorted(folder.iterdir())
        if not inputs:
            yield f"{folder.name}: no input"
        for path in inputs:
            size = path.stat().st_size
            if size > limit_of(folder.name):
                yield (f"{folder.name}/{path.name}: {size} bytes of at most "
                       f"{limit_of(folder.name)}; shorten it, or raise the limit")


def faults_of_the_check() -> Iterator[str]:
    with tempfile.TemporaryDirectory() as folder:
        sample = Path(folder)
        for name in (*MAX_INPUTS, "of_the_default", "empty"):
            (sample / name).mkdir()
            if name != "empty":
                (sample / name / "fits").write_bytes(bytes(limit_of(name)))
        for name in ("hashes", "of_the_default"):
            (sample / name / "long").write_bytes(bytes(limit_of(name) + 1))
        refused = [fault.split(":")[0] for fault in faults_of(sample)]
        if refused != ["empty", "hashes/long", "of_the_default/long"]:
            yield f"of a sample the check refuses {refused}"


def main() -> int:
    faults = [*faults_of_the_check(), *faults_of(CORPUS)]
    for fault in faults:
        print(fault, file=sys.stderr)
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
