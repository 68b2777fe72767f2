"""tests/layers/test_buildroot.py: the external tree as Kconfig and GNU make read it, and Meson with
the options that come of it."""
import re
import shlex
import subprocess
from pathlib import Path

import kconfiglib
import pytest

import meson_project
from conftest import BUILDROOT, PERMANENT_GROUPS, TREE
from kconfig import FILES, PACKAGE, REFUSED, REQUIRED, SELECTED, Made, load

LIBRARIES = ("libauthz", "libbootparam", "libdigestentry", "liblogbackend", "libparamcli",
             "librtcclock")

# The names that pkg-config and Buildroot have for one library.
PACKAGE_OF = {"glib-2.0": "libglib2", "gio-2.0": "libglib2", "gio-unix-2.0": "libglib2",
              "json-glib-1.0": "json-glib", "libcrypt": "libxcrypt", "libubootenv": "libubootenv",
              "zlib": "zlib"}

# The variables of a package that Buildroot reads; a misspelt one it would not miss.
READ_BY_BUILDROOT = {"CONF_OPTS", "DEPENDENCIES", "INSTALL_STAGING", "LICENSE",
                     "OVERRIDE_SRCDIR_RSYNC_EXCLUSIONS", "POST_INSTALL_TARGET_HOOKS", "REDISTRIBUTE",
                     "SITE", "SITE_METHOD", "USERS", "VERSION"}

BUILDS = {
    "polkit": {},
    "policy-file": {
        "AUTHZ_POLICY_FILE": "y", "AUTHZ_POLICY_FILE_PATH": "/etc/acme/roles.conf",
        "AUTHZ_DEADLINE_MS": "5000", "BUS_MESSAGE_LIMIT": "2097152",
        "ACCOUNT_LOSS_MARKER": "/etc/acme/accept", "CLIENT": "n", "DOCS": "y", "HARDENING": "n"},
}
EXPECTED = {
    "polkit": {
        "authz": "polkit", "client": "true", "docs": "false", "hardening": "true"},
    "policy-file": {
        "authz": "policy-file", "authz_policy_file": "/etc/acme/roles.conf",
        "authz_deadline_ms": "5000", "bus_message_limit": "2097152",
        "account_loss_marker": "/etc/acme/accept", "client": "false", "docs": "true",
        "hardening": "false"},
}


def words(text: str) -> list[str]:
    """As a recipe of make, run by a shell, would split them."""
    return shlex.split(text)


@pytest.fixture
def menu(tmp_path: Path) -> kconfiglib.Kconfig:
    return load(tmp_path)


@pytest.mark.parametrize("name", list(BUILDS))
def test_options_reach_meson(name: str, tmp_path: Path) -> None:
    made = Made(tmp_path, **BUILDS[name])
    meson_project.configure(
        ["--prefix=/usr", "--libdir=lib", "--default-library=shared", "--buildtype=release",
         "-Db_pie=false", "-Dstrip=false", *words(made.values["PRIVANE_SYSTEM_CONF_OPTS"])],
        tmp_path / "build")
    values = meson_project.values(tmp_path / "build")
    options = meson_project.product_options()
    expected = {**{name: option.default for name, option in options.items()}, **EXPECTED[name]}

    assert {name: values[name] for name in options} == expected
    assert values["werror"] == "false"


@pytest.mark.parametrize("name", list(BUILDS))
def test_every_option_is_given(name: str, tmp_path: Path) -> None:
    given = words(Made(tmp_path, **BUILDS[name]).values["PRIVANE_SYSTEM_CONF_OPTS"])
    named = {word.removeprefix("-D").partition("=")[0] for word in given}
    unused = {"authz_policy_file"} if name == "polkit" else set()

    assert named == (set(meson_project.product_options()) | {"werror"}) - unused
    assert len(given) == len(named)
    assert all(word.startswith("-D") and not word.endswith("=") for word in given)


def test_menu_has_no_faults(menu: kconfiglib.Kconfig) -> None:
    assert menu.warnings == []
    assert menu.syms[PACKAGE].str_value == "y"


