"""tests/bus/test_diagnostics.py: the methods that run a diagnostic tool with whitelisted words."""
import signal

import pytest

from harness.bus import BusError, domain_error, error_of
from harness.device import (ETHTOOL, LLDPCLI, NETSTAT, SMARTCTL, Device, answered, asked, failed)
from harness.fake_authz import FakeAuthz
from harness.stage import Effects, Stage

LLDPCLI_CALLS = {"show-neighbors": (LLDPCLI, "show", "neighbors", "details"),
                 "show-interfaces": (LLDPCLI, "show", "interfaces", "details")}
NETSTAT_CALLS = {"all": (NETSTAT, "-Wnap"), "tcp-udp": (NETSTAT, "-Wnutp")}

# Methods whose failing tool answers with its error text: its tool, arguments and vector.
TELLING = {"ExecuteLldpcli": (LLDPCLI, ("show-neighbors",), LLDPCLI_CALLS["show-neighbors"]),
           "ExecuteEthtool": (ETHTOOL, ("d", "eth0"), (ETHTOOL, "-d", "eth0"))}

SMARTCTL_CALL = (SMARTCTL, "--all", "/dev/sda")

every_telling_method = pytest.mark.parametrize("member", TELLING)


def smartctl(device: str) -> Effects:
    return answered("", calls=((SMARTCTL, "--all", device),))


def ethtool(interface: str) -> Effects:
    return answered("", calls=((ETHTOOL, "-d", interface),))


@pytest.mark.parametrize("command", LLDPCLI_CALLS)
def test_lldpcli_command_selects_a_whole_vector(command: str, system: Stage, device: Device,
                                                authz: FakeAuthz) -> None:
    authz.forget()
    device.tools[LLDPCLI].print("Interface: eth0\n")

    assert system.call("ExecuteLldpcli", command) == answered(
        "Interface: eth0\n", calls=(LLDPCLI_CALLS[command],))
    assert asked(authz) == ["executelldpcli"]


@pytest.mark.parametrize("command", ["", "show", "neighbors", "show neighbors", "show-neighbor",
                                     "show-neighbors ", "Show-Neighbors", "-show-neighbors",
                                     "show-neighborsx", "configure", "show-chassis", "--help"])
def test_another_lldpcli_command_is_refused(command: str, system: Stage) -> None:
    assert system.call("ExecuteLldpcli", command) == failed(
        37, f"Command not supported by Privane: {command}")


@every_telling_method
def test_clean_exit_answers_with_standard_output(member: str, system: Stage,
                                                 device: Device) -> None:
    tool, arguments, call = TELLING[member]
    device.tools[tool].print("an answer\n")
    device.tools[tool].print_error("a remark\n")

    assert system.call(member, *arguments) == answered("an answer\n", calls=(call,))


@every_telling_method
@pytest.mark.parametrize("status", [1, 2, 75, 128, 255])
def test_failing_tool_answers_with_standard_error(status: int, member: str, system: Stage,
                                                  device: Device) -> None:
    tool, arguments, call = TELLING[member]
    device.tools[tool].print("half an answer\n")
    device.tools[tool].print_error("no such thing\n")
    device.tools[tool].exit_with(status)

    assert system.call(member, *arguments) == answered("no such thing\n", calls=(call,))


@every_telling_method
def test_killed_tool_answers_with_standard_error(member: str, system: Stage,
                                                 device: Device) -> None:
    tool, arguments, call = TELLING[member]
    device.tools[tool].before_answering("echo half; echo last words >&2; kill -KILL $PPID")

    assert system.call(member, *arguments) == answered("last words\n", calls=(call,))


@every_telling_method
def test_failing_tool_that_says_nothing_answers_with_nothing(member: str, system: Stage,
                                                             device: Device) -> None:
    tool, arguments, call = TELLING[member]
    device.tools[tool].print("half an answer\n")
    device.tools[tool].exit_with(1)

    assert system.call(member, *arguments) == answered("", calls=(call,))


