"""tests/bus/test_secrets.py: clear texts stay out of the argument vectors of tools.

That no log and no error text carries one is checked at the end of every test that uses a stage.
"""
from pathlib import Path

from harness.accounts import AccountFiles
from harness.bus import Bus, error_of
from harness.fake_authz import FakeAuthz
from harness.passwords import MARK, NEW, OLD
from harness.sandbox import BINARY
from harness.service_fixtures import StartService
from harness.strace import Trace
from harness.world import Neighbour

PIDOF_RUN = '"/bin/pidof", ["/bin/pidof", "cfgstore"], '


def test_no_program_but_pidof_is_run_and_it_learns_no_secret(
        changing_accounts: AccountFiles, start: StartService, bus: Bus, authz: FakeAuthz,
        cfgstore: Neighbour, tmp_path: Path) -> None:
    trace = Trace(tmp_path / "trace", "execve")
    service = start(environment=authz.environment(), wrapper=trace.wrapper)
    service.wait_registered(bus)

    bus.call("AddUser", "sssss", "carol", NEW, "users", "", "")
    bus.call("AddSystemUser", "sssasss", "ftpd", NEW, "users", [], "", "")
    bus.call("ModifyUser", "sssasss", "root", NEW, "", [], "", "")
    bus.call("ModifyUser", "sssasss", "carol", OLD, "", [], "", "")
    bus.call("ChpasswdUser", "ss", "root", OLD)
    bus.call("AuthUserBasic", "ss", "carol", OLD)
    error_of(bus.call, "AuthUserBasic", "ss", "carol", NEW)
    bus.call("Digest", "as", ["create", f"dave:{MARK}"])
    bus.call("RemoveUser", "s", "carol")
    assert service.stop() == 0

    first, *others = [call.rest for call in trace.calls()]
    assert first.startswith(f'"{BINARY}"')
    # One for each change that cfgstore learns of.
    assert [rest[:len(PIDOF_RUN)] for rest in others] == [PIDOF_RUN] * 5
    assert not [rest for rest in others if MARK in rest]
