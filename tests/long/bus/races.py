"""tests/long/bus/races.py: callers that vanish, and others that write the account files.

A trial is one call that reached the service from a connection that was made to be left, one change
that another program races with, or one service that another one follows; 0 of the refused ones may
do anything.
"""
import math
import random
import signal
import threading
from collections import Counter
from pathlib import Path
from typing import Callable, Iterator

import pytest

from account_watch import require_agreement, rows
from harness.accounts import (GROUP, PASSWD, SHADOW, STANDARD_GROUP, STANDARD_PASSWD,
                              STANDARD_SHADOW, AccountFiles)
from harness.bus import NAME, Bus
from harness.deadline import wait_for
from harness.device import SYSFLASH, Device
from harness.fake_authz import OwnAuthz
from harness.interface import METHODS
from harness.monitor import BUS, CALL, ERROR, Record, is_end_of
from harness.service import Service
from harness.stage import PIDOF, Stage
from harness.stage_fixtures import run_stage
from harness.syslog_socket import SyslogSocket
from other_writers import Outsider, Reader
from pipeline import Call, Pipeline
from polkit_control import NAME as POLKIT
from racing import CONNECTIONS_TO_A_CALL, RACERS, Racer, Races
from surroundings import differences, world

# Of the trials; those of the refused callers are the rest.
ALLOWED_SHARE, WRITERS_SHARE, INSTANCES_SHARE = 0.04, 0.04, 0.01
SINGLE_TRIALS = 2

# Changes made until so many of them were raced with.
CHANGES_TO_A_RACE = 20
LOST = "/etc/passwd was changed by another program; its changes are lost"

# Callers that vanish until so many of their calls have arrived, and some were both served and left.
CALLERS_TO_A_CALL = 20

LINGER_MS = 60


@pytest.fixture
def stage(accounts: AccountFiles, device: Device, hardware_clock: Path,
          start: Callable[..., Service], bus: Bus, syslog: SyslogSocket,
          tmp_path: Path) -> Iterator[Stage]:
    accounts.write(STANDARD_PASSWD, STANDARD_SHADOW.replace(":7:::", ":7:0::"), STANDARD_GROUP)
    yield from run_stage(Stage(start, bus, OwnAuthz(), syslog, tmp_path,
                               others=device.fakes()))


@pytest.fixture
def monitor() -> Iterator[Record]:
    listener = Record()
    yield listener
    listener.close()


def share(amount: int, part: float) -> int:
    return max(4, int(amount * part))


def rest(amount: int) -> int:
    """The trials of the refused callers."""
    others = SINGLE_TRIALS + sum(share(amount, part) for part in (
        ALLOWED_SHARE, WRITERS_SHARE, INSTANCES_SHARE))
    return max(RACERS, amount - others)


def test_refused_callers_that_vanish(stage: Stage, device: Device, monitor: Record,
                                     privane_gid: int, chance: random.Random, amount: int,
                                     figures: Counter[str]) -> None:
    bus, service = stage.bus, stage.service
    unique_name = bus.owner()
    assert bus.call("CheckUser", "s", "root") == (True,)
    begin_output, before = service.output(), world(stage.cfgstore)
    mark, wanted = monitor.mark(), rest(amount)
    races = Races(bus, service, monitor)

    while (arrived := len(races.calls())) < wanted:
        connections = math.ceil((wanted - arrived) * CONNECTIONS_TO_A_CALL / RACERS)
        races.run([Racer(privane_gid, connections, chance.getrandbits(32))
                   for _ in range(RACERS)])
        assert len(races.calls()) > arrived, "nothing arrives"
    told = races.told()

    after = world(stage.cfgstore)
    assert after == before, differences(before, after)
    assert stage.calls() == []
    assert service.output() == begin_output + told
    require_only_refusals(monitor, mark, unique_name)
    require_new_names(monitor)
    assert len(told) == arrived
    figures.update(races.counts)
    figures["trials"] += arrived
    figures["calls_arrived"] += arrived
    figures["gone_when_asked_for"] += sum("uid is not known" in line or "no such name" in line
                                          for line in told)
    assert bus.call("Reboot") == (0,)
    assert stage.calls() == [(SYSFLASH, "reboot")], "a reset was armed"


