"""tests/source/test_interface_document.py: the comments of the interface document are complete."""
import shlex
import subprocess
import xml.etree.ElementTree as ET
from pathlib import Path

import pytest

from reference.interface import DOCUMENT, Fault, Interface, Method, read_interface
from reference.sources import method_rows, signal_of

INTERFACE: Interface = read_interface()

every_method = pytest.mark.parametrize("method", INTERFACE.methods, ids=lambda m: m.name)


def test_there_are_46_methods_and_a_signal() -> None:
    assert len(INTERFACE.methods) == 46
    assert [signal.name for signal in INTERFACE.signals] == ["UserDatabaseUpdated"]
    assert INTERFACE.signals[0].paragraphs


def test_actions_are_those_of_the_method_table() -> None:
    assert {signal_of(method.name): method.action
            for method in INTERFACE.methods} == method_rows()


@every_method
def test_example_has_the_methods_signature(method: Method) -> None:
    name, *rest = shlex.split(method.example)

    assert name == method.name
    assert (rest[0] if rest else "") == method.signature
    assert values_taken(method.signature, rest[1:]) == len(rest[1:])


def values_taken(signature: str, values: list[str]) -> int:
    """How many of the words of busctl make up the arguments; -1 where there are too few."""
    taken = 0
    for kind in signature.replace("as", "A"):
        taken += 1
        if kind == "A" and taken <= len(values):
            taken += int(values[taken - 1])
    return taken if taken <= len(values) else -1


def test_values_are_counted() -> None:
    assert values_taken("sasb", ["x", "2", "a", "b", "true"]) == 5
    assert values_taken("sasb", ["x", "2", "a", "b"]) == -1


@pytest.fixture(scope="module")
def docbook(tmp_path_factory: pytest.TempPathFactory) -> str:
    """All that gdbus-codegen makes of the document, as plain text."""
    folder = tmp_path_factory.mktemp("docbook")
    subprocess.run(["gdbus-codegen", f"--generate-docbook={folder}/page", str(DOCUMENT)],
                   check=True)
    (page,) = folder.iterdir()
    return " ".join(" ".join(ET.fromstring(page.read_text()).itertext()).split())


@every_method
def test_gdbus_codegen_reads_the_same(method: Method, docbook: str) -> None:
    for text in (*method.paragraphs, *(failure.meaning for failure in method.failures),
                 *(argument.text for argument in method.inputs),
                 *(argument.text for argument in method.outputs), f"Example: {method.example}"):
        assert " ".join(text.split()) in docbook


WHOLE = """\
<node name="/a">
  <!--
    a.B:
    @short_description: Short

    Text.
  -->
  <interface name="a.B">
    <!--
      Do:
      @x: What.

      Does it.

      Action: a.do

      Errors:
      domain 1: bad;
      domain 2: worse.

      Example: Do s x
    -->
    <method name="Do"><arg name="x" type="s" direction="in"/></method>
  </interface>
</node>
"""


def read_text(tmp_path: Path, text: str) -> Interface:
    (tmp_path / "a.xml").write_text(text)
    return read_interface(tmp_path / "a.xml")


def test_whole_document_is_read(tmp_path: Path) -> None:
    (method,) = read_text(tmp_path, WHOLE).methods

    assert (method.action, len(method.failures), method.example) == ("a.do", 2, "Do s x")


@pytest.mark.parametrize("old, new, fault", [
    ("      Do:", "      Done:", "no comment of its own"),
    ("      @x: What.\n", "", "no line for @x"),
    ("@x: What.\n", "@x: What.\n      @y: What.\n", "has no argument y"),
    ("@x: What.\n", "@x: What\n        else.\n", "no blank line"),
    ("      Does it.\n\n", "", "nothing tells what it does"),
    ("Action: a.do\n", "", "no paragraph 'Action: '"),
    ("Errors:\n", "", "no paragraph 'Errors:'"),
    ("domain 2: worse.", "domain two: worse.", "is no domain, code and meaning"),
    ("Example: Do s x\n", "", "no paragraph 'Example: '"),
])
def test_what_lacks_is_told(old: str, new: str, fault: str, tmp_path: Path) -> None:
    assert old in WHOLE

    with pytest.raises(Fault, match=fault):
        read_text(tmp_path, WHOLE.replace(old, new))
