"""tests/device/test_change_authorization.py: who may change accounts, and what the service itself
may touch while it does so."""
import pytest
from accounts import fingerprint
from calls import BusError, ask
from camera.bus_call import UNIT
from camera.machine import Camera
from camera.tour import REFUSED, await_rules

ANNA = ("anna", "Sunny-7", "users", "", "")
# Every method that changes or checks accounts, arguments it would succeed with, and its action.
CHANGES = {
    "AddUser": (("bert", "Foggy-5", "users", "", ""), "adduser"),
    "AddUidUser": (("bert", "Foggy-5", "users", "", "", "5000"), "adduiduser"),
    "AddSystemUser": (("technician", "Foggy-5", "users", "[]", "/bin/sh", ""), "adduser"),
    "ModifyUser": (("anna", "Rainy-8", "", "[]", "", ""), "modifyuser"),
    "ClearUserFields": (("anna", "false", "true", "true"), "clearuserfields"),
    "ChpasswdUser": (("anna", "Windy-9"), "chpasswduser"),
    "RemoveUser": (("anna",), "removeuser"),
    "AddGroup": (("nightshift",), "addgroup"),
    "RemoveGroup": (("privane-viewer",), "removegroup"),
    "Digest": (("['delete', 'anna']",), "digest"),
    "GetDigestList": ((), "getdigestlist"),
    "AuthUserBasic": (("anna", "Sunny-7"), "authuserbasic"),
}
# Beside the one in question, the action that await_rules asks for.
ROLE = """
polkit.addRule(function (action, subject) {
    if (/^com[.]zintor[.]privane-system[.](adduser|checkuser)$/.test(action.id) &&
        subject.isInGroup("privane-viewer"))
        return polkit.Result.YES;
});
"""


@pytest.fixture
def camera_with_anna(camera: Camera) -> Camera:
    ask(camera, "AddUser", *ANNA)
    return camera


def refusal_of(camera: Camera, method: str, user: str) -> BusError:
    with pytest.raises(BusError, match=REFUSED) as caught:
        ask(camera, method, *CHANGES[method][0], user=user)
    return caught.value


def test_members_of_the_group_may_change_nothing(camera_with_anna: Camera) -> None:
    before = fingerprint(camera_with_anna)
    for method, (_, action) in CHANGES.items():
        refusal = refusal_of(camera_with_anna, method, "cam-web")
        assert f"com.zintor.privane-system.{action} " in refusal.text, method
    assert fingerprint(camera_with_anna) == before


@pytest.mark.parametrize("method", CHANGES)
def test_the_arguments_were_such_that_root_succeeds(camera_with_anna: Camera, method: str) -> None:
    ask(camera_with_anna, method, *CHANGES[method][0])


def test_a_rule_grants_one_action_to_one_role(camera_with_anna: Camera) -> None:
    refusal_of(camera_with_anna, "AddUser", "cam-viewer")
    camera_with_anna.put_file("/etc/polkit-1/rules.d/50-test.rules", ROLE.encode())
    await_rules(camera_with_anna, "cam-viewer")
    granted = [method for method, (_, action) in CHANGES.items() if action == "adduser"]
    for method in granted:
        ask(camera_with_anna, method, *CHANGES[method][0], user="cam-viewer")
        refusal_of(camera_with_anna, method, "cam-web")
    for method in CHANGES:
        if method not in granted:
            refusal_of(camera_with_anna, method, "cam-viewer")
    (users,) = ask(camera_with_anna, "GetUserList")
    assert {"anna", "bert", "technician"} <= set(users)


def test_the_service_sees_a_read_only_system_apart_from_etc(camera: Camera) -> None:
    """So that the other tests of changes say something about the packaged unit."""
    inside = f"nsenter --mount --target $(systemctl show --value -p MainPID {UNIT})"
    for folder in ("/usr", "/var", "/boot", "/opt"):
        refused = camera.run(f"{inside} touch {folder}/file")
        assert refused.status == 1 and "Read-only file system" in refused.err
    camera.run(f"{inside} touch /etc/file /etc/apache2/file").check()
    shown = camera.run(["systemctl", "show", UNIT, "-p", "ProtectSystem,NoNewPrivileges"])
    assert set(shown.out.split()) == {"ProtectSystem=strict", "NoNewPrivileges=yes"}
