"""tests/long/bus/conftest.py: what the proofs on the bus are told, and where they report.

Each module is a proof of its own; tests/long/on_bus starts one.
"""
import argparse
import json
import random
from collections import Counter
from pathlib import Path
from typing import Iterator

import pytest

pytest_plugins = ["harness.service_fixtures", "harness.stage_fixtures", "harness.device_fixtures"]

# What the matrices share tells of a failure what was compared, as a module of tests does.
pytest.register_assert_rewrite("authorization_table")

FIGURES = pytest.StashKey[Counter]()


def positive(text: str) -> int:
    number = int(text)
    if number <= 0:
        raise argparse.ArgumentTypeError("must be above 0")
    return number


def pytest_addoption(parser: pytest.Parser) -> None:
    group = parser.getgroup("proof")
    group.addoption("--amount", type=positive, default=100, help="how much, in the proof's own unit")
    group.addoption("--seed", type=int, default=1, help="where everything random starts from")
    group.addoption("--figures", type=Path, help="the file that gets the counts, as JSON")


def pytest_configure(config: pytest.Config) -> None:
    config.stash[FIGURES] = Counter()


@pytest.fixture(scope="session")
def amount(pytestconfig: pytest.Config) -> int:
    return pytestconfig.getoption("--amount")


@pytest.fixture
def chance(pytestconfig: pytest.Config, request: pytest.FixtureRequest) -> random.Random:
    """A source of its own for each test, the same for the same seed."""
    return random.Random(f"{pytestconfig.getoption('--seed')} {request.node.nodeid}")


@pytest.fixture(scope="session")
def figures(pytestconfig: pytest.Config) -> Counter:
    """The counts of this run: figures["calls"] += 1. What begins with "max_" is no sum."""
    return pytestconfig.stash[FIGURES]


@pytest.hookimpl(hookwrapper=True)
def pytest_runtest_makereport(item: pytest.Item) -> Iterator[None]:
    report = (yield).get_result()
    if report.failed:
        item.config.stash[FIGURES]["failures"] += 1


def pytest_sessionfinish(session: pytest.Session) -> None:
    figures = session.config.stash[FIGURES]
    figures["failures"] += 0
    print(f"\n{json.dumps(figures)}")
    if path := session.config.getoption("--figures"):
        path.write_text(json.dumps(figures) + "\n")
