"""tests/bus/test_privanectl_output.py: how the client prints, what it says of errors, and how it
ends."""
import json
import os
import re
import signal
import subprocess
import time
from pathlib import Path

import pytest

from harness.bus import Bus
from harness.deadline import wait_for
from harness.device import LLDPCLI, Device
from harness.fake_authz import FakeAuthz
from harness.privanectl import (DONE, PROGRAM, Run, Terminal, failed, on_terminal, privanectl,
                                surroundings, wrong_usage)
from harness.sandbox import start_bus
from harness.service import Service
from harness.stage import Stage

ESCAPE = "\x1b"

# What GDBus waits where nobody says how long.
GDBUS_SECONDS = 25


def test_title_is_underlined_on_a_terminal_only(service: Service) -> None:
    plain = privanectl("group", "list", "--names").output

    assert plain.startswith("NAME\nroot\n") and ESCAPE not in plain
    assert on_terminal("group", "list", "--names").output == plain.replace(
        "NAME\n", "\x1b[4mNAME\x1b[0m\n", 1)
    for environment in ({"TERM": "dumb"}, {"NO_COLOR": "1"}):
        assert on_terminal("group", "list", "--names", **environment).output == plain
    assert ESCAPE not in on_terminal("group", "list", "--no-legend").output


def test_control_characters_are_shown_on_a_terminal(system: Stage, device: Device) -> None:
    text = "a\x1b[31mb\u009bc\u202ed\x07\n\te\n"
    device.tools[LLDPCLI].print(text)

    assert privanectl("lldp", "neighbors").output == text
    assert on_terminal("lldp", "neighbors").output == (
        "a\\x1b[31mb\\x9bc\\u202ed\\x07\n\te\n")
    device.boot.hold("line\nor two\x1b")
    assert privanectl("boot", "get", "COLOR").output == "line\nor two\x1b\n"
    assert on_terminal("boot", "get", "COLOR").output == "line\\x0aor two\\x1b\n"
    assert privanectl("serial", "-j").json == {"serial": "line\nor two\x1b"}


def test_control_characters_in_a_record_and_an_error(accounts: object, service: Service,
                                                     authz: FakeAuthz) -> None:
    authz.refuse("first\nprivanectl: second\x1b[2J\n")

    assert privanectl("user", "check", "x") == failed(
        r"Authorization check failed: first\x0aprivanectl: second\x1b[2J (fake-authz 42)")


def test_domain_of_an_error_may_have_any_characters(service: Service, authz: FakeAuthz) -> None:
    authz.refuse("no", "odd.domain-of_others", 0)

    assert privanectl("serial") == failed(
        "Authorization check failed: no (odd.domain-of_others 0)")


def test_json_is_pretty_on_a_terminal_with_j(service: Service) -> None:
    short = '{"exists":true}\n'
    pretty = '{\n  "exists" : true\n}\n'
    words = ("user", "check", "root")

    assert privanectl(*words, "-j").output == short
    assert on_terminal(*words, "-j").output == pretty
    for run in (privanectl, on_terminal):
        assert run(*words, "--json=short").output == short
        assert run(*words, "--json=pretty").output == pretty
        assert run(*words, "--json=off").output == "yes\n"
        assert run(*words, "-j", "--json=off").output == "yes\n"


@pytest.mark.parametrize("words, text", [
    ((), "no command; privanectl --help lists all"),
    (("frobnicate",), "unknown command 'frobnicate'; privanectl --help lists all"),
    (("user",), "'user' needs a verb; privanectl user --help lists them"),
    (("user", "frob"), "unknown verb 'frob' of 'user'; privanectl user --help lists them"),
    (("user", "show"), "usage: privanectl user show NAME"),
    (("user", "show", "a", "b"), "usage: privanectl user show NAME"),
    (("serial", "x"), "usage: privanectl serial"),
    (("digest", "delete"), "usage: privanectl digest delete NAME [NAME...]"),
    (("user", "add", "x"), "'user add' needs --group"),
    (("user", "list", "--uid=3"), "'user list' takes no --uid"),
    (("user", "add", "x", "--system", "--uid=3", "--group=y"),
     "'user add' takes no --uid with --system"),
    (("serial", "--frob"), "unknown option --frob"),
    (("serial", "-x"), "unknown option -x"),
    (("serial", "--timeout"), "option --timeout needs a value"),
    (("serial", "--no-legend=1"), "option --no-legend takes no value"),
    (("serial", "--json=xml"), "--json takes short, pretty or off, not 'xml'"),
    (("serial", "--timeout=1x"), "--timeout takes a number of seconds up to 86400, not '1x'"),
    (("serial", "--timeout=-1"), "--timeout takes a number of seconds up to 86400, not '-1'"),
    (("user", "passwd", "x", "--password-fd=x"),
     "--password-fd takes a number, not 'x'"),
    (("user", "passwd", "x", "--password-fd=-1"), "--password-fd takes a number, not '-1'"),
    # These would ask for a password first, if they were looked at where they are used.
    (("user", "add", "x", "--group=y", "--uid=2a"), "--uid takes a number, not '2a'"),
    (("user", "add", "x", "--group=y", "--groups=,"), "--groups=, names no group"),
    (("digest", "set", "a:b"), "no web login can be named 'a:b'"),
    (("user", "modify", "x", "--groups=,,"), "--groups=,, names no group"),
    (("digest", "delete", "x", "a:PRIVANE"), "no web login can be named 'a:PRIVANE'"),
    (("digest", "delete", "a\nb"), "no web login can be named 'a\\x0ab'"),
    (("clock", "set", "@-2147483648.5"),
     "'@-2147483648.5' is no time; write \"2026-01-31 23:59:59\" or @SECONDS"),
    (("user", "modify", "x", "--password-fd=0", "--ask-password"),
     "--ask-password and --password-fd exclude each other"),
    (("user", "show", b"\xff"), "'\ufffd' is no UTF-8"),
])
def test_usage_errors(words: tuple[str | bytes, ...], text: str, service: Service,
                      authz: FakeAuthz) -> None:
    authz.forget()

    assert privanectl(*words) == wrong_usage(text)
    assert authz.checks() == []


