"""tests/layers/test_yocto.py: the recipe against what Meson installs with the options it gives."""
import glob
import os
import re
import subprocess
from pathlib import Path

import pytest

import meson_project
from conftest import PERMANENT_GROUPS, TREE, YOCTO
from recipe import Recipe, SkipRecipe

RECIPES = YOCTO / "recipes-core/privane-system"
LIBRARIES = {"libbootparam", "libdigestentry", "liblogbackend", "libparamcli", "librtcclock"}

# The names that pkg-config and OpenEmbedded have for one library.
RECIPE_OF = {"glib-2.0": "glib-2.0", "gio-2.0": "glib-2.0", "gio-unix-2.0": "glib-2.0",
             "json-glib-1.0": "json-glib", "libcrypt": "virtual/crypt", "libubootenv": "libubootenv",
             "zlib": "zlib"}

SOURCE = {"PRIVANE_SYSTEM_SRC_URI": "git:///source;branch=main"}
BUILDS = {
    "polkit": {"PACKAGECONFIG": "polkit client docs hardening"},
    "policy-file": {"PACKAGECONFIG": "policy-file client docs hardening",
                    "PRIVANE_AUTHZ_POLICY_FILE": "/etc/acme/roles.conf",
                    "PRIVANE_AUTHZ_DEADLINE_MS": "5000", "PRIVANE_BUS_MESSAGE_LIMIT": "2097152",
                    "PRIVANE_ACCOUNT_LOSS_MARKER": "/etc/acme/accept"},
    "small": {"PACKAGECONFIG": "policy-file", "unit_folder": "/lib/systemd/system"},
}


def read_recipe(**configuration: str) -> Recipe:
    found = list(RECIPES.glob("*.bb"))
    assert len(found) == 1
    return Recipe(found[0], **{**SOURCE, **configuration})


class Build:
    def __init__(self, configuration: dict[str, str], folder: Path) -> None:
        self.recipe = read_recipe(**configuration)
        self.recipe.check()
        meson_project.configure(self.recipe.meson_arguments(), folder)
        self.folder = folder
        self.files = meson_project.installed(folder)


@pytest.fixture(scope="module", params=list(BUILDS))
def build(request: pytest.FixtureRequest, tmp_path_factory: pytest.TempPathFactory) -> Build:
    return Build(BUILDS[request.param], tmp_path_factory.mktemp(request.param))


def matching(patterns: list[str], image: Path) -> set[str]:
    """The files below an image folder that FILES takes: it is a list for glob(), and of a folder
    everything is taken."""
    found: set[str] = set()
    for match in (match for pattern in patterns
                  for match in glob.glob(f"{image}{pattern}", recursive=True)):
        below = [Path(folder) / name for folder, _, names in os.walk(match) for name in names]
        found |= {f"/{path.relative_to(image)}" for path in below or [Path(match)] if path.is_file()}
    return found


def packages_of(recipe: Recipe, image: Path) -> dict[str, set[str]]:
    return {package: matching(recipe.words(f"FILES:{package}"), image)
            for package in recipe.words("PACKAGES")}


def test_every_file_is_in_one_package(build: Build, tmp_path: Path) -> None:
    meson_project.stage(build.files, tmp_path)
    packages = packages_of(build.recipe, tmp_path)
    owners = {file: sorted(package for package, files in packages.items() if file in files)
              for file in build.files}

    assert {file: names for file, names in owners.items() if len(names) != 1} == {}


def test_packages_hold_what_they_are_named_for(build: Build, tmp_path: Path) -> None:
    meson_project.stage(build.files, tmp_path)
    packages = {name: files for name, files in packages_of(build.recipe, tmp_path).items() if files}
    authz = f"libauthz-{meson_project.values(build.folder)['authz']}"
    client = meson_project.values(build.folder)["client"] == "true"

    assert set(packages) == {"privane-system", "privane-system-tools", "privane-system-dev",
                             "privane-system-doc", authz} | LIBRARIES | (
                                 {"privane-system-bash-completion"} if client else set())
    for name in LIBRARIES:
        assert packages[name] == {f"/usr/lib/{name}.so.1", f"/usr/lib/{name}.so.1.0.0"}
    data = ("/usr/share/polkit-1/actions/com.zintor.privane-system.policy"
            if authz == "libauthz-polkit" else build.recipe.get("PRIVANE_AUTHZ_POLICY_FILE"))
    assert packages[authz] == {"/usr/lib/libauthz.so.1", "/usr/lib/libauthz.so.1.0.0", data}
    assert ("/usr/bin/privanectl" in packages["privane-system-tools"]) is client
    assert all("/lib" not in file for file in packages["privane-system-tools"])
    unit = f"{build.recipe.get('systemd_system_unitdir')}/privane-system.service"
    assert unit in packages["privane-system"]


