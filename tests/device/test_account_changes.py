"""tests/device/test_account_changes.py: after every change the camera's own tools read the account
files the way the service meant them."""
import pytest
from accounts import access, fingerprint, lines_with
from calls import BusError, ask
from camera.bus_call import PRIVANE_ERROR, USERMGMT_ERROR
from camera.change_tour import DIGEST_FILE
from camera.machine import Camera

ANNA = ("anna", "Sunny-7", "users", "video:audio", "Anna at the desk")
TECHNICIAN = ("technician", "Sunny-7", "users", "['audio']", "/bin/sh", "Field service")


def change_everything(camera: Camera) -> None:
    """Every kind of change once, with an account of each kind left over."""
    ask(camera, "AddUser", *ANNA)
    ask(camera, "AddUidUser", "bert", "Foggy-5", "users", "", "", "5000")
    ask(camera, "AddSystemUser", *TECHNICIAN)
    ask(camera, "AddGroup", "nightshift")
    ask(camera, "ModifyUser", "anna", "Rainy-8", "games", "['nightshift']", "", "moved")
    ask(camera, "ClearUserFields", "technician", "true", "true", "true")
    ask(camera, "ChpasswdUser", "root", "Windy-9")
    ask(camera, "RemoveUser", "bert")


def test_the_c_library_reads_them_as_meant(camera: Camera) -> None:
    ask(camera, "AddUser", *ANNA)
    ask(camera, "AddSystemUser", *TECHNICIAN)
    assert camera.run(["getent", "passwd", "anna"]).check().out \
        == "anna:x:1000:100:Anna at the desk::/bin/false\n"
    assert camera.run(["id", "-Gn", "anna"]).check().out == "users audio video\n"
    shown = camera.run(["getent", "passwd", "technician"]).check().out
    name, password, uid, *rest = shown.split(":")
    assert (name, password, rest) == ("technician", "x", ["100", "Field service", "", "/bin/sh\n"])
    assert 500 <= int(uid) <= 999
    assert camera.run(["id", "-Gn", "technician"]).check().out == "users audio\n"
    for user in ("anna", "technician"):
        fields = camera.run(["getent", "shadow", user]).check().out.strip().split(":")
        assert fields[1].startswith("$5$") and len(fields) == 9
        today = int(camera.run("echo $(($(date +%s) / 86400))").check().out)
        assert int(fields[2]) == today


def test_the_tools_that_check_the_files_have_nothing_to_say(camera: Camera) -> None:
    before = [camera.run(command) for command in ("pwck -qr", "grpck -r")]
    assert [result.status for result in before] == [0, 0]
    change_everything(camera)
    for command in ("pwck -qr", "grpck -r"):
        result = camera.run(command)
        assert (result.status, result.out, result.err) == (0, "", ""), command


def test_those_tools_do_see_a_bad_line(camera: Camera) -> None:
    camera.run("echo 'anna:x:1000' >>/etc/passwd; echo 'crew:x:1:nobodyknown' >>/etc/group").check()
    assert camera.run("pwck -qr").status == 2
    assert camera.run("grpck -r").status == 2


def test_nothing_else_in_the_files_changes(camera: Camera) -> None:
    passwd, group = camera.read_file("/etc/passwd"), camera.read_file("/etc/group")
    names = {line.split(b":")[0] for line in camera.read_file("/etc/shadow").splitlines()}
    hashes = {line.split(b":")[0]: line.split(b":")[1]
              for line in camera.read_file("/etc/shadow").splitlines()}
    ask(camera, "AddUser", *ANNA)
    ask(camera, "AddGroup", "nightshift")
    ask(camera, "RemoveUser", "anna")
    ask(camera, "RemoveGroup", "nightshift")
    assert camera.read_file("/etc/passwd") == passwd
    # The order of a group's members is not promised.
    assert _members_sorted(camera.read_file("/etc/group")) == _members_sorted(group)
    after = {line.split(b":")[0]: line.split(b":")[1]
             for line in camera.read_file("/etc/shadow").splitlines()}
    assert set(after) == names and after == hashes


def _members_sorted(group: bytes) -> list[list[bytes]]:
    lines = [line.split(b":") for line in group.splitlines()]
    return [[*fields[:3], b",".join(sorted(fields[3].split(b",")))] for fields in lines]


@pytest.mark.parametrize("makers", ["the camera's", "another"])
def test_modes_stay_and_nothing_lies_beside(camera: Camera, makers: str) -> None:
    if makers == "another":
        camera.run("chmod 664 /etc/passwd; chmod 640 /etc/group; chmod 600 /etc/shadow; "
                   f"chown www-data:adm {DIGEST_FILE}; chmod 460 {DIGEST_FILE}").check()
    before = access(camera)
    assert "/etc/shadow root:shadow 6" in before
    change_everything(camera)
    # The account files become those of whom the service runs as; the digest file keeps its owner.
    assert access(camera) == before.replace("root:shadow", "root:root")
    # All four were written, so it was worth looking.
    assert all(lines_with(camera, "anna").values())


def test_a_login_takes_the_password(camera: Camera) -> None:
    """The part of PAM that compares a password with the shadow file; su wants a home folder too."""
    ask(camera, "AddUser", *ANNA)
    ask(camera, "AddSystemUser", *TECHNICIAN)
    for user in ("anna", "technician"):
        assert [accepted(camera, user, word) for word in ("Sunny-7", "sunny-7", "")] \
            == [True, False, False]
        ask(camera, "ChpasswdUser", user, "Windy-9")
        assert [accepted(camera, user, word) for word in ("Sunny-7", "Windy-9")] == [False, True]
    ask(camera, "ClearUserFields", "technician", "true", "false", "false")
    assert [accepted(camera, "technician", word) for word in ("Windy-9", "")] == [False, False]


