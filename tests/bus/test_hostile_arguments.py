"""tests/bus/test_hostile_arguments.py: generated arguments of callers who mean harm.

Nothing but whitelisted vectors may be executed, nothing but checked names may reach systemd, and
pinsrv alone gets a caller's words, byte for byte.
"""
import random
import re
from pathlib import Path
from typing import Callable

import pytest

from harness import process
from harness.bus import Bus, BusError, domain_error, error_of
from harness.device import (ETHTOOL, LLDPCLI, NETSTAT, PINSRV, SMARTCTL, SYSFLASH,
                            TIME_SYNC_HOOK, TOOLS, Device)
from harness.fake_authz import FakeAuthz
from harness.stage import Stage
from harness.strace import Attached

SEED = 20

UNIT_NAMES = 2000  # for each of the five methods
TRACED_WORDS = 200
RUNNER_WORDS = 1200  # for each of the four methods; the two with two words take as many pairs
PINSRV_CALLS, PINSRV_WORDS = 380, 100

UNIT_METHODS = {
    "StartService": ("startservice", "StartUnit", ".service"),
    "StopService": ("stopservice", "StopUnit", ".service"),
    "RestartService": ("restartservice", "RestartUnit", ".service"),
    "ReloadService": ("reloadservice", "ReloadUnit", ".service"),
    "SetDefaultTarget": ("setdefaulttarget", "SetDefaultTarget", ".target"),
}

FRAGMENTS = (
    "", " ", "-", "--", "-x", "--help", ";", "&&", "|", "||", ">", "<", "`", "$(", ")", "$IFS",
    "'", '"', "\\", "\n", "\r\n", "\t", "\x01", "\x1b[2J", "\x7f", "*", "?", "[a]", "~", "#", "!",
    "%s", "%n", "%00", "../", "..", "/", "//", "/etc/passwd", "/dev/sd", "sda", "sda1", "eth",
    "eth0", "br", "wlan", "all", "tcp-udp", "show-neighbors", "show-interfaces", "d", "foo", "a",
    "0", "@", "getty@tty1", ".service", ".target", ".", "_", ":", "=", "é", "\u00a0", "\u202e",
    "\ufeff", "\uffff", "\U0001f4a3", "A", "Z",
)
NAME_CHARACTERS = "abcdefghijklmnopqrstuvwxyz0123456789"


class Generator:
    """Words of which some are valid, some nearly so, and the others as odd as the bus takes."""

    def __init__(self) -> None:
        print(f"seed {SEED}")
        self._random = random.Random(SEED)

    def word(self, *valid: str) -> str:
        choice = self._random.random()
        if valid and choice < 0.15:
            return self._random.choice(valid)
        if valid and choice < 0.4:
            return self._changed(self._random.choice(valid))
        if choice < 0.5:
            return self._name()
        if choice < 0.52:
            return self._random.choice(FRAGMENTS) * self._random.randint(1, 2000)
        return "".join(self._random.choices(FRAGMENTS, k=self._random.randint(0, 5)))

    def _name(self) -> str:
        return "".join(self._random.choices(NAME_CHARACTERS + "-@", k=self._random.randint(0, 70)))

    def _changed(self, word: str) -> str:
        position = self._random.randint(0, len(word))
        return (word[:position] + self._random.choice(FRAGMENTS)
                + word[position + self._random.randint(0, 1):])


def attempt(bus: Bus, member: str, *arguments: str) -> bool:
    """Whether the call was answered without an error."""
    try:
        bus.call(member, "s" * len(arguments), *arguments)
    except BusError:
        return False
    return True


def action_of(unit: str) -> str:
    template, at, _ = unit.partition("@")
    return f"{template}.any" if at else unit


def is_unit_name(name: str) -> bool:
    return re.fullmatch(r"[-a-z0-9@]{0,64}", name) is not None


@pytest.mark.parametrize("member", UNIT_METHODS)
def test_only_checked_names_reach_systemd(member: str, system: Stage, device: Device,
                                          authz: FakeAuthz) -> None:
    generator = Generator()
    action, call, suffix = UNIT_METHODS[member]
    flag = "True" if call == "SetDefaultTarget" else "replace"
    signature = "sb" if call == "SetDefaultTarget" else "ss"
    names = [generator.word("foo", "getty@tty1", "a" * 64, "a" * 65) for _ in range(UNIT_NAMES)]
    accepted = [name for name in names if is_unit_name(name)]
    assert UNIT_NAMES // 10 < len(accepted) < UNIT_NAMES // 2
    authz.forget()

    assert [name for name in names if attempt(system.bus, member, name)] == accepted

    assert [made.words for made in device.systemd.calls()] == [
        (call, signature, name + suffix, flag) for name in accepted]
    assert [check.action for check in authz.checks()] == [
        f"com.zintor.privane-system.{action}.{action_of(name)}" for name in accepted]
    assert not any(device.tools[path].calls() for path in TOOLS)


def lldpcli(command: str) -> tuple[str, ...] | None:
    return {"show-neighbors": (LLDPCLI, "show", "neighbors", "details"),
            "show-interfaces": (LLDPCLI, "show", "interfaces", "details")}.get(command)


def netstat(mode: str) -> tuple[str, ...] | None:
    return {"all": (NETSTAT, "-Wnap"), "tcp-udp": (NETSTAT, "-Wnutp")}.get(mode)


def smartctl(flag: str, disk: str) -> tuple[str, ...] | None:
    is_valid = flag == "all" and re.fullmatch(r"/dev/sd[a-z0-9]{0,3}", disk)
    return (SMARTCTL, "--all", disk) if is_valid else None


