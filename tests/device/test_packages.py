"""tests/device/test_packages.py: installing, upgrading, exchanging and purging our packages in a camera
that runs."""
import gzip
import re
import subprocess
from pathlib import Path

import pytest
from accounts import access, contents
from calls import BusError, ask, owner_pid, wait_for_owner
from camera.change_tour import DIGEST_FILE
from camera.image_layer import PACKAGES, package_file
from camera.layer_cache import LayerCache
from camera.machine import Camera
from camera.paths import DEVICE, TREE
from camera.tour import REFUSED
from camera.warm_start import BOOTED
from document_blocks import block
from dpkg import (HIGHER, altered, package_version, put_packages, run_beside_packages, statuses,
                  upgraded, versions)
from drop_in import unit_properties

STOCKED = "stocked"
ALL_INSTALLED = dict.fromkeys(PACKAGES, "installed")
LIBRARIES = [name for name in PACKAGES if name.startswith("lib")]
POLICY = "/etc/privane/authz.conf"
PURGE = f"dpkg --purge {' '.join(PACKAGES)}"

# What of ours a purge leaves in this camera, which docs/packages.md tells; the accounts are lines.
KEPT = {DIGEST_FILE}
KEPT_UNTIL_THE_NEXT_BOOT = {"/run/lock/fw_printenv.lock"}
# What is neither Debian's nor the camera's to begin with, but comes when the image is made, when it boots
# and runs, and with this test.
OF_OTHERS = re.compile("|".join((
    r"/lost\+found",
    r"/etc/systemd/system/(multi-user\.target\.wants/)?(?!privane)[^/]*",
    r"/root/packages(/.*)?",
    r"/(var/)?tmp/(systemd-private-|\.\w+-unix).*",
    r"/var/(cache/ldconfig/aux-cache|lib/dbus/machine-id|lib/sysflash)",
    r"/var/lib/systemd/(linger|random-seed)",
    r"/var/log/(dpkg\.log|journal/.*)",
)))


@pytest.fixture(scope="module")
def stocked_camera(session_camera: Camera, packages_dir: Path,
                   tmp_path_factory: pytest.TempPathFactory) -> Camera:
    """Has each package at hand, and with a higher version those that are installed."""
    folder = tmp_path_factory.mktemp("upgraded")
    installed = [package_file(packages_dir, name) for name in PACKAGES]
    session_camera.restore(BOOTED)
    put_packages(session_camera, [*installed, package_file(packages_dir, "libauthz1-policy-file"),
                                  *(upgraded(file, folder) for file in installed)])
    session_camera.save(STOCKED)
    return session_camera


@pytest.fixture
def camera(stocked_camera: Camera) -> Camera:
    stocked_camera.restore(STOCKED)
    return stocked_camera


@pytest.fixture(scope="module")
def version(packages_dir: Path) -> str:
    return package_version(package_file(packages_dir, "privane-system"))


def install_all(camera: Camera, version: str) -> None:
    """As the document tells, and the tools, which are not needed."""
    command = block("docs/packages.md", "dpkg --install privane-system_").rstrip()
    run_beside_packages(camera, f"{command} privane-tools_*.deb".replace("_*", f"_{version}_*"))


def use_everything_that_is_kept(camera: Camera) -> None:
    """An account with a password on the web, root's password, of which the parameter store tells, and
    the boot block."""
    ask(camera, "AddUser", "'anna'", "'Sunny-7'", "'users'", "''", "''")
    ask(camera, "ModifyUser", "'root'", "'Sunny-7'", "''", "[]", "''", "''")
    ask(camera, "AddBootblockParam", "COLOUR", "black")


def mapped_files(camera: Camera, pid: int) -> str:
    """Those of a process that are programs and libraries, a replaced one as deleted."""
    return camera.run(f"grep -o '/usr/.*' /proc/{pid}/maps | sort -u").check().out


