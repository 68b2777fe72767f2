"""tests/long/bus/bus_fuzzing.py: random calls of allowed and of refused callers.

The service must be built with the sanitizers: --build=DIR. The amount counts calls of the methods;
others are strewn in.
"""
import os
import random
from collections import Counter
from contextlib import suppress
from pathlib import Path
from typing import Any, Callable, Iterator, Sequence

import pytest
from gi.repository import GLib

from account_watch import Watch, require_agreement
from expectations import PREFIX, Expectations, refusal_by_polkit
from harness import process
from harness.accounts import (CLERK_UID, STANDARD_GROUP, STANDARD_PASSWD, STANDARD_SHADOW,
                              AccountFiles)
from harness.bus import INTERFACE, NAME, PATH, Bus, BusError, domain_error
from harness.deadline import wait_for
from harness.device import Device
from harness.fake_authz import CODE, DOMAIN, FakeAuthz, OwnAuthz
from harness.passwords import OLD_HASH
from harness.service import Service
from harness.stage import Stage
from harness.syslog_socket import SyslogSocket
from harness.wire import as_user
from harness.world import World
from hostile_calls import METHOD, Generator, methods_of
from pipeline import Answer, Call, Pipeline, exchange
from surroundings import differences, world

PASSWD_TEXT = STANDARD_PASSWD + """\
daemon:x:1:1:daemon:/usr/sbin:/usr/sbin/nologin
anonymous:x:300:100:Visitor::/bin/false
alice:x:1000:100:Alice Liddell:/home/alice:/bin/false
bob:x:1001:100:Bob::/bin/false
nobody:x:65534:65534:nobody:/nonexistent:/usr/sbin/nologin
"""
# As the service itself writes it.
SHADOW_TEXT = STANDARD_SHADOW.replace(":7:::", ":7:0::") + "".join(
    f"{name}:{OLD_HASH}:19000:0:99999:7:0::\n" for name in ("daemon", "anonymous", "alice", "bob")
) + "nobody:*:19000:0:99999:7:0::\n"
GROUP_TEXT = STANDARD_GROUP + """\
daemon:x:1:
users:x:100:alice
staff:x:50:alice
nogroup:x:65534:
"""

METHOD_COUNT = 46
CALLS_OF_A_BATCH, BATCHES_OF_A_RUN = 460, 6  # between two looks at all; between two starts
ALLOWED_EVERY = 3  # of the batches; the others are refused
CONNECTIONS = 3
BROKEN_MESSAGES = 8  # after every batch
POLKIT_SHARE = 0.15

PINSRV = "pinsrv"

SANITIZER_EXIT = 99
STOP_SECONDS = 20.0  # leaks are looked for at the end

TEXT = "not for you"
REFUSAL_BY_FAKE = domain_error(DOMAIN, CODE, PREFIX + TEXT)

CHANGES = ("AddSystemUser", "ModifyUser", "AddUser", "AddUidUser", "RemoveUser", "ChpasswdUser",
           "AddGroup", "RemoveGroup")
CHANGE_ROOT = ("ModifyUser", "ClearUserFields", "ChpasswdUser")

NO_REPLY = "org.freedesktop.DBus.Error.NoReply"

CAP_SYS_BOOT, CAP_SYS_TIME = 22, 25


class Sanitized:
    """Starts services of the sanitizers, and has their reports."""

    def __init__(self, start: Callable[..., Service], directory: Path) -> None:
        self._start = start
        self._reports = directory / "reports"
        self._reports.mkdir()

    def __call__(self, arguments: Sequence[str], wrapper: Sequence[str],
                 environment: dict[str, str]) -> Service:
        options = f"log_path={self._reports}/report:exitcode={SANITIZER_EXIT}"
        return self._start(
            arguments, wrapper=wrapper, stop_seconds=STOP_SECONDS, environment=environment | {
                "ASAN_OPTIONS": f"{options}:detect_leaks=1",
                "UBSAN_OPTIONS": f"{options}:halt_on_error=1:print_stacktrace=1"})

    def require_no_report(self) -> None:
        reports = [report.read_text() for report in sorted(self._reports.iterdir())]
        assert not reports, reports[0][:6000]


