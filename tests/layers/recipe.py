"""tests/layers/recipe.py: reads the part of bitbake's language that the recipe is written in, and
refuses every other line; what bitbake.conf and the inherited classes would have set is set here."""
import re
import subprocess
from pathlib import Path
from types import SimpleNamespace
from typing import Any

ASSIGNMENT = re.compile(
    r'(?P<name>[\w.:${}-]+)(?:\[(?P<flag>[\w-]+)\])?\s*(?P<op>\?\?=|\?=|\+=|=\+|\.=|=)\s*"(?P<value>[^"]*)"')
FUNCTION = re.compile(r"(?P<python>python )?(?P<name>[\w:]*) ?\(\) \{")
# The forms that bitbake expands, and no others: a shell's ${name%%...} stays as it is.
REFERENCE = re.compile(r"\$\{(@[^{}]+|[\w.:/+~-]+)\}")

# meta/conf/bitbake.conf of scarthgap, as far as the recipe builds upon it.
BITBAKE_CONF = {
    "prefix": "/usr", "bindir": "/usr/bin", "sbindir": "/usr/sbin", "libdir": "/usr/lib",
    "nonarch_libdir": "/usr/lib", "includedir": "/usr/include", "datadir": "/usr/share",
    "docdir": "/usr/share/doc", "mandir": "/usr/share/man", "infodir": "/usr/share/info",
    "sysconfdir": "/etc", "localstatedir": "/var", "SOLIBS": ".so.*", "SOLIBSDEV": ".so",
    "WORKDIR": "/work", "PACKAGECONFIG_CONFARGS": "", "ASSUME_SHLIBS": "",
    "PACKAGES": "${PN}-src ${PN}-dbg ${PN}-staticdev ${PN}-dev ${PN}-doc ${PN}-locale ${PN}",
    "FILES:${PN}-dev": "${includedir} ${libdir}/lib*${SOLIBSDEV} ${libdir}/pkgconfig "
                       "${datadir}/pkgconfig",
    "FILES:${PN}-doc": "${docdir} ${mandir} ${infodir}",
}

# What meson.bbclass gives to Meson beside EXTRA_OEMESON.
MESONOPTS = ("--prefix ${prefix} --buildtype plain --bindir bin --sbindir sbin --datadir share "
             "--libdir lib --libexecdir libexec --includedir include --mandir share/man "
             "--infodir share/info --sysconfdir ${sysconfdir} --localstatedir ${localstatedir} "
             "--sharedstatedir /com --wrap-mode nodownload")


class SkipRecipe(Exception):
    pass


class Recipe:
    """The variables of a recipe. The configuration stands for local.conf: it is there before the
    recipe is read."""

    def __init__(self, path: Path, unit_folder: str = "/usr/lib/systemd/system",
                 distro_features: str = "systemd usrmerge", **configuration: str) -> None:
        self.path = path
        name, _, self.version = path.stem.partition("_")
        self.values = {"PN": name, "PV": self.version, "systemd_system_unitdir": unit_folder,
                       "DISTRO_FEATURES": distro_features}
        self.flags: dict[tuple[str, str], str] = {}
        self.appended: dict[str, list[str]] = {}
        self.weak: dict[str, str] = {}
        self.shell: dict[str, str] = {}
        self.python: list[str] = []
        self.classes: list[str] = []
        for key, value in {**BITBAKE_CONF, **configuration}.items():
            self.values[self.expand(key)] = value
        self.read(path)
        if "bash-completion" in self.classes:
            package = f"{name}-bash-completion"
            self.values["PACKAGES"] = f"{package} {self.values['PACKAGES']}"
            self.values[f"FILES:{package}"] = "${libdir}/bash-completion ${datadir}/bash-completion"

    def read(self, path: Path) -> None:
        lines = iter(re.sub(r"\\\n", "", path.read_text()).splitlines())
        for line in lines:
            if not line or line.startswith("#"):
                continue
            if match := FUNCTION.fullmatch(line):
                body = "\n".join(iter(lambda: next(lines), "}")) + "\n"
                if match["python"]:
                    self.python.append(body)
                else:
                    self.shell[match["name"]] = body
            elif match := ASSIGNMENT.fullmatch(line):
                self.assign(**match.groupdict())
            elif line.startswith("inherit "):
                self.classes += line.split()[1:]
            elif line.startswith("require "):
                self.read(path.parent / line.split()[1])
            else:
                raise ValueError(f"{path.name}: {line}")

    def assign(self, name: str, flag: str | None, op: str, value: str) -> None:
        name = self.expand(name)
        if flag:
            self.flags[name, flag] = value
        elif name.endswith(":append"):
            self.appended.setdefault(name.removesuffix(":append"), []).append(value)
        elif op == "??=":
            self.weak[name] = value
        elif op == "?=":
            self.values.setdefault(name, value)
        elif op == "+=":
            self.values[name] = f"{self.values.get(name, '')} {value}"
        elif op == ".=":
            self.values[name] = self.values.get(name, "") + value
        elif op == "=+":
            self.values[name] = f"{value} {self.values.get(name, '')}"
        else:
            self.values[name] = value

    def expand(self, text: str) -> str:
        def replace(match: re.Match[str]) -> str:
            inner = match[1]
            if not inner.startswith("@"):
                value = self.get(inner)
                if value is None:
                    raise KeyError(inner)
                return value
            return str(eval(inner[1:], {"bb": self.bb, "d": self}))

        while (expanded := REFERENCE.sub(replace, text)) != text:
            text = expanded
        return text

    def get(self, name: str) -> str | None:
        value = self.values.get(name, self.weak.get(name))
        if value is None:
            return None
        return self.expand(value + "".join(self.appended.get(name, [])))

    getVar = get

    @property
    def bb(self) -> Any:
        def contains(name: str, wanted: str, yes: str, no: str, d: "Recipe") -> str:
            return yes if set(wanted.split()) <= set((d.get(name) or "").split()) else no

        return SimpleNamespace(utils=SimpleNamespace(contains=contains),
                               parse=SimpleNamespace(SkipRecipe=SkipRecipe))

    def words(self, name: str) -> list[str]:
        return (self.get(name) or "").split()

    def check(self) -> None:
        """Runs the anonymous functions, as bitbake does when it has read a recipe."""
        for body in self.python:
            exec("if True:\n" + body, {"bb": self.bb, "d": self})

    def meson_arguments(self) -> list[str]:
        """With what base.bbclass makes of PACKAGECONFIG."""
        chosen = self.words("PACKAGECONFIG")
        features = {flag: value.split(",") for (name, flag), value in self.flags.items()
                    if name == "PACKAGECONFIG"}
        assert set(chosen) <= set(features), chosen
        given = [fields[0] if feature in chosen else fields[1] for feature, fields in features.items()
                 if feature in chosen or len(fields) > 1]
        return self.expand(MESONOPTS).split() + self.words("EXTRA_OEMESON") + given

    def run_shell(self, name: str, image: Path) -> subprocess.CompletedProcess[str]:
        """As a task runs it, over an image folder."""
        self.values["D"] = str(image)
        return subprocess.run(["sh", "-e", "-u", "-c", self.expand(self.shell[name])],
                              capture_output=True, text=True)
