"""tests/device/test_web_login.py: the camera's web server, a real Apache that checks HTTP digest
passwords, follows every change of the accounts the moment a call is answered."""
import pytest
from accounts import contents
from calls import BusError, ask
from camera.bus_call import PRIVANE_ERROR, call
from camera.change_tour import DIGEST_FILE, digest_line, visit
from camera.machine import Camera
from gi.repository import GLib

LET_IN, REFUSED = 200, 401
NEW_LINE = "\\n"  # in the text of a GVariant
ANNA = ("anna", "Sunny-7", "users", "", "Anna at the desk")


def verdicts(camera: Camera, *commands: str) -> list[int]:
    """Runs calls of the service and visits in one script; the answers to the visits."""
    shown = camera.run("set -e\n" + "\n".join(commands)).check().out.splitlines()
    return [int(line) for line in shown if line != "()"]


def test_nobody_is_let_in_before_the_first_user(camera: Camera) -> None:
    assert camera.read_file(DIGEST_FILE) == b""
    assert verdicts(camera, visit("anna", "Sunny-7"), visit("root", "")) == [REFUSED, REFUSED]


def test_a_new_user_is_let_in_at_once(camera: Camera) -> None:
    assert verdicts(camera, call("AddUser", *ANNA), visit("anna", "Sunny-7"),
                    visit("anna", "sunny-7"), visit("anna", ""), visit("Anna", "Sunny-7"),
                    visit("bert", "Sunny-7")) == [LET_IN, REFUSED, REFUSED, REFUSED, REFUSED]


def test_the_page_is_shown_to_whom_is_let_in(camera: Camera) -> None:
    ask(camera, "AddUser", *ANNA)
    page = camera.run("curl -s --digest -u anna:Sunny-7 http://localhost/").check().out
    assert "<title>Live view of the camera</title>" in page


@pytest.mark.parametrize("password", ["two words", "a:\\b'\"$`", "\u00e4\u20ac", "x" * 64])
def test_any_password_works_on_the_web(camera: Camera, password: str) -> None:
    ask(camera, "AddUser", "anna", GLib.Variant("s", password).print_(False), "users", "", "")
    assert verdicts(camera, visit("anna", password), visit("anna", password + "x")) \
        == [LET_IN, REFUSED]


def test_every_user_has_a_password_of_their_own(camera: Camera) -> None:
    assert verdicts(camera, call("AddUser", *ANNA),
                    call("AddUidUser", "bert", "Foggy-5", "users", "", "", "5000"),
                    visit("anna", "Sunny-7"), visit("bert", "Foggy-5"),
                    visit("anna", "Foggy-5"), visit("bert", "Sunny-7")) \
        == [LET_IN, LET_IN, REFUSED, REFUSED]
    assert camera.read_file(DIGEST_FILE).decode().splitlines() \
        == [digest_line("anna", "Sunny-7"), digest_line("bert", "Foggy-5")]
    assert ask(camera, "GetDigestList") == (["anna", "bert"],)


def test_a_new_password_replaces_the_old_one_at_once(camera: Camera) -> None:
    assert verdicts(camera, call("AddUser", *ANNA),
                    call("AddUser", "bert", "Foggy-5", "users", "", ""),
                    call("ModifyUser", "anna", "Rainy-8", "", "[]", "", ""),
                    visit("anna", "Sunny-7"), visit("anna", "Rainy-8"), visit("bert", "Foggy-5")) \
        == [REFUSED, LET_IN, LET_IN]


def test_another_change_leaves_the_web_password_alone(camera: Camera) -> None:
    ask(camera, "AddUser", *ANNA)
    before = camera.read_file(DIGEST_FILE)
    assert verdicts(camera, call("ModifyUser", "anna", "", "games", "['video']", "", "moved"),
                    visit("anna", "Sunny-7")) == [LET_IN]
    assert camera.read_file(DIGEST_FILE) == before


def test_a_new_password_of_the_account_is_not_one_for_the_web(camera: Camera) -> None:
    assert verdicts(camera, call("AddUser", *ANNA), call("ChpasswdUser", "anna", "Windy-9"),
                    call("AuthUserBasic", "anna", "Windy-9"),
                    visit("anna", "Windy-9"), visit("anna", "Sunny-7")) == [REFUSED, LET_IN]
    with pytest.raises(BusError):
        ask(camera, "AuthUserBasic", "anna", "Sunny-7")