class Fuzzing:
    """What one run of the service is asked, and the looks at what came of it."""

    def __init__(self, stage: Stage, device: Device, sanitized: Sanitized, generator: Generator,
                 figures: Counter[str]) -> None:
        self.stage = stage
        self._device = device
        self._sanitized = sanitized
        self._generator = generator
        self._figures = figures
        self._watch = Watch()
        self._may_change_root = False
        self._pids: list[int] = []
        self._gids = require_agreement()[2]

    def batch(self, lines: Sequence[Pipeline], expected: Expectations, order: Sequence[str],
              is_allowed: bool = False) -> None:
        def on_answer(call: Call, answer: Answer) -> None:
            if not expected.holds(call, answer):
                self._explain(call, answer)
            self._require_alive(call)
            self._figures["errors" if answer.error else "answers"] += 1
            self._figures["changes"] += call.member in CHANGES and not answer.error
            if call.member == "Pinsrv" and call.kind == METHOD and not answer.error:
                self._pids += [pid for pid in answer.message.get_body().unpack() if pid > 0]
            self._look()

        self._may_change_root = False
        exchange(lines, self._noted(order, is_allowed), on_answer)
        # The same connections once more: those calls that want no answer were served before.
        exchange(lines, [Call(METHOD, "CheckUser", "s", ("",)) for _ in lines], on_answer)
        self._look()
        self._reap()
        self._sanitized.require_no_report()

    def _noted(self, order: Sequence[str], is_allowed: bool) -> Iterator[Call]:
        for call in self._generator.calls(order):
            self._figures["calls" if call.kind == METHOD else "other_calls"] += 1
            if (is_allowed and call.kind == METHOD and call.member in CHANGE_ROOT
                    and call.arguments[0] == "root"):
                self._may_change_root = True
            yield call

    def _explain(self, call: Call, answer: Answer) -> None:
        """Of a service that ended, the sanitizers tell more than the bus."""
        if answer.error and answer.error.name == NO_REPLY:
            wait_for("the service's end", lambda: not self.stage.service.is_running())
            self._require_alive(call)
        raise AssertionError(f"{call}\nwas answered with {answer}")

    def _require_alive(self, call: Call) -> None:
        if not self.stage.service.is_running():
            self._sanitized.require_no_report()
            output = "\n".join(self.stage.service.output()[-60:])
            raise AssertionError(f"ended with {self.stage.service.status} after {call}:\n{output}")

    def _look(self) -> None:
        if self._watch.changed_root():
            assert self._may_change_root, f"root became {self._watch.root}"
            self._figures["root_changes"] += 1

    def broken(self, connect: Callable[[], Pipeline], is_allowed: bool) -> None:
        """Messages that are none, each on a connection that ends with it."""
        blobs = [self._generator.broken() for _ in range(BROKEN_MESSAGES)]
        self._may_change_root = is_allowed and any(b"root" in blob for blob in blobs)
        for blob in blobs:
            connect().end_with(blob)
            self._figures["broken_messages"] += 1
        # The bus has passed on what came of them, and, as the main loop answers this one, the
        # service has served it.
        for _ in range(3):
            self.stage.bus.send(NAME, PATH, "org.freedesktop.DBus.Properties", "GetAll",
                                GLib.Variant("(s)", (INTERFACE,)))
        self._look()
        self._reap()
        self._sanitized.require_no_report()

    def _reap(self) -> None:
        """The children that came to us when what started them went, also those of whom calls that
        want no answer did not tell."""
        silent = {pid for pid in process.children() if process.name(pid) == PINSRV}
        for pid in silent.union(self._pids):
            assert process.wait_for_child(pid, 10) is not None
        self._pids.clear()

    def require_agreement(self) -> None:
        """The files tell of the same accounts as each other and as the service. A group that goes
        may leave users behind, of whom it was not known that it is their primary one."""
        users, groups, gids, missing = require_agreement()
        assert missing <= self._gids, missing
        self._gids |= gids
        assert self.stage.bus.call("GetUserList") == (users,)
        assert self.stage.bus.call("GetGroupList") == (groups,)
        self._figures["max_users"] = max(self._figures["max_users"], len(users))

    def known(self) -> Any:
        """Of each user the primary group and the UID, and the groups. A user without a primary
        group cannot be told, and is gone at the next start."""
        (users,) = self.stage.bus.call("GetUserList")
        names, gids, members = self.stage.bus.call("GetGroupListFull")
        told = {}
        for user in users:
            with suppress(BusError):
                told[user] = self.stage.bus.call("GetUser", "s", user)[1::3]
        return (told, dict(zip(names, gids)),
                {(name, user) for name, row in zip(names, members) for user in row if user in told})

    def require_same_after_restart(self) -> None:
        before = self.known()
        self.stage.restart()
        assert self.known() == before

    def require_unmoved(self, before: World) -> None:
        """All that a refused call must leave as it is."""
        after = world(self.stage.cfgstore)
        assert after == before, differences(before, after)
        assert self.stage.calls() == []

    def forget(self) -> None:
        for fake in (*self._device.fakes(), self.stage.pidof, self.stage.digest, self.stage.params):
            fake.forget()
        self.stage.syslog.forget()


def batches_of(chance: random.Random, members: Sequence[str], amount: int) -> list[list[str]]:
    """So many calls, as evenly over the methods as can be, in a random order."""
    order = [members[index % len(members)] for index in range(amount)]
    batches = [order[begin:begin + CALLS_OF_A_BATCH]
               for begin in range(0, amount, CALLS_OF_A_BATCH)]
    for batch in batches:
        chance.shuffle(batch)
    return batches


@pytest.fixture
def sanitized(start: Callable[..., Service], tmp_path: Path) -> Sanitized:
    return Sanitized(start, tmp_path)


