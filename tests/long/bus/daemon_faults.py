"""tests/long/bus/daemon_faults.py: proof: a call on the file system that fails in the service harms
no account, and its caller is told.

strace makes one call fail in the running service, in each change of the accounts and of the digest
file and in what reads a file. One fault is one such call: the answer, the log and the files are what
the rules say, the service lives, and the next change works.
"""
import random
import subprocess
from collections import Counter
from dataclasses import dataclass
from pathlib import Path
from typing import Any, Iterator

import pytest

from account_history import Call, History
from daemon_kill_points import CHANGES, Tracer
from fault_rules import (CORE_FILES, ERRORS, LEFT_OUT, Expected, Struck, calls_of, expected_of,
                         path_of)
from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.bus import Bus, BusError
from harness.fake_authz import FakeAuthz
from harness.passwords import OLD
from harness.service_fixtures import StartService
from harness.syslog_socket import SyslogSocket
from kept_files import FILES, PARAMETERS, TEMPORARIES, Version, difference, read_version
from killed_service import SIGNATURES, KilledService

SLABINFO = "/proc/slabinfo"
READS: dict[str, Call] = {
    "AuthUserBasic": ("AuthUserBasic", "alice", OLD),
    "ReadLogFile": ("ReadLogFile", str(PARAMETERS)),
    "GetSlabinfo": ("GetSlabinfo",),
}
CALLS: dict[str, Call] = {
    **{name: call for name, call in CHANGES.items()
       if call[0] not in ("AddBootblockParam", "ClearUserFields")},
    "ClearUserFields password": ("ClearUserFields", "timer", True, False, False),
    "ClearUserFields others": ("ClearUserFields", "timer", False, True, True),
    **READS,
}
NEXT: Call = ("AddGroup", "later")
# Of 2,705 that were counted: a rehearsal that sees fewer calls has missed some.
LEAST_KNOWN = 2_500
# Their failed write reloads the users alone. What they changed in the groups stays in memory, and
# the next change of a group writes it.
# A failed change of a user's fields alone reloads nothing: it stays in memory whole, and the next
# change of anything writes it.
USERS = (PASSWD, SHADOW)
MEMBERSHIPS_STAY = ("AddUser", "AddUidUser", "AddSystemUser", "ClearUserFields")


@dataclass(frozen=True)
class Fault:
    """The call of that name and number fails like that."""

    call: str
    name: str
    number: int
    error: int


@dataclass
class Rehearsal:
    """What a call does where nothing fails."""

    calls: list[tuple[str, str, int]]
    output: list[str]
    syslog: list[tuple[int, str]]
    answer: Any

    def renamed(self) -> list[str]:
        core = [f"{file}.tmp" for file in CORE_FILES]
        return [path.rpartition("/")[2].removesuffix(".tmp") for name, path, _ in self.calls
                if name.startswith("rename") and path in core]


