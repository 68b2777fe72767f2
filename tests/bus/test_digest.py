"""tests/bus/test_digest.py: Digest."""
import pytest

from harness.passwords import MARK
from harness.stage import Stage, refused

# A user list as a caller might hand it over; what it means is the library's business.
USERS = f"carol:{MARK}:dave:{MARK}"


@pytest.mark.parametrize("action, function", [
    ("set", "digest_entry_set_list"),
    ("create", "digest_entry_set_list"),
    ("delete", "digest_entry_delete_list"),
])
@pytest.mark.parametrize("result", [0, 1, -5])
def test_list_goes_to_the_library_whose_result_does_not_count(action: str, function: str,
                                                              result: int, stage: Stage) -> None:
    stage.digest.fail(result)

    stage.assert_unmoved(stage.done((function, USERS, "1")), "Digest", [action, USERS])


@pytest.mark.parametrize("users", ["", " ", "a,b", "a:b\nc:d", "猫", "%s%n", "x" * (1 << 20)],
                         ids=lambda users: repr(users[:10]))
def test_list_is_relayed_as_it_came(users: str, stage: Stage) -> None:
    stage.assert_unmoved(stage.done(("digest_entry_set_list", users, "1")), "Digest",
                         ["create", users])


def test_further_elements_are_ignored(stage: Stage) -> None:
    stage.assert_unmoved(stage.done(("digest_entry_delete_list", "carol", "1")), "Digest",
                         ["delete", "carol", "set", "dave", ""])


@pytest.mark.parametrize("request_words", [[], ["create"], ["delete"], ["nonsense"], [""]])
def test_missing_element_is_refused(request_words: list[str], stage: Stage) -> None:
    stage.assert_unmoved(
        refused("privaneSystemError", 24, "Invalid parameters digest management"),
        "Digest", request_words)


@pytest.mark.parametrize("action", ["", "Set", "SET", "set ", " set", "setx", "se", "remove",
                                    "update", "delete\n"])
def test_unknown_action_is_refused_with_the_list_in_its_place(action: str, stage: Stage) -> None:
    stage.assert_unmoved(
        refused("privaneSystemError", 24, "Invalid action 'carol:dave' to digest management"),
        "Digest", [action, "carol:dave"])


def test_unknown_action_with_an_empty_list(stage: Stage) -> None:
    stage.assert_unmoved(refused("privaneSystemError", 24,
                                 "Invalid action '' to digest management"), "Digest", ["x", ""])


def test_accounts_have_no_say_in_the_list(stage: Stage) -> None:
    stage.assert_unmoved(stage.done(("digest_entry_set_list", "alice", "1")), "Digest",
                         ["set", "alice"])
