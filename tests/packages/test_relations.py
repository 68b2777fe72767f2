"""tests/packages/test_relations.py: what the packages ask for, what excludes what, and what the
libraries offer."""
import re
import subprocess
from pathlib import Path

import pytest
from conftest import TREE
from deb import Deb

DEPENDS = {
    "privane-system": {
        "default-dbus-system-bus | dbus-system-bus", "libc6", "libcrypt1", "libglib2.0-0",
        "libjson-glib-1.0-0", "libstdc++6", "systemd",
        "libauthz1-polkit (>= 0.1.0) | libauthz1 (>= 0.1.0)", "libbootparam1 (>= 0.1.0)",
        "libdigestentry1 (>= 0.1.0)", "liblogbackend1 (>= 0.1.0)", "libparamcli1 (>= 0.1.0)",
        "librtcclock1 (>= 0.1.0)"},
    "privane-tools": {"libc6", "libglib2.0-0", "libjson-glib-1.0-0"},
    "libauthz1-polkit": {"libc6", "libglib2.0-0", "polkitd"},
    "libauthz1-policy-file": {"libc6", "libglib2.0-0", "libstdc++6"},
    "libbootparam1": {"libc6", "libstdc++6", "libubootenv0.1", "zlib1g"},
    "libdigestentry1": {"libc6", "libglib2.0-0", "libstdc++6"},
    "liblogbackend1": {"libc6", "libglib2.0-0"},
    "libparamcli1": {"libc6", "libglib2.0-0"},
    "librtcclock1": {"libc6"},
}

# Since when each symbol is there, and in which of the two packages of libauthz one is looked for.
SYMBOLS = {
    "libauthz1-polkit": ["authz_check", "authz_init", "authz_release"],
    "libauthz1-policy-file": ["authz_check", "authz_init", "authz_policy_path", "authz_release"],
    "libbootparam1": ["bootparam_default_chip", "bootparam_read", "bootparam_set_chip",
                      "bootparam_write"],
    "libdigestentry1": ["digest_entry_delete", "digest_entry_delete_list", "digest_entry_set",
                        "digest_entry_set_list"],
    "liblogbackend1": ["log_backend_stdout", "log_backend_syslog"],
    "libparamcli1": ["paramcli_reset_options", "paramcli_set_custom_param", "paramcli_sync"],
    "librtcclock1": ["rtc_write_time"],
}

# In the list of what a build needs, and nothing that the package of the source would name: a compiler
# and dpkg-dev are there always, meson brings ninja, and git and gettext are for working on the tree.
NOT_NAMED = {"dpkg-dev", "g++", "gettext", "git", "ninja-build"}


def listed(purpose: str) -> set[str]:
    shown = subprocess.run([TREE / "tools/install_dependencies", "--list", purpose], check=True,
                           capture_output=True, text=True).stdout
    return set(shown.split())


@pytest.mark.parametrize("name", DEPENDS)
def test_dependencies(packages: dict[str, Deb], name: str) -> None:
    assert packages[name].relations("Depends") == DEPENDS[name]


def test_development_files_fit_their_libraries(packages: dict[str, Deb], version: str) -> None:
    libraries = {f"{name} (= {version})" for name in SYMBOLS if not name.startswith("libauthz1-")}
    assert packages["privane-dev"].relations("Depends") == libraries | {
        "libglib2.0-dev", f"libauthz1-polkit (= {version}) | libauthz1 (= {version})"}


def test_version_and_architecture(packages: dict[str, Deb], version: str) -> None:
    assert {deb.field("Version") for deb in packages.values()} == {version}
    ours = subprocess.run(["dpkg", "--print-architecture"], check=True, capture_output=True,
                          text=True).stdout.strip()
    assert {deb.field("Architecture") for deb in packages.values()} == {ours}


def test_one_libauthz_at_a_time(packages: dict[str, Deb], version: str) -> None:
    others = {"libauthz1-polkit": "libauthz1-policy-file",
              "libauthz1-policy-file": "libauthz1-polkit"}
    for name, deb in packages.items():
        relations = [deb.field(field) for field in ("Provides", "Conflicts", "Replaces")]
        # dpkg takes the other one away only where it is named.
        assert relations == ([f"libauthz1 (= {version})", "libauthz1", f"libauthz1, {others[name]}"]
                             if name in others else ["", "", ""]), name