def test_version() -> None:
    run = privanectl("--version")

    assert (run.status, run.errors) == (DONE, "")
    assert re.fullmatch(r"privanectl \d+\.\d+\.\d+\n", run.output)


def test_service_that_is_not_there() -> None:
    assert privanectl("serial") == failed(
        "The name com.zintor.PrivaneSystem was not provided by any .service files "
        "(org.freedesktop.DBus.Error.ServiceUnknown)")


def test_bus_that_is_not_there() -> None:
    run = privanectl("serial", "--address=unix:path=/missing")

    assert run == failed(
        "Cannot reach the bus: Could not connect: No such file or directory (g-io-error-quark 1)")


def test_address_is_that_of_another_bus(service: Service, tmp_path: Path) -> None:
    address = f"unix:path={tmp_path}/bus"
    other = start_bus(address)
    try:
        wait_for("the other bus", (tmp_path / "bus").exists)
        assert privanectl("serial", f"--address={address}").errors.endswith(
            "(org.freedesktop.DBus.Error.ServiceUnknown)\n")
        assert privanectl("user", "check", "root", "--address",
                          "unix:path=/run/dbus/system_bus_socket").output == "yes\n"
    finally:
        other.terminate()
        other.wait(5)


def test_timeout(service: Service) -> None:
    os.kill(service.pid, signal.SIGSTOP)
    begin = time.monotonic()
    try:
        assert privanectl("serial", "--timeout=1") == failed(
            "Timeout was reached (g-io-error-quark 24)")
        assert 1 <= time.monotonic() - begin < GDBUS_SECONDS
    finally:
        os.kill(service.pid, signal.SIGCONT)
    assert privanectl("user", "check", "root", "--timeout=0").output == "yes\n"


def test_output_that_cannot_be_written_is_a_failure(service: Service) -> None:
    with open("/dev/full", "wb") as full:
        ended = subprocess.run([PROGRAM, "user", "list"], stdout=full, stderr=subprocess.PIPE,
                               env=surroundings(), check=False)

    assert (ended.returncode, ended.stderr) == (
        1, b"privanectl: Cannot write to standard output: No space left on device\n")


class Monitor:
    """privanectl monitor, which has said that it waits."""

    def __init__(self, *words: str) -> None:
        self.process = subprocess.Popen([PROGRAM, "monitor", *words], env=surroundings(),
                                        stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
        assert self.process.stderr is not None and self.process.stdout is not None
        self.output = self.process.stdout
        self.told = self.process.stderr.readline()

    def end(self, number: signal.Signals) -> tuple[int, str]:
        self.process.send_signal(number)
        rest, _ = self.process.communicate(timeout=60)
        return self.process.returncode, rest


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM])
def test_monitor_prints_signals_as_they_come(number: signal.Signals, stage: Stage) -> None:
    monitor = Monitor()
    assert monitor.told == ("Waiting for announcements of com.zintor.PrivaneSystem; "
                            "Ctrl-C ends this.\n")
    for _ in range(2):
        stage.succeed("RtspreadConfig")
        assert re.fullmatch(r"\d{4}-\d\d-\d\d \d\d:\d\d:\d\d UserDatabaseUpdated\n",
                            monitor.output.readline())
    stage.restart()
    stage.succeed("RtspreadConfig")
    assert monitor.output.readline().endswith(" UserDatabaseUpdated\n")
    assert monitor.end(number) == (0, "")


def test_monitor_in_json(stage: Stage) -> None:
    monitor = Monitor("--json=short")
    stage.succeed("RtspreadConfig")
    row = json.loads(monitor.output.readline())
    assert set(row) == {"signal", "time"} and row["signal"] == "UserDatabaseUpdated"
    assert re.fullmatch(r"\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.?\d*Z", row["time"])
    assert monitor.end(signal.SIGTERM) == (0, "")


def test_monitor_of_a_bus_that_goes(tmp_path: Path) -> None:
    address = f"unix:path={tmp_path}/bus"
    other = start_bus(address)
    wait_for("the other bus", (tmp_path / "bus").exists)
    monitor = Monitor(f"--address={address}")
    other.terminate()
    other.wait(5)
    _, errors = monitor.process.communicate(timeout=60)
    assert (monitor.process.returncode, errors) == (1, "privanectl: The bus has gone\n")


def test_monitor_without_its_legend(stage: Stage, bus: Bus) -> None:
    terminal = Terminal("monitor", "--no-legend")
    try:
        def announced() -> bool:
            stage.succeed("RtspreadConfig")
            terminal.read(0.05)
            return bool(terminal.shown)
        wait_for("an announcement", announced, 60)
        terminal.process.terminate()
        assert terminal.wait() == 0
        assert all(line.endswith(" UserDatabaseUpdated") for line in terminal.shown.splitlines())
    finally:
        terminal.close()


def test_run_of_nothing_but_words(service: Service) -> None:
    assert privanectl("user", "check", "--", "--help") == Run(DONE, "no\n", "")
