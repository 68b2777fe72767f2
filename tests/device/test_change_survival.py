"""tests/device/test_change_survival.py: an answered change is there after a restart and a power
cut, and one that could not be made has left nothing."""
import pytest
from accounts import fingerprint
from calls import BusError, ask
from camera.bus_call import UNIT
from camera.change_tour import DIGEST_FILE, digest_line, visit
from camera.machine import Camera

PARAMETERS = "/etc/privane/parameters.conf"
ROOT_PASSWORD_IS_SET = "root.System.RootPwdSet=yes\n"
CORE_FILE_ERROR = "org.gtk.GDBus.UnmappedGError.Quark._corefile.Code"
ANNA = ("anna", "Sunny-7", "users", "video", "Anna at the desk")
ANNAS_RECORD = (True, "users", ["video"], "Anna at the desk", 1000)
# Allocates all blocks without writing them; what is left then is less than the last size.
FILL_THE_DISK = """
for size in 512M 64M 8M 1M 128K 16K 4K; do
    for number in $(seq 16); do fallocate -l $size /fill-$size-$number 2>/dev/null || break; done
done
sync
! head -c 4096 /dev/zero >/fill-last
"""


def test_a_restart_of_the_service(camera: Camera) -> None:
    ask(camera, "AddUser", *ANNA)
    ask(camera, "AddGroup", "nightshift")
    camera.run(["systemctl", "restart", UNIT]).check()
    assert ask(camera, "GetUser", "anna") == ANNAS_RECORD
    assert ask(camera, "CheckGroup", "nightshift") == (True,)
    ask(camera, "AuthUserBasic", "anna", "Sunny-7")
    assert camera.run(visit("anna", "Sunny-7")).out == "200\n"
    # The next user gets the next UID: what was written is what is read.
    ask(camera, "AddUser", "bert", "Foggy-5", "users", "", "")
    assert ask(camera, "GetUser", "bert")[-1] == 1001


@pytest.fixture
def forgetful_camera(camera: Camera) -> Camera:
    """Its file system is no better than others: it loses what nobody told it to keep."""
    camera.run("sync; mount -o remount,noauto_da_alloc /").check()
    return camera


def test_a_power_cut_right_after_the_first_change(forgetful_camera: Camera) -> None:
    """Of account files only: writing another file would bring them to the disk as well."""
    camera = forgetful_camera
    ask(camera, "AddSystemUser", "technician", "Sunny-7", "users", "['video']", "/bin/sh", "")
    before = ask(camera, "GetUser", "technician")
    camera.cut_power()
    assert ask(camera, "GetUser", "technician") == before
    assert before[:4] == (True, "users", ["video"], "")
    ask(camera, "AuthUserBasic", "technician", "Sunny-7")


def test_a_power_cut_right_after_the_last_of_many(forgetful_camera: Camera) -> None:
    camera = forgetful_camera
    for words in (("AddUser", *ANNA), ("AddUser", "bert", "Foggy-5", "users", "", ""),
                  ("AddGroup", "nightshift"), ("RemoveUser", "bert"),
                  ("ModifyUser", "anna", "Rainy-8", "", "[]", "", ""),
                  ("ChpasswdUser", "root", "Windy-9")):
        ask(camera, *words)
    camera.cut_power()
    assert ask(camera, "GetUser", "anna") == ANNAS_RECORD
    assert ask(camera, "CheckUser", "bert") == (False,)
    assert ask(camera, "CheckGroup", "nightshift") == (True,)
    ask(camera, "AuthUserBasic", "anna", "Rainy-8")
    ask(camera, "AuthUserBasic", "root", "Windy-9")
    assert camera.read_file(PARAMETERS).decode() == ROOT_PASSWORD_IS_SET
    assert camera.read_file(DIGEST_FILE).decode() == digest_line("anna", "Rainy-8") + "\n"
    assert camera.run(visit("anna", "Rainy-8")).out == "200\n"
    assert camera.run("pwck -qr && grpck -r").status == 0


@pytest.mark.parametrize("method, arguments", [
    ("AddUser", ("bert", "Foggy-5", "users", "video", "")),
    ("AddSystemUser", ("technician", "Foggy-5", "users", "[]", "/bin/sh", "")),
    ("ModifyUser", ("anna", "Rainy-8", "games", "[]", "", "moved")),
    ("RemoveUser", ("anna",)),
    ("AddGroup", ("nightshift",)),
])
def test_on_a_full_disk_a_change_fails_as_a_whole(camera: Camera, method: str,
                                                  arguments: tuple[str, ...]) -> None:
    ask(camera, "AddUser", *ANNA)
    # What a failed change falls back to is what was read at the start.
    camera.run(["systemctl", "restart", UNIT]).check()
    before, users = fingerprint(camera), ask(camera, "GetUserList")
    camera.run(FILL_THE_DISK).check()
    with pytest.raises(BusError) as caught:
        ask(camera, method, *arguments)
    assert caught.value.name.startswith(CORE_FILE_ERROR)
    assert "unable to sync core files, failed to write " in caught.value.text
    assert caught.value.text.endswith("No space left on device")
    assert fingerprint(camera) == before
    assert ask(camera, "GetUserList") == users
    camera.run("rm /fill-*").check()
    ask(camera, method, *arguments)
    assert camera.run("pwck -qr && grpck -r").status == 0