def test_a_removed_user_is_refused_at_once(camera: Camera) -> None:
    assert verdicts(camera, call("AddUser", *ANNA),
                    call("AddUser", "bert", "Foggy-5", "users", "", ""),
                    call("RemoveUser", "anna"),
                    visit("anna", "Sunny-7"), visit("bert", "Foggy-5")) == [REFUSED, LET_IN]
    assert ask(camera, "GetDigestList") == (["bert"],)


def test_a_name_that_is_used_again_does_not_bring_the_old_password_back(camera: Camera) -> None:
    assert verdicts(camera, call("AddUser", *ANNA), call("RemoveUser", "anna"),
                    call("AddUser", "anna", "Foggy-5", "users", "", ""),
                    visit("anna", "Sunny-7"), visit("anna", "Foggy-5")) == [REFUSED, LET_IN]


def test_a_user_of_the_system_is_no_user_of_the_web(camera: Camera) -> None:
    assert verdicts(camera,
                    call("AddSystemUser", "technician", "Sunny-7", "users", "[]", "/bin/sh", ""),
                    visit("technician", "Sunny-7")) == [REFUSED]
    assert camera.read_file(DIGEST_FILE) == b""


def test_root_is_a_user_of_the_web_once_its_password_was_set(camera: Camera) -> None:
    assert verdicts(camera, call("ModifyUser", "root", "Sunny-7", "", "[]", "", ""),
                    visit("root", "Sunny-7"), visit("root", "")) == [LET_IN, REFUSED]


def test_the_web_server_never_sees_half_a_file(camera: Camera) -> None:
    """One visitor comes again and again while another user's password is written."""
    ask(camera, "AddUser", *ANNA)
    ask(camera, "AddUser", "bert", "Foggy-5", "users", "", "")
    # One curl for many visits: it keeps its connection, and most of the time is the web server's.
    visits = visit("anna", "Sunny-7").replace("localhost/", "localhost/?[1-50]")
    changes = [call("ModifyUser", "bert", f"Foggy-{number}", "", "[]", "", "")
               for number in range(8)]
    seen = verdicts(camera, f"(while [ ! -e /run/enough ]; do {visits}; done) >/run/seen &",
                    *changes, "touch /run/enough", "wait", "cat /run/seen")
    assert len(seen) >= 50
    assert set(seen) == {LET_IN}


def test_many_at_once(camera: Camera) -> None:
    ask(camera, "AddUser", *ANNA)
    several = [digest_line("carl", "Misty-1"), digest_line("anna", "Rainy-8"),
               digest_line("dora", "Clear-2")]
    ask(camera, "Digest", f"['create', '{NEW_LINE.join(several)}']")
    assert verdicts(camera, visit("carl", "Misty-1"), visit("dora", "Clear-2"),
                    visit("anna", "Rainy-8"), visit("anna", "Sunny-7")) \
        == [LET_IN, LET_IN, LET_IN, REFUSED]
    assert ask(camera, "GetDigestList") == (["anna", "carl", "dora"],)
    ask(camera, "Digest", f"['delete', 'carl{NEW_LINE}dora']")
    assert verdicts(camera, visit("carl", "Misty-1"), visit("dora", "Clear-2"),
                    visit("anna", "Rainy-8")) == [REFUSED, REFUSED, LET_IN]


def test_a_file_that_cannot_be_written_takes_the_new_user_back(camera: Camera) -> None:
    before = contents(camera)
    camera.run(["mv", "/etc/apache2", "/etc/elsewhere"]).check()
    with pytest.raises(BusError) as caught:
        ask(camera, "AddUser", *ANNA)
    assert caught.value.name == f"{PRIVANE_ERROR}24"
    assert caught.value.text == "Failed to add digest info for 'anna' (Err 6)"
    assert ask(camera, "CheckUser", "'anna'") == (False,)
    camera.run(["mv", "/etc/elsewhere", "/etc/apache2"]).check()
    assert b"anna" not in b"".join(contents(camera).values())
    assert contents(camera)[DIGEST_FILE] == before[DIGEST_FILE]
    assert verdicts(camera, call("AddUser", *ANNA), visit("anna", "Sunny-7")) == [LET_IN]