def all_is_in_order(camera: Camera) -> None:
    """All is configured and as it was packed, it runs, and nothing else has suffered."""
    pid = wait_for_owner(camera)
    assert "/usr/sbin/privane_system\n" in mapped_files(camera, pid)
    assert "(deleted)" not in mapped_files(camera, pid)
    assert statuses(camera) == ALL_INSTALLED
    assert camera.run(["dpkg", "--audit"]).check().out == ""
    assert altered(camera, PACKAGES) == set()
    assert unit_properties(camera, "ActiveState", "UnitFileState", "NeedDaemonReload") == {
        "ActiveState": "active", "UnitFileState": "enabled", "NeedDaemonReload": "no"}
    the_others_run(camera)


def the_others_run(camera: Camera) -> None:
    units = ["dbus.service", "polkit.service", "apache2.service", "account-watcher.service"]
    assert camera.run(["systemctl", "is-active", *units]).out == "active\n" * len(units)
    assert camera.run(["systemctl", "is-system-running"]).out == "running\n"
    # Nobody would keep it in step with the group file.
    assert camera.run(["test", "-e", "/etc/gshadow"]).status == 1


def files_before_our_packages(base: Path) -> set[str]:
    """All that the camera is made of without them."""
    listed = subprocess.run(["tar", "-t", "--quoting-style=literal", "-f", base / "root.tar"],
                            check=True, capture_output=True, text=True).stdout
    paths = {name.removeprefix("./").rstrip("/") for name in listed.splitlines()}
    for folder in (base / "modules", DEVICE / "guest"):
        paths |= {str(path.relative_to(folder)) for path in folder.rglob("*")}
    return {f"/{path}" for path in paths}


def list_files(camera: Camera, name: str) -> None:
    """Too long for the console; it stays in the camera."""
    camera.run(f"find / -xdev | sort >/run/{name}").check()


def test_each_package_is_installed_and_configured(camera: Camera) -> None:
    all_is_in_order(camera)


def test_dpkg_tells_a_file_that_was_altered(camera: Camera) -> None:
    """Without this, finding none would tell nothing."""
    file = "/usr/share/polkit-1/actions/com.zintor.privane-system.policy"
    camera.run(f"echo >>{file}; rm /usr/sbin/privane-check").check()
    assert altered(camera, PACKAGES) == {file, "/usr/sbin/privane-check"}


def test_installing_the_same_version_again_leaves_the_accounts_alone(camera: Camera,
                                                                     version: str) -> None:
    use_everything_that_is_kept(camera)
    before, accessible, first = contents(camera), access(camera), wait_for_owner(camera)
    install_all(camera, version)
    assert wait_for_owner(camera) != first
    assert versions(camera, PACKAGES) == {version}
    assert (contents(camera), access(camera)) == (before, accessible)
    all_is_in_order(camera)


def test_an_upgrade_starts_the_new_service_and_leaves_the_accounts_alone(camera: Camera,
                                                                         version: str) -> None:
    use_everything_that_is_kept(camera)
    before, accessible, first = contents(camera), access(camera), wait_for_owner(camera)
    run_beside_packages(camera, f"dpkg --install *{HIGHER}_*.deb")
    assert wait_for_owner(camera) != first
    assert versions(camera, PACKAGES) == {version + HIGHER}
    assert (contents(camera), access(camera)) == (before, accessible)
    all_is_in_order(camera)
    assert ask(camera, "CheckUser", "'anna'") == (True,)


@pytest.mark.parametrize("name", LIBRARIES)
def test_an_upgraded_platform_library_counts_at_once(camera: Camera, name: str) -> None:
    first = wait_for_owner(camera)
    run_beside_packages(camera, f"dpkg --install {name}_*{HIGHER}_*.deb")
    assert wait_for_owner(camera) != first
    all_is_in_order(camera)


