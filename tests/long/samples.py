"""tests/long/samples.py: made-up proofs for the tests of the runner."""
import time
from collections.abc import Callable
from importlib.machinery import SourceFileLoader
from importlib.util import module_from_spec, spec_from_loader
from pathlib import Path
from types import ModuleType

from proofs import Proof

HERE = Path(__file__).parent


def script(name: str) -> ModuleType:
    """A program of this folder that has no .py in its name."""
    path = HERE / name
    loader = SourceFileLoader(f"script_{name}", str(path))
    spec = spec_from_loader(loader.name, loader)
    assert spec is not None
    module = module_from_spec(spec)
    loader.exec_module(module)
    return module


def proof_of(text: str, cores: int = 1, name: str = "sample", aim: int = 100,
             patience_to_start: float = 60, unit: str = "points", pace: float = 0.001) -> Proof:
    """A proof that runs this Python text; "amount", "seed" and "figures" are what it was told."""
    program = ("import argparse, json, os, pathlib, subprocess, sys, time\n"
               "parser = argparse.ArgumentParser()\n"
               "for word in ('amount', 'seed'): parser.add_argument(f'--{word}', type=int)\n"
               "parser.add_argument('--figures', type=pathlib.Path)\n"
               "told = parser.parse_args()\n"
               "def count(**counts): told.figures.write_text(json.dumps(counts))\n" + text)
    return Proof(name, ("/usr/bin/python3", "-c", program), unit, gate=5, step=10, aim=aim,
                 full=10 * aim, pace=pace, patience=0.01, cores=cores,
                 patience_to_start=patience_to_start)


def await_it(holds: Callable[[], bool], seconds: float = 20) -> None:
    until = time.monotonic() + seconds
    while not holds():
        assert time.monotonic() < until
        time.sleep(0.02)


def await_end(pid: int) -> None:
    """A zombie, which nobody may have waited for yet, has ended."""
    def ended() -> bool:
        try:
            state = Path(f"/proc/{pid}/stat").read_text().rsplit(")", 1)[1].split()[0]
        except (FileNotFoundError, ProcessLookupError):
            return True
        return state == "Z"
    await_it(ended)


# Tells the processes of its group, of which one is deaf, and does not come to an end.
SLEEPER = ("deaf_script = 'trap \"\" TERM INT; while :; do sleep 0.1; done'\n"
           "deaf = subprocess.Popen(['sh', '-c', deaf_script])\n"
           "count(points=told.amount, failures=0)\n"
           "print('so far', os.getpid(), deaf.pid, flush=True)\n"
           "time.sleep(600)\n")