def require_only_refusals(monitor: Record, mark: int, service: str | None) -> None:
    """The service said nothing but errors, questions, and the answers to root."""
    names = {seen.arguments[1] for seen in monitor.since(0) if seen.member == "NameOwnerChanged"
             and seen.arguments[0] == POLKIT}
    for seen in monitor.since(mark):
        if seen.sender == service and seen.type == CALL:
            assert seen.destination in {BUS, POLKIT, *names} or seen.member in (
                "CheckAuthorization", "CancelCheckAuthorization"), seen
        elif seen.sender == service and seen.type != ERROR and not seen.are_zeros():
            assert seen.arguments == (True,), seen


def require_new_names(monitor: Record) -> None:
    """No unique name is given twice."""
    given = Counter(seen.arguments[0] for seen in monitor.since(0)
                    if seen.member == "NameOwnerChanged" and str(seen.arguments[0]).startswith(":")
                    and seen.arguments[1] == "")
    assert given and max(given.values()) == 1, given.most_common(3)


def is_there(name: str) -> tuple[bool, ...]:
    """Whether the account stands in each of the three files."""
    in_users = tuple(any(row[0] == name for row in rows(path)) for path in (PASSWD, SHADOW))
    return *in_users, any(name in row[3].split(",") for row in rows(GROUP))


def call_and_vanish(call: Call, delay: float, bus: Bus, monitor: Record) -> bool:
    """Whether the call was passed on to the service before the bus forgot the caller, as it has."""
    mark = monitor.mark()
    line = Pipeline()
    line.start(call)
    threading.Event().wait(delay)
    line.close()
    monitor.wait_for("the caller's end", mark, is_end_of(line.unique_name))
    monitor.catch_up(bus)
    return any(seen.type == CALL and seen.sender == line.unique_name and seen.destination == NAME
               for seen in monitor.since(mark))


def test_allowed_callers_that_vanish(stage: Stage, device: Device, monitor: Record,
                                     chance: random.Random, amount: int,
                                     figures: Counter[str]) -> None:
    """A change is made wholly, with all that belongs to it, or not at all: where the caller is
    not found any more."""
    signature = next(method.signature for method in METHODS if method.member == "AddUser")
    wanted = share(amount, ALLOWED_SHARE)
    counts: Counter[str] = Counter()
    for number in range(CALLERS_TO_A_CALL * wanted):
        name = f"race{number}"
        arrived = call_and_vanish(Call("method", "AddUser", signature,
                                       (name, "secret", "clerk", "privane-viewer", "")),
                                  chance.choice((0, 0, chance.uniform(0, 0.008))), stage.bus,
                                  monitor)
        counts["allowed_calls_that_arrived" if arrived else "allowed_calls_dropped"] += 1
        for _ in range(3):
            stage.bus.call("CheckUser", "s", name)
        (exists,) = stage.bus.call("CheckUser", "s", name)
        assert is_there(name) == (exists,) * 3, name
        users, *_ = require_agreement()
        assert stage.bus.call("GetUserList") == (users,)
        tools = [words[0] for words in stage.calls()]
        assert tools == (["digest_entry_set", PIDOF] if exists else []), (name, stage.calls())
        assert arrived or not exists
        if arrived:
            counts["changes_made" if exists else "changes_not_made"] += 1
        stage.digest.forget()
        stage.pidof.forget()
        if exists:
            stage.bus.call("RemoveUser", "s", name)
            stage.digest.forget()
            stage.pidof.forget()
        if (counts["allowed_calls_that_arrived"] >= wanted and counts["changes_made"]
                and counts["changes_not_made"]):
            break
    assert counts["allowed_calls_that_arrived"] >= wanted, counts
    assert counts["changes_made"] > 0, "all were gone in time"
    assert counts["changes_not_made"] > 0, "none was gone in time"
    figures["trials"] += counts["allowed_calls_that_arrived"]
    figures.update(counts)


@pytest.mark.parametrize("member, tool", [("Reboot", SYSFLASH),
                                          ("ExecuteLldpcli", "/usr/sbin/lldpcli")])