def test_over_to_the_policy_file_and_back(camera: Camera, version: str) -> None:
    first = wait_for_owner(camera)
    camera.run(["systemctl", "mask", "--now", "polkit.service"]).check()
    run_beside_packages(camera, block("docs/packages.md", "dpkg --install libauthz1-policy-file_").rstrip())
    second = wait_for_owner(camera)
    assert second != first
    others = {name: "installed" for name in PACKAGES if name != "libauthz1-polkit"}
    assert statuses(camera) == {**others, "libauthz1-policy-file": "installed"}
    assert altered(camera, [*others, "libauthz1-policy-file"]) == set()
    assert "root" in ask(camera, "GetUserList")[0]
    camera.run(f"echo >>{POLICY}").check()

    camera.run("systemctl unmask polkit.service; systemctl start polkit.service").check()
    run_beside_packages(camera, f"dpkg --install libauthz1-polkit_{version}_*.deb")
    assert wait_for_owner(camera) != second
    # What the maker of the device changed is kept, and counts no more.
    assert statuses(camera) == {**ALL_INSTALLED, "libauthz1-policy-file": "config-files"}
    camera.run(f": >{POLICY}").check()
    assert "root" in ask(camera, "GetUserList")[0]
    with pytest.raises(BusError, match=REFUSED):
        ask(camera, "GetUserList", user="cam-viewer")

    run_beside_packages(camera, "dpkg --purge libauthz1-policy-file")
    assert camera.run(["test", "-e", POLICY]).status == 1
    all_is_in_order(camera)


def test_removing_the_service_ends_it_and_keeps_the_libraries(camera: Camera) -> None:
    run_beside_packages(camera, "dpkg --remove privane-system")
    assert owner_pid(camera) == 0
    with pytest.raises(BusError) as caught:
        ask(camera, "CheckUser", "'root'")
    assert caught.value.name == "org.freedesktop.DBus.Error.ServiceUnknown"
    others = {name: "installed" for name in PACKAGES if name != "privane-system"}
    assert statuses(camera) == {**others, "privane-system": "config-files"}
    the_others_run(camera)


def test_purging_leaves_what_is_documented_and_nothing_else(camera: Camera,
                                                            layer_cache: LayerCache) -> None:
    use_everything_that_is_kept(camera)
    accounts = contents(camera)
    base, = layer_cache.folder.glob("base-*")
    known = "\n".join(sorted(files_before_our_packages(base))) + "\n"
    camera.put_file("/root/packages/known.gz", gzip.compress(known.encode()))
    camera.run("zcat /root/packages/known.gz >/run/known").check()
    list_files(camera, "before")
    run_beside_packages(camera, PURGE)
    list_files(camera, "after")

    appeared = set(camera.run("comm -13 /run/known /run/after").check().out.splitlines())
    assert {path for path in appeared if not OF_OTHERS.fullmatch(path)} == KEPT
    gone = camera.run("comm -23 /run/before /run/after | comm -12 - /run/known").check().out
    assert gone == "", "these were not ours"
    here = camera.run("find /run /tmp /dev/shm -name '*privane*' -o -name 'fw_printenv*'").out
    assert set(here.splitlines()) == KEPT_UNTIL_THE_NEXT_BOOT
    document = (TREE / "docs/packages.md").read_text()
    assert [path for path in KEPT | KEPT_UNTIL_THE_NEXT_BOOT if f"`{path}`" not in document] == []

    assert contents(camera) == accounts, "accounts and the group are nobody's to take away"
    assert statuses(camera) == {}
    assert unit_properties(camera, "LoadState", "ActiveState") == {
        "LoadState": "not-found", "ActiveState": "inactive"}
    the_others_run(camera)


def test_a_device_without_the_group_gets_it_and_no_gshadow(camera: Camera, version: str) -> None:
    run_beside_packages(camera, PURGE)
    camera.run(["groupdel", "privane"]).check()
    install_all(camera, version)
    camera.run(["getent", "group", "privane"]).check()
    all_is_in_order(camera)


def test_installing_again_after_a_purge(camera: Camera, version: str) -> None:
    use_everything_that_is_kept(camera)
    accounts = contents(camera)
    run_beside_packages(camera, PURGE)
    install_all(camera, version)
    all_is_in_order(camera)
    assert contents(camera) == accounts
    assert ask(camera, "CheckUser", "'anna'") == (True,)
