"""tests/long/bus/daemon_secrets.py: proof: no password and no replaced hash stays in the service.

After each method that carries a password, done or failed, and six further calls, none of the
service's writable memory, logs, and children's arguments and environment holds the password, nor
the hash that it replaced. The hashes of the account files as they were read at the start stay in
memory on purpose; the accounts of this proof are newer. One call counts once.
"""
import os
import random
import signal
import string
import subprocess
from collections import Counter
from pathlib import Path
from typing import Any, Callable, Iterator

import pytest

from harness import process
from harness.account_model import digest_line
from harness.bus import Bus, BusError
from harness.changing_accounts import stored_hash
from harness.deadline import wait_for
from harness.fake_authz import FakeAuthz
from harness.passwords import NEW
from harness.sandbox import BINARY
from harness.service_fixtures import StartService
from harness.stage import SIGNATURES, Stage
from harness.stage_fixtures import DIGEST_FILE
from process_secrets import find, forms

UNIT = Path("/usr/lib/systemd/system/privane-system.service")

FURTHER_CALLS: tuple[tuple[Any, ...], ...] = (
    ("CheckUser", "alice"), ("GetUserList",), ("GetUser", "alice"), ("CheckGroup", "users"),
    ("GetGroupListFull",), ("GetDigestList",))

# Of the web, of the system, and root: those whose hashes change.
WEB, SYSTEM, ROOT = "carol", "ftpd", "root"
REALM = "PRIVANE"

Call = tuple[Any, ...]


def calls(secret: str, name: str) -> dict[str, Call]:
    """One for each way in which a password comes; what adds an account adds one of this name."""
    entry = digest_line(WEB, secret)
    return {
        "AddUser": ("AddUser", name, secret, "users", "viewer:admin", "New"),
        "AddUidUser": ("AddUidUser", name, secret, "users", "", "New", 5000),
        "AddSystemUser": ("AddSystemUser", name, secret, "users", ["viewer"], "/bin/sh", "New"),
        "ModifyUser": ("ModifyUser", WEB, secret, "", [], "", ""),
        "ModifyUser with all": ("ModifyUser", WEB, secret, "viewer", ["admin"], "", name),
        "ModifyUser root": ("ModifyUser", ROOT, secret, "", [], "", ""),
        "ModifyUser system": ("ModifyUser", SYSTEM, secret, "", [], "/bin/sh", name),
        "ChpasswdUser": ("ChpasswdUser", WEB, secret),
        "ChpasswdUser root": ("ChpasswdUser", ROOT, secret),
        "ChpasswdUser system": ("ChpasswdUser", SYSTEM, secret),
        "Digest": ("Digest", ["create", entry]),
        "Digest set": ("Digest", ["set", entry]),
    }


def failing_calls(secret: str, name: str) -> dict[str, Call]:
    """Refused one after the other for each reason that there is."""
    long = secret * 8
    return {
        "AddUser that exists": ("AddUser", "alice", secret, "users", "", ""),
        "AddUser into no group": ("AddUser", name, secret, "nogroups", "", ""),
        "AddUser into no second group": ("AddUser", name, secret, "users", "viewer:none", ""),
        "AddUser with a bad name": ("AddUser", "a b", secret, "users", "", ""),
        "AddUser with a long password": ("AddUser", name, long, "users", "", ""),
        "AddUidUser with a taken UID": ("AddUidUser", name, secret, "users", "", "", 1000),
        "AddSystemUser that is no line": ("AddSystemUser", f" {name}", secret, "users", [], "", ""),
        "AddSystemUser crypt refuses": ("AddSystemUser", name, long * 4, "users", [], "", ""),
        "ModifyUser of nobody": ("ModifyUser", name, secret, "", [], "", ""),
        "ModifyUser without a name": ("ModifyUser", "", secret, "", [], "", ""),
        "ModifyUser with a shell": ("ModifyUser", WEB, secret, "", [], "/bin/sh", ""),
        "ModifyUser crypt refuses": ("ModifyUser", SYSTEM, long * 4, "", [], "", ""),
        "ChpasswdUser of nobody": ("ChpasswdUser", name, secret),
        "ChpasswdUser of a permanent user": ("ChpasswdUser", "daemon", secret),
        "AuthUserBasic of nobody": ("AuthUserBasic", name, secret),
        "AuthUserBasic with a wrong password": ("AuthUserBasic", WEB, secret),
        "AuthUserBasic crypt refuses": ("AuthUserBasic", WEB, long * 4),
        # The other way round the list is logged, which is interface: it holds no clear text.
        "Digest with no such action": ("Digest", [secret, "nobody"]),
        "Digest without users": ("Digest", [secret]),
    }


