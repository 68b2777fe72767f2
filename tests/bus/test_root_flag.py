"""tests/bus/test_root_flag.py: the parameter that records a change of root."""
from typing import Any

import pytest

from harness.passwords import NEW
from harness.stage import ROOT_FLAG_CALLS, ROOT_FLAG_SET, Stage

MODIFY = ("ModifyUser", "root", "", "", [], "", "")
CHPASSWD = ("ChpasswdUser", "root", NEW)

each_number = pytest.mark.parametrize("number", [1, 17, -3])
each_method = pytest.mark.parametrize("call, announced", [(MODIFY, True), (CHPASSWD, False)],
                                      ids=["ModifyUser", "ChpasswdUser"])


@each_number
@each_method
def test_parameter_that_cannot_be_set(call: tuple[Any, ...], announced: bool, number: int,
                                      stage: Stage) -> None:
    stage.params.fail_to_set(number)

    assert stage.call(*call) == stage.done(
        *ROOT_FLAG_CALLS[:2], signal_sent=announced, pidof_run=announced,
        lines=(f"warning: Updating root user failed to set param! Error: {number}",))


@each_number
@each_method
def test_parameter_that_cannot_be_committed(call: tuple[Any, ...], announced: bool, number: int,
                                            stage: Stage) -> None:
    stage.params.fail_to_sync(number)

    assert stage.call(*call) == stage.done(
        *ROOT_FLAG_CALLS, signal_sent=announced, pidof_run=announced,
        lines=(f"warning: Updating root user failed to sync param! Error: {number}",))


def test_flag_is_set_anew_each_time(stage: Stage) -> None:
    stage.params.fail_to_set(5)
    stage.succeed(*MODIFY)
    stage.params.fail_to_set(0)

    for _ in range(2):
        assert stage.call(*MODIFY) == stage.announced(*ROOT_FLAG_CALLS, lines=(ROOT_FLAG_SET,))
