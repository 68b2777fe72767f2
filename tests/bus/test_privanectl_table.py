"""tests/bus/test_privanectl_table.py: the client's table of commands against the interface, the
manual page and the document; the shell's completion."""
import re
import subprocess
import xml.etree.ElementTree as ET
from pathlib import Path

import pytest
from gi.repository import GLib

from harness.fake_authz import FakeAuthz
from harness.fake_systemd import FakeSystemd
from harness.interface import METHODS
from harness.privanectl import (Run, Terminal, privanectl, surroundings, table, with_password,
                                wrong_usage)
from harness.service import Service

INTERFACE = Path("/usr/share/dbus-1/interfaces/com.zintor.PrivaneSystem.xml")
COMPLETION = Path("/usr/share/bash-completion/completions/privanectl")
MANUAL = Path("/usr/share/man/man1/privanectl.1")
DOCUMENT = Path(__file__).parents[2] / "docs" / "privanectl.md"

# For each row of the table what calls it, and the action of its method.
CALLS = {
    "user list": ("", "getuserlist"),
    "user show NAME": ("clerk", "getuser"),
    "user check NAME": ("clerk", "checkuser"),
    "user authenticate NAME [--password-fd=FD]": ("clerk", "authuserbasic"),
    "user add NAME [--ask-password | --password-fd=FD] --group=GROUP [--groups=GROUP,...] "
    "[--shell=PATH] [--comment=TEXT] --system": ("new --group=clerk --system", "adduser"),
    "user add NAME [--password-fd=FD] --group=GROUP [--groups=GROUP,...] [--comment=TEXT] "
    "--uid=UID": ("new --group=clerk --uid=1234", "adduiduser"),
    "user add NAME [--password-fd=FD] --group=GROUP [--groups=GROUP,...] [--comment=TEXT]":
        ("new --group=clerk", "adduser"),
    "user modify NAME [--ask-password | --password-fd=FD] [--group=GROUP] [--groups=GROUP,...] "
    "[--shell=PATH] [--comment=TEXT]": ("clerk", "modifyuser"),
    "user clear NAME [password] [groups] [comment]": ("clerk comment", "clearuserfields"),
    "user passwd NAME [--password-fd=FD]": ("clerk", "chpasswduser"),
    "user remove NAME": ("clerk", "removeuser"),
    "user announce": ("", "rtspreadconfig"),
    "group list --names": ("--names", "getgrouplist"),
    "group list": ("", "getgrouplistfull"),
    "group show NAME": ("clerk", "getgroup"),
    "group check NAME": ("clerk", "checkgroup"),
    "group add NAME": ("new", "addgroup"),
    "group remove NAME": ("clerk", "removegroup"),
    "digest list": ("", "getdigestlist"),
    "digest set NAME [--password-fd=FD]": ("clerk", "digest"),
    "digest import": ("", "digest"),
    "digest delete NAME [NAME...]": ("clerk", "digest"),
    "unit start UNIT": ("sshd", "startservice.sshd"),
    "unit stop UNIT": ("sshd", "stopservice.sshd"),
    "unit restart UNIT": ("sshd", "restartservice.sshd"),
    "unit reload UNIT": ("getty@tty1", "reloadservice.getty.any"),
    "default-target TARGET": ("rescue", "setdefaulttarget.rescue"),
    "ntp start": ("", "startntp"),
    "ntp stop": ("", "stopntp"),
    "ntp restart": ("", "restartntp"),
    "lensd start": ("", "startlensd"),
    "lensd stop": ("", "stoplensd"),
    "clock set TIME": ("@1", "settimeofday"),
    "clock adjust SECONDS": ("-1", "adjtime"),
    "clock synced": ("", "notifytimesync"),
    "net info [MODE]": ("", "getactivenetworkinfo.all"),
    "net speed": ("", "getnetworkspeedduplex"),
    "ethtool INTERFACE": ("eth0", "executeethtool"),
    "smart DEVICE": ("/dev/sda", "executesmartctl"),
    "lldp neighbors": ("", "executelldpcli"),
    "lldp interfaces": ("", "executelldpcli"),
    "boot get PARAMETER": ("COLOR", "readbootblockparam"),
    "boot set PARAMETER VALUE": ("COLOR blue", "addbootblockparam"),
    "serial": ("", "readserno"),
    "slabinfo": ("", "getslabinfo"),
    "log PATH": ("/etc/hostname", "readlogfile"),
    "pinsrv [ARGUMENT...]": ("", "pinsrv"),
    "reboot": ("", "reboot"),
    "reset arm KIND": ("soft", "updatereleasefile"),
}


def name_of(usage: str) -> list[str]:
    """Noun and verb: the lower-case words in front of the first that is an argument."""
    return re.match(r"[a-z-]+( [a-z]+)?(?=$| )", usage).group().split()


def test_every_method_can_be_reached() -> None:
    methods = {method.get("name") for method in ET.parse(INTERFACE).iter("method")}

    assert len(methods) == 46
    assert {row["method"] for row in table() if row["method"]} == methods