def test_patterns_all_match_something(tmp_path: Path, build: Build) -> None:
    """A path that is written out and never installed would be a slip."""
    meson_project.stage(build.files, tmp_path)
    optional = {"/usr/bin/privanectl"} if build.recipe.get("PACKAGECONFIG") == "policy-file" else set()
    own = {"privane-system", "privane-system-tools", *LIBRARIES,
           f"libauthz-{build.recipe.get('PRIVANE_AUTHZ')}"}
    idle = {pattern for package in own for pattern in build.recipe.words(f"FILES:{package}")
            if not matching([pattern], tmp_path)}

    assert idle == optional


def test_options_reach_meson(build: Build) -> None:
    values = meson_project.values(build.folder)
    chosen = build.recipe.words("PACKAGECONFIG")
    expected = {
        "authz": "policy-file" if "policy-file" in chosen else "polkit",
        "account_loss_marker": build.recipe.get("PRIVANE_ACCOUNT_LOSS_MARKER"),
        "authz_deadline_ms": build.recipe.get("PRIVANE_AUTHZ_DEADLINE_MS"),
        "authz_policy_file": build.recipe.get("PRIVANE_AUTHZ_POLICY_FILE"),
        "bus_message_limit": build.recipe.get("PRIVANE_BUS_MESSAGE_LIMIT"),
        "systemd_unit_dir": build.recipe.get("systemd_system_unitdir"),
        "sysusers_dir": "/usr/lib/sysusers.d",
        **{name: str(name in chosen).lower() for name in ("client", "docs", "hardening")},
    }

    assert {name: values[name] for name in meson_project.product_options()} == expected
    assert values["werror"] == "false"


def test_every_option_is_given(build: Build) -> None:
    given = [word for word in build.recipe.meson_arguments() if word.startswith("-D")]
    named = {word.removeprefix("-D").partition("=")[0] for word in given}

    assert named == set(meson_project.product_options()) | {"werror"}
    assert len(given) == len(named)


def test_defaults_are_the_projects() -> None:
    recipe = read_recipe()
    options = meson_project.options()

    for name in ("authz_deadline_ms", "authz_policy_file", "bus_message_limit", "account_loss_marker"):
        assert recipe.get(f"PRIVANE_{name.upper()}") == options[name].default
    assert recipe.words("PACKAGECONFIG") == ["policy-file", "client", "hardening"]
    assert read_recipe(distro_features="systemd polkit api-documentation").words("PACKAGECONFIG") \
        == ["polkit", "docs", "client", "hardening"]


@pytest.mark.parametrize("chosen", ["client", "polkit policy-file", ""])
def test_one_authorization_is_chosen(chosen: str) -> None:
    with pytest.raises(SkipRecipe, match="one of polkit and policy-file"):
        read_recipe(PACKAGECONFIG=chosen).check()


def test_source_is_named_by_the_maker() -> None:
    with pytest.raises(SkipRecipe, match="PRIVANE_SYSTEM_SRC_URI or EXTERNALSRC"):
        read_recipe(PRIVANE_SYSTEM_SRC_URI="").check()
    read_recipe(PRIVANE_SYSTEM_SRC_URI="", EXTERNALSRC=str(TREE)).check()


def test_version_is_the_projects() -> None:
    assert read_recipe().version == meson_project.version()


def test_dependencies_are_those_of_the_build() -> None:
    assert meson_project.dependencies() == set(RECIPE_OF)
    # glib-2.0-native brings gdbus-codegen.
    assert set(read_recipe().words("DEPENDS")) == {*RECIPE_OF.values(), "glib-2.0-native"}


def test_classes() -> None:
    recipe = read_recipe()

    assert set(recipe.classes) == {"meson", "pkgconfig", "systemd", "useradd", "bash-completion",
                                   "features_check"}
    assert recipe.get("USERADD_PACKAGES") == "privane-system"
    assert recipe.get("SYSTEMD_SERVICE:privane-system") == "privane-system.service"
    group = re.search(r"^g (\S+) 480$", (TREE / "data/privane-system.sysusers.conf").read_text(),
                      re.MULTILINE)
    assert group
    assert recipe.get("GROUPADD_PARAM:privane-system") == f"--system --gid 480 {group[1]}"


@pytest.mark.parametrize("gid", PERMANENT_GROUPS)
def test_gid_is_the_makers(gid: str) -> None:
    recipe = read_recipe(PRIVANE_GID=gid)
    recipe.check()

    assert recipe.get("GROUPADD_PARAM:privane-system") == f"--system --gid {gid} privane"


