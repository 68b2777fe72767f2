"""tests/bus/harness/polkit.py: rules, declarations and questions for the sandbox's polkitd."""
import itertools
import os
import signal
from contextlib import contextmanager
from pathlib import Path
from typing import Any, Iterator, Mapping

from gi.repository import GLib

from harness import process
from harness.bus import Bus, User
from harness.deadline import wait_for
from harness.interface import ACTION_PREFIX
from harness.sandbox import polkitd_pid

AUTHORITY = ("org.freedesktop.PolicyKit1", "/org/freedesktop/PolicyKit1/Authority",
             "org.freedesktop.PolicyKit1.Authority")
RULES = Path("/etc/polkit-1/rules.d")
POLICIES = Path("/usr/share/polkit-1/actions")
EXAMPLES = Path("/usr/share/doc/privane-system/examples")

# On a busy machine; polkitd itself gives up a rule after 15 s.
ANSWER_SECONDS = 60.0


def check(bus: Bus, subject: str, action: str, details: Mapping[str, str] | None = None) -> bool:
    """polkitd's answer for the owner of a unique bus name; BusError where it has none."""
    arguments = GLib.Variant("((sa{sv})sa{ss}us)", (
        ("system-bus-name", {"name": GLib.Variant("s", subject)}), action, dict(details or {}), 0,
        ""))
    reply: Any = bus.send(*AUTHORITY, "CheckAuthorization", arguments, timeout=ANSWER_SECONDS)
    return reply[0][0]


def actions(bus: Bus) -> dict[str, tuple[int, int, int]]:
    """The declared actions, each with the answers for any, inactive and active sessions."""
    reply: Any = bus.send(*AUTHORITY, "EnumerateActions", GLib.Variant("(s)", ("C",)))
    return {row[0]: (row[6], row[7], row[8]) for row in reply[0]}


def stop_polkitd() -> None:
    """From then on it is there, and answers nobody."""
    os.kill(polkitd_pid(), signal.SIGSTOP)
    wait_for("polkitd's stop", lambda: process.status(polkitd_pid())["State"].startswith("T"),
             ANSWER_SECONDS)


@contextmanager
def hanging_polkitd() -> Iterator[None]:
    """polkitd is stopped meanwhile."""
    stop_polkitd()
    try:
        yield
    finally:
        os.kill(polkitd_pid(), signal.SIGCONT)


def install(path: Path, text: str) -> None:
    """A file of polkitd's, which reads it at the first sign of it and must see it whole."""
    new = path.with_suffix(".new")
    new.write_text(text)
    new.rename(path)


MARKER_ACTION = ACTION_PREFIX + "startservice"
_marker_numbers = itertools.count()


@contextmanager
def local_rules(bus: Bus, anyone: User, text: str) -> Iterator[None]:
    """Rules in effect meanwhile. A rule of the same file, which grants a unit that no test calls,
    shows that they are."""
    marker = {"unit": f"marker-of-rules-{next(_marker_numbers)}"}
    path = RULES / "50-local.rules"

    def is_in_effect() -> bool:
        return check(bus, anyone.unique_name, MARKER_ACTION, marker)
    install(path, f"""{text}
polkit.addRule(function (action, subject) {{
    if (action.id === "{MARKER_ACTION}" && action.lookup("unit") === "{marker["unit"]}")
        return polkit.Result.YES;
}});
""")
    try:
        wait_for("polkitd's new rules", is_in_effect, ANSWER_SECONDS)
        yield
    finally:
        path.unlink()
        wait_for("polkitd's old rules", lambda: not is_in_effect(), ANSWER_SECONDS)


@contextmanager
def declared(bus: Bus, text: str, names: set[str]) -> Iterator[None]:
    """A .policy file in effect meanwhile, which declares the named actions."""
    path = POLICIES / "com.zintor.camera.units.policy"
    assert not names & set(actions(bus))
    install(path, text)
    try:
        wait_for("polkitd's new actions", lambda: names <= set(actions(bus)), ANSWER_SECONDS)
        yield
    finally:
        path.unlink()
        wait_for("polkitd's old actions", lambda: not names & set(actions(bus)), ANSWER_SECONDS)


class ExampleRules:
    """The packaged example rules. polkitd notices new files by itself, within some milliseconds."""

    # An action of the role, by which a change of the rules is seen.
    SAMPLES = {"viewer": ACTION_PREFIX + "checkuser", "operator": ACTION_PREFIX + "reboot",
               "web": ACTION_PREFIX + "authuserbasic", "time": ACTION_PREFIX + "settimeofday",
               "updater": ACTION_PREFIX + "updatereleasefile",
               "monitor": ACTION_PREFIX + "getslabinfo"}

    def __init__(self, bus: Bus, members: dict[str, User]) -> None:
        """members: for each role a user who has it."""
        self._bus = bus
        self._members = members

    def install(self) -> None:
        for role in self._members:
            name = f"60-privane-{role}.rules"
            install(RULES / name, (EXAMPLES / name).read_text())
        wait_for("polkitd's new rules", lambda: all(self._granted()), ANSWER_SECONDS)

    def remove(self) -> None:
        for role in self._members:
            (RULES / f"60-privane-{role}.rules").unlink(missing_ok=True)
        wait_for("polkitd's old rules", lambda: not any(self._granted()), ANSWER_SECONDS)

    def _granted(self) -> list[bool]:
        return [check(self._bus, user.unique_name, self.SAMPLES[role])
                for role, user in self._members.items()]
