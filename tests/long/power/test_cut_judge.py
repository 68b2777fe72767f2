"""tests/long/power/test_cut_judge.py: the judge lets pass what may be left, and nothing else."""
import pytest
from cut_judge import faults_in
from power_plan import CLEARING_ORDER, FILES
from recorded_run import Change, File, RecordingError, Version, read_answers

ROOT = 0o644, 0, 0


def version(number: int, **others: File) -> Version:
    old: Version = {name: (*ROOT, f"{name} {number}\n".encode()) for name in FILES}
    return {**old, "parameters": None, **others}


def mixed(old: Version, new: Version, *names: str) -> Version:
    """The old version with some files of the new one."""
    return {**old, **{name: new[name] for name in names}}


V0, V1, V2 = version(0), version(1), version(2)
ACCOUNTS = ("passwd", "shadow", "group")
CHANGES = [Change("start", V0, ()),
           Change("AddUser", mixed(V0, V1, *ACCOUNTS), ACCOUNTS),
           Change("ModifyUser", mixed(V1, V2, *ACCOUNTS), ACCOUNTS)]
CHANGES[2] = Change("ModifyUser", mixed(CHANGES[1].version, V2, *ACCOUNTS), ACCOUNTS)
OLD, NEW = CHANGES[1].version, CHANGES[2].version


@pytest.mark.parametrize("left", [OLD, mixed(OLD, NEW, "passwd"),
                                  mixed(OLD, NEW, "passwd", "shadow"), NEW])
def test_what_a_cut_during_a_change_may_leave(left: Version) -> None:
    assert faults_in(left, CHANGES, 1, 2) == []


@pytest.mark.parametrize("names", [("group",), ("shadow",), ("passwd", "group"),
                                   ("shadow", "group")])
def test_the_order_of_the_files(names: tuple[str, ...]) -> None:
    (fault,) = faults_in(mixed(OLD, NEW, *names), CHANGES, 1, 2)
    assert "not replaced in their order" in fault


@pytest.mark.parametrize("name", FILES[:4])
def test_a_torn_file(name: str) -> None:
    for content in (b"", b"\0" * 9, f"{name} ".encode()):
        (fault,) = faults_in({**OLD, name: (*ROOT, content)}, CHANGES, 1, 2)
        assert fault.startswith(f"{name} is neither old nor new: {len(content)} bytes")


def test_a_file_that_is_gone_or_should_not_be() -> None:
    assert faults_in({**OLD, "group": None}, CHANGES, 1, 2) == ["group is gone"]
    (fault,) = faults_in({**OLD, "parameters": (*ROOT, b"x")}, CHANGES, 1, 2)
    assert fault.startswith("parameters is neither")


def test_an_answered_change_that_is_lost() -> None:
    faults = faults_in(OLD, CHANGES, 2, 2)
    assert len(faults) == 3
    assert "though change 2 was answered: ModifyUser" in faults[0]
    assert len(faults_in(mixed(OLD, NEW, "passwd", "shadow"), CHANGES, 2, 2)) == 1


def test_a_change_that_was_never_begun() -> None:
    faults = faults_in(NEW, CHANGES, 1, 1)
    assert len(faults) == 3 and "though only change 1 was begun" in faults[0]


def test_mode_and_owner_are_the_files_own() -> None:
    for access in ((0o600, 0, 0), (0o644, 1, 0), (0o644, 0, 42)):
        (fault,) = faults_in({**OLD, "shadow": (*access, b"shadow 1\n")}, CHANGES, 1, 2)
        assert "has its content, but mode" in fault


def test_a_mode_that_was_always_wrong() -> None:
    """The service changed it itself, and was seen with it while all was well; the owner may
    change."""
    for access, faults in (((0o666, 0, 0), ["shadow has mode 666, and had 644"]),
                           ((0o644, 0, 42), [])):
        left: Version = {**NEW, "shadow": (*access, b"shadow 2\n")}
        changes = [*CHANGES[:2], Change("ModifyUser", left, ACCOUNTS)]
        assert faults_in(left, changes, 2, 2) == faults


def test_no_valid_boot_block() -> None:
    assert faults_in({**OLD, "boot": None}, CHANGES, 1, 2) == ["boot has no valid copy"]


STEPS: list[dict[str, object]] = [
    {"line": "ClearUserFields", "succeeds": True, "order": list(CLEARING_ORDER)},
    {"line": "RemoveUser", "succeeds": False, "order": list(FILES)}]
FIRST = "file passwd 644 0 0 YQ==\nfile shadow 640 0 42 YQ==\nfile group 644 0 0 \n"
ANSWERS = f"{FIRST}answer 1 ok\nfile passwd 644 0 0 Yg==\nfile shadow 640 0 0 Yg==\nanswer 2 no\n"


def test_the_answers_of_a_recording() -> None:
    start, cleared, refused = read_answers(ANSWERS, STEPS)
    assert start.version == {**dict.fromkeys(FILES), "passwd": (0o644, 0, 0, b"a"),
                             "shadow": (0o640, 0, 42, b"a"), "group": (0o644, 0, 0, b"")}
    assert cleared.written == ("shadow", "passwd")
    assert cleared.version["shadow"] == (0o640, 0, 0, b"b")
    assert refused.version == cleared.version and refused.written == ()


@pytest.mark.parametrize("answers", [
    FIRST, f"{FIRST}answer 1 no\nanswer 2 no\n", f"{FIRST}answer 1 ok\nanswer 2 ok\n",
    f"{FIRST}answer 2 ok\nanswer 1 no\n", f"{ANSWERS}file passwd 644 0 0 YQ==\n", "hello\n"])
def test_what_no_recording_may_say(answers: str) -> None:
    with pytest.raises(RecordingError):
        read_answers(answers, STEPS)