def test_caller_that_vanishes_while_a_tool_runs(member: str, tool: str, stage: Stage,
                                                device: Device, figures: Counter[str]) -> None:
    method = next(method for method in METHODS if method.member == member)
    stand_in = device.tools[tool]
    stand_in.answer("linger", LINGER_MS)
    line = Pipeline()
    line.start(Call("method", member, method.signature, method.arguments))
    wait_for("the tool's start", stand_in.calls)
    line.close()

    assert stage.bus.call("CheckUser", "s", "root") == (True,)
    assert len(stand_in.calls()) == 1
    require_agreement()
    figures["trials"] += 1


def test_another_writer(stage: Stage, amount: int, figures: Counter[str]) -> None:
    """The service is the only writer, and says so where another one comes: but what either
    writes, it writes whole."""
    outsider, reader = Outsider(), Reader()
    wanted = share(amount, WRITERS_SHARE)
    changes = raced = 0
    try:
        while raced < wanted and changes < CHANGES_TO_A_RACE * wanted:
            name, before = f"both{changes}", outsider.changes
            stage.bus.call("AddUser", "sssss", name, "secret", "clerk", "privane-viewer", "")
            stage.bus.call("RemoveUser", "s", name)
            changes += 1
            raced += outsider.changes > before
    finally:
        outsider.end()
        reader.end()
    assert raced >= wanted, (raced, changes)
    assert reader.looks > 3
    told = [text for _, text in stage.syslog.texts()]
    assert told.count(LOST) > 0
    figures["trials"] += raced
    figures["trials_with_another_writer"] += raced
    figures["changes_of_another"] += outsider.changes
    figures["looks"] += reader.looks
    # One more change of the service's own, and the files are those of its database.
    stage.bus.call("AddUser", "sssss", "last", "secret", "clerk", "privane-viewer", "")
    users, groups, *_ = require_agreement()
    assert stage.bus.call("GetUserList") == (users,)
    assert stage.bus.call("GetGroupList") == (groups,)
    assert is_there("last") == (True,) * 3


def end(service: Service, number: signal.Signals) -> None:
    service.kill(number)
    assert service.wait(5) == (-number if number == signal.SIGKILL else 0)


def follow(stage: Stage, first: Service, second: Service, number: signal.Signals) -> None:
    """The second waits for the name and touches nothing; when the first is gone it serves from the
    files as they were at its start, and warns before it writes."""
    bus, owner = stage.bus, stage.bus.owner()
    before = world(stage.cfgstore)
    wait_for("the second in the queue", lambda: len(bus.queue()) == 2)
    after = world(stage.cfgstore)
    assert (after.files, after.folders["/etc"]) == (before.files, before.folders["/etc"])
    assert bus.owner() == owner

    bus.call("AddUser", "sssss", "early", "secret", "clerk", "privane-viewer", "")
    require_agreement()
    stage.syslog.forget()
    end(first, number)
    second.wait_registered(bus)
    assert (bus.call("CheckUser", "s", "early"), is_there("early")) == ((False,), (True,) * 3)
    bus.call("AddUser", "sssss", "late", "secret", "clerk", "privane-viewer", "")
    users, *_ = require_agreement()
    assert bus.call("GetUserList") == (users,)
    assert (is_there("early"), is_there("late")) == ((False,) * 3, (True,) * 3)
    assert LOST in [text for _, text in stage.syslog.texts()]
    bus.call("RemoveUser", "s", "late")


def test_second_instance(stage: Stage, start: Callable[..., Service], chance: random.Random,
                         amount: int, figures: Counter[str]) -> None:
    serving = stage.service
    for _ in range(share(amount, INSTANCES_SHARE)):
        second = start(environment=stage.environment)
        follow(stage, serving, second, chance.choice((signal.SIGTERM, signal.SIGINT, signal.SIGHUP,
                                                      signal.SIGKILL)))
        serving = second
        figures["trials"] += 1
        figures["trials_with_two_instances"] += 1
    assert serving.stop() == 0
    stage.start()


def test_all_was_tried(figures: Counter[str], amount: int) -> None:
    assert figures["trials"] >= amount
    assert figures["calls_arrived"] > 0 and figures["gone_when_asked_for"] > 0
    assert figures["trials_with_another_writer"] >= share(amount, WRITERS_SHARE)
    assert figures["trials_with_two_instances"] >= share(amount, INSTANCES_SHARE)
