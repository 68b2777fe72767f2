"""tests/long/bus/secret_search.py: calls with a password, and the search for it afterwards."""
import random
import string
from collections import Counter
from typing import Any

from harness.bus import BusError
from harness.stage import SIGNATURES, Stage
from process_secrets import find, forms

FURTHER_CALLS: tuple[tuple[Any, ...], ...] = (
    ("CheckUser", "alice"), ("GetUserList",), ("GetUser", "alice"), ("CheckGroup", "users"),
    ("GetGroupListFull",), ("GetDigestList",))

# Of the web, of the system, and root: those whose hashes change.
WEB, SYSTEM, ROOT = "carol", "ftpd", "root"

Call = tuple[Any, ...]


class SecretSearch:
    """Makes calls, and looks for what they carried."""

    def __init__(self, stage: Stage, chance: random.Random, figures: Counter[str]) -> None:
        self.stage = stage
        self.chance = chance
        self._figures = figures
        self._number = 0
        self.found: list[str] = []
        for call in (("AddUser", WEB, self.draw(), "users", "", ""),
                     ("AddSystemUser", SYSTEM, self.draw(), "users", [], "", ""),
                     ("ChpasswdUser", ROOT, self.draw())):
            assert self.call(call) is None

    def draw(self) -> str:
        """A password like no other; a few of its letters are no ASCII."""
        text = "".join(self.chance.choices(string.ascii_letters + string.digits + "_.%+/", k=28))
        return text[:5] + self.chance.choice(("", "ü", "€")) + text[5:]

    def new_name(self) -> str:
        self._number += 1
        return f"u{self._number}"

    def call(self, call: Call, signature: str | None = None) -> BusError | None:
        try:
            self.stage.bus.call(call[0], SIGNATURES[call[0]] if signature is None else signature,
                                *call[1:])
        except BusError as error:
            return error
        return None

    def look(self, what: str, *secrets: str) -> None:
        """Makes the further calls, and notes where any of the secrets is found after them."""
        for further in FURTHER_CALLS:
            assert self.call(further) is None, further
        wanted = set().union(*map(forms, secrets))
        places = find(self.stage.service.pid, wanted)
        told = "\n".join([*self.stage.service.output(),
                          *(text for _, text in self.stage.syslog.texts())]).encode()
        places += ["the log" for form in wanted if form in told]
        words = " ".join(word for call in self.stage.calls() for word in call).encode()
        words += b" ".join(file.read_bytes() for file in self.stage.pidof.directory.iterdir()
                           if file.is_file())
        places += ["a child" for form in wanted if form in words]
        self._figures["calls"] += 1
        self.found += [f"{what}: {place}" for place in places]
