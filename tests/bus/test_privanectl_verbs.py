"""tests/bus/test_privanectl_verbs.py: every command of the client succeeds, and prints what it has to
tell as a text and as both forms of JSON.

The names in the answers are those of the interface document, written down once more: who renames a
result there breaks the scripts that read it.
"""
import json
import re
from dataclasses import dataclass
from pathlib import Path
from typing import Any, Iterator

import pytest

from harness import process
from harness.device import ETHTOOL, LLDPCLI, NETSTAT, SMARTCTL, Device
from harness.ethernet import AUTONEGOTIATION, FULL, Ethernet
from harness.passwords import NEW, OLD
from harness.privanectl import DONE, Run, privanectl, table, with_password
from harness.stage import Stage

TOOLS_PRINT = "first\nsecond\n"
LOG_FILE = Path("/tmp/some-log")

CHARACTERS = "[^\0]*"


@dataclass(frozen=True)
class Verb:
    """A call, and what it prints: the text as a pattern, and the answer, in which a type stands for
    a value that differs from run to run."""

    words: tuple[str, ...]
    answer: Any
    text: str = ""
    password: str | None = None
    stdin: str = ""


def silent(*words: str, password: str | None = None, stdin: str = "") -> Verb:
    """What has nothing to tell."""
    return Verb(words, {}, password=password, stdin=stdin)


def listing(*words: str, titles: str, rows: list[str], answer: list[dict[str, Any]]) -> Verb:
    lines = [titles, *rows, "", f"{len(rows)} listed."]
    return Verb(words, answer, "".join(re.escape(line) + "\n" for line in lines))


def telling(*words: str, name: str, text: str = TOOLS_PRINT) -> Verb:
    """What prints a text as it comes."""
    return Verb(words, {name: text}, re.escape(text))


USERS = ["root", "daemon", "anonymous", "timer", "alice", "bob", "nobody"]
GROUPS = ["root", "daemon", "users", "viewer", "operator", "admin", "timer", "nogroup", "recorder"]

ALICE = """\
            Name: alice
    Has password: yes
   Primary group: users
Secondary groups: operator
         Comment: Alice Liddell
             UID: 1000
"""
FULL_GROUPS = [
    ("root         0", "root", 0, []), ("daemon       1", "daemon", 1, []),
    ("users      100 alice", "users", 100, ["alice"]), ("viewer     101", "viewer", 101, []),
    ("operator   102 alice", "operator", 102, ["alice"]),
    ("admin      103 timer", "admin", 103, ["timer"]), ("timer      998", "timer", 998, []),
    ("nogroup  65534", "nogroup", 65534, []), ("recorder 60005", "recorder", 60005, [])]
LINK = """\
          Speed: 1000 Mbit/s
    Half duplex: no
Autonegotiation: yes
"""

