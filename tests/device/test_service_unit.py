"""tests/device/test_service_unit.py: the service under systemd: start, stop, restart, journal."""
import pytest
from calls import BusError, ask, owner_pid, wait_for_owner
from camera.machine import Camera
from camera.tour import METHODS, NAME, OBJECT, UNIT
from journal import records, started


def properties(camera: Camera, *names: str) -> dict[str, str]:
    shown = camera.run(["systemctl", "show", UNIT, "-p", ",".join(names)]).check().out
    return dict(line.split("=", 1) for line in shown.splitlines())


def test_started_at_boot_and_known_by_its_bus_name(camera: Camera) -> None:
    expected = {"Type": "dbus", "BusName": NAME, "ActiveState": "active", "SubState": "running",
                "UnitFileState": "enabled", "NRestarts": "0"}
    assert properties(camera, *expected) == expected
    assert owner_pid(camera) == int(properties(camera, "MainPID")["MainPID"])


def test_the_unit_file_is_clean(camera: Camera) -> None:
    path = f"/usr/lib/systemd/system/{UNIT}"
    result = camera.run(["systemd-analyze", "verify", "--man=no", path])
    assert (result.status, result.out, result.err) == (0, "", "")


def test_a_call_starts_it(camera: Camera) -> None:
    camera.run(["systemctl", "stop", UNIT]).check()
    assert properties(camera, "ActiveState") == {"ActiveState": "inactive"}
    assert owner_pid(camera) == 0
    assert ask(camera, "CheckUser", "'root'") == (True,)
    assert properties(camera, "ActiveState") == {"ActiveState": "active"}
    assert owner_pid(camera) == int(properties(camera, "MainPID")["MainPID"])


def test_the_interface(camera: Camera) -> None:
    shown = camera.run(["busctl", "introspect", NAME, OBJECT, NAME]).check().out
    members = [line.split()[:2] for line in shown.splitlines()[1:]]
    assert len([name for name, kind in members if kind == "method"]) == METHODS
    assert [name for name, kind in members if kind == "signal"] == [".UserDatabaseUpdated"]
    assert len(members) == METHODS + 1


def test_starting_is_told_in_the_journal(camera: Camera) -> None:
    assert records(camera) == started(NAME, OBJECT)


def test_a_refusal_is_one_warning(camera: Camera) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, "GetUserList", user="cam-web")
    warning = (4, f"warning: {caught.value.text}")
    assert records(camera) == [*started(NAME, OBJECT), warning]


def test_a_failed_request_is_one_warning_of_one_line(camera: Camera) -> None:
    with pytest.raises(BusError):
        # gdbus makes a line end of the escape; a record must not end with it, nor another begin.
        ask(camera, "GetUser", "'no\\n<0>such'")
    (_, _, _, (priority, text)) = records(camera)
    assert priority == 4
    assert text.startswith("warning: Could not retrieve user 'no")
    assert text.endswith("<0>such', user does not exist")
    assert "\n" not in text


def test_an_answered_request_is_no_record(camera: Camera) -> None:
    ask(camera, "GetUserList")
    ask(camera, "CheckUser", "'nosuch'")
    assert records(camera) == started(NAME, OBJECT)


def test_comes_back_after_a_crash(camera: Camera) -> None:
    killed = owner_pid(camera)
    camera.run(["kill", "-KILL", str(killed)]).check()
    assert wait_for_owner(camera) != killed
    assert ask(camera, "CheckUser", "'root'") == (True,)
    assert properties(camera, "ActiveState", "NRestarts") == {
        "ActiveState": "active", "NRestarts": "1"}


def test_stops_in_order_within_a_second(camera: Camera) -> None:
    pid = owner_pid(camera)
    camera.run(["systemctl", "stop", UNIT]).check()
    # systemd's own clock, since systemctl itself takes its time on a slow machine.
    times = properties(camera, "ActiveExitTimestampMonotonic", "ExecMainExitTimestampMonotonic")
    asked, ended = (int(times[name]) for name in sorted(times))
    assert 0 < ended - asked < 1_000_000
    assert camera.run(["test", "-e", f"/proc/{pid}"]).status == 1
    assert owner_pid(camera) == 0
    # Code 1: it exited, instead of being killed.
    assert properties(camera, "Result", "ExecMainCode", "ExecMainStatus") == {
        "Result": "success", "ExecMainCode": "1", "ExecMainStatus": "0"}
