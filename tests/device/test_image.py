"""tests/device/test_image.py: what the installation left in the camera's image."""
from camera.change_tour import DIGEST_FILE
from camera.image_layer import PACKAGES
from camera.machine import Camera

PROGRAMS = ("/usr/sbin/privane_system", "/usr/sbin/privane-check", "/usr/bin/privanectl")
LIBRARIES = ("libauthz", "libbootparam", "libdigestentry", "liblogbackend", "libparamcli",
             "librtcclock")
CAMERAS_USERS = {"cam-web", "cam-viewer", "cam-other"}


def test_installed_files_are_writable_by_root_only(camera: Camera) -> None:
    """What each is in its package tests/packages tells; here is what the image made of them."""
    files = f"dpkg -L {' '.join(PACKAGES)} | sort -u | while read -r file; do " \
        "[ ! -e $file ] || [ -d $file ] || echo $file; done"
    shown = camera.run(f"{files} | xargs stat -L -c '%n %U:%G %a'").check().out.splitlines()
    assert {"/usr/sbin/privane_system", "/usr/bin/privanectl"} <= {line.split()[0] for line in shown}
    for line in shown:
        _, owner, mode = line.split()
        assert owner == "root:root" and int(mode, 8) & 0o022 == 0, line


def test_system_accounts_have_the_ids_of_a_type(camera: Camera) -> None:
    """A group of 1000 or more would have no type, a user another one."""
    for path, expected in (("/etc/passwd", CAMERAS_USERS),
                           ("/etc/group", CAMERAS_USERS | {"privane", "privane-viewer"})):
        lines = [line.split(":") for line in camera.read_file(path).decode().splitlines()]
        ids = {name: int(number) for name, _, number, *_ in lines}
        assert expected <= set(ids)
        assert all(number < 1000 for name, number in ids.items() if number != 65534)
        assert all(0 < ids[name] for name in expected)


def test_every_library_is_there(camera: Camera) -> None:
    libraries = [f"/usr/lib/*/{name}.so.1" for name in LIBRARIES]
    shown = camera.run(f"ldd {' '.join((*PROGRAMS, *libraries))}").check().out
    assert "libauthz.so.1 => /" in shown
    assert "not found" not in shown


def test_nothing_failed_at_boot(camera: Camera) -> None:
    assert camera.run(["systemctl", "is-system-running"]).out == "running\n"
    assert camera.run(["systemctl", "--failed", "--no-legend"]).check().out == ""


def test_what_the_service_needs_of_the_camera(camera: Camera) -> None:
    camera.run(["test", "-x", "/bin/pidof"]).check()
    for unit in ("apache2", "cfgstore", "account-watcher"):
        assert camera.run(["systemctl", "is-active", unit]).out == "active\n"
    pid = camera.run(["systemctl", "show", "--value", "-p", "MainPID", "cfgstore"]).check().out
    assert camera.run(["/bin/pidof", "cfgstore"]).out == pid
    shown = camera.run(["stat", "-c", "%U:%G %a %s", DIGEST_FILE]).check().out
    assert shown == "root:www-data 640 0\n"
    # Nobody would keep it in step with the group file.
    assert camera.run(["test", "-e", "/etc/gshadow"]).status == 1