def test_smartctl_runs_on_the_device(system: Stage, device: Device, authz: FakeAuthz) -> None:
    authz.forget()
    device.tools[SMARTCTL].print("PASSED\n")

    assert system.call("ExecuteSmartctl", "all", "/dev/sda") == answered(
        "PASSED\n", calls=(SMARTCTL_CALL,))
    assert asked(authz) == ["executesmartctl"]


@pytest.mark.parametrize("name", ["/dev/sda", "/dev/sda1", "/dev/sdaaa", "/dev/sd9", "/dev/sd",
                                  "/dev/sdz99"])
def test_disk_is_accepted(name: str, system: Stage) -> None:
    assert system.call("ExecuteSmartctl", "all", name) == smartctl(name)


@pytest.mark.parametrize("name", [
    "/dev/sdA", "/dev/nvme0", "/dev/sdaaaa", "/dev/sdaaa1", "", "/dev/s", "sda", "dev/sda",
    "/DEV/SDA", " /dev/sda", "/dev/sda ", "/dev/sd!", "/dev/sd/..", "/dev/sd-a", "/dev/sd.a",
    "/dev/sd\n", "/dev/sdé", "/dev/hda", "/dev//sda", "-d", "--all", "x/dev/sda"])
def test_another_device_is_refused(name: str, system: Stage) -> None:
    assert system.call("ExecuteSmartctl", "all", name) == failed(
        36, f"Device not supported by Privane: {name}")


@pytest.mark.parametrize("flag", ["", "a", "ALL", "all ", "--all", "-a", "allx", "health"])
def test_another_flag_of_smartctl_is_refused_before_the_device(flag: str, system: Stage) -> None:
    for name in ("/dev/sda", "/dev/nvme0"):
        assert system.call("ExecuteSmartctl", flag, name) == failed(
            36, f"Flag not supported by Privane: {flag}")


@pytest.mark.parametrize("status", [1, 4, 64, 255])
def test_findings_of_smartctl_are_answered_whatever_its_status(status: int, system: Stage,
                                                               device: Device) -> None:
    device.tools[SMARTCTL].print("FAILING\n")
    device.tools[SMARTCTL].print_error("not shown\n")
    device.tools[SMARTCTL].exit_with(status)

    assert system.call("ExecuteSmartctl", "all", "/dev/sda") == answered(
        "FAILING\n", calls=(SMARTCTL_CALL,))


def test_killed_smartctl_answers_with_what_it_printed(system: Stage, device: Device) -> None:
    device.tools[SMARTCTL].before_answering("echo half; kill -KILL $PPID")

    assert system.call("ExecuteSmartctl", "all", "/dev/sda") == answered(
        "half\n", calls=(SMARTCTL_CALL,))


def test_ethtool_runs_on_the_interface(system: Stage, device: Device, authz: FakeAuthz) -> None:
    authz.forget()
    device.tools[ETHTOOL].print("registers\n")

    assert system.call("ExecuteEthtool", "d", "eth0") == answered(
        "registers\n", calls=((ETHTOOL, "-d", "eth0"),))
    assert asked(authz) == ["executeethtool"]


@pytest.mark.parametrize("name", ["eth0", "br0", "wlan0", "wlan10", "eth", "br", "wlan", "bridge",
                                  "eth999", "brbrbr"])
def test_interface_is_accepted(name: str, system: Stage) -> None:
    assert system.call("ExecuteEthtool", "d", name) == ethtool(name)


@pytest.mark.parametrize("name", [
    "eth0.1", "ETH0", "Eth0", "eth0A", "bridge1", "wlan100", "eth0000", "", "e", "et", "b", "wla",
    "lo", "0eth", "xeth0", "-d", "eth-0", "eth!", "eth ", "eth\n", "br_0", "ethé", "eth0 -s",
    "eth0;"])