@pytest.fixture
def begin(sanitized: Sanitized, accounts: AccountFiles, bus: Bus, syslog: SyslogSocket,
          device: Device, hardware_clock: Path, tmp_path: Path) -> Callable[..., Stage]:
    """Starts the service with fresh accounts."""
    bounding = int(process.status(os.getpid())["CapBnd"], 16)
    assert not bounding & (1 << CAP_SYS_TIME | 1 << CAP_SYS_BOOT), "this clock is the machine's"

    def begin_stage(authz: FakeAuthz | OwnAuthz) -> Stage:
        accounts.write(PASSWD_TEXT, SHADOW_TEXT, GROUP_TEXT)
        stage = Stage(sanitized, bus, authz, syslog, tmp_path, others=device.fakes())
        maps = Path(f"/proc/{stage.service.pid}/maps").read_text()
        assert "libasan" in maps and "libubsan" in maps, "not built with the sanitizers"
        return stage
    return begin_stage


class Callers:
    """The connections of root, and of clerk, who has no role."""

    def __init__(self, privane_gid: int) -> None:
        self._privane_gid = privane_gid
        self.root = [Pipeline() for _ in range(CONNECTIONS)]
        self.clerk = [self.connect_clerk() for _ in range(CONNECTIONS)]

    def connect_clerk(self) -> Pipeline:
        with as_user(CLERK_UID, [self._privane_gid]):
            return Pipeline()

    def close(self) -> None:
        for line in self.root + self.clerk:
            line.close()


@pytest.fixture
def callers(privane_gid: int) -> Iterator[Callers]:
    made = Callers(privane_gid)
    yield made
    made.close()


class Bout:
    """Batches in turn of allowed and of refused callers, with a new service for every few."""

    def __init__(self, begin: Callable[..., Stage], device: Device, sanitized: Sanitized,
                 callers: Callers, chance: random.Random, figures: Counter[str]) -> None:
        self._begin = begin
        self._device = device
        self._sanitized = sanitized
        self._callers = callers
        self._chance = chance
        self._figures = figures

    def run(self, amount: int, authz: FakeAuthz | OwnAuthz) -> None:
        stage = self._begin(authz)
        methods = methods_of(stage.bus)
        assert len(methods) == METHOD_COUNT
        batches = batches_of(self._chance, [*methods], amount)
        generator = Generator(self._chance, methods)
        for number, batch in enumerate(batches):
            if number % BATCHES_OF_A_RUN == 0 and number > 0:
                self._end(fuzzing)
                stage = self._begin(authz)
            if number % BATCHES_OF_A_RUN == 0:
                fuzzing = Fuzzing(stage, self._device, self._sanitized, generator, self._figures)
            if number % ALLOWED_EVERY == 0:
                self._allowed(fuzzing, Expectations(methods, None), batch)
            else:
                self._refused(fuzzing, methods, batch, authz)
        self._end(fuzzing)

    def _end(self, fuzzing: Fuzzing) -> None:
        try:
            fuzzing.require_same_after_restart()
            fuzzing.stage.stop()
        except AssertionError:
            self._sanitized.require_no_report()
            raise
        fuzzing.stage.require_no_leaks()
        fuzzing.stage.close()
        self._figures["runs"] += 1

    def _allowed(self, fuzzing: Fuzzing, expected: Expectations, batch: Sequence[str]) -> None:
        fuzzing.batch(self._callers.root, expected, batch, is_allowed=True)
        fuzzing.broken(Pipeline, is_allowed=True)
        fuzzing.require_agreement()
        fuzzing.forget()

    def _refused(self, fuzzing: Fuzzing, methods: dict[str, tuple[str, str]],
                 batch: Sequence[str], authz: FakeAuthz | OwnAuthz) -> None:
        before, known = world(fuzzing.stage.cfgstore), fuzzing.known()
        lines, refusal = self._callers.clerk, refusal_by_polkit
        if isinstance(authz, FakeAuthz):
            lines, refusal = self._callers.root + lines, lambda call: REFUSAL_BY_FAKE
            authz.refuse(TEXT)
        fuzzing.batch(lines, Expectations(methods, refusal), batch)
        fuzzing.broken(self._callers.connect_clerk, is_allowed=False)
        fuzzing.require_unmoved(before)
        if isinstance(authz, FakeAuthz):
            authz.allow()
            authz.forget()
        assert fuzzing.known() == known
        self._figures["refused_batches"] += 1


@pytest.fixture
def bout(begin: Callable[..., Stage], device: Device, sanitized: Sanitized, callers: Callers,
         chance: random.Random, figures: Counter[str]) -> Bout:
    return Bout(begin, device, sanitized, callers, chance, figures)


def test_fake_authorization(bout: Bout, authz: FakeAuthz, amount: int) -> None:
    bout.run(amount - int(amount * POLKIT_SHARE), authz)


def test_polkit(bout: Bout, amount: int) -> None:
    bout.run(max(1, int(amount * POLKIT_SHARE)), OwnAuthz())


def test_all_was_asked(figures: Counter[str], amount: int) -> None:
    assert figures["calls"] == amount
    assert all(figures[count] for count in ("answers", "errors", "changes", "other_calls",
                                            "broken_messages", "refused_batches", "runs"))
