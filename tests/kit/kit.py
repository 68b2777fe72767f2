"""tests/kit/kit.py: tools/sandbox as a user starts it."""
import os
import subprocess
from pathlib import Path
from typing import Mapping

TREE = Path(__file__).resolve().parents[2]
BUILD = TREE / "build"
SANDBOX = TREE / "tools" / "sandbox"
EXAMPLES = TREE / "data" / "examples"
OWN_TESTS = TREE / "docs" / "examples" / "testkit" / "my-tests"

SECONDS = 120
NO_SANDBOX = 125

CALL = ("gdbus call --system --dest com.zintor.PrivaneSystem --object-path /com/zintor/PrivaneSystem "
        "--method com.zintor.PrivaneSystem.")


def sandbox(*words: str | Path, folder: Path | None = None, stdin: str = "",
            environment: Mapping[str, str] | None = None) -> "subprocess.CompletedProcess[str]":
    return subprocess.run([SANDBOX, *words], cwd=folder, text=True, input=stdin,
                          env={**os.environ, **(environment or {})}, capture_output=True,
                          timeout=SECONDS, check=False)


def output_of(*words: str | Path, folder: Path | None = None) -> str:
    ended = sandbox(*words, folder=folder)
    assert (ended.returncode, ended.stderr) == (0, ""), ended
    return ended.stdout


def as_user(name: str) -> str:
    return f"setpriv --reuid={name} --regid={name} --init-groups --"
