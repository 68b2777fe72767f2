"""tests/device/test_units.py: the unit methods against the real systemd and the real polkit."""
import pytest
from calls import BusError, ask
from camera.bus_call import PRIVANE_ERROR
from camera.machine import Camera
from camera.tour import REFUSED

ACTION = "com.zintor.privane-system"
# Grants cam-web one unit and one template, both through the action that stands for all units.
RULES = """polkit.addRule(function (action, subject) {
    if (subject.user != "cam-web") return polkit.Result.NOT_HANDLED;
    if (action.id == "com.zintor.privane-system.startservice" &&
        ["lensd", "getty@"].indexOf(action.lookup("unit")) >= 0)
        return polkit.Result.YES;
    return polkit.Result.NOT_HANDLED;
});
"""


def state(camera: Camera, unit: str) -> str:
    return camera.run(["systemctl", "show", "--value", "-p", "ActiveState", unit]).check().out.strip()


def main_pid(camera: Camera, unit: str) -> int:
    return int(camera.run(["systemctl", "show", "--value", "-p", "MainPID", unit]).check().out)


def wait_for_state(camera: Camera, unit: str, wanted: str) -> None:
    """The methods answer when a job is queued, not when it is done."""
    script = (f"for try in {{1..100}}; do [ $(systemctl show --value -p ActiveState {unit}) = "
              f"{wanted} ] && exit; sleep 0.1; done; exit 1")
    camera.run(script).check()


def grant(camera: Camera) -> None:
    camera.put_file("/etc/polkit-1/rules.d/50-units.rules", RULES.encode())
    camera.run(["systemctl", "restart", "polkit"]).check()


def test_start_restart_reload_stop(camera: Camera) -> None:
    assert state(camera, "lensd") == "inactive"
    assert ask(camera, "StartService", "lensd") == ()
    wait_for_state(camera, "lensd", "active")
    first = main_pid(camera, "lensd")
    assert ask(camera, "ReloadService", "lensd") == ()
    camera.run("for try in {1..50}; do [ -s /run/lensd/reloads ] && exit; sleep 0.1; done; "
               "exit 1").check()
    assert (main_pid(camera, "lensd"), camera.read_file("/run/lensd/reloads")) \
        == (first, b"reloaded\n")
    assert ask(camera, "RestartService", "lensd") == ()
    camera.run(f"for try in {{1..50}}; do [ ! -e /proc/{first} ] && exit; sleep 0.1; done; "
               "exit 1").check()
    wait_for_state(camera, "lensd", "active")
    assert main_pid(camera, "lensd") not in (0, first)
    assert ask(camera, "StopService", "lensd") == ()
    wait_for_state(camera, "lensd", "inactive")


def test_units_with_methods_of_their_own(camera: Camera) -> None:
    for start, stop, unit in (("StartNtp", "StopNtp", "ntp"), ("StartLensd", "StopLensd", "lensd")):
        assert ask(camera, start) == ()
        wait_for_state(camera, unit, "active")
        assert ask(camera, stop) == ()
        wait_for_state(camera, unit, "inactive")
    assert ask(camera, "RestartNtp") == ()
    wait_for_state(camera, "ntp", "active")


def test_default_target(camera: Camera) -> None:
    assert camera.run(["systemctl", "get-default"]).check().out == "graphical.target\n"
    assert ask(camera, "SetDefaultTarget", "multi-user") == ()
    assert camera.run(["systemctl", "get-default"]).check().out == "multi-user.target\n"


@pytest.mark.parametrize("method, code, action, called", [
    ("StartService", 29, "startservice", "StartUnit"),
    ("StopService", 30, "stopservice", "StopUnit"),
    ("RestartService", 31, "restartservice", "RestartUnit"),
    ("ReloadService", 32, "reloadservice", "ReloadUnit"),
])
def test_a_unit_that_is_not_there(camera: Camera, method: str, code: int, action: str,
                                  called: str) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, method, "nosuch")
    assert caught.value.name == f"{PRIVANE_ERROR}{code}"
    assert caught.value.text.startswith(
        f"Action {action} on nosuch failed: {called} failed, "
        "GDBus.Error:org.freedesktop.systemd1.NoSuchUnit: Unit nosuch.service")


def test_a_target_that_is_not_there(camera: Camera) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, "SetDefaultTarget", "nosuch")
    assert caught.value.name == f"{PRIVANE_ERROR}33"
    assert caught.value.text.startswith(
        "Action setdefaulttarget on nosuch failed: SetDefaultTarget failed, GDBus.Error:")


def test_a_unit_of_its_own_that_is_not_there(camera: Camera) -> None:
    camera.run("rm /etc/systemd/system/lensd.service && systemctl daemon-reload").check()
    with pytest.raises(BusError) as caught:
        ask(camera, "StartLensd")
    assert caught.value.name == f"{PRIVANE_ERROR}26"
    assert caught.value.text.startswith(
        "Failed to start lensd service: StartUnit failed, "
        "GDBus.Error:org.freedesktop.systemd1.NoSuchUnit: Unit lensd.service")


def test_a_caller_without_rights_is_refused_for_a_unit_that_is_not_declared(camera: Camera) -> None:
    for method, action in (("StartService", "startservice"), ("StopService", "stopservice"),
                           ("RestartService", "restartservice"),
                           ("ReloadService", "reloadservice"),
                           ("SetDefaultTarget", "setdefaulttarget")):
        with pytest.raises(BusError) as caught:
            ask(camera, method, "lensd", user="cam-web")
        assert caught.value.text.startswith(REFUSED)
        assert f"{ACTION}.{action}.lensd" in caught.value.text
    assert state(camera, "lensd") == "inactive"


def test_a_rule_grants_one_unit_and_no_other(camera: Camera) -> None:
    grant(camera)
    assert ask(camera, "StartService", "lensd", user="cam-web") == ()
    wait_for_state(camera, "lensd", "active")
    for method, unit in (("StartService", "ntp"), ("StopService", "lensd"),
                         ("StartService", "lensd2"), ("StartService", "lensd@x")):
        with pytest.raises(BusError) as caught:
            ask(camera, method, unit, user="cam-web")
        assert caught.value.text.startswith(REFUSED), (method, unit)
    assert state(camera, "lensd") == "active"


def test_an_instance_is_decided_for_its_whole_template(camera: Camera) -> None:
    assert state(camera, "getty@tty1") == "inactive"
    with pytest.raises(BusError) as caught:
        ask(camera, "StartService", "getty@tty1", user="cam-web")
    assert f"{ACTION}.startservice.getty.any" in caught.value.text
    grant(camera)
    assert ask(camera, "StartService", "getty@tty1", user="cam-web") == ()
    wait_for_state(camera, "getty@tty1", "active")


def test_a_declared_action_of_a_unit_is_asked_instead_of_the_parent(camera: Camera) -> None:
    generated = camera.run(["privane-unit-actions", "getty@.service", "ntp.service"]).check().out
    camera.put_file("/usr/share/polkit-1/actions/camera-units.policy", generated.encode())
    grant(camera)
    # Declared now, and no rule speaks of it; the parent's rule counts for lensd only.
    with pytest.raises(BusError) as caught:
        ask(camera, "StartService", "getty@tty1", user="cam-web")
    assert caught.value.text.startswith(REFUSED)
    assert f"{ACTION}.startservice.getty.any" in caught.value.text
    assert ask(camera, "StartService", "lensd", user="cam-web") == ()
    assert ask(camera, "StartService", "getty@tty1") == ()
    wait_for_state(camera, "getty@tty1", "active")
