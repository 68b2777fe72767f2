"""tests/device/test_reboot.py: Reboot, and the factory resets that UpdateReleaseFile arms."""
import pytest
from calls import BusError, ask, wait_for_owner
from camera.bus_call import PRIVANE_ERROR
from camera.machine import Camera
from camera.transcript import sync_journal

BOOT_ID = "/proc/sys/kernel/random/boot_id"
RESETS = "/var/lib/sysflash/resets"


@pytest.mark.parametrize("text, resets", [
    (None, ""),
    ("upgrade SOFT_RESET now", "soft\n"),
    ("SOFT_RESET ONVIF_HARD_RESET", "onvifhard\n"),
])
def test_the_camera_reboots_with_the_reset_that_was_asked_for(camera: Camera, text: str | None,
                                                              resets: str) -> None:
    first = camera.read_file(BOOT_ID)
    if text is not None:
        assert ask(camera, "UpdateReleaseFile", text) == ()
    assert ask(camera, "Reboot") == (0,)
    camera.wait_for_reboot()
    assert camera.read_file(BOOT_ID) != first
    assert camera.run(f"cat {RESETS} 2>/dev/null").out == resets
    assert wait_for_owner(camera) > 0


def test_a_reset_is_forgotten_after_its_reboot_failed(camera: Camera) -> None:
    """The tool's raw wait status is the answer; exit 3 stands in bits 8 to 15."""
    camera.put_file("/usr/sbin/sysflash", b"#!/bin/sh\nlogger -t sysflash -- \"$*\"\nexit 3\n", 0o755)
    ask(camera, "UpdateReleaseFile", "SOFT_RESET")
    assert ask(camera, "Reboot") == (3 << 8,)
    assert ask(camera, "Reboot") == (3 << 8,)
    sync_journal(camera)
    said = camera.run(["journalctl", "-t", "sysflash", "-o", "cat"]).check().out
    assert said == "factorydefault soft\nreboot\n"


def test_without_the_tool(camera: Camera) -> None:
    camera.run(["rm", "/usr/sbin/sysflash"]).check()
    assert ask(camera, "Reboot") == (-1,)


def test_a_text_without_a_reset_is_refused(camera: Camera) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, "UpdateReleaseFile", "soft_reset")
    assert (caught.value.name, caught.value.text) == (f"{PRIVANE_ERROR}25", "Unknown")
