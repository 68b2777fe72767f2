"""tests/device/test_watchdog.py: a service that hangs, and a polkit that hangs, under systemd."""
import time

import pytest
from calls import BusError, ask, owner_pid, wait_for_owner
from camera.machine import Camera
from camera.tour import NAME, REFUSED, UNIT, call
from camera.transcript import sync_journal
from drop_in import install_drop_in, unit_properties

DEADLINE = 25
# The camera is a slow machine.
DELAY = 15


@pytest.fixture
def watched(camera: Camera) -> Camera:
    """A camera whose service may be silent for two seconds."""
    install_drop_in(camera, "watchdog.conf", "[Service]\nWatchdogSec=2\n")
    return camera


def test_the_unit_is_watched(camera: Camera) -> None:
    expected = {"WatchdogUSec": "3min", "NotifyAccess": "main", "WatchdogSignal": "9",
                "LimitCORE": "0", "LimitCORESoft": "0"}
    assert unit_properties(camera, *expected) == expected


def test_a_service_that_works_is_left_alone(watched: Camera) -> None:
    pid = owner_pid(watched)
    time.sleep(6)
    assert owner_pid(watched) == pid
    assert unit_properties(watched, "NRestarts", "ActiveState") == {
        "NRestarts": "0", "ActiveState": "active"}


def test_a_service_that_hangs_is_killed_and_comes_back(watched: Camera) -> None:
    stopped = owner_pid(watched)
    watched.run(["kill", "-STOP", str(stopped)]).check()
    end = time.monotonic() + 2 + DELAY
    while owner_pid(watched) == stopped and time.monotonic() < end:
        time.sleep(0.2)
    assert wait_for_owner(watched) != stopped
    assert ask(watched, "CheckUser", "'root'") == (True,)
    assert watched.run(["test", "-e", f"/proc/{stopped}"]).status == 1
    assert unit_properties(watched, "NRestarts") == {"NRestarts": "1"}
    sync_journal(watched)
    told = watched.run(["journalctl", "-u", UNIT, "-o", "cat"]).check().out
    assert "Watchdog timeout (limit 2s)!" in told
    assert "code=killed, status=9/KILL" in told


def test_a_hanging_tool_goes_on_when_the_service_is_started_anew(watched: Camera) -> None:
    killed = owner_pid(watched)
    watched.put_file("/usr/sbin/sysflash", b"#!/bin/sh\necho $$ >/etc/sysflash.pid\nsleep 1000\n",
                     0o755)
    with pytest.raises(BusError) as caught:
        ask(watched, "Reboot")
    assert caught.value.name == "org.freedesktop.DBus.Error.NoReply"
    assert wait_for_owner(watched) != killed
    assert ask(watched, "CheckUser", "'root'") == (True,)
    assert watched.run("kill -0 $(cat /etc/sysflash.pid)").status == 0


def test_a_polkit_that_hangs_costs_a_call_its_deadline(camera: Camera) -> None:
    pid = owner_pid(camera)
    assert ask(camera, "CheckUser", "'root'") == (True,)
    camera.run("kill -STOP $(systemctl show --value -p MainPID polkit.service)").check()
    command = [*call("CheckUser", "root").split(), "--timeout", "120"]
    begin = time.monotonic()
    refused = camera.run(command, timeout=180)
    taken = time.monotonic() - begin
    camera.run("kill -CONT $(systemctl show --value -p MainPID polkit.service)").check()
    assert refused.status == 1
    assert f"_authz.Code4: {REFUSED}cannot check action " in refused.err
    assert "checkuser: no answer in time" in refused.err
    assert DEADLINE - 2 < taken < DEADLINE + DELAY
    assert ask(camera, "CheckUser", "'root'") == (True,)
    assert owner_pid(camera) == pid
    assert unit_properties(camera, "NRestarts") == {"NRestarts": "0"}


def test_a_caller_of_its_own_patience_sees_a_timeout(camera: Camera) -> None:
    """Most callers wait for 25 s, as long as the service does: who is first then is chance."""
    camera.run("kill -STOP $(systemctl show --value -p MainPID polkit.service)").check()
    command = [*call("CheckUser", "root").split(), "--timeout", str(DEADLINE - 10)]
    gave_up = camera.run(command, timeout=180)
    camera.run("kill -CONT $(systemctl show --value -p MainPID polkit.service)").check()
    assert gave_up.status == 1
    assert NAME not in gave_up.err
    assert gave_up.err == "Error: Timeout was reached\n"
    assert ask(camera, "CheckUser", "'root'") == (True,)
