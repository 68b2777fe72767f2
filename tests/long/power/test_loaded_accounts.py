"""tests/long/power/test_loaded_accounts.py: the service's own reader is asked of what is left."""
from pathlib import Path

import pytest
from loaded_accounts import AccountReader, Users, faults_of_loading
from power_plan import FILES
from recorded_run import Change, Version

BUILD = Path(__file__).resolve().parents[3] / "build"


def version(passwd: str, shadow: str, group: str = "root:x:0:\n") -> Version:
    contents = {"passwd": passwd, "shadow": shadow, "group": group}
    return {**dict.fromkeys(FILES), **{name: (0o644, 0, 0, text.encode())
                                       for name, text in contents.items()}}


ROOT, ANNA = "root:x:0:0::/root:/bin/sh\n", "anna:x:1000:0::/:/bin/sh\n"
ROOT_SHADOW, ANNA_SHADOW = "root:$5$r:20000::::::\n", "anna:$5$a:20000::::::\n"
BEFORE = version(ROOT, ROOT_SHADOW)
AFTER = version(ROOT + ANNA, ROOT_SHADOW + ANNA_SHADOW)
HALF = version(ROOT + ANNA, ROOT_SHADOW)
CHANGES = [Change("start", BEFORE, ()), Change("AddUser", AFTER, ("passwd", "shadow"))]


@pytest.fixture
def reader(tmp_path: Path) -> AccountReader:
    return AccountReader(BUILD / "tests/long/power/account_reader", tmp_path)


def test_what_is_loaded(reader: AccountReader) -> None:
    users: Users = {"root": (0, "$5$r"), "anna": (1000, "$5$a")}
    assert reader(AFTER) == reader(AFTER) == users
    assert reader(BEFORE) == reader(HALF) == {"root": (0, "$5$r")}


def test_an_account_may_be_there_in_part_while_it_is_made(reader: AccountReader) -> None:
    for left in (BEFORE, HALF, AFTER):
        assert faults_of_loading(left, reader, CHANGES, 0, 1) == []
    assert faults_of_loading(AFTER, reader, CHANGES, 1, 0) == []
    assert faults_of_loading(HALF, reader, CHANGES, 1, 1) == ["the service would not load anna"]


def test_root_is_loaded_with_a_password(reader: AccountReader) -> None:
    for passwd, shadow, fault in (
            ("root::0:0::/root:/bin/sh\n", ROOT_SHADOW, "without any password"),
            ("root:x:1001:0::/root:/bin/sh\n", ROOT_SHADOW, "with UID 1001"),
            (ANNA, ANNA_SHADOW, "with UID None"),
            (ROOT, "root::20000::::::\n", "without any password")):
        left = version(passwd, shadow)
        (found,) = faults_of_loading(left, reader, [Change("start", left, ())], 0, 0)
        assert fault in found


def test_files_that_stop_the_service(reader: AccountReader) -> None:
    for name in ("passwd", "group"):
        (fault,) = faults_of_loading({**AFTER, name: None}, reader, CHANGES, 1, 1)
        assert fault.startswith("the service would not load the accounts: status 1: ")
        # The same once more, without another start of the program.
        assert faults_of_loading({**AFTER, name: None}, reader, CHANGES, 1, 1) == [fault]
