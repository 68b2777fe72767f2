"""tests/source/test_reference.py: the reference that the build makes of the interface document."""
import re
import subprocess
import xml.etree.ElementTree as ET
from pathlib import Path

import pytest

from conftest import TREE
from reference.errors import HEADERS, Domain, escaped, read_codes, read_domains
from reference.interface import Failure, Fault, Method, read_interface
from reference.sources import ROOT, manual_commands
from reference.texts import PASSWORD_WARNING, arguments, example, shows_password, signature

INTERFACE = read_interface()

every_method = pytest.mark.parametrize("method", INTERFACE.methods, ids=lambda m: m.name)


@pytest.fixture(scope="module")
def folder(tmp_path_factory: pytest.TempPathFactory) -> Path:
    made = tmp_path_factory.mktemp("reference")
    subprocess.run([TREE / "tools" / "make_reference", "1.2.3", made / "manual", made / "page"],
                   check=True)
    return made


@pytest.fixture(scope="module")
def manual(folder: Path) -> str:
    """The page as it is shown, on one line."""
    shown = subprocess.run(["groff", "-ww", "-man", "-Kutf8", "-Tutf8", "-P-cbou", "-rLL=400n",
                            folder / "manual"], capture_output=True, check=True)
    assert shown.stderr == b""
    return " ".join(shown.stdout.decode().replace("‐\n", "-").split())


@pytest.fixture(scope="module")
def page(folder: Path) -> ET.Element:
    return ET.fromstring((folder / "page").read_text().removeprefix("<!DOCTYPE html>"))


def text_of(element: ET.Element) -> str:
    return " ".join(" ".join(element.itertext()).split())


@every_method
def test_manual_tells_all(method: Method, manual: str) -> None:
    entry = manual.partition(f" {signature(method)} ")[2].partition("Example busctl")[0]

    for text in (*method.paragraphs, method.action,
                 *(f"{argument.name} {argument.text}" for _, argument in arguments(method)),
                 *(f"{failure.domain} {failure.code} {failure.meaning}"
                   for failure in method.failures)):
        assert " ".join(text.split()) in entry
    assert f" {example(INTERFACE, method)} " in manual
    for command in manual_commands()[method.name]:
        assert f" privanectl {command} " in manual


@every_method
def test_page_tells_all(method: Method, page: ET.Element) -> None:
    text = text_of(page)

    for part in (signature(method), *method.paragraphs, f"Action: {method.action}",
                 *(argument.text for _, argument in arguments(method)),
                 *(f"{failure.domain} {failure.code} {failure.meaning}"
                   for failure in method.failures), example(INTERFACE, method)):
        assert " ".join(part.split()) in text


# Of each method whose example has a password, the command that asks for it.
ASKING = {"AuthUserBasic": "privanectl user authenticate NAME",
          "AddUser": "privanectl user add NAME --group=GROUP",
          "AddUidUser": "privanectl user add NAME --group=GROUP --uid=UID",
          "ChpasswdUser": "privanectl user passwd NAME"}


def test_examples_with_a_password_are_known() -> None:
    assert {method.name for method in INTERFACE.methods if shows_password(method)} == set(ASKING)
    assert {method.name for method in INTERFACE.methods if "secret" in method.example} == set(ASKING)


@every_method
def test_example_with_a_password_warns_and_names_what_asks(method: Method, manual: str,
                                                           page: ET.Element) -> None:
    shown, text = example(INTERFACE, method), text_of(page)

    if method.name in ASKING:
        warning = f"{PASSWORD_WARNING} {ASKING[method.name]}"
        assert f" {shown} Warning {warning}. " in manual
        assert f" {shown} Warning: {warning} " in text
    else:
        assert f" {shown} Warning" not in manual + text


def test_page_has_what_it_links_to(page: ET.Element) -> None:
    targets = [element.get("id") for element in page.iter() if element.get("id")]
    links = {element.get("href") for element in page.iter("a")}

    assert len(targets) == len(set(targets)) == 46 + 1 + 6
    assert links <= {f"#{target}" for target in targets}
    assert len(links) >= 47


def test_version_is_the_builds(folder: Path) -> None:
    assert 'privane\\-system 1.2.3"' in (folder / "manual").read_text()
    assert "Version 1.2.3." in (folder / "page").read_text()


def domains() -> tuple[Domain, ...]:
    return read_domains(INTERFACE.methods)


def test_every_code_of_the_methods_domain_comes_from_one() -> None:
    (own,) = (domain for domain in domains() if domain.name == "privaneSystemError")

    assert len(own.codes) == 28
    assert [code.number for code in own.codes if not code.methods] == []


def test_domains_are_named_as_in_the_code() -> None:
    """Each quark is made of the name that the documents have."""
    sources = "".join(file.read_text() for folder in ("service", "usermgmt", "platform/authz")
                      for file in (ROOT / folder).rglob("*") if file.suffix in (".cpp", ".h"))
    quarks = set(re.findall(r'(?:g_quark_from_string\("|G_DEFINE_QUARK\()(\w+)', sources))

    assert set(HEADERS) == quarks


def test_unknown_code_is_told() -> None:
    method = INTERFACE.methods[0]
    broken = Method(**{**vars(method), "failures": (Failure("usermgmt", 99, "bad"),)})

    with pytest.raises(Fault, match="there is no usermgmt 99"):
        read_domains((broken,))


def test_code_without_a_meaning_is_told(tmp_path: Path) -> None:
    (tmp_path / "a.h").write_text("enum e {\n    A = 1,  // one\n    B = 2,\n};\n")

    with pytest.raises(Fault, match="an enumerator of e has no comment"):
        read_codes(tmp_path / "a.h", "e")


def test_domain_is_escaped_as_gdbus_does() -> None:
    assert escaped("g-file-error-quark") == "g_2dfile_2derror_2dquark"