@pytest.mark.parametrize("gid", ["0", "500", "", "privane", "-1"])
def test_gid_is_no_dynamic_one(gid: str) -> None:
    with pytest.raises(SkipRecipe, match="PRIVANE_GID takes 1 to 499"):
        read_recipe(PRIVANE_GID=gid).check()


def test_two_libauthz_exclude_each_other() -> None:
    recipe = read_recipe()
    pair = ("libauthz-polkit", "libauthz-policy-file")

    for one, other in (pair, pair[::-1]):
        assert recipe.get(f"RCONFLICTS:{one}") == recipe.get(f"RREPLACES:{one}") == other
        assert recipe.get(f"RPROVIDES:{one}") == "libauthz"
        assert recipe.get(f"DEBIAN_NOAUTONAME:{one}") == "1"
    assert recipe.get("RDEPENDS:libauthz-polkit") == "polkit"
    assert recipe.get("RDEPENDS:libauthz-policy-file") is None


def test_every_package_has_a_summary() -> None:
    for chosen in ("polkit", "policy-file"):
        recipe = read_recipe(PACKAGECONFIG=chosen)
        own = [name for name in recipe.words("PACKAGES") if name.startswith("lib")]

        assert len(own) == 6
        assert all(recipe.get(f"SUMMARY:{name}") for name in own)


def test_replaced_libraries_are_left_out(tmp_path: Path) -> None:
    files = [f"/usr/lib/{name}.so{end}" for name in {*LIBRARIES, "libauthz"}
             for end in ("", ".1", ".1.0.0")]
    meson_project.stage(files, tmp_path)
    providers = "libparamcli.so.1:acme-parameters libauthz.so.1:acme-authz"
    recipe = read_recipe(PRIVANE_LIBRARY_PROVIDERS=providers)
    done = recipe.run_shell("do_install:append", tmp_path)
    left = {path.name.partition(".")[0] for path in (tmp_path / "usr/lib").iterdir()}

    assert (done.returncode, done.stderr) == (0, "")
    assert left == LIBRARIES - {"libparamcli"}
    assert recipe.words("ASSUME_SHLIBS") == providers.split()


def test_nothing_is_replaced_unasked(tmp_path: Path) -> None:
    meson_project.stage(["/usr/lib/libparamcli.so.1"], tmp_path)
    done = read_recipe().run_shell("do_install:append", tmp_path)

    assert done.returncode == 0 and (tmp_path / "usr/lib/libparamcli.so.1").exists()


def test_unknown_library_cannot_be_replaced(tmp_path: Path) -> None:
    meson_project.stage(["/usr/lib/libparamcli.so.1"], tmp_path)
    recipe = read_recipe(PRIVANE_LIBRARY_PROVIDERS="libparameters.so.1:acme-parameters")

    assert recipe.run_shell("do_install:append", tmp_path).returncode != 0


def test_image_class_removes_gshadow(tmp_path: Path) -> None:
    meson_project.stage(["/etc/group", "/etc/gshadow", "/etc/gshadow-"], tmp_path)
    image = Recipe(YOCTO / "classes/privane-image.bbclass", IMAGE_ROOTFS=str(tmp_path))
    done = image.run_shell(image.words("ROOTFS_POSTPROCESS_COMMAND")[0], tmp_path)

    assert done.returncode == 0
    assert [path.name for path in (tmp_path / "etc").iterdir()] == ["group"]


def test_layer_finds_its_recipes() -> None:
    layer = Recipe(YOCTO / "conf/layer.conf", LAYERDIR=str(YOCTO), BBPATH="")
    found = {path for pattern in layer.words("BBFILES") for path in glob.glob(pattern)}

    assert found == {str(path) for path in YOCTO.rglob("*.bb")}
    name = layer.words("BBFILE_COLLECTIONS")[0]
    assert re.match(layer.get(f"BBFILE_PATTERN_{name}") or "-", min(found))
    assert layer.get(f"LAYERSERIES_COMPAT_{name}") == "scarthgap"


@pytest.mark.parametrize("line", ["FILES = unquoted", 'A = "1', "inherits meson", "do_install( {"])
def test_reader_refuses_what_is_no_recipe(line: str, tmp_path: Path) -> None:
    path = tmp_path / "a_1.bb"
    path.write_text(line + "\n")

    with pytest.raises(ValueError, match="a_1.bb"):
        Recipe(path)


def test_shell_of_the_layer_parses() -> None:
    recipe, image = read_recipe(), Recipe(YOCTO / "classes/privane-image.bbclass")
    for body in (*recipe.shell.values(), *image.shell.values()):
        assert subprocess.run(["bash", "-n", "-c", body]).returncode == 0
