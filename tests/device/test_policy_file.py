"""tests/device/test_policy_file.py: the libauthz that a file answers, on a camera without polkit."""
import subprocess
from pathlib import Path

import pytest
from calls import BusError, ask, wait_for_owner
from camera.machine import Camera
from camera.tour import REFUSED, UNIT

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


@pytest.fixture(scope="session")
def library(build_dir: Path, tmp_path_factory: pytest.TempPathFactory) -> bytes:
    """Without what debuggers need: it goes through the camera's console."""
    stripped = tmp_path_factory.mktemp("authz") / "libauthz.so.1"
    subprocess.run(["strip", "-o", stripped, build_dir / "platform/authz/policy/libauthz.so.1"],
                   check=True)
    return stripped.read_bytes()


@pytest.fixture
def camera(camera: Camera, library: bytes) -> Camera:
    """The camera, whose libauthz another package replaced, and which has no polkit any more."""
    installed = camera.run("readlink -f /usr/lib/*/libauthz.so.1").check().out.strip()
    camera.put_file(f"{installed}.new", library, 0o755)
    camera.put_file("/root/authz.conf", ROOT_ROLE.encode())
    camera.run(f"""set -e
        mv {installed}.new {installed}
        install -D -m 644 /root/authz.conf {POLICY}
        systemctl mask --now polkit.service
        systemctl restart {UNIT}""", timeout=180).check()
    owner = wait_for_owner(camera)
    loaded = camera.run(["grep", "-c", "polkit", f"/proc/{owner}/maps"])
    assert loaded.out == "0\n", "the service has the libauthz that asks polkit"
    return camera


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