@pytest.mark.parametrize("name", ["AUTHZ_DEADLINE_MS", "BUS_MESSAGE_LIMIT"])
def test_limits_are_the_projects(menu: kconfiglib.Kconfig, name: str) -> None:
    option = meson_project.options()[name.lower()]
    symbol = menu.syms[f"{PACKAGE}_{name}"]

    assert symbol.str_value == option.default
    assert tuple(end.str_value for end in symbol.ranges[0][:2]) == option.range


def test_authorization_is_a_choice_of_the_same(menu: kconfiglib.Kconfig) -> None:
    option = meson_project.options()["authz"]
    choice = menu.syms[f"{PACKAGE}_AUTHZ_POLKIT"].choice
    names = [symbol.name.removeprefix(f"{PACKAGE}_AUTHZ_").lower().replace("_", "-")
             for symbol in choice.syms]

    assert sorted(names) == sorted(option.choices)
    assert choice.selection.name == f"{PACKAGE}_AUTHZ_{option.default.upper()}"


def test_polkit_comes_only_where_it_decides(menu: kconfiglib.Kconfig) -> None:
    assert menu.syms["BR2_PACKAGE_POLKIT"].str_value == "y"
    menu.syms[f"{PACKAGE}_AUTHZ_POLICY_FILE"].set_value("y")
    assert menu.syms[f"{PACKAGE}_AUTHZ_POLKIT"].str_value == "n"
    assert menu.syms["BR2_PACKAGE_POLKIT"].str_value == "n"


@pytest.mark.parametrize("name", [*REQUIRED, REFUSED])
def test_what_is_missing_is_told(menu: kconfiglib.Kconfig, name: str) -> None:
    comment = next(node for node in menu.node_iter() if node.item is kconfiglib.COMMENT
                   and node.prompt[0].startswith("privane-system needs"))
    package = menu.syms[PACKAGE]

    def visible() -> bool:
        return kconfiglib.expr_value(comment.prompt[1]) > 0

    assert (package.visibility, visible()) == (2, False)
    menu.syms[name].set_value(2 if name == REFUSED else 0)
    # Without an MMU nothing can be done about it.
    assert (package.visibility, visible()) == (0, name != "BR2_USE_MMU")


def test_dependencies_are_those_of_the_build(menu: kconfiglib.Kconfig, tmp_path: Path) -> None:
    assert meson_project.dependencies() == set(PACKAGE_OF)
    # host-libglib2 brings gdbus-codegen.
    assert set(words(Made(tmp_path).values["PRIVANE_SYSTEM_DEPENDENCIES"])) == {
        *PACKAGE_OF.values(), "host-libglib2", "host-pkgconf"}
    selected = {symbol.name for symbol, _ in menu.syms[PACKAGE].selects}
    needed = {f"BR2_PACKAGE_{name.upper().replace('-', '_')}" for name in PACKAGE_OF.values()}
    assert selected == needed | {"BR2_PACKAGE_DBUS"}
    assert {f"BR2_PACKAGE_{name}" for name in SELECTED} == selected | {"BR2_PACKAGE_POLKIT"}


def test_symbols_are_used_and_defined(menu: kconfiglib.Kconfig) -> None:
    used = set(re.findall(rf"\b{PACKAGE}_\w+", (FILES / "privane-system.mk").read_text()))
    defined = {name for name in (symbol.name for symbol in menu.unique_defined_syms)
               if name.startswith(f"{PACKAGE}_")}

    assert used == defined


def test_variables_are_those_that_are_read() -> None:
    text = (FILES / "privane-system.mk").read_text()
    defined = re.findall(r"^(?:define )?(\w+)(?: \+?=|$)", text, re.MULTILINE)
    own = {name for name in defined if name not in ("endef", "endif")}
    ours = {name for name in own if name.removeprefix("PRIVANE_SYSTEM_") not in READ_BY_BUILDROOT}

    assert {f"PRIVANE_SYSTEM_{name}" for name in READ_BY_BUILDROOT} == own - ours
    assert {name for name in ours if text.count(name) < 2} == set()
    assert all(name.startswith("PRIVANE_SYSTEM_") for name in own)
    assert re.findall(r"\$\(eval .*", text) == ["$(eval $(meson-package))"]
    assert text.endswith("$(eval $(meson-package))\n")