# For each row of the client's table.
VERBS = {
    "user list": listing("user", "list", titles="NAME", rows=USERS,
                         answer=[{"name": user} for user in USERS]),
    "user show NAME": Verb(
        ("user", "show", "alice"),
        {"name": "alice", "has_password": True, "primary_group": "users",
         "secondary_groups": ["operator"], "comment": "Alice Liddell", "uid": 1000}, ALICE),
    "user check NAME": Verb(("user", "check", "alice"), {"exists": True}, "yes\n"),
    "user authenticate NAME [--password-fd=FD]":
        silent("user", "authenticate", "alice", password=OLD),
    "user add NAME [--ask-password | --password-fd=FD] --group=GROUP [--groups=GROUP,...] "
    "[--shell=PATH] [--comment=TEXT] --system":
        silent("user", "add", "clock", "--group=timer", "--groups=viewer,admin", "--shell=/bin/sh",
               "--comment=Shows it", "--system", password=NEW),
    "user add NAME [--password-fd=FD] --group=GROUP [--groups=GROUP,...] [--comment=TEXT] "
    "--uid=UID":
        silent("user", "add", "carol", "--group=users", "--groups=viewer", "--comment=Carol",
               "--uid=2345", password=NEW),
    "user add NAME [--password-fd=FD] --group=GROUP [--groups=GROUP,...] [--comment=TEXT]":
        silent("user", "add", "carol", "--group=users", "--groups=viewer", "--comment=Carol",
               password=NEW),
    "user modify NAME [--ask-password | --password-fd=FD] [--group=GROUP] [--groups=GROUP,...] "
    "[--shell=PATH] [--comment=TEXT]":
        silent("user", "modify", "timer", "--group=users", "--groups=viewer", "--shell=/bin/sh",
               "--comment=Ticks", password=NEW),
    "user clear NAME [password] [groups] [comment]":
        silent("user", "clear", "timer", "password", "groups", "comment"),
    "user passwd NAME [--password-fd=FD]": silent("user", "passwd", "bob", password=NEW),
    "user remove NAME": silent("user", "remove", "bob"),
    "user announce": silent("user", "announce"),
    "group list --names": listing("group", "list", "--names", titles="NAME", rows=GROUPS,
                                  answer=[{"name": group} for group in GROUPS]),
    "group list": listing(
        "group", "list", titles="NAME       GID MEMBERS", rows=[row[0] for row in FULL_GROUPS],
        answer=[{"name": name, "gid": gid, "members": members}
                for _, name, gid, members in FULL_GROUPS]),
    "group show NAME": Verb(("group", "show", "users"),
                            {"name": "users", "gid": 100, "members": ["alice"]},
                            "   Name: users\n    GID: 100\nMembers: alice\n"),
    "group check NAME": Verb(("group", "check", "missing"), {"exists": False}, "no\n"),
    "group add NAME": silent("group", "add", "helpers"),
    "group remove NAME": silent("group", "remove", "timer"),
    "digest list": listing("digest", "list", titles="NAME", rows=["alice", "bob"],
                           answer=[{"name": "alice"}, {"name": "bob"}]),
    "digest set NAME [--password-fd=FD]": silent("digest", "set", "alice", password=NEW),
    "digest import": silent("digest", "import", stdin=f"alice:PRIVANE:{'a' * 32}\n"),
    "digest delete NAME [NAME...]": silent("digest", "delete", "alice", "bob"),
    "unit start UNIT": silent("unit", "start", "sshd"),
    "unit stop UNIT": silent("unit", "stop", "sshd"),
    "unit restart UNIT": silent("unit", "restart", "sshd.service"),
    "unit reload UNIT": silent("unit", "reload", "getty@tty1"),
    "default-target TARGET": silent("default-target", "rescue"),
    "ntp start": silent("ntp", "start"),
    "ntp stop": silent("ntp", "stop"),
    "ntp restart": silent("ntp", "restart"),
    "lensd start": silent("lensd", "start"),
    "lensd stop": silent("lensd", "stop"),
    "clock set TIME": Verb(("clock", "set", "2026-01-31 23:59:59"), {"result": 0}),
    "clock adjust SECONDS": silent("clock", "adjust", "-1.5"),
    "clock synced": silent("clock", "synced"),
    "net info [MODE]": telling("net", "info", name="output"),
    "net speed": Verb(("net", "speed"),
                      {"speed": 1000, "half_duplex": False, "autonegotiation": 64}, LINK),
    "ethtool INTERFACE": telling("ethtool", "eth0", name="output"),
    "smart DEVICE": telling("smart", "/dev/sda", name="output"),
    "lldp neighbors": telling("lldp", "neighbors", name="output"),
    "lldp interfaces": telling("lldp", "interfaces", name="output"),
    "boot get PARAMETER": Verb(("boot", "get", "COLOR"), {"value": "light blue"}, "light blue\n"),
    "boot set PARAMETER VALUE": silent("boot", "set", "COLOR", "light blue"),
    "serial": Verb(("serial",), {"serial": "light blue"}, "light blue\n"),
    # The kernel's own, whose numbers change.
    "slabinfo": Verb(("slabinfo",), {"contents": str}, f"slabinfo - version{CHARACTERS}\n"),
    "log PATH": telling("log", str(LOG_FILE), name="contents"),
    "pinsrv [ARGUMENT...]": Verb(("pinsrv", "--", "-v"), {"pid": int}, r"PID: [1-9]\d*\n"),
    "reboot": Verb(("reboot",), {"exit_status": 0}),
    "reset arm KIND": silent("reset", "arm", "soft"),
}


@pytest.fixture
def camera(hardware_clock: Path, digest_file: Path, device: Device,
           system_with_clock: Stage) -> Iterator[Stage]:
    """The service amid a device on which every command succeeds."""
    digest_file.write_text(f"alice:PRIVANE:{'0' * 32}\nbob:PRIVANE:{'1' * 32}\n")
    for tool in (NETSTAT, ETHTOOL, SMARTCTL, LLDPCLI):
        device.tools[tool].print(TOOLS_PRINT)
    device.boot.hold("light blue")
    LOG_FILE.write_text(TOOLS_PRINT)
    link = Ethernet()
    link.report(1000, FULL, AUTONEGOTIATION)
    before = process.children()
    yield system_with_clock
    # The PIN server, which outlives its call, would write into a folder that goes.
    for child in process.children() - before:
        assert process.wait_for_child(child, 5) == 0
    link.close()
    LOG_FILE.unlink()


def run(verb: Verb, *options: str) -> Run:
    if verb.password is not None:
        return with_password(verb.password, *options, *verb.words)
    return privanectl(*options, *verb.words, stdin=verb.stdin)


def assert_answer(answer: Any, expected: Any) -> None:
    """Member by member and in this order, so that scripts and people find them where they were."""
    if isinstance(expected, type):
        assert type(answer) is expected and answer, answer
    elif isinstance(expected, dict):
        assert list(answer) == list(expected)
        for name, value in expected.items():
            assert_answer(answer[name], value)
    else:
        assert (type(answer), answer) == (type(expected), expected)


def test_no_command_is_missing() -> None:
    own = {"monitor", "explain METHOD [UNIT|TARGET|MODE]"}  # they call no method

    assert [row["usage"] for row in table() if row["usage"] not in own] == list(VERBS)
    assert {row["usage"] for row in table() if not row["method"]} == own


@pytest.mark.parametrize("usage", VERBS)
def test_text(usage: str, camera: Stage) -> None:
    ended = run(VERBS[usage])

    assert (ended.status, ended.errors) == (DONE, "")
    assert re.fullmatch(VERBS[usage].text, ended.output)


@pytest.mark.parametrize("usage", VERBS)
def test_short_json(usage: str, camera: Stage) -> None:
    ended = run(VERBS[usage], "--json=short")

    assert_answer(ended.json, VERBS[usage].answer)
    assert ended.output == json.dumps(ended.json, separators=(",", ":")) + "\n"


@pytest.mark.parametrize("usage", VERBS)
def test_pretty_json(usage: str, camera: Stage) -> None:
    ended = run(VERBS[usage], "--json=pretty")

    assert_answer(ended.json, VERBS[usage].answer)
    assert ended.output == json.dumps(ended.json, indent=2, separators=(",", " : ")) + "\n"
