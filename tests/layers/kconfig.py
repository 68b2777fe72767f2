"""tests/layers/kconfig.py: the menu of the external tree, below a menu that stands for Buildroot's,
and what GNU make makes of the package with a chosen configuration."""
import os
import subprocess
from pathlib import Path

import kconfiglib

from conftest import BUILDROOT

PACKAGE = "BR2_PACKAGE_PRIVANE_SYSTEM"
FILES = BUILDROOT / "package/privane-system"

# What a toolchain and a system must have, each of which one may turn off; the last must be off.
REQUIRED = ("BR2_INIT_SYSTEMD", "BR2_INSTALL_LIBSTDCPP", "BR2_TOOLCHAIN_GCC_AT_LEAST_12",
            "BR2_TOOLCHAIN_HAS_THREADS", "BR2_TOOLCHAIN_USES_GLIBC", "BR2_USE_MMU", "BR2_USE_WCHAR")
REFUSED = "BR2_STATIC_LIBS"
# Packages of Buildroot, of which this one may select some.
SELECTED = ("DBUS", "JSON_GLIB", "LIBGLIB2", "LIBUBOOTENV", "LIBXCRYPT", "POLKIT", "ZLIB")

# What Buildroot itself has, and its meson-package, which is evaluated once every variable is there.
MAKEFILE = """\
include {config}
qstrip = $(strip $(subst ",,$(1)))
define sep


endef
TARGET_DIR = {target}
BR2_EXTERNAL_PRIVANE_PATH = {external}
define meson-package
EVALUATED += $(PRIVANE_SYSTEM_VERSION)
endef
include {external}/external.mk

values:
	@: $(foreach name,EVALUATED $(filter PRIVANE_SYSTEM_%,$(.VARIABLES)),$(info $(name)=$(strip $($(name)))))
hooks:
	$(foreach hook,$(PRIVANE_SYSTEM_POST_INSTALL_TARGET_HOOKS),$($(hook))$(sep))
"""


def load(folder: Path) -> kconfiglib.Kconfig:
    """The menu with all that the package asks for turned on."""
    root = folder / "Config.in"
    symbols = [*REQUIRED, REFUSED, *(f"BR2_PACKAGE_{name}" for name in SELECTED)]
    root.write_text("".join(f'config {name}\n\tbool "{name}"\n' for name in symbols)
                    + f'source "{BUILDROOT}/Config.in"\n')
    os.environ.update(BR2_EXTERNAL_PRIVANE_PATH=str(BUILDROOT), CONFIG_="", KCONFIG_WARN_UNDEF="y")
    menu = kconfiglib.Kconfig(str(root), warn_to_stderr=False)
    for name in REQUIRED:
        menu.syms[name].set_value(2)
    menu.syms[PACKAGE].set_value(2)
    return menu


class Made:
    """The package as make sees it, with the choices given by the ends of their symbols' names."""

    def __init__(self, folder: Path, **chosen: str) -> None:
        menu = load(folder)
        for name, value in chosen.items():
            symbol = menu.syms[f"{PACKAGE}_{name}"]
            assert symbol.set_value(value) and symbol.str_value == value, name
        self.warnings = menu.warnings
        self.unset = {symbol.name for symbol in menu.unique_defined_syms if symbol.str_value == "n"}
        self.target = folder / "target"
        menu.write_config(str(folder / "config"))
        self.makefile = folder / "Makefile"
        self.makefile.write_text(MAKEFILE.format(config=folder / "config", target=self.target,
                                                 external=BUILDROOT))
        done = self.make("values")
        assert (done.returncode, done.stderr) == (0, ""), done.stderr
        self.values = dict(line.split("=", 1) for line in done.stdout.splitlines() if "=" in line)

    def make(self, *goals: str) -> subprocess.CompletedProcess[str]:
        """What make says of a variable that nobody sets is kept, unless it is a choice that is off."""
        done = subprocess.run(["make", "--no-print-directory", "--warn-undefined-variables", "-rR",
                               "-f", self.makefile, *goals], capture_output=True, text=True)
        done.stderr = "".join(line for line in done.stderr.splitlines(keepends=True)
                              if line.rpartition(" '")[2].rstrip("'\n") not in self.unset)
        return done