def test_make_evaluates_the_package(tmp_path: Path) -> None:
    made = Made(tmp_path)

    assert made.warnings == []
    assert made.values["EVALUATED"] == meson_project.version()
    assert Path(made.values["PRIVANE_SYSTEM_SITE"]).resolve() == TREE
    assert made.values["PRIVANE_SYSTEM_SITE_METHOD"] == "local"
    database = made.make("-n", "-p", "values")
    assert database.returncode == 0 and "PRIVANE_SYSTEM_CONF_OPTS" in database.stdout


def test_source_may_be_elsewhere(tmp_path: Path) -> None:
    assert Made(tmp_path, SOURCE="/opt/source").values["PRIVANE_SYSTEM_SITE"] == "/opt/source"


def test_group_is_the_one_of_the_bus_policy(tmp_path: Path) -> None:
    username, uid, group, gid, *rest = Made(tmp_path).values["PRIVANE_SYSTEM_USERS"].split(None, 8)

    assert (username, uid, gid) == ("-", "-", "480")
    assert rest[:4] == ["-", "-", "-", "-"] and rest[4]
    assert f'<policy group="{group}">' in (TREE / "data/com.zintor.PrivaneSystem.conf").read_text()
    assert re.search(rf"^g {group} 480$", (TREE / "data/privane-system.sysusers.conf").read_text(),
                     re.MULTILINE)


def test_gid_is_that_of_the_menu_and_no_dynamic_one(menu: kconfiglib.Kconfig, tmp_path: Path) -> None:
    symbol = menu.syms[f"{PACKAGE}_GID"]

    assert tuple(end.str_value for end in symbol.ranges[0][:2]) == PERMANENT_GROUPS
    assert Made(tmp_path, GID="123").values["PRIVANE_SYSTEM_USERS"].split()[2:4] == ["privane", "123"]


@pytest.mark.parametrize("replaced", [(), ("libparamcli",), LIBRARIES])
def test_replaced_libraries_are_removed(replaced: tuple[str, ...], tmp_path: Path) -> None:
    made = Made(tmp_path, **{name.upper(): "n" for name in replaced})
    meson_project.stage([f"/usr/lib/{name}{end}" for name in LIBRARIES
                         for end in (".so", ".so.1", ".so.1.0.0")], made.target)
    meson_project.stage(["/usr/lib/libother.so.1"], made.target)
    done = made.make("hooks")
    left = {path.name.partition(".")[0] for path in (made.target / "usr/lib").iterdir()}

    assert (done.returncode, done.stderr) == (0, "")
    assert left == {"libother", *LIBRARIES} - set(replaced)


def test_libraries_are_those_of_the_build() -> None:
    built = "".join(file.read_text() for file in (TREE / "platform").rglob("meson.build"))

    assert {f"lib{name}" for name in re.findall(r"shared_library\(\s*'(\w+)',", built)} \
        == set(LIBRARIES)


def test_tree_is_described() -> None:
    described = dict(line.split(": ", 1)
                     for line in (BUILDROOT / "external.desc").read_text().splitlines())

    assert set(described) == {"name", "desc"}
    for file in ("external.mk", "Config.in"):
        assert f"BR2_EXTERNAL_{described['name']}_PATH" in (BUILDROOT / file).read_text()


def test_form_of_the_menu() -> None:
    """A help text is a tab, two blanks and at most 62 characters; what else is indented has a tab."""
    lines = (FILES / "Config.in").read_text().splitlines()
    helps = [line for line in lines if line.startswith("\t ")]

    assert len(helps) > 20
    assert [line for line in helps if not re.fullmatch(r"\t  \S.{0,61}", line)] == []
    assert [line for line in lines if line.startswith(" ") or line.endswith((" ", "\t"))] == []


def test_shell_of_the_recipes_parses(tmp_path: Path) -> None:
    made = Made(tmp_path, LIBPARAMCLI="n", LIBAUTHZ="n")
    commands = made.make("-n", "hooks").stdout.split("\n")

    assert [line.split()[0] for line in commands if line] == ["rm", "rm"]
    for line in commands:
        assert subprocess.run(["bash", "-n", "-c", line]).returncode == 0