def test_rows_without_a_method_are_the_clients_own() -> None:
    assert [row["usage"] for row in table() if not row["method"]] == [
        "monitor", "explain METHOD [UNIT|TARGET|MODE]"]


def test_every_row_is_called_below() -> None:
    assert [row["usage"] for row in table() if row["method"]] == list(CALLS)


@pytest.mark.parametrize("usage", CALLS)
def test_row_calls_its_method_and_a_refusal_is_told(usage: str, authz: FakeAuthz,
                                                    service: Service) -> None:
    rest, action = CALLS[usage]
    words = [*name_of(usage), *rest.split()]
    authz.refuse("not for you")
    authz.forget()

    run = (with_password("secret", *words) if "--password-fd" in usage and "--system" not in usage
           else privanectl(*words, stdin="clerk:PRIVANE:00\n"))

    assert run == Run(1, "", "privanectl: Authorization check failed: not for you "
                             "(fake-authz 42)\n")
    assert [check.action for check in authz.checks()] == [f"com.zintor.privane-system.{action}"]


def test_actions_above_are_those_of_the_rows_methods() -> None:
    expected = {method.member: method.action.split(".")[0] for method in METHODS}

    for row in table():
        if row["method"]:
            assert CALLS[row["usage"]][1].split(".")[0] == expected[row["method"]], row


def test_help_lists_every_row() -> None:
    run = privanectl("--help")

    assert (run.status, run.errors) == (0, "")
    for row in table():
        assert re.search(rf"^  {re.escape(row['usage'])}(\n {{34}}| +){re.escape(row['help'])}$",
                         run.output, re.MULTILINE), row
    assert "complete" not in run.output and "verbs" not in run.output
    assert privanectl("-h") == run


def test_help_of_a_noun_lists_its_verbs_and_options() -> None:
    output = privanectl("clock", "--help").output

    commands = output.partition("Commands:\n")[2].partition("\n\n")[0]
    assert re.findall(r"^  (\S+ \S+)", commands, re.MULTILINE) == [
        "clock set", "clock adjust", "clock synced"]
    assert "--timeout" in output and "--group" not in output
    assert privanectl("nothing", "--help") == wrong_usage(
        "unknown command 'nothing'; privanectl --help lists all")


def plain(text: str) -> str:
    """What roff shows of a line."""
    return text.replace(r"\-", "-").replace(r"\(aq", "'").replace(r"\e", "\\")


def test_manual_has_every_row_and_no_other() -> None:
    section = MANUAL.read_text().partition(".SH COMMANDS\n")[2].partition("\n.PP")[0]
    entries = [plain(entry).strip().split("\n") for entry in section.split(".TP\n")[1:]]

    assert entries == [
        [f".B {row['usage']}", f"{row['help']}.",
         *(["Calls", f".BR {row['method']} ."] if row["method"] else [])] for row in table()]


def test_manual_has_every_option() -> None:
    text = plain(MANUAL.read_text())
    options = set(re.findall(r"--[a-z-]+", privanectl("--help").output))

    assert len(options) == 15
    assert options <= set(re.findall(r"--[a-z-]+", text))


@pytest.mark.parametrize("command", [("groff", "-ww", "-man", "-Tutf8", "-z"),
                                     ("man", "--warnings", "-l")])
def test_manual_is_set_without_a_warning(command: tuple[str, ...]) -> None:
    ended = subprocess.run([*command, str(MANUAL)], capture_output=True, check=False,
                           env=surroundings(MANWIDTH="100", LC_ALL="C.UTF-8"))

    assert (ended.returncode, ended.stderr) == (0, b"")


def test_document_has_every_method() -> None:
    rows = re.findall(r"^\| `(\w+)` \| (.*) \|$", DOCUMENT.read_text(), re.MULTILINE)
    expected: dict[str, list[str]] = {}
    for row in table():
        if row["method"]:
            selector = re.search(r" (--\w+)(=UID)?$", row["usage"])
            name = " ".join(name_of(row["usage"])) + (f" {selector[1]}" if selector else "")
            expected.setdefault(row["method"], []).append(f"`{name}`")
    assert [method for method, _ in rows] == [
        method.get("name") for method in ET.parse(INTERFACE).iter("method")]
    assert {method: commands.split(", ") for method, commands in rows} == expected


def complete(line: str) -> list[str]:
    """What bash would offer for the last word of the line, with its own way to split lines."""
    script = f"""\
source {COMPLETION}
COMP_LINE=$1
COMP_POINT=${{#COMP_LINE}}
_privanectl
printf '%s\\n' "${{COMPREPLY[@]}}"
"""
    ended = subprocess.run(["bash", "--norc", "-c", script, "bash", line], capture_output=True,
                           text=True, env=surroundings(), cwd="/etc/apache2", check=True)
    assert ended.stderr == ""
    return ended.stdout.splitlines() if ended.stdout != "\n" else []