def accepted(camera: Camera, user: str, password: str) -> bool:
    status = camera.run(f"printf '{password}\\0' | unix_chkpwd {user} nullok").status
    assert status in (0, 7), "7 is a wrong password, anything else a failure"
    return status == 0


def lets_in(camera: Camera, user: str, password: str) -> bool:
    """The service's answer."""
    try:
        ask(camera, "AuthUserBasic", user, password)
    except BusError as error:
        assert (error.name, error.text) == (f"{PRIVANE_ERROR}7", f"No valid password for user {user}")
        return False
    return True


def stored_password(camera: Camera, user: str) -> str:
    return camera.run(["getent", "shadow", user]).check().out.split(":")[1]


@pytest.mark.parametrize("maker, prefix", [
    ("the service", "$5$"), ("YESCRYPT", "$y$"), ("SHA512", "$6$"), ("SHA256", "$5$")])
def test_the_service_and_a_login_agree(camera: Camera, maker: str, prefix: str) -> None:
    """For accounts of this service, and for those that the distribution's tools made."""
    words = ("Foggy-5", "foggy-5", "Foggy-5 ", "")
    if maker == "the service":
        ask(camera, "AddUser", "frida", "Foggy-5", "users", "", "")
    else:
        camera.run("useradd -N -g users frida").check()
        camera.run(f"echo frida:Foggy-5 | chpasswd -c {maker}").check()
    assert stored_password(camera, "frida").startswith(prefix)
    assert [lets_in(camera, "frida", word) for word in words] == [True, False, False, False]
    assert [accepted(camera, "frida", word) for word in words] == [True, False, False, False]

    camera.run("usermod -L frida").check()
    assert stored_password(camera, "frida").startswith("!" + prefix)
    assert not any(lets_in(camera, "frida", word) for word in words)
    assert not any(accepted(camera, "frida", word) for word in words)

    camera.run("usermod -U frida").check()
    assert lets_in(camera, "frida", "Foggy-5") and accepted(camera, "frida", "Foggy-5")


def test_an_empty_field_lets_nobody_in_although_a_login_might(camera: Camera) -> None:
    camera.run("useradd -N -g users frida && passwd -d frida").check()
    assert stored_password(camera, "frida") == ""
    assert accepted(camera, "frida", ""), "with PAM's nullok"
    assert not lets_in(camera, "frida", "")


def test_a_password_that_another_tool_set_is_seen(camera: Camera) -> None:
    ask(camera, "AddUser", *ANNA)
    assert lets_in(camera, "anna", "Sunny-7")
    camera.run("echo anna:Foggy-5 | chpasswd").check()
    assert [lets_in(camera, "anna", word) for word in ("Foggy-5", "Sunny-7")] == [True, False]


@pytest.mark.parametrize("user, password, code, text", [
    ("anna", "sunny-7", 7, "No valid password for user anna"),
    ("anna", "", 7, "No valid password for user anna"),
    ("cam-web", "", 7, "No valid password for user cam-web"),
    ("nosuch", "", 5, "Failed to locate user nosuch."),
])
def test_wrong_passwords(camera: Camera, user: str, password: str, code: int, text: str) -> None:
    ask(camera, "AddUser", *ANNA)
    with pytest.raises(BusError) as caught:
        ask(camera, "AuthUserBasic", user, password)
    assert (caught.value.name, caught.value.text) == (f"{PRIVANE_ERROR}{code}", text)


@pytest.mark.parametrize("method, arguments, name, text", [
    ("AddUser", ("anna", "x", "users", "", ""), f"{USERMGMT_ERROR}6",
     "Failed to add user 'anna', user already exists"),
    ("AddUser", ("bert", "x", "users", "nosuch", ""), f"{USERMGMT_ERROR}4",
     "Failed to add user 'bert', secondary group 'nosuch' does not exist"),
    ("AddUser", (" root", "x", "users", "", ""), f"{USERMGMT_ERROR}3",
     "Failed to add user ' root', username contains invalid characters"),
    ("AddUidUser", ("bert", "x", "users", "", "", "1000"), f"{USERMGMT_ERROR}17",
     "Failed to add user 'bert', specified UID is unavailable"),
    ("RemoveUser", ("root",), f"{USERMGMT_ERROR}11",
     "Failed to delete user 'root', cannot delete 'root' with user type 'root'"),
    ("RemoveGroup", ("nosuch",), f"{USERMGMT_ERROR}7",
     "Failed to delete group 'nosuch', group does not exist"),
    ("ModifyUser", ("", "", "", "[]", "", ""), f"{PRIVANE_ERROR}14",
     "Provided username cannot be NULL/empty"),
])
def test_a_refused_change_changes_nothing(camera: Camera, method: str, arguments: tuple[str, ...],
                                          name: str, text: str) -> None:
    ask(camera, "AddUser", *ANNA)
    before = fingerprint(camera)
    with pytest.raises(BusError) as caught:
        ask(camera, method, *arguments)
    assert (caught.value.name, caught.value.text) == (name, text)
    assert fingerprint(camera) == before
