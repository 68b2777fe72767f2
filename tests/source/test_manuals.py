"""tests/source/test_manuals.py: what the manual pages name, refer to and promise is there."""
import re
from pathlib import Path

import pytest

from conftest import TREE

PAGES = sorted(path for folder in ("client", "check", "data", "service")
               for path in (TREE / folder).glob("*.[1-9]"))

# Made by the build, and the manuals of others.
MADE = {"com.zintor.PrivaneSystem(5)"}
FOREIGN = {"busctl(1)", "chroot(2)", "crypt(5)", "group(5)", "loginctl(1)", "passwd(5)", "pkaction(1)", "polkit(8)",
           "shadow(5)", "syslog(3)", "systemctl(1)", "timedatectl(1)", "unshare(1)",
           "vipw(8)"}

REFERENCE = re.compile(r"^\.BR (\S+) \((\d)\)", re.MULTILINE)


def references(page: Path) -> set[str]:
    return {f"{name}({section})".replace("\\-", "-")
            for name, section in REFERENCE.findall(page.read_text())}


def test_there_are_four() -> None:
    assert [page.name for page in PAGES] == ["privane-check.8", "privanectl.1",
                                             "privane-unit-actions.1", "privane_system.8"]


@pytest.mark.parametrize("page", PAGES, ids=lambda page: page.name)
def test_references_lead_somewhere(page: Path) -> None:
    ours = {f"{page.stem}({page.suffix[1:]})" for page in PAGES} | MADE

    assert references(page) and references(page) <= ours | FOREIGN


@pytest.mark.parametrize("page", PAGES, ids=lambda page: page.name)
def test_page_is_installed(page: Path) -> None:
    assert f"install_man('{page.name}')" in (page.parent / "meson.build").read_text()


@pytest.mark.parametrize("path", re.findall(r"^\.(?:I|IR|TP\n\.I) (/etc/\S+)$",
                                            (TREE / "service/privane_system.8").read_text(),
                                            re.MULTILINE))
def test_files_of_the_service_are_those_of_the_code(path: str) -> None:
    folders = ("usermgmt", "platform", "methods")
    named = "".join(source.read_text() for folder in folders
                    for source in (TREE / folder).rglob("*") if source.suffix in (".cpp", ".h"))
    options = (TREE / "meson_options.txt").read_text()

    assert f'"{path}"' in named or f"'{path}'" in options
