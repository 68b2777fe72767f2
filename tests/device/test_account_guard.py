"""tests/device/test_account_guard.py: the unit does not start the service where it would lose
accounts, unless the maker of the device wants that."""
from accounts import LOSS_MARKER, accept_loss
from calls import ask, owner_pid, wait_for_owner
from camera.machine import Camera
from camera.tour import UNIT
from drop_in import unit_properties

HUMAN = "human:x:70000:100::/home/human:/bin/sh"


def test_the_service_of_the_camera_would_lose_nothing(camera: Camera) -> None:
    assert camera.run(["privane-check", "--guard"]).status == 0


def test_a_device_that_would_lose_an_account(camera: Camera) -> None:
    camera.run(f"echo '{HUMAN}' >> /etc/passwd; systemctl restart {UNIT}")
    # Skipped, and neither failed nor tried again.
    assert unit_properties(camera, "ActiveState", "Result", "NRestarts") == {
        "ActiveState": "inactive", "Result": "exec-condition", "NRestarts": "0"}
    assert owner_pid(camera) == 0
    journal = camera.run(["journalctl", "-b", "-o", "cat", "-u", UNIT]).check().out
    assert "loss: no-shadow-line: 'human': a write drops the user" in journal
    assert f"The maker of a device who wants that makes the file {LOSS_MARKER}." in journal
    assert HUMAN in camera.run(["cat", "/etc/passwd"]).check().out

    accept_loss(camera)
    camera.run(["systemctl", "restart", UNIT]).check()
    wait_for_owner(camera)
    assert ask(camera, "CheckUser", "'human'") == (False,)


def test_an_addition_that_a_crash_cut_off(camera: Camera) -> None:
    """It was answered to nobody, and keeps the service from nothing."""
    camera.run("echo 'half:x:1500:100::/home:/bin/false' >>/etc/passwd && "
               "cp /etc/shadow /etc/shadow.tmp").check()
    camera.run(["systemctl", "restart", UNIT]).check()
    wait_for_owner(camera)
    assert ask(camera, "CheckUser", "'half'") == (False,)
    camera.run(["rm", "/etc/shadow.tmp"]).check()
    camera.run(f"systemctl restart {UNIT}")
    assert unit_properties(camera, "ActiveState", "Result") == {
        "ActiveState": "inactive", "Result": "exec-condition"}