SILENT = {"Digest that is no entry": lambda secret: ("Digest", ["create", f"{WEB}:{secret}\n"])}
BROKEN_DIGEST = ("AddUser", "AddUidUser", "ModifyUser", "ModifyUser root", "Digest")
REFUSED = ("AddUser", "AddUidUser", "AddSystemUser", "ModifyUser", "ChpasswdUser", "Digest")


def packaged_environment() -> dict[str, str]:
    """What the packaged unit gives the service."""
    words = [line.removeprefix("Environment=") for line in UNIT.read_text().splitlines()
             if line.startswith("Environment=")]
    assert words
    return dict(word.split("=", 1) for word in words)


class Secrets:
    """Makes calls, and looks for what they carried."""

    def __init__(self, stage: Stage, authz: FakeAuthz, chance: random.Random,
                 figures: Counter[str]) -> None:
        self._stage = stage
        self._authz = authz
        self._chance = chance
        self._figures = figures
        self._number = 0
        self.found: list[str] = []
        for call in (("AddUser", WEB, self.draw(), "users", "", ""),
                     ("AddSystemUser", SYSTEM, self.draw(), "users", [], "", ""),
                     ("ChpasswdUser", ROOT, self.draw())):
            assert self.call(call) is None

    def draw(self) -> str:
        """A password like no other; a few of its letters are no ASCII."""
        text = "".join(self._chance.choices(string.ascii_letters + string.digits + "_.%+/", k=28))
        return text[:5] + self._chance.choice(("", "ü", "€")) + text[5:]

    def new_name(self) -> str:
        self._number += 1
        return f"u{self._number}"

    def call(self, call: Call, signature: str | None = None) -> BusError | None:
        try:
            self._stage.bus.call(call[0], SIGNATURES[call[0]] if signature is None else signature,
                                 *call[1:])
        except BusError as error:
            return error
        return None

    def look(self, what: str, *secrets: str) -> None:
        """Makes the further calls, and notes where any of the secrets is found after them."""
        for further in FURTHER_CALLS:
            assert self.call(further) is None, further
        wanted = set().union(*map(forms, secrets))
        places = find(self._stage.service.pid, wanted)
        told = "\n".join([*self._stage.service.output(),
                          *(text for _, text in self._stage.syslog.texts())]).encode()
        places += ["the log" for form in wanted if form in told]
        words = " ".join(word for call in self._stage.calls() for word in call).encode()
        words += b" ".join(file.read_bytes() for file in self._stage.pidof.directory.iterdir()
                           if file.is_file())
        places += ["a child" for form in wanted if form in words]
        self._figures["calls"] += 1
        self.found += [f"{what}: {place}" for place in places]

    def succeed(self, what: str) -> None:
        """A call that is done, and whose secret is nobody's in the end."""
        secret, name = self.draw(), self.new_name()
        call = calls(secret, name)[what]
        replaced = self._hashes_of(call)
        assert self.call(call) is None, call
        self.look(what, secret, *replaced)
        if call[1] == name:
            assert self.call(("AuthUserBasic", name, secret)) is None
            self.look(f"AuthUserBasic after {what}", secret)
            assert self.call(("RemoveUser", name)) is None

    def _hashes_of(self, call: Call) -> list[str]:
        """What a call replaces: the hash of the account, and its line for the web server."""
        if call[0] in ("ModifyUser", "ChpasswdUser"):
            hashes = [stored_hash(call[1]).rpartition("$")[2]]
            if call[0] == "ModifyUser":
                hashes += _digests_of(call[1])
            return hashes
        return _digests_of(WEB) if call[0] == "Digest" else []

    def fail(self, what: str) -> None:
        secret = self.draw()
        assert self.call(failing_calls(secret, self.new_name())[what]) is not None, what
        self.look(what, secret)

    def fail_silently(self, what: str) -> None:
        secret = self.draw()
        assert self.call(SILENT[what](secret)) is None, what
        self.look(what, secret)

    def be_refused(self, what: str) -> None:
        secret = self.draw()
        self._authz.refuse("not you")
        try:
            error = self.call(calls(secret, self.new_name())[what])
        finally:
            self._authz.allow()
        assert error is not None and error.text.endswith("not you"), error
        self.look(f"{what} refused", secret)

    def call_wrongly(self, what: str) -> None:
        """With an argument too many, which GDBus refuses."""
        secret = self.draw()
        call = calls(secret, self.new_name())[what]
        error = self.call((*call, 1), SIGNATURES[call[0]] + "i")
        assert error is not None and "InvalidArgs" in error.name, error
        self.look(f"{what} with a strange argument", secret)

    def break_digest(self, what: str) -> None:
        """The digest library fails."""
        secret = self.draw()
        aside = DIGEST_FILE.with_name("aside")
        DIGEST_FILE.rename(aside)
        DIGEST_FILE.symlink_to("/etc/shadow")
        try:
            error = self.call(calls(secret, self.new_name())[what])
            # The further calls read the list.
            assert (error is None) == (what == "Digest"), error
        finally:
            aside.rename(DIGEST_FILE)
        self.look(f"{what} with a broken digest file", secret)


