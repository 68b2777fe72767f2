"""tests/device/test_boot_block.py: the boot block, by the service and by U-Boot's own tools."""
import pytest
from calls import BusError, ask
from camera.bus_call import PRIVANE_ERROR, call
from camera.machine import Camera
from camera.storage_disk import FACTORY_PARAMETERS

WRITES = 50


def by_the_tool(camera: Camera, name: str) -> str:
    return camera.run(["fw_printenv", "-n", name]).check().out.removesuffix("\n")


def test_the_service_and_the_tool_agree(camera: Camera) -> None:
    for name, value in FACTORY_PARAMETERS.items():
        assert ask(camera, "ReadBootblockParam", name) == (value,)
        assert by_the_tool(camera, name) == value
    assert ask(camera, "ReadSerno") == (FACTORY_PARAMETERS["SERNO"],)
    ask(camera, "AddBootblockParam", "COLOUR", "matt black")
    assert by_the_tool(camera, "COLOUR") == "matt black"
    camera.run(["fw_setenv", "COLOUR", "white"]).check()
    assert ask(camera, "ReadBootblockParam", "COLOUR") == ("white",)
    assert by_the_tool(camera, "SERNO") == FACTORY_PARAMETERS["SERNO"]


def test_a_parameter_that_is_not_there_is_empty(camera: Camera) -> None:
    assert ask(camera, "ReadBootblockParam", "NOSUCH") == ("",)


def test_a_blank_boot_block_is_empty_and_can_be_written(camera: Camera) -> None:
    camera.run("dd if=/dev/zero of=/dev/sda1 bs=16k count=2 conv=fsync").check()
    assert ask(camera, "ReadSerno") == ("",)
    ask(camera, "AddBootblockParam", "SERNO", "4711")
    assert ask(camera, "ReadSerno") == ("4711",)
    assert by_the_tool(camera, "SERNO") == "4711"


@pytest.mark.parametrize("copy", [0, 1])
def test_one_broken_copy_is_made_up_for_by_the_other(camera: Camera, copy: int) -> None:
    camera.run(f"printf X | dd of=/dev/sda1 bs=1 seek={copy * 0x4000 + 5} conv=fsync").check()
    assert ask(camera, "ReadSerno") == (FACTORY_PARAMETERS["SERNO"],)


def test_a_boot_block_that_is_not_there_is_an_error(camera: Camera) -> None:
    camera.run(["rm", "/etc/fw_env.config"]).check()
    with pytest.raises(BusError) as caught:
        ask(camera, "ReadSerno")
    assert caught.value.name == f"{PRIVANE_ERROR}15"
    assert caught.value.text.startswith("Failed to set chip parameters, error=")


def test_nobody_else_can_hold_the_lock(camera: Camera) -> None:
    shown = camera.run(["stat", "-c", "%U:%G %a", "/run/lock/fw_printenv.lock"]).check().out
    assert shown == "root:root 600\n"
    opened = camera.run("flock -n /run/lock/fw_printenv.lock true", user="cam-web")
    assert opened.status != 0 and "Permission denied" in opened.err


def test_a_power_cut_in_the_middle_of_many_writes(camera: Camera) -> None:
    """Whatever was being written, the old or the new values are there, and all others; and what was
    answered is not lost."""
    writes = "; ".join(f"{call('AddBootblockParam', 'COUNT', str(number))} && echo {number} "
                       ">>/run/answered" for number in range(1, WRITES + 1))
    camera.run(f"({writes}) >/dev/null 2>&1 &").check()
    camera.run(f"touch /run/answered; until [ $(wc -l </run/answered) -ge {WRITES // 2} ]; do "
               "sleep 0.05; done").check()
    answered = len(camera.read_file("/run/answered").splitlines())
    assert WRITES // 2 <= answered < WRITES, "the writes must still be going on"
    camera.cut_power()
    (count,) = ask(camera, "ReadBootblockParam", "COUNT")
    assert answered <= int(count) <= WRITES
    assert by_the_tool(camera, "COUNT") == count
    for name, value in FACTORY_PARAMETERS.items():
        assert by_the_tool(camera, name) == value
        assert ask(camera, "ReadBootblockParam", name) == (value,)
    assert ask(camera, "ReadSerno") == (FACTORY_PARAMETERS["SERNO"],)
    ask(camera, "AddBootblockParam", "COUNT", "0")
    assert by_the_tool(camera, "COUNT") == "0"
