"""tests/long/bus/daemon_secrets.py: proof: no password and no replaced hash stays in the service.

After each call that carries a password, done, failed, or refused before it reached a method, and
six further calls, none of the service's writable memory, logs, and children's arguments and
environment holds the password, nor the hash that it replaced. The hashes of the account files as
they were read at the start stay in memory on purpose; the accounts of this proof are newer. One
call counts once; a third of them do not reach a method.
"""
import os
import random
import signal
import subprocess
from collections import Counter
from pathlib import Path
from typing import Any, Callable, Iterator, TypeVar

import pytest

from harness import packaged, process
from harness.account_rules import digest_line
from harness.accounts import CLERK_UID, AccountFiles
from harness.bus import Bus
from harness.changing_accounts import Texts, stored_hash
from harness.deadline import wait_for
from harness.device import Device
from harness.fake_authz import FakeAuthz
from harness.passwords import NEW
from harness.sandbox import BINARY
from harness.service_fixtures import StartService
from harness.stage import SIGNATURES, Stage
from harness.stage_fixtures import DIGEST_FILE, run_stage
from harness.syslog_socket import SyslogSocket
from refused_secrets import MEMBERS, RefusedSecrets
from secret_search import ROOT, SYSTEM, WEB, Call, SecretSearch

# Of the calls; the others reach a method.
REFUSED_SHARE = 1 / 3

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


class Secrets(SecretSearch):
    """Calls that reach their methods, but for those that the authorization or GDBus refuses."""

    def __init__(self, stage: Stage, authz: FakeAuthz, chance: random.Random,
                 figures: Counter[str]) -> None:
        super().__init__(stage, chance, figures)
        self._authz = authz

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
    stage_with_stores.start(**packaged.environment())
    return stage_with_stores


@pytest.fixture
def guarded_stage(changing_accounts: AccountFiles, device: Device, start: StartService, bus: Bus,
                  authz: FakeAuthz, syslog: SyslogSocket, tmp_path: Path) -> Iterator[Stage]:
    """As the unit starts it, with polkit deciding, and with a user whom the bus lets in."""
    texts = Texts()
    changing_accounts.write(texts.passwd + f"clerk:x:{CLERK_UID}:{CLERK_UID}::/:/bin/false\n",
                            texts.shadow + "clerk:!:19000:0:99999:7:0::\n",
                            texts.group + f"clerk:x:{CLERK_UID}:\n")
    authz.environment = packaged.environment  # type: ignore[method-assign]
    yield from run_stage(Stage(start, bus, authz, syslog, tmp_path, fake_stores=False,
                               others=device.fakes()))


Trial = tuple[Callable[[Secrets, str], None], str]
Item = TypeVar("Item")


def all_trials() -> list[Trial]:
    return [*((Secrets.succeed, what) for what in calls("", "")),
            *((Secrets.fail, what) for what in failing_calls("", "")),
            *((Secrets.fail_silently, what) for what in SILENT),
            *((Secrets.be_refused, what) for what in REFUSED),
            *((Secrets.call_wrongly, what) for what in REFUSED),
            *((Secrets.break_digest, what) for what in BROKEN_DIGEST)]


def shuffled_for_ever(all_of_them: list[Item], chance: random.Random) -> Iterator[Item]:
    while True:
        yield from chance.sample(all_of_them, len(all_of_them))


def require_none_found(search: SecretSearch, most: int = 1) -> None:
    assert len(search.found) < most, "\n".join(search.found)


def test_no_secret_stays(packaged_stage: Stage, authz: FakeAuthz, amount: int,
                         chance: random.Random, figures: Counter[str]) -> None:
    secrets = Secrets(packaged_stage, authz, chance, figures)
    trials = shuffled_for_ever(all_trials(), chance)
    while figures["calls"] < amount * (1 - REFUSED_SHARE):
        make, what = next(trials)
        make(secrets, what)
        require_none_found(secrets, 10)
    require_none_found(secrets)


def test_no_secret_of_a_call_stays_that_reaches_no_method(
        guarded_stage: Stage, device: Device, privane_gid: int, amount: int,
        chance: random.Random, figures: Counter[str]) -> None:
    secrets = RefusedSecrets(guarded_stage, device, privane_gid, chance, figures)
    trials = shuffled_for_ever([(way, member) for way in RefusedSecrets.WAYS for member in MEMBERS],
                               chance)
    while figures["calls"] < amount:
        way, member = next(trials)
        way(secrets, member)
        figures["calls_without_a_method"] += 1
        require_none_found(secrets, 10)
    require_none_found(secrets)
    assert figures["calls_without_a_method"] > 0


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

    service = start(environment=authz.environment() | packaged.environment(), wrapper=unlimited)
    service.wait_registered(bus)
    assert Path(f"/proc/{service.pid}/exe").resolve() == Path(BINARY)
    has_core = dies_with_a_core(service.started)

    assert not has_core and not list(CRASH_FOLDER.iterdir())
    figures["core_dumps_tried"] += 1
