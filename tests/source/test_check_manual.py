"""tests/source/test_check_manual.py: the manual of privane-check has the kinds of findings, their weights, the
members of the JSON and the exit statuses of the code, and the tests meet each kind."""
import re

from conftest import TREE

CHECK = TREE / "check"
MANUAL = (CHECK / "privane-check.8").read_text().replace("\\-", "-")
CODE = "".join(path.read_text() for path in sorted(CHECK.glob("*.cpp")))

# A weight as an argument, or two to choose from, and then the kind, likewise.
FINDING = re.compile(r"gravity::(\w+)(?: : gravity::(\w+))?,\s*"
                     r'(?:[^",;]*\? )?"([a-z-]+)"(?: : "([a-z-]+)")?')

# No file is known that has it: it is told where the three reasons for leaving out a user do not hold.
UNMET = {"dropped"}


def section(name: str) -> str:
    found = re.search(rf"^\.SH {name}\n(.*?)(?=^\.SH |\Z)", MANUAL, re.MULTILINE | re.DOTALL)
    assert found, name
    return found[1]


def findings_of_the_code() -> set[tuple[str, str]]:
    return {(kind, weight.lower()) for row in FINDING.findall(CODE) for weight in row[:2] if weight
            for kind in row[2:] if kind}


def test_every_finding_of_the_code_is_read() -> None:
    arguments = re.findall(r"\bgravity::\w+,", CODE)

    assert len(FINDING.findall(CODE)) == len(arguments) > 30


def test_kinds_are_those_of_the_code() -> None:
    rows = re.findall(r'^\.BR (\S+) " \((\w+)\)"\n(\S)', section("KINDS"), re.MULTILINE)

    assert {(kind, weight) for kind, weight, _ in rows} == findings_of_the_code()
    assert len(rows) == len(findings_of_the_code()) == section("KINDS").count(".TP\n")


def test_weights_are_those_of_the_code() -> None:
    names = re.search(r"NAMES\[\] = \{(.*?)\};", CODE)
    order = re.search(r"enum class gravity \{(.*?)\};", (CHECK / "findings.h").read_text(), re.DOTALL)
    assert names and order
    weights = re.findall(r'"(\w+)"', names[1])

    assert weights == [word.lower() for word in re.findall(r"^ +([A-Z]+),", order[1], re.MULTILINE)]
    assert weights == re.findall(r"^\.TP\n\.B (\w+)$", section("DESCRIPTION"), re.MULTILINE)


def test_members_are_those_of_the_code() -> None:
    report = (CHECK / "report.cpp").read_text()
    named = re.findall(r'(?:add_text\(builder, |set_member_name\(builder, )"(\w+)"', report)

    assert set(named) == set(re.findall(r"^\.TP\n\.B (\w+)$", section("JSON"), re.MULTILINE))


def test_statuses_are_those_of_the_code() -> None:
    numbers = re.search(r"enum exit_status \{(.*?)\};", CODE, re.DOTALL)
    assert numbers

    assert re.findall(r"= (\d),", numbers[1]) == re.findall(r"^\.B (\d)$", section("EXIT STATUS"),
                                                            re.MULTILINE)


def test_every_kind_is_met_by_a_test() -> None:
    met = "".join(path.read_text() for path in (TREE / "tests/bus").glob("test_privane_check*.py"))

    assert {kind for kind, weight in findings_of_the_code()
            if f"{weight}: {kind}: " not in met} == UNMET
