"""tests/device/test_authorization.py: who may call the service, own its name, and do what."""
import pytest
from calls import QUERIES, BusError, ask
from camera.machine import Camera
from camera.tour import NAME, REFUSED, RULES, UNIT, await_rules

OWN_THE_NAME = ["gdbus", "call", "--system", "-d", "org.freedesktop.DBus",
                "-o", "/org/freedesktop/DBus", "-m", "org.freedesktop.DBus.RequestName", NAME, "0"]


@pytest.mark.parametrize("method", QUERIES)
def test_members_of_the_group_are_allowed_nothing(camera: Camera, method: str) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, method, *QUERIES[method], user="cam-web")
    assert caught.value.text.startswith(REFUSED)
    assert f"com.zintor.privane-system.{method.lower()} " in caught.value.text


def test_a_role_is_allowed_its_methods(camera: Camera) -> None:
    camera.run(["install", "-m", "644", RULES, "/etc/polkit-1/rules.d/"]).check()
    await_rules(camera, "cam-viewer")
    for method, arguments in QUERIES.items():
        answer = ask(camera, method, *arguments)
        assert ask(camera, method, *arguments, user="cam-viewer") == answer
    with pytest.raises(BusError, match=REFUSED):
        ask(camera, "GetUserList", user="cam-web")


def test_the_example_rules_are_not_in_force_by_themselves(camera: Camera) -> None:
    with pytest.raises(BusError, match=REFUSED):
        ask(camera, "GetUserList", user="cam-viewer")


@pytest.mark.parametrize("method", QUERIES)
def test_the_bus_refuses_strangers(camera: Camera, method: str) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, method, *QUERIES[method], user="cam-other")
    assert caught.value.name == "org.freedesktop.DBus.Error.AccessDenied"


@pytest.mark.parametrize("user", ["cam-web", "cam-viewer", "cam-other"])
def test_only_root_may_own_the_name(camera: Camera, user: str) -> None:
    camera.run(["systemctl", "stop", UNIT]).check()
    refused = camera.run(OWN_THE_NAME, user=user)
    assert refused.status == 1
    assert "org.freedesktop.DBus.Error.AccessDenied" in refused.err
    assert f'is not allowed to own the service "{NAME}"' in refused.err
    # 1: you own it now.
    assert camera.run(OWN_THE_NAME).check().out == "(uint32 1,)\n"


def test_polkit_knows_every_query_and_denies_it_by_default(camera: Camera) -> None:
    for method in QUERIES:
        action = f"com.zintor.privane-system.{method.lower()}"
        shown = camera.run(["pkaction", "--verbose", "--action-id", action]).check().out
        lines = [" ".join(line.split()) for line in shown.splitlines()]
        for subject in ("any", "inactive", "active"):
            assert f"implicit {subject}: no" in lines


def test_a_restarted_polkit_is_found_again(camera: Camera) -> None:
    camera.run(["systemctl", "restart", "polkit.service"]).check()
    assert ask(camera, "CheckUser", "'root'") == (True,)
    with pytest.raises(BusError, match=REFUSED):
        ask(camera, "CheckUser", "'root'", user="cam-web")
    assert "NRestarts=0" in camera.run(["systemctl", "show", UNIT]).check().out.splitlines()
