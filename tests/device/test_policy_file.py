"""tests/device/test_policy_file.py: the libauthz that a file answers, on a camera without polkit."""
from pathlib import Path

import pytest
from calls import BusError, ask, wait_for_owner
from camera.image_layer import package_file
from camera.machine import Camera
from camera.tour import REFUSED, UNIT
from camera.warm_start import BOOTED
from dpkg import put_packages, run_beside_packages

EXCHANGED = "exchanged"
POLICY = "/etc/privane/authz.conf"
ROOT_ROLE = "[role root]\nusers=root\nactions=com.zintor.privane-system.*\n"
PREFIX = "com.zintor.privane-system."


def viewers(*actions: str) -> str:
    return "[role viewer]\ngroups=privane-viewer\nactions=" + ";".join(
        PREFIX + action for action in actions) + "\n"


def replace_policy(camera: Camera, text: str) -> None:
    """As an administrator would, with one rename."""
    camera.put_file(f"{POLICY}.new", text.encode())
    camera.run(["mv", f"{POLICY}.new", POLICY]).check()


@pytest.fixture(scope="module")
def exchanged_camera(session_camera: Camera, packages_dir: Path) -> Camera:
    """Its libauthz was exchanged as on a device, and it has no polkit any more."""
    session_camera.restore(BOOTED)
    put_packages(session_camera, [package_file(packages_dir, "libauthz1-policy-file")])
    before = wait_for_owner(session_camera)
    session_camera.run(["systemctl", "mask", "--now", "polkit.service"]).check()
    run_beside_packages(session_camera, "dpkg --install libauthz1-policy-file_*.deb")
    assert wait_for_owner(session_camera) != before, "the service has the libauthz that asks polkit"
    replace_policy(session_camera, ROOT_ROLE)
    session_camera.save(EXCHANGED)
    return session_camera


@pytest.fixture
def camera(exchanged_camera: Camera) -> Camera:
    exchanged_camera.restore(EXCHANGED)
    return exchanged_camera


def refusal(camera: Camera, user: str) -> str:
    uid = camera.run(["id", "-u", user]).check().out.strip()
    return f"{REFUSED}action {PREFIX}getuserlist is refused to uid {uid}"


def is_refused(camera: Camera, user: str) -> bool:
    with pytest.raises(BusError) as caught:
        ask(camera, "GetUserList", user=user)
    return caught.value.text == refusal(camera, user)


def test_a_role_of_the_file_is_allowed_and_others_are_not(camera: Camera) -> None:
    replace_policy(camera, ROOT_ROLE + viewers("getuserlist"))
    answer = ask(camera, "GetUserList")
    assert ask(camera, "GetUserList", user="cam-viewer") == answer
    assert is_refused(camera, "cam-web")
    with pytest.raises(BusError, match=REFUSED):
        ask(camera, "GetGroupList", user="cam-viewer")
    assert camera.run(["systemctl", "is-active", "polkit.service"]).out == "inactive\n"


def test_a_changed_file_counts_at_the_next_call(camera: Camera) -> None:
    for _ in range(3):
        assert is_refused(camera, "cam-viewer")
        replace_policy(camera, ROOT_ROLE + viewers("checkuser", "getuserlist"))
        assert ask(camera, "GetUserList", user="cam-viewer")
        replace_policy(camera, ROOT_ROLE + viewers("checkuser", "getgrouplist"))
    assert is_refused(camera, "cam-viewer")


def test_it_counts_under_a_clock_that_was_set_back(camera: Camera) -> None:
    replace_policy(camera, ROOT_ROLE + viewers("getuserlist"))
    assert ask(camera, "GetUserList", user="cam-viewer")
    camera.run("date -s @$(( $(date +%s) - 86400 ))").check()
    assert ask(camera, "GetUserList", user="cam-viewer")
    replace_policy(camera, ROOT_ROLE + viewers("getgrouplist"))
    assert is_refused(camera, "cam-viewer")


def test_a_folder_of_others_refuses_everybody_and_the_journal_tells(camera: Camera) -> None:
    camera.run(["chgrp", "privane", "/etc/privane"]).check()
    camera.run(["chmod", "775", "/etc/privane"]).check()
    why = (f"Authorization check failed: cannot check action {PREFIX}getuserlist: "
           "/etc/privane: others than root may write it")
    with pytest.raises(BusError) as caught:
        ask(camera, "GetUserList")
    assert caught.value.text == why
    shown = camera.run(["journalctl", "-u", UNIT, "-o", "cat", "--no-pager"]).check().out
    assert why in shown
    camera.run(["chmod", "755", "/etc/privane"]).check()
    assert ask(camera, "GetUserList")
