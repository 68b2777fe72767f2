"""tests/device/test_root_password.py: a new password of root is recorded in the parameter file."""
import pytest
from calls import BusError, ask
from camera.machine import Camera
from journal import records

PARAMETERS = "/etc/privane/parameters.conf"
IS_SET = "root.System.RootPwdSet=yes\n"


@pytest.mark.parametrize("method, arguments", [
    ("ModifyUser", ("root", "Sunny-7", "", "[]", "", "")),
    ("ChpasswdUser", ("root", "Sunny-7")),
])
def test_a_new_password_is_recorded(camera: Camera, method: str,
                                    arguments: tuple[str, ...]) -> None:
    assert camera.run(["test", "-e", PARAMETERS]).status == 1
    ask(camera, method, *arguments)
    assert camera.read_file(PARAMETERS).decode() == IS_SET
    assert (5, "message: Updating root user!") in records(camera)
    ask(camera, "AuthUserBasic", "root", "Sunny-7")


def test_other_parameters_stay_as_they_are(camera: Camera) -> None:
    text = "# of the maker\nroot.Network.Name=camera one\nroot.System.RootPwdSet=no\nodd line\n"
    camera.run(["mkdir", "-p", PARAMETERS.rpartition("/")[0]]).check()
    camera.put_file(PARAMETERS, text.encode(), 0o640)
    camera.run(["chgrp", "privane", PARAMETERS]).check()
    ask(camera, "ChpasswdUser", "root", "Sunny-7")
    assert camera.read_file(PARAMETERS).decode() == text.replace("PwdSet=no", "PwdSet=yes")
    assert camera.run(["stat", "-c", "%U:%G %a", PARAMETERS]).out == "root:privane 640\n"


def test_what_is_refused_or_of_others_is_not_recorded(camera: Camera) -> None:
    with pytest.raises(BusError):
        ask(camera, "ModifyUser", "root", "Sunny-7", "", "[]", "/bin/sh", "")
    ask(camera, "AddUser", "anna", "Sunny-7", "users", "", "")
    ask(camera, "ChpasswdUser", "anna", "Windy-9")
    assert camera.run(["test", "-e", PARAMETERS]).status == 1
