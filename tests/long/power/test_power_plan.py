"""tests/long/power/test_power_plan.py: a plan is the same for the same seed, and has every kind of
change."""
from power_plan import LEAST_CHANGES, MOST_CHANGES, Planner, Step, changes_for

METHODS = {"AddUser", "AddUidUser", "AddSystemUser", "ModifyUser", "ChpasswdUser", "RemoveUser",
           "ClearUserFields", "AddGroup", "RemoveGroup", "Digest", "AddBootblockParam"}


def method_of(step: Step) -> str:
    return step.line.removeprefix("watched ").split()[0]


def test_the_same_seed_plans_the_same() -> None:
    assert Planner("1").steps(40) == Planner("1").steps(40) != Planner("2").steps(40)


def test_every_plan_has_every_kind() -> None:
    for seed in range(20):
        shortest = [step for step in Planner(str(seed)).steps(LEAST_CHANGES) if step.is_call]
        assert {method_of(step) for step in shortest} == METHODS
        steps = [step for step in Planner(str(seed)).steps(40) if step.is_call]
        assert len(steps) == 40
        assert {method_of(step) for step in steps} == METHODS
        assert any(not step.succeeds for step in steps)
        assert 5 < sum(step.line.startswith("watched ") for step in steps) < 35
        assert any("root" in step.line and step.succeeds for step in steps)
        assert all("\n" not in step.line for step in steps)


def test_the_changes_go_by_the_amount() -> None:
    assert [changes_for(states) for states in (1, 1500, 2250, 3000, 10**6)] == [
        LEAST_CHANGES, 20, 30, MOST_CHANGES, MOST_CHANGES]


def test_nobody_is_changed_who_is_not_there() -> None:
    steps = Planner("1").steps(200)
    there = {"root"}
    for step in steps:
        if not step.is_call or not step.succeeds:
            continue
        method, name = method_of(step), step.line.split("'")[1]
        if method in ("AddUser", "AddUidUser", "AddSystemUser"):
            there.add(name)
        elif method in ("ModifyUser", "ChpasswdUser", "ClearUserFields", "RemoveUser"):
            assert name in there
        if method == "RemoveUser":
            there.remove(name)
