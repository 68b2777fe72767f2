"""tests/bus/conftest.py: the fixtures of the bus ring, and what they ask of its tests."""
from typing import Iterator

import pytest

from harness.service import Service

pytest_plugins = ["harness.service_fixtures", "harness.told_errors", "harness.stage_fixtures",
                  "harness.device_fixtures"]

OWN_AUTHZ = ("real_authz", "polkit", "policy_file")


@pytest.fixture(autouse=True)
def own_authz_is_marked(request: pytest.FixtureRequest) -> Iterator[None]:
    """By the marks ./test bus finds what to run with each libauthz: what has no mark has the fake,
    or starts no service, and is the same with both."""
    before = Service.with_own_authz
    yield
    if Service.with_own_authz > before:
        assert any(request.node.get_closest_marker(mark) for mark in OWN_AUTHZ), (
            "a service had one of our own libauthz: mark the test real_authz")
