"""tests/source/test_makers.py: what the makers' guide tells of options, IDs and libraries is so."""
import re

from conftest import TREE
from documents import read

GUIDE = read("docs/makers.md")

DIGITS = re.compile(r"\d+")


def rows(heading: str) -> list[list[str]]:
    """The cells of the table with that heading."""
    table = GUIDE.partition(f"\n| {heading} |\n")[2].partition("\n\n")[0]
    return [[cell.strip() for cell in line.strip("|").split("|")]
            for line in table.splitlines()[1:]]


def test_build_options_are_there() -> None:
    options = dict(re.findall(r"^option\('(\w+)'.*?\bvalue: (\S+?),?$",
                              (TREE / "meson_options.txt").read_text(), re.MULTILINE | re.DOTALL))
    told = {re.findall("`(\\w+)`", where)[0]: default.strip("`")
            for _, where, default in rows("decision | where | unless you decide")
            if where.startswith("build option ")}

    assert told == {"authz": "polkit", "authz_policy_file": options["authz_policy_file"].strip("'"),
                    "authz_deadline_ms": "25 s", "bus_message_limit": "32 MiB",
                    "account_loss_marker": options["account_loss_marker"].strip("'")}
    assert (options["authz"], options["authz_deadline_ms"], options["bus_message_limit"]) == (
        "'polkit'", "25000", str(32 << 20))


def ranges(kind: str) -> set[tuple[int, int]]:
    source = (TREE / "usermgmt/account_types.cpp").read_text()
    found = re.findall(rf"{{RANGE_TYPE_{kind}, \w+, \"[^\"]+\", \w+, (\d+),\s*(\d+)}}", source)
    return {(int(low), int(high)) for low, high in found}


def test_ranges_of_ids_are_those_of_the_code() -> None:
    table = rows("users | type | groups | type")

    for kind, column in (("USER", 0), ("GROUP", 2)):
        told = [[int(number) for number in DIGITS.findall(row[column])] for row in table]
        assert {(row[0], row[-1]) for row in told} == ranges(kind)
        assert len(ranges(kind)) == 5


def test_each_platform_library_is_told_of() -> None:
    headers = {path.parent.name for path in (TREE / "platform").glob("*/*.h")
               if path.stem == path.parent.name}
    listed = rows("library | header | what ours does | the service calls it")
    explained = rows("library | what the service expects")

    assert {re.findall(r"\[(\w+)\.h\]", row[1])[0] for row in listed} == headers
    assert [row[0] for row in explained] == [row[0] for row in listed]
    assert len(headers) == 6


def test_programs_are_those_that_are_started() -> None:
    cells = " ".join(row[0] for row in rows("program | called | has to"))
    paths = set(re.findall(r"`(/[\w/]+)", cells))
    started = {path for file in (TREE / "methods").rglob("*.cpp")
               for path in re.findall(r'"(/(?:usr/)?(?:s?bin|lib)/[\w/]+)"', file.read_text())}

    assert paths | {"/usr/sbin/smartctl", "/usr/sbin/ethtool"} == started
    assert "`smartctl`, `ethtool`" in cells