def ethtool(flag: str, interface: str) -> tuple[str, ...] | None:
    is_valid = flag == "d" and re.fullmatch(r"(?=.{0,6}\Z)(eth|br|wlan)[a-z0-9]*", interface)
    return (ETHTOOL, "-d", interface) if is_valid else None


Oracle = Callable[..., tuple[str, ...] | None]


@pytest.mark.parametrize("member, oracle, valid", [
    ("ExecuteLldpcli", lldpcli, (("show-neighbors", "show-interfaces"),)),
    ("GetActiveNetworkInfo", netstat, (("all", "tcp-udp"),)),
    ("ExecuteSmartctl", smartctl, (("all",), ("/dev/sda", "/dev/sda1", "/dev/sdaaa"))),
    ("ExecuteEthtool", ethtool, (("d",), ("eth0", "br0", "wlan0", "wlan10")))])
def test_only_whitelisted_vectors_are_executed(member: str, oracle: Oracle,
                                               valid: tuple[tuple[str, ...], ...],
                                               system: Stage, device: Device) -> None:
    generator = Generator()
    calls = [tuple(generator.word(*words) for words in valid) for _ in range(RUNNER_WORDS)]
    if len(valid) == 2:  # every other one with a good flag, else the name is hardly looked at
        calls[::2] = [(valid[0][0], name) for _, name in calls[::2]]
    expected = [vector for call in calls if (vector := oracle(*call)) is not None]
    assert RUNNER_WORDS // 30 < len(expected) < RUNNER_WORDS // 2

    for call in calls:
        assert attempt(system.bus, member, *call) is (oracle(*call) is not None), call

    executed = {path: [made.words for made in device.tools[path].calls()] for path in TOOLS}
    (tool,) = {vector[0] for vector in expected}
    assert executed == {path: expected if path == tool else [] for path in TOOLS}
    assert device.systemd.calls() == []


def test_no_program_runs_but_the_tool_of_the_method(system: Stage, tmp_path: Path) -> None:
    """Not a shell, and none of those that no stand-in takes the place of."""
    generator = Generator()
    vectors = []
    with Attached(system.service.pid, tmp_path / "trace", "execve") as trace:
        for _ in range(TRACED_WORDS):
            words = ("d", generator.word("eth0", "br0", "wlan0"))
            attempt(system.bus, "ExecuteEthtool", *words)
            vectors += [vector for vector in [ethtool(*words)] if vector is not None]
        system.bus.call("Pinsrv", "as", ["", "; /bin/sh", "$(id)"])
        vectors.append((PINSRV, "; /bin/sh", "$(id)"))

    made = [call.split(", 0x")[0] for call in trace.calls() if call.startswith("execve(")]
    assert made == [f'execve("{vector[0]}", [' + ", ".join(f'"{word}"' for word in vector) + "]"
                    for vector in vectors]
    assert TRACED_WORDS // 30 < len(vectors) < TRACED_WORDS // 2


def test_pinsrv_gets_the_words_byte_for_byte_and_nothing_else_runs(system: Stage,
                                                                   device: Device) -> None:
    generator = Generator()
    pinsrv = device.tools[PINSRV]
    seen = 0

    for _ in range(PINSRV_CALLS):
        words = [generator.word(PINSRV, SYSFLASH, TIME_SYNC_HOOK) for _ in range(PINSRV_WORDS)]
        (pid,) = system.bus.call("Pinsrv", "as", words)
        assert process.wait_for_child(pid, 5) == 0
        (made,) = pinsrv.calls()
        assert made.words == (PINSRV, *words[1:])
        seen += len(words)
        pinsrv.forget()

    assert seen == PINSRV_CALLS * PINSRV_WORDS
    assert not any(device.tools[path].calls() for path in TOOLS)
    assert device.systemd.calls() == []


@pytest.mark.parametrize("member, arguments, domain, code, text", [
    ("StartService", ("{}",), "privaneSystemError", 29, "Invalid unit '{}': Name too long"),
    ("GetActiveNetworkInfo", ("{}",), "privaneSystemError", 28, "Invalid mode: {}"),
    ("ExecuteLldpcli", ("{}",), "privaneSystemError", 37,
     "Command not supported by Privane: {}"),
    ("ExecuteSmartctl", ("all", "/dev/sd{}"), "privaneSystemError", 36,
     "Device not supported by Privane: /dev/sd{}"),
    ("ExecuteEthtool", ("d", "eth{}"), "privaneSystemError", 35,
     "Interface not supported by Privane: eth{}"),
    ("ReadLogFile", ("/{}",), "g-file-error-quark", 3,
     "Failed to open file “/{}”: File name too long")])
def test_huge_words_are_refused(member: str, arguments: tuple[str, ...], domain: str, code: int,
                                text: str, system: Stage, device: Device) -> None:
    def error(word: str) -> BusError:
        return error_of(system.bus.call, member, "s" * len(arguments),
                        *(argument.format(word) for argument in arguments), timeout=60)
    large, largest = "a" * ((4 << 20) - 1024), "a" * ((32 << 20) - 1024)

    assert error(large) == domain_error(domain, code, text.format(large))
    assert error(largest) == BusError("org.freedesktop.DBus.Error.LimitsExceeded",
                                      "The arguments of the call are too large")
    assert not any(device.tools[path].calls() for path in TOOLS)
    assert device.systemd.calls() == []


def test_so_many_words_are_generated() -> None:
    assert (UNIT_NAMES * len(UNIT_METHODS) + RUNNER_WORDS * (1 + 1 + 2 + 2)
            + PINSRV_CALLS * PINSRV_WORDS) >= 50_000
