"""tests/device/test_diagnostics.py: the diagnostic methods answer what the real tools print."""
import re

import pytest
from calls import BusError, ask
from camera.bus_call import PRIVANE_ERROR
from camera.machine import Camera


def printed(camera: Camera, *command: str) -> str:
    return camera.run(list(command)).out


def test_smartctl(camera: Camera) -> None:
    (answer,) = ask(camera, "ExecuteSmartctl", "all", "/dev/sda")
    timed = re.compile(r"^Local Time is:.*$", re.MULTILINE)
    assert timed.sub("", answer) == timed.sub("", printed(camera, "smartctl", "--all", "/dev/sda"))
    assert "SMART overall-health self-assessment test result: PASSED" in answer


def test_ethtool(camera: Camera) -> None:
    (answer,) = ask(camera, "ExecuteEthtool", "d", "eth0")
    # Some registers count what passes by; their names and the card's settings stay.
    names = [line.split(":")[0] for line in answer.splitlines()]
    assert names == [line.split(":")[0] for line in
                     printed(camera, "ethtool", "-d", "eth0").splitlines()]
    assert "MAC Registers" in answer and "CTRL (Device control register)" in answer


def test_an_interface_that_is_not_there_is_answered_with_the_tools_words(camera: Camera) -> None:
    assert ask(camera, "ExecuteEthtool", "d", "eth9") \
        == (camera.run(["ethtool", "-d", "eth9"]).err,)
    assert "No such device" in ask(camera, "ExecuteEthtool", "d", "eth9")[0]


def sockets(shown: str) -> set[tuple[str, ...]]:
    """What netstat says of each socket, without the numbers of queues and references."""
    lines = [line.split() for line in shown.splitlines()]
    return {(words[0], *words[3:]) for words in lines
            if words[0] in ("tcp", "tcp6", "udp", "udp6", "unix")}


@pytest.mark.parametrize("mode, option", [("tcp-udp", "-Wnutp"), ("all", "-Wnap")])
def test_netstat(camera: Camera, mode: str, option: str) -> None:
    camera.run("(exec 3<>/dev/tcp/127.0.0.1/80; sleep 60) >/dev/null 2>&1 &").check()
    camera.run("for try in {1..50}; do netstat -tn | grep -q ESTABLISHED && exit; sleep 0.1; done; "
               "exit 1").check()
    before = sockets(printed(camera, "netstat", option))
    (answer,) = ask(camera, "GetActiveNetworkInfo", mode)
    after = sockets(printed(camera, "netstat", option))
    assert re.search(r"^tcp .*127\.0\.0\.1:80 +ESTABLISHED +\d+/sleep", answer, re.MULTILINE)
    # Each look at them makes and closes some.
    assert before & after and before & after <= sockets(answer)
    assert ("Active UNIX domain sockets" in answer) == (mode == "all")


def test_lldpcli_without_its_daemon(camera: Camera) -> None:
    (answer,) = ask(camera, "ExecuteLldpcli", "show-neighbors")
    assert "unable to connect to socket" in answer


def test_lldpcli_sees_the_neighbour(camera: Camera) -> None:
    camera.run(["systemctl", "start", "lldp-neighbour", "lldpd"]).check()
    camera.run("for try in {1..120}; do lldpcli show neighbors | grep -q port7 && exit; sleep 0.5; "
               "done; exit 1", timeout=90).check()
    for what in ("neighbors", "interfaces"):
        (answer,) = ask(camera, "ExecuteLldpcli", f"show-{what}")
        expected = printed(camera, "lldpcli", "show", what, "details")
        age = re.compile(r"(Time: +|TTL: +).*")
        assert age.sub("", answer) == age.sub("", expected)
        assert re.search(r"Interface: +lan1", answer), what
    assert re.search(r"PortDescr: +port7", ask(camera, "ExecuteLldpcli", "show-neighbors")[0])


@pytest.mark.parametrize("method, arguments, code, text", [
    ("ExecuteSmartctl", ("all", "/dev/nvme0"), 36, "Device not supported by Privane: /dev/nvme0"),
    ("ExecuteEthtool", ("s", "eth0"), 35, "Flag not supported by Privane: s"),
    ("ExecuteLldpcli", ("configure",), 37, "Command not supported by Privane: configure"),
    ("GetActiveNetworkInfo", ("udp",), 28, "Invalid mode: udp"),
])
def test_what_is_not_on_the_list(camera: Camera, method: str, arguments: tuple[str, ...], code: int,
                                 text: str) -> None:
    with pytest.raises(BusError) as caught:
        ask(camera, method, *arguments)
    assert (caught.value.name, caught.value.text) == (f"{PRIVANE_ERROR}{code}", text)