def _digests_of(name: str) -> list[str]:
    return [line.split(":")[2] for line in DIGEST_FILE.read_text().splitlines()
            if line.startswith(f"{name}:")]


@pytest.fixture
def packaged_stage(stage_with_stores: Stage) -> Stage:
    """As the unit starts it."""
    stage_with_stores.stop()
    stage_with_stores.start(**packaged_environment())
    return stage_with_stores


Trial = tuple[Callable[[Secrets, str], None], str]


def all_trials() -> list[Trial]:
    return [*((Secrets.succeed, what) for what in calls("", "")),
            *((Secrets.fail, what) for what in failing_calls("", "")),
            *((Secrets.fail_silently, what) for what in SILENT),
            *((Secrets.be_refused, what) for what in REFUSED),
            *((Secrets.call_wrongly, what) for what in REFUSED),
            *((Secrets.break_digest, what) for what in BROKEN_DIGEST)]


def test_no_secret_stays(packaged_stage: Stage, authz: FakeAuthz, amount: int,
                         chance: random.Random, figures: Counter[str]) -> None:
    secrets = Secrets(packaged_stage, authz, chance, figures)
    trials: Iterator[Trial] = iter(())
    while figures["calls"] < amount:
        trial = next(trials, None)
        if trial is None:
            trials = iter(chance.sample(all_trials(), len(all_trials())))
            continue
        trial[0](secrets, trial[1])
        assert len(secrets.found) < 10, "\n".join(secrets.found)
    assert not secrets.found, "\n".join(secrets.found)


def test_search_finds_what_is_there(packaged_stage: Stage, authz: FakeAuthz,
                                    chance: random.Random) -> None:
    """The name and the new hash of an account are in memory, and so is a password where freed
    memory is not overwritten."""
    secrets = Secrets(packaged_stage, authz, chance, Counter())
    name = "Wonderland1865"
    assert secrets.call(("AddUser", name, NEW, "users", "", "")) is None
    secrets.look("a name", name)
    secrets.look("a hash", stored_hash(name).rpartition("$")[2])
    assert len({line.split(":")[0] for line in secrets.found}) == 2, secrets.found

    packaged_stage.stop()
    packaged_stage.start()
    secrets.found.clear()
    for what in calls("", ""):
        secrets.succeed(what)
    assert secrets.found


CRASH_FOLDER = Path("/dev/shm/core-dumps")


def dies_with_a_core(child: "subprocess.Popen[Any]") -> bool:
    os.kill(child.pid, signal.SIGSEGV)
    ended = os.waitid(os.P_PID, child.pid, os.WEXITED | os.WNOWAIT)
    assert ended is not None and ended.si_status == signal.SIGSEGV
    child.wait(5)
    return ended.si_code == os.CLD_DUMPED


def test_no_core_dump_can_be_had(start: StartService, authz: FakeAuthz, bus: Bus,
                                 figures: Counter[str]) -> None:
    """Where another program leaves one."""
    CRASH_FOLDER.mkdir(exist_ok=True)
    unlimited = ["prlimit", "--core=unlimited:unlimited", "--", "env", f"--chdir={CRASH_FOLDER}"]
    other = subprocess.Popen([*unlimited, "sleep", "100"])
    wait_for("sleep", lambda: process.name(other.pid) == "sleep")
    assert dies_with_a_core(other), "core dumps cannot be had here"
    for file in CRASH_FOLDER.iterdir():
        file.unlink()

    service = start(environment=authz.environment() | packaged_environment(), wrapper=unlimited)
    service.wait_registered(bus)
    assert Path(f"/proc/{service.pid}/exe").resolve() == Path(BINARY)
    has_core = dies_with_a_core(service.started)

    assert not has_core and not list(CRASH_FOLDER.iterdir())
    figures["core_dumps_tried"] += 1
