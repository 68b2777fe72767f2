"""tests/bus/test_resources.py: what the service holds is released when it ends."""
import signal

import pytest

from harness.bus import Bus, BusError
from harness.fake_authz import FakeAuthz
from harness.service_fixtures import StartService

# The status that tells of a finding, since the service itself would end with 0 or 1.
FOUND = 99
VALGRIND = ["valgrind", "--quiet", f"--error-exitcode={FOUND}", "--leak-check=full",
            "--errors-for-leak-kinds=definite", "--show-leak-kinds=definite"]
TOOL_ENVIRONMENT = {"G_SLICE": "always-malloc"}


@pytest.mark.parametrize("number", [signal.SIGHUP, signal.SIGINT, signal.SIGTERM],
                         ids=lambda number: number.name)
def test_nothing_is_lost_by_a_service_that_served(number: signal.Signals, start: StartService,
                                                  authz: FakeAuthz, bus: Bus) -> None:
    service = start(environment={**authz.environment(), **TOOL_ENVIRONMENT}, wrapper=VALGRIND)
    service.wait_registered(bus)
    assert bus.call("CheckUser", "s", "root") == (True,)
    assert bus.call("GetGroupListFull")[0] == bus.call("GetGroupList")[0]
    assert "root" in bus.call("GetUserList")[0]
    with pytest.raises(BusError):
        bus.call("GetUser", "s", "nosuch")

    assert service.stop(number) == 0, service.output()
    assert authz.calls()[-1] == "release"
