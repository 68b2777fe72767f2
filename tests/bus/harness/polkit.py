"""tests/bus/harness/polkit.py: rules and questions for the sandbox's polkitd."""
import shutil
from pathlib import Path
from typing import Any

from gi.repository import GLib

from harness.bus import Bus, User
from harness.deadline import wait_for
from harness.interface import ACTION_PREFIX

AUTHORITY = ("org.freedesktop.PolicyKit1", "/org/freedesktop/PolicyKit1/Authority",
             "org.freedesktop.PolicyKit1.Authority")
RULES = Path("/etc/polkit-1/rules.d")
EXAMPLES = Path("/usr/share/doc/privane-system/examples")

# On a busy machine; polkitd itself gives up a rule after 15 s.
ANSWER_SECONDS = 60.0


def check(bus: Bus, subject: str, action: str) -> bool:
    """polkitd's answer for the owner of a unique bus name; BusError where it has none."""
    arguments = GLib.Variant("((sa{sv})sa{ss}us)", (
        ("system-bus-name", {"name": GLib.Variant("s", subject)}), action, {}, 0, ""))
    reply: Any = bus.send(*AUTHORITY, "CheckAuthorization", arguments, timeout=ANSWER_SECONDS)
    return reply[0][0]


def actions(bus: Bus) -> dict[str, tuple[int, int, int]]:
    """The declared actions, each with the answers for any, inactive and active sessions."""
    reply: Any = bus.send(*AUTHORITY, "EnumerateActions", GLib.Variant("(s)", ("C",)))
    return {row[0]: (row[6], row[7], row[8]) for row in reply[0]}


class ExampleRules:
    """The packaged example rules. polkitd notices new files by itself, within some milliseconds."""

    # An action of the role, by which a change of the rules is seen.
    SAMPLES = {"viewer": ACTION_PREFIX + "checkuser", "operator": ACTION_PREFIX + "reboot"}

    def __init__(self, bus: Bus, members: dict[str, User]) -> None:
        """members: for each role a user who has it."""
        self._bus = bus
        self._members = members

    def install(self) -> None:
        for role in self._members:
            # polkitd reads a file at the first sign of it, which must show it whole.
            new = RULES / f"60-privane-{role}.new"
            shutil.copy(EXAMPLES / f"60-privane-{role}.rules", new)
            new.rename(new.with_suffix(".rules"))
        wait_for("polkitd's new rules", lambda: all(self._granted()), ANSWER_SECONDS)

    def remove(self) -> None:
        for role in self._members:
            (RULES / f"60-privane-{role}.rules").unlink(missing_ok=True)
        wait_for("polkitd's old rules", lambda: not any(self._granted()), ANSWER_SECONDS)

    def _granted(self) -> list[bool]:
        return [check(self._bus, user.unique_name, self.SAMPLES[role])
                for role, user in self._members.items()]