def test_another_interface_is_refused(name: str, system: Stage) -> None:
    assert system.call("ExecuteEthtool", "d", name) == failed(
        35, f"Interface not supported by Privane: {name}")


@pytest.mark.parametrize("flag", ["", "D", "-d", "dd", "d ", "s", "e"])
def test_another_flag_of_ethtool_is_refused_before_the_interface(flag: str, system: Stage) -> None:
    for name in ("eth0", "eth0.1"):
        assert system.call("ExecuteEthtool", flag, name) == failed(
            35, f"Flag not supported by Privane: {flag}")


@pytest.mark.parametrize("mode", NETSTAT_CALLS)
def test_netstat_mode_selects_an_option_and_an_action(mode: str, system: Stage, device: Device,
                                                      authz: FakeAuthz) -> None:
    authz.forget()
    device.tools[NETSTAT].print("tcp 0 0\n")
    device.tools[NETSTAT].print_error("not shown\n")

    assert system.call("GetActiveNetworkInfo", mode) == answered(
        "tcp 0 0\n", calls=(NETSTAT_CALLS[mode],))
    assert asked(authz) == [f"getactivenetworkinfo.{mode}"]


@pytest.mark.parametrize("mode", ["udp", "tcp", "", "ALL", "all ", "tcp-udp,all", "-Wnap", "allx",
                                  "tcp_udp"])
def test_another_mode_is_refused_before_any_authorization(mode: str, system: Stage,
                                                          authz: FakeAuthz) -> None:
    assert system.call("GetActiveNetworkInfo", mode) == failed(28, f"Invalid mode: {mode}")

    authz.refuse("not for you")
    authz.forget()
    assert error_of(system.bus.call, "GetActiveNetworkInfo", "s", mode) == domain_error(
        "privaneSystemError", 28, f"Invalid mode: {mode}")
    assert authz.checks() == []


@pytest.mark.parametrize("status", [1, 2, 75, 255])
def test_failing_netstat_is_an_error_with_its_exit_code(status: int, system: Stage,
                                                        device: Device) -> None:
    device.tools[NETSTAT].print("half an answer\n")
    device.tools[NETSTAT].exit_with(status)

    assert system.call("GetActiveNetworkInfo", "all") == failed(
        28, f"netstat call failed with code: {status}", NETSTAT_CALLS["all"])


@pytest.mark.parametrize("number", [signal.SIGTERM, signal.SIGKILL], ids=lambda s: s.name)
def test_killed_netstat_is_an_error_with_code_0(number: signal.Signals, system: Stage,
                                                device: Device) -> None:
    device.tools[NETSTAT].before_answering(f"echo half; kill -{int(number)} $PPID")

    assert system.call("GetActiveNetworkInfo", "tcp-udp") == failed(
        28, "netstat call failed with code: 0", NETSTAT_CALLS["tcp-udp"])


@pytest.mark.parametrize("member, arguments, action", [
    ("ExecuteLldpcli", ("nonsense",), "executelldpcli"),
    ("ExecuteSmartctl", ("nonsense", "nonsense"), "executesmartctl"),
    ("ExecuteEthtool", ("nonsense", "nonsense"), "executeethtool")])
def test_words_are_looked_at_after_the_authorization(
        member: str, arguments: tuple[str, ...], action: str, system: Stage,
        authz: FakeAuthz) -> None:
    authz.refuse("not for you")
    authz.forget()

    assert error_of(system.bus.call, member, "s" * len(arguments), *arguments) == domain_error(
        "fake-authz", 42, "Authorization check failed: not for you")
    assert asked(authz) == [action]


def test_refused_word_leaves_the_next_call_as_it_is(system: Stage) -> None:
    assert isinstance(system.call("ExecuteEthtool", "d", "eth0.1").answer, BusError)

    assert system.call("ExecuteEthtool", "d", "eth0") == ethtool("eth0")
