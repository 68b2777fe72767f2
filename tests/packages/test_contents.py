"""tests/packages/test_contents.py: every file of every package, and who may write it."""
import os
import subprocess
from pathlib import Path

import pytest
from deb import Deb

FILE = "644 root:root"
PROGRAM = "755 root:root"

# Each library is a file and the link by which it is found.
LIBRARIES = {
    "libauthz1-policy-file": "libauthz",
    "libauthz1-polkit": "libauthz",
    "libbootparam1": "libbootparam",
    "libdigestentry1": "libdigestentry",
    "liblogbackend1": "liblogbackend",
    "libparamcli1": "libparamcli",
    "librtcclock1": "librtcclock",
}

EXAMPLES = ("60-privane-monitor.rules", "60-privane-operator.rules", "60-privane-time.rules",
            "60-privane-units.rules", "60-privane-updater.rules", "60-privane-viewer.rules",
            "60-privane-web.rules", "privane-authz-roles.conf", "privane-bus-limits.conf",
            "privane-own-programs.conf", "privane-roles.conf")
HEADERS = ("authz", "bootparam", "digest_entry", "log_backend", "paramcli", "rtc_clock")

CONTENTS = {
    "privane-system": {
        "/lib/systemd/system/privane-system.service": FILE,
        "/usr/lib/sysusers.d/privane-system.conf": FILE,
        "/usr/lib/tmpfiles.d/privane-system.conf": FILE,
        "/usr/sbin/privane-check": PROGRAM,
        "/usr/sbin/privane_system": PROGRAM,
        "/usr/share/dbus-1/system-services/com.zintor.PrivaneSystem.service": FILE,
        "/usr/share/dbus-1/system.d/com.zintor.PrivaneSystem.conf": FILE,
        "/usr/share/doc/privane-system/authorization.md": FILE,
        "/usr/share/doc/privane-system/com.zintor.PrivaneSystem.html": FILE,
        "/usr/share/man/man5/com.zintor.PrivaneSystem.5.gz": FILE,
        "/usr/share/man/man8/privane-check.8.gz": FILE,
        "/usr/share/man/man8/privane_system.8.gz": FILE,
        "/usr/share/polkit-1/actions/com.zintor.privane-system.policy": FILE,
        **{f"/usr/share/doc/privane-system/examples/{name}": FILE for name in EXAMPLES},
    },
    "privane-tools": {
        "/usr/bin/privane-unit-actions": PROGRAM,
        "/usr/bin/privanectl": PROGRAM,
        "/usr/share/bash-completion/completions/privanectl": FILE,
        "/usr/share/man/man1/privane-unit-actions.1.gz": FILE,
        "/usr/share/man/man1/privanectl.1.gz": FILE,
    },
    "libauthz1-policy-file": {"/etc/privane/authz.conf": FILE},
}
# Those with a folder of libraries in their paths.
DEVELOPMENT = {
    "/usr/share/dbus-1/interfaces/com.zintor.PrivaneSystem.xml": FILE,
    **{f"/usr/include/privane-system/{name}.h": FILE for name in HEADERS},
}
OVERRIDES = ("libauthz1-policy-file", "libauthz1-polkit")


def expected(name: str, triplet: str) -> dict[str, str]:
    files = {f"/usr/share/doc/{name}/changelog.gz": FILE, f"/usr/share/doc/{name}/copyright": FILE}
    files |= CONTENTS.get(name, {})
    folder = f"/usr/lib/{triplet}"
    if library := LIBRARIES.get(name):
        files[f"{folder}/{library}.so.1"] = f"-> {library}.so.1.0.0"
        files[f"{folder}/{library}.so.1.0.0"] = FILE
    if name in OVERRIDES:
        files[f"/usr/share/lintian/overrides/{name}"] = FILE
    if name == "privane-dev":
        files |= DEVELOPMENT
        files[f"{folder}/pkgconfig/privane-system.pc"] = FILE
        files |= {f"{folder}/{library}.so": f"-> {library}.so.1" for library in LIBRARIES.values()}
    return files


def test_the_packages(packages: dict[str, Deb]) -> None:
    assert set(packages) == {"privane-system", "privane-tools", "privane-dev", *LIBRARIES}


@pytest.mark.parametrize("name", ["privane-system", "privane-tools", "privane-dev", *LIBRARIES])
def test_files(packages: dict[str, Deb], triplet: str, name: str) -> None:
    assert packages[name].contents() == expected(name, triplet)
    assert packages[name].folders() == set()


def test_files_that_a_device_changes(packages: dict[str, Deb], tmp_path: Path) -> None:
    """What is changed on the device is kept by an upgrade; all else belongs to the package."""
    kept = {name: control["conffiles"] for name, deb in packages.items()
            if "conffiles" in (control := deb.control(tmp_path))}
    assert kept == {"libauthz1-policy-file": "/etc/privane/authz.conf\n"}


def test_scripts(packages: dict[str, Deb], tmp_path: Path) -> None:
    """No package does more when it comes and goes than those that have to."""
    scripts = {(name, script) for name, deb in packages.items()
               for script in deb.control(tmp_path)
               if script in ("preinst", "postinst", "prerm", "postrm", "config")}
    assert scripts == {("privane-system", "postinst"), ("privane-system", "prerm"),
                       ("privane-system", "postrm"), ("libparamcli1", "postrm"),
                       ("libdigestentry1", "postrm")}


@pytest.mark.parametrize(("name", "files"), [
    ("libparamcli1", ("etc/privane/parameters.conf", "etc/privane/parameters.conf.lock")),
    ("libdigestentry1", ("etc/apache2/digest_auth_passwd.lock",))])
def test_what_another_architectures_copy_uses_is_kept(name: str, files: tuple[str, ...],
                                                      packages: dict[str, Deb], tmp_path: Path) -> None:
    """dpkg tells the scripts how many architectures of a package there are."""
    script = packages[name].control(tmp_path)["postrm"]

    def purge(copies: int) -> list[bool]:
        for file in files:
            (tmp_path / file).parent.mkdir(parents=True, exist_ok=True)
            (tmp_path / file).touch()
        subprocess.run(["sh", "-c", script, "sh", "purge"], check=True,
                       env={**os.environ, "DPKG_ROOT": str(tmp_path),
                            "DPKG_MAINTSCRIPT_PACKAGE_REFCOUNT": str(copies)})
        return [(tmp_path / file).exists() for file in files]

    assert purge(2) == [True] * len(files)
    assert purge(1) == [False] * len(files)


def test_accounts_are_nobodys_to_remove(packages: dict[str, Deb], tmp_path: Path) -> None:
    for name, deb in packages.items():
        for script, text in deb.control(tmp_path).items():
            words = set(text.replace('"', " ").split())
            assert not words & {"userdel", "deluser", "groupdel", "delgroup"}, (name, script)
            for path in ("/etc/passwd", "/etc/shadow", "/etc/group"):
                assert path not in text, (name, script)
