"""tests/bus/test_reboot.py: the methods that restart the device and reset it to its defaults."""
import signal

import pytest

from harness.bus import domain_error, error_of
from harness.device import SYSFLASH, Device, answered, asked
from harness.fake_authz import FakeAuthz
from harness.stage import Effects, Stage

PLAIN = (SYSFLASH, "reboot")
HARD = (SYSFLASH, "factorydefault", "onvifhard")
SOFT = (SYSFLASH, "factorydefault", "soft")

# A failure that has no error to tell, and logs nothing.
UNKNOWN = domain_error("privaneSystemError", 25, "Unknown")
NOTHING_ARMED = Effects(UNKNOWN, ["error"])

NO_SYSFLASH = ("warning: Failed to call sysflash: Failed to execute child process "
               "“/sbin/sysflash” (No such file or directory)")


def rebooted(call: tuple[str, ...]) -> Effects:
    return answered(0, calls=(call,))


def arm(system: Stage, text: str) -> None:
    assert system.call("UpdateReleaseFile", text) == answered()


def test_reboot_is_plain_at_the_start(system: Stage, authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call("Reboot") == rebooted(PLAIN)
    assert asked(authz) == ["reboot"]


def test_arming_asks_for_its_own_action_and_runs_nothing(system: Stage, authz: FakeAuthz) -> None:
    authz.forget()

    assert system.call("UpdateReleaseFile", "SOFT_RESET") == answered()
    assert asked(authz) == ["updatereleasefile"]


@pytest.mark.parametrize("text, call", [
    ("ONVIF_HARD_RESET", HARD),
    ("SOFT_RESET", SOFT),
    ("RESET=ONVIF_HARD_RESET\n", HARD),
    ("xSOFT_RESETx", SOFT),
    ("a line\n" * 1000 + "ONVIF_HARD_RESET", HARD),
    ("ONVIF_HARD_RESET SOFT_RESET", HARD),
    ("SOFT_RESET ONVIF_HARD_RESET", HARD),
    ("HARD_RESET SOFT_RESET", SOFT),
    ("ONVIF_SOFT_RESET", SOFT),
])
def test_text_arms_the_next_reboot_and_only_that(text: str, call: tuple[str, ...],
                                                 system: Stage) -> None:
    arm(system, text)

    assert system.call("Reboot") == rebooted(call)
    assert system.call("Reboot") == rebooted(PLAIN)


@pytest.mark.parametrize("text", ["", "soft_reset", "SOFT RESET", "SOFT_RESE", "HARD_RESET",
                                  "ONVIF_HARD_RESE", "SOFT_\nRESET", "onvif_hard_reset"])
def test_text_without_a_word_is_unknown_and_leaves_the_mode(text: str, system: Stage) -> None:
    assert system.call("UpdateReleaseFile", text) == NOTHING_ARMED
    assert system.call("Reboot") == rebooted(PLAIN)

    arm(system, "SOFT_RESET")
    assert system.call("UpdateReleaseFile", text) == NOTHING_ARMED
    assert system.call("Reboot") == rebooted(SOFT)


@pytest.mark.parametrize("first, second, call", [
    ("ONVIF_HARD_RESET", "SOFT_RESET", SOFT), ("SOFT_RESET", "ONVIF_HARD_RESET", HARD)])
def test_later_text_overwrites_the_mode(first: str, second: str, call: tuple[str, ...],
                                        system: Stage) -> None:
    arm(system, first)
    arm(system, second)

    assert system.call("Reboot") == rebooted(call)


def test_mode_does_not_survive_a_restart_of_the_service(system: Stage) -> None:
    arm(system, "ONVIF_HARD_RESET")
    system.restart()

    assert system.call("Reboot") == rebooted(PLAIN)


def test_refused_text_arms_nothing(system: Stage, authz: FakeAuthz) -> None:
    authz.refuse_silently()
    assert error_of(system.bus.call, "UpdateReleaseFile", "s", "ONVIF_HARD_RESET") == UNKNOWN
    authz.allow()

    assert system.call("Reboot") == rebooted(PLAIN)


def test_refused_reboot_runs_nothing_and_stays_armed(system: Stage, device: Device,
                                                     authz: FakeAuthz) -> None:
    arm(system, "SOFT_RESET")
    authz.refuse_silently()
    assert error_of(system.bus.call, "Reboot") == UNKNOWN
    assert device.tools[SYSFLASH].calls() == []
    authz.allow()

    assert system.call("Reboot") == rebooted(SOFT)


@pytest.mark.parametrize("status, told", [(1, 256), (2, 512), (255, 65280)])
def test_exit_status_is_told_as_the_raw_wait_status(status: int, told: int, system: Stage,
                                                    device: Device) -> None:
    device.tools[SYSFLASH].exit_with(status)
    arm(system, "SOFT_RESET")

    assert system.call("Reboot") == answered(told, calls=(SOFT,))
    assert system.call("Reboot") == answered(told, calls=(PLAIN,))


@pytest.mark.parametrize("number", [signal.SIGTERM, signal.SIGKILL], ids=lambda s: s.name)
def test_signal_is_told_as_the_raw_wait_status(number: signal.Signals, system: Stage,
                                               device: Device) -> None:
    device.tools[SYSFLASH].before_answering(f"kill -{int(number)} $PPID")

    assert system.call("Reboot") == answered(int(number), calls=(PLAIN,))


def test_tool_that_is_not_there_is_no_error_and_disarms(system: Stage, device: Device) -> None:
    arm(system, "ONVIF_HARD_RESET")
    sysflash = device.tools[SYSFLASH]
    content = sysflash.path.read_bytes()
    sysflash.remove()

    assert system.call("Reboot") == answered(-1, output=(NO_SYSFLASH,))

    sysflash.path.write_bytes(content)
    sysflash.path.chmod(0o755)
    assert system.call("Reboot") == rebooted(PLAIN)


def test_what_the_tool_prints_goes_where_the_service_prints(system: Stage, device: Device) -> None:
    device.tools[SYSFLASH].print("going down\n")
    device.tools[SYSFLASH].print_error("now\n")

    assert system.call("Reboot") == answered(0, calls=(PLAIN,), output=("going down", "now"))