@pytest.mark.parametrize("name", SYMBOLS)
def test_symbols(packages: dict[str, Deb], tmp_path: Path, name: str) -> None:
    control = packages[name].control(tmp_path)
    lines = control["symbols"].splitlines()
    library = re.sub(r"1(-.*)?$", "", name)
    needed = [f"{library}.so.1 {name} #MINVER#"]
    if library == "libauthz":
        needed = ["libauthz.so.1 libauthz1-polkit #MINVER# | libauthz1 #MINVER#"]
    # What is in one of the alternatives alone needs that one.
    if "authz_policy_path" in SYMBOLS[name]:
        needed.append("| libauthz1-policy-file #MINVER#")
    assert lines == [*needed, "* Build-Depends-Package: privane-dev",
                     *(f" {symbol}@Base 0.1.0{' 1' if symbol == 'authz_policy_path' else ''}"
                       for symbol in SYMBOLS[name])]


def test_the_service_follows_its_libraries(packages: dict[str, Deb], tmp_path: Path,
                                           triplet: str) -> None:
    """It is started anew when any package has exchanged one."""
    wanted = packages["privane-system"].control(tmp_path)["triggers"].splitlines()
    assert set(wanted) == {f"interest-noawait /usr/lib/{triplet}/{library}.so.1" for library in
                           ("libauthz", "libbootparam", "libdigestentry", "liblogbackend",
                            "libparamcli", "librtcclock")}


def test_one_list_of_build_dependencies() -> None:
    control = (TREE / "packaging/debian/control").read_text()
    (field,) = re.findall(r"^Build-Depends: (.*?)\n\n?(?=\S)", control, re.MULTILINE | re.DOTALL)
    named = {re.sub(r" *\(.*?\)", "", one).strip() for one in field.split(",")}
    # What debhelper brings stands there by other names, which say how it is to be used.
    debhelpers = {name for name in named if re.match(r"debhelper-compat$|dh-sequence-", name)}
    assert debhelpers
    assert named - debhelpers == listed("build") - NOT_NAMED
    assert "debhelper" in listed("package")


def test_pkg_config_leads_to_the_interface(packages: dict[str, Deb], tmp_path: Path,
                                           triplet: str) -> None:
    packages["privane-dev"].extract(tmp_path)

    def ask(*words: str) -> str:
        return subprocess.run(
            ["pkg-config", *words, "privane-system"], check=True, capture_output=True, text=True,
            env={"PATH": "/usr/bin:/bin", "PKG_CONFIG_LIBDIR":
                 f"{tmp_path}/usr/lib/{triplet}/pkgconfig:/usr/lib/{triplet}/pkgconfig"
                 ":/usr/share/pkgconfig"}).stdout.strip()

    document = ask("--variable=interface")
    assert document == "/usr/share/dbus-1/interfaces/com.zintor.PrivaneSystem.xml"
    assert ask("--variable=interfaces_dir") == "/usr/share/dbus-1/interfaces"
    ours = (TREE / "service/com.zintor.PrivaneSystem.xml").read_bytes()
    assert (tmp_path / document.lstrip("/")).read_bytes() == ours
    assert ask("--modversion") == packages["privane-dev"].field("Version")
    assert "-I/usr/include/privane-system" in ask("--cflags").split()


def test_headers_and_links_are_enough_to_build_with(packages: dict[str, Deb], tmp_path: Path,
                                                    triplet: str) -> None:
    """A program in C that names a function of each library."""
    for name in ("privane-dev", *SYMBOLS):
        if name != "libauthz1-policy-file":
            packages[name].extract(tmp_path)
    headers = ("authz", "bootparam", "digest_entry", "log_backend", "paramcli", "rtc_clock")
    functions = sorted({symbols[0] for symbols in SYMBOLS.values()})
    source = "".join(f"#include <{header}.h>\n" for header in headers)
    source += "const void *const used[] = {" + ", ".join(functions) + "};\n"
    source += "int main(void) { return used[0] == 0; }\n"
    program = tmp_path / "program"
    glib = subprocess.run(["pkg-config", "--cflags", "glib-2.0"], check=True, capture_output=True,
                          text=True).stdout.split()
    libraries = [f"-l{re.sub(r'^lib|1(-.*)?$', '', name)}" for name in SYMBOLS]
    done = subprocess.run(
        ["gcc", "-Wall", "-Wextra", "-Werror", "-xc", "-", f"-I{tmp_path}/usr/include/privane-system",
         *glib, f"-L{tmp_path}/usr/lib/{triplet}", "-Wl,--no-as-needed", *dict.fromkeys(libraries),
         "-Wl,--allow-shlib-undefined", "-o", program],
        input=source, capture_output=True, text=True)
    assert done.returncode == 0, done.stderr
    needed = subprocess.run(["readelf", "-d", program], check=True, capture_output=True,
                            text=True).stdout
    for name in SYMBOLS:
        assert f"[{re.sub(r'1(-.*)?$', '', name)}.so.1]" in needed