class Faults:
    def __init__(self, killed: KilledService) -> None:
        self._killed = killed
        self._rehearsals = {name: self._rehearse(call) for name, call in CALLS.items()}

    def _call(self, call: Call) -> Any:
        """The reply's values, or the error."""
        try:
            return self._killed.bus.call(call[0], SIGNATURES[call[0]], *call[1:])
        except BusError as error:
            return error

    def _traced(self, call: Call, *options: str) -> Rehearsal:
        killed = self._killed
        killed.syslog.forget()
        said = len(killed.service.output())
        tracer = Tracer(killed.service.pid, "-y", "-P", SLABINFO, *options)
        answer = self._call(call)
        lines = tracer.end_with_lines()
        self.struck = [line for line in lines if "(INJECTED)" in line]
        return Rehearsal(calls_of(lines), killed.service.output()[said:], killed.syslog.texts(),
                         answer)

    def _rehearse(self, call: Call) -> Rehearsal:
        history = self._killed.start_on(self._killed.fresh)
        if call[0] not in READS:
            assert history.begin(call) is None
        rehearsal = self._traced(call, "-e", "trace=%file,%desc")
        assert not isinstance(rehearsal.answer, BusError), (call, rehearsal.answer)
        assert read_version(self._killed.hashes) == history.versions[-1], call
        self._killed.stop()
        unlisted = {name for name, _, _ in rehearsal.calls} - set(ERRORS) - set(LEFT_OUT)
        assert not unlisted, f"nobody listed how these fail: {unlisted}"
        assert rehearsal.calls
        return rehearsal

    def all_faults(self) -> list[Fault]:
        faults = []
        for call, rehearsal in self._rehearsals.items():
            counts: Counter[str] = Counter()
            for name, _, _ in rehearsal.calls:
                counts[name] += 1
                faults += [Fault(call, name, counts[name], error)
                           for error in ERRORS.get(name, ())]
        return faults

    def strike(self, fault: Fault) -> bool:
        """Whether it did harm."""
        try:
            return self._strike(fault)
        except AssertionError as error:
            raise AssertionError(f"{fault}: {error}") from error

    def _strike(self, fault: Fault) -> bool:
        killed, call, rehearsal = self._killed, CALLS[fault.call], self._rehearsals[fault.call]
        history = killed.start_on(killed.fresh)
        if call[0] not in READS:
            assert history.begin(call) is None
        result = self._traced(call, "-e", f"trace={fault.name}", "-e",
                              f"inject={fault.name}:error={fault.error}:when={fault.number}")
        same = [one for one in rehearsal.calls if one[0] == fault.name]
        name, path, turn = same[fault.number - 1]
        assert len(self.struck) == 1 and path_of(self.struck[0]) == path, self.struck
        expected = expected_of(call, Struck(name, path, turn, fault.error), rehearsal.renamed())

        self._judge_answer(expected, result, rehearsal)
        version = self._expected_version(expected, history)
        now = read_version(killed.hashes)
        assert now == version, difference(now, version)
        killed.access.check()
        left = [path for path in TEMPORARIES if path.exists()]
        assert not left, left
        self._go_on(call, expected, version, history)
        killed.stop()
        return expected.error is not None

    @staticmethod
    def _judge_answer(expected: Expected, result: Rehearsal, rehearsal: Rehearsal) -> None:
        if expected.error is not None:
            assert result.answer == expected.error, (result.answer, expected.error)
            output, syslog = expected.output, expected.warnings
        else:
            assert result.answer == rehearsal.answer, result.answer
            output = rehearsal.output
            if expected.instead is not None:
                assert output.count(expected.instead[0]) == 1, output
                output = [expected.instead[1] if line == expected.instead[0] else line
                          for line in output]
            syslog = expected.warnings + rehearsal.syslog
        assert result.output == output, (result.output, output)
        assert result.syslog == syslog, (result.syslog, syslog)

    @staticmethod
    def _expected_version(expected: Expected, history: History) -> Version:
        old, new = history.versions[0], history.versions[-1]
        if expected.error is None:
            return {file: (old if file in expected.old else new)[file] for file in FILES}
        ahead = CORE_FILES[:expected.ahead]
        return {file: (new if file in ahead else old)[file] for file in FILES}

    def _go_on(self, call: Call, expected: Expected, version: Version,
               history: History) -> None:
        """The next change writes what memory holds: of most failed changes what was read at
        the start."""
        killed = self._killed
        assert killed.service.is_running(), killed.service.output()
        groups = version[GROUP]
        if expected.error is not None and "corefile" in expected.error.name:
            groups = history.versions[-1 if call[0] in MEMBERSHIPS_STAY else 0][GROUP]
            if call[0] == "ChpasswdUser" or call[:2] == ("ModifyUser", "root"):
                version = {**version, **{file: history.versions[-1][file] for file in USERS}}
        killed.syslog.forget()
        said = len(killed.service.output())
        answer = self._call(NEXT)
        assert answer == (), f"the next change: {answer}"
        assert killed.service.output()[said:] == [], killed.service.output()[said:]
        assert killed.syslog.texts() == expected.next_warnings, killed.syslog.texts()
        now = read_version(killed.hashes)
        *kept, last = now[GROUP].splitlines(keepends=True)
        assert last.startswith("later:") and last.endswith(":\n"), last
        assert "".join(kept) == groups, f"the next change left {now[GROUP]} of {groups}"
        wanted = {**version, GROUP: now[GROUP]}
        assert now == wanted, f"the next change:\n{difference(now, wanted)}"


def chosen(faults: list[Fault], most: int, chance: random.Random) -> list[Fault]:
    """Each call once with an error by chance, then the other errors, as far as there are."""
    chance.shuffle(faults)
    seen: set[tuple[str, str, int]] = set()
    ranks = {}
    for fault in faults:
        call = (fault.call, fault.name, fault.number)
        ranks[fault] = int(call in seen)
        seen.add(call)
    return sorted(faults, key=lambda fault: ranks[fault])[:most]


@pytest.fixture
def slabinfo(tmp_path: Path) -> Iterator[None]:
    """The kernel's own changes from one call to the next."""
    file = tmp_path / "slabinfo"
    file.write_text("slabinfo - version: 2.1\nkmalloc-8 1 2 3\n")
    subprocess.run(["mount", "--bind", file, SLABINFO], check=True)
    yield
    subprocess.run(["umount", SLABINFO], check=True)


@pytest.fixture
def killed(start: StartService, bus: Bus, authz: FakeAuthz, syslog: SyslogSocket,
           accounts: AccountFiles) -> KilledService:
    return KilledService(start, bus, authz, syslog, accounts)


@pytest.mark.usefixtures("slabinfo")
def test_fail_at_calls(killed: KilledService, amount: int, chance: random.Random,
                       figures: Counter[str]) -> None:
    faults = Faults(killed)
    all_faults = faults.all_faults()
    figures["max_known_faults"] = len(all_faults)
    assert len(all_faults) >= LEAST_KNOWN
    for fault in chosen(all_faults, amount, chance):
        figures["harmful_faults"] += faults.strike(fault)
        figures["faults"] += 1
        figures["max_exhaustive_faults"] += 1
    assert 0 < figures["harmful_faults"] < figures["faults"]