@pytest.mark.parametrize("line, offered", [
    ("privanectl us", ["user"]),
    ("privanectl l", ["lensd", "lldp", "log"]),
    ("privanectl user c", ["check", "clear"]),
    ("privanectl -j user a", ["authenticate", "add", "announce"]),
    ("privanectl user show al", ["alice"]),
    ("privanectl --timeout 5 user show al", ["alice"]),
    ("privanectl group remove re", ["recorder"]),
    ("privanectl user add x --group=vi", ["viewer"]),
    ("privanectl user add x --group vi", ["viewer"]),
    ("privanectl user add x --groups=users,vi", ["users,viewer"]),
    ("privanectl user clear alice ", ["password", "groups", "comment"]),
    ("privanectl net info ", ["all", "tcp-udp"]),
    ("privanectl reset arm s", ["soft"]),
    ("privanectl --json=", ["short", "pretty", "off"]),
    ("privanectl user list --n", ["--no-legend"]),
    ("privanectl group list --na", ["--names"]),
    ("privanectl user add x --pa", ["--password-fd="]),
    ("privanectl explain StartN", ["StartNtp"]),
    ("privanectl explain GetActiveNetworkInfo ", ["all", "tcp-udp"]),
    ("privanectl explain GetUser ", []),
    ("privanectl log /etc/apache2/ap", ["/etc/apache2/apache-file"]),
    ("privanectl user add x --shell=/etc/apache2/ap", ["/etc/apache2/apache-file"]),
    # The service would look for it in its own folder, which is the root.
    ("privanectl log ap", []),
    ("privanectl log ./ap", []),
    ("privanectl user add x --shell=ap", []),
    ("privanectl verb", []),
    ("privanectl nothing ", []),
])
def test_completion(line: str, offered: list[str], changing_accounts: object) -> None:
    Path("/etc/apache2/apache-file").touch()

    assert complete(line) == offered


def test_completion_of_a_path_begins_at_the_root() -> None:
    assert {"/etc", "/usr"} <= set(complete("privanectl log "))
    assert all(path.startswith("/") for path in complete("privanectl user add x --shell="))


def test_completion_offers_every_method() -> None:
    assert complete("privanectl explain ") == [
        method.get("name") for method in ET.parse(INTERFACE).iter("method")]


def test_completion_of_units() -> None:
    systemd = FakeSystemd()
    try:
        systemd.reply_with(GLib.Variant("(a(ss))", ([
            ("/lib/systemd/system/sshd.service", "enabled"),
            ("/lib/systemd/system/getty@.service", "enabled"),
            ("/lib/systemd/system/Odd_One.service", "enabled")],)))
        assert complete("privanectl unit start ") == ["sshd", "getty@"]
        assert complete("privanectl explain StopService ss") == ["sshd"]
        (call,) = {call.words for call in systemd.calls()}
        assert call == ("ListUnitFilesByPatterns", "asas", "[]", "['*.service']")

        systemd.reply_with(GLib.Variant("(a(ss))", ([("/x/rescue.target", "static")],)))
        assert complete("privanectl default-target ") == ["rescue"]
        systemd.reply_with(GLib.Variant("(s)", ("nothing of the kind",)))
        assert complete("privanectl unit start ") == []
    finally:
        systemd.close()


@pytest.mark.parametrize("typed, line", [
    ("user show ali\t", "user show alice"),
    ("user add x --group=vi\t", "user add x --group=viewer"),
    ("user add x --groups=users,vi\t", "user add x --groups=users,viewer"),
    ("--json=sh\t", "--json=short"),
    ("user add x --pa\t3", "user add x --password-fd=3"),
    ("--address=unix:path=/x us\t", "--address=unix:path=/x user"),
    ("log /etc/apache2/ap\t", "log /etc/apache2/apache-file"),
    ("user add x --shell=/etc/apache2/ap\t", "user add x --shell=/etc/apache2/apache-file"),
])
def test_completion_in_an_interactive_shell(typed: str, line: str,
                                            changing_accounts: object) -> None:
    """The shell splits words and puts in what it is offered by its own rules."""
    Path("/etc/apache2/apache-file").touch()
    shell = Terminal("--norc", "-i", program=("/bin/bash",), environment={"PS1": "ready> "})
    try:
        shell.await_text("ready> ")
        shell.type(f"source {COMPLETION}\n")
        # The line becomes a text that is printed, before anything could run it.
        shell.type(f"privanectl {typed}\x01line='\x05'; echo \"<$line|\"\n")
        shell.await_text("<privanectl ")
        shell.await_text("|")
        assert shell.passed.strip() == line
    finally:
        shell.close()


@pytest.mark.parametrize("method", [method.member for method in METHODS])
def test_completion_leads_to_every_method(method: str) -> None:
    """The shell offers each noun, and behind it each verb, of the commands that call a method."""
    rows = [row for row in table() if row["method"] == method]
    assert rows
    for row in rows:
        words = name_of(row["usage"])
        for count, word in enumerate(words):
            line = " ".join(["privanectl", *words[:count], word])
            assert word in complete(line), line
