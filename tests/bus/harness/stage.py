"""tests/bus/harness/stage.py: a service amid all that a change can reach, and what one call did."""
import signal
from dataclasses import dataclass, field
from pathlib import Path
from typing import Any, Callable, Protocol, Sequence

from harness.bus import Bus, BusError, domain_error
from harness.fake_authz import FakeAuthz, OwnAuthz
from harness.fake_folder import Call, FakeDigest, FakeParamcli, StandInTool, together
from harness.interface import METHODS
from harness.passwords import MARK
from harness.service import Service
from harness.syslog_socket import SyslogSocket
from harness.wire import Message, Wire
from harness.world import Neighbour, snapshot

PIDOF = "/bin/pidof"
PIDOF_CALL = (PIDOF, "cfgstore")
ROOT_FLAG_CALLS = (("paramcli_reset_options",),
                   ("paramcli_set_custom_param", "root.System.RootPwdSet", "yes", "0"),
                   ("paramcli_sync", "0"))

EMITTED = "message: Emitted DBus signal to inform the user DB was updated."
ROOT_FLAG_SET = "message: Updating root user!"

# syslog.h
LOG_ERR, LOG_WARNING = 3, 4

SIGNATURES = {method.member: method.signature for method in METHODS}


class Fake(Protocol):
    """What keeps a record of its calls."""

    def environment(self) -> dict[str, str]: ...

    def calls(self) -> list[Call]: ...

    def forget(self) -> None: ...


@dataclass
class Effects:
    """All that came of one call: the answer, the messages that reached a bus client in their order,
    the calls of libraries and tools in theirs, the signals sent to cfgstore, and the new lines of
    the service's log and of syslog."""

    answer: tuple[Any, ...] | BusError
    messages: list[str]
    calls: list[tuple[str, ...]] = field(default_factory=list)
    signals: set[int] = field(default_factory=set)
    output: list[str] = field(default_factory=list)
    syslog: list[tuple[int, str]] = field(default_factory=list)


def refused(domain: str, code: int, text: str) -> Effects:
    """A call that only fails, and says so once."""
    return Effects(domain_error(domain, code, text), ["error"], output=[f"warning: {text}"])


class Stage:
    """The service with a fake libauthz, fake or our own stores behind it, a stand-in for pidof, a
    process named cfgstore that pidof finds, and other fakes, which their maker closes."""

    def __init__(self, start: Callable[..., Service], bus: Bus, authz: FakeAuthz | OwnAuthz,
                 syslog: SyslogSocket, directory: Path, fake_stores: bool = True,
                 others: Sequence[Fake] = ()) -> None:
        self.bus = bus
        self.syslog = syslog
        self.digest = FakeDigest(directory / "digest")
        self.params = FakeParamcli(directory / "params")
        self.pidof = StandInTool(PIDOF)
        self.cfgstore = Neighbour("cfgstore")
        self.pidof.print(f"{self.cfgstore.pid}\n")
        self._start = start
        stores = (self.digest, self.params) if fake_stores else ()
        self._fakes: tuple[Fake, ...] = (self.digest, self.params, self.pidof, *others)
        self._environment = together(authz.environment(),
                                     *(fake.environment() for fake in (*stores, *others)))
        self._runs: list[Service] = []
        self._shown: list[str] = []
        self.start()
        self.wire = Wire()

    @property
    def environment(self) -> dict[str, str]:
        """That of a service that uses the fakes."""
        return dict(self._environment)

    @property
    def service(self) -> Service:
        """The run that serves now."""
        return self._runs[-1]

    def start(self, *arguments: str, wrapper: Sequence[str] = (), **environment: str) -> None:
        """Starts the service, in the foreground unless arguments say otherwise."""
        self._runs.append(self._start(arguments or ("-n",), wrapper=wrapper,
                                      environment=self._environment | environment))
        self.service.wait_registered(self.bus)

    def restart(self) -> None:
        self.stop()
        self.start()

    def stop(self) -> None:
        assert self.service.is_running(), (self.service.status, self.service.output())
        assert self.service.stop() == 0

    def use_real_pidof(self) -> None:
        self.pidof.close()

    def close(self) -> None:
        self.wire.close()
        self.cfgstore.close()
        self.pidof.close()

    def require_no_leaks(self) -> None:
        """No clear text and no hash may have gone to a log, into an error or to a tool."""
        shown = self._shown + [line for run in self._runs for line in run.output()]
        assert not [line for line in shown if MARK in line or "$5$" in line]

    def calls(self) -> list[tuple[str, ...]]:
        """The calls of the fakes, in the order in which they were made."""
        calls = [call for fake in self._fakes for call in fake.calls()]
        return [call.words for call in sorted(calls, key=lambda call: call.time)]

    def _forget(self) -> None:
        for fake in self._fakes:
            fake.forget()
        self.syslog.forget()
        if self.cfgstore.signals():
            self.cfgstore.close()
            self.cfgstore = Neighbour("cfgstore")
            if self.pidof.is_installed:
                self.pidof.print(f"{self.cfgstore.pid}\n")

    def send(self, member: str, *arguments: Any) -> int:
        """Sends a call without waiting for its reply; the serial for Wire.until_reply()."""
        return self.wire.send(member, SIGNATURES[member], *arguments)

    def call(self, member: str, *arguments: Any) -> Effects:
        """Makes a call and tells all that came of it."""
        self._forget()
        before = self.service.output()
        serial = self.send(member, *arguments)
        messages = self.wire.until_reply(serial)
        signals = self.cfgstore.signals()
        # Another call is answered after all that this one may have sent late.
        messages += self.wire.until_reply(self.send("CheckUser", ""))[:-1]
        serials = [message.serial for message in messages]
        assert serials == sorted(serials)
        (reply,) = [message for message in messages if message.reply_serial == serial]
        output = self.service.output()
        assert output[:len(before)] == before
        effects = Effects(reply.answer(), [_name(message) for message in messages], self.calls(),
                          signals, output[len(before):], self.syslog.texts())
        self._remember_what_was_shown(effects)
        return effects

    def _remember_what_was_shown(self, effects: Effects) -> None:
        self._shown += [text for _, text in effects.syslog]
        self._shown += [word for call in self.pidof.calls() for word in call.words]
        if isinstance(effects.answer, BusError):
            self._shown.append(effects.answer.text)

    def succeed(self, member: str, *arguments: Any) -> Effects:
        """As call(), of what must be answered without an error."""
        effects = self.call(member, *arguments)
        assert not isinstance(effects.answer, BusError), effects
        return effects

    def assert_unmoved(self, expected: Effects, member: str, *arguments: Any) -> None:
        """A call that has these effects, and leaves files, processes and database unmoved."""
        before = (self.memory(), snapshot(self.cfgstore))
        effects = self.call(member, *arguments)
        assert effects == expected, f"{effects}\nis not\n{expected}"
        after = (self.memory(), snapshot(self.cfgstore))
        assert after == before, f"{after}\nis not\n{before}"

    def done(self, *calls: tuple[str, ...], signal_sent: bool = False, pidof_run: bool = False,
             lines: tuple[str, ...] = ()) -> Effects:
        """A successful call without results that made the calls and logged the lines, then sent the
        bus signal, then found and signalled cfgstore, as far as it did."""
        output = [*lines]
        if signal_sent:
            output.append(EMITTED)
        if pidof_run:
            output += [f"message: Got PID for process 'cfgstore': {self.cfgstore.pid}'",
                       f"message: Sent SIGUSR1 to cfgstore ({self.cfgstore.pid})"]
        return Effects(
            (), [*(["UserDatabaseUpdated"] if signal_sent else []), "reply"],
            [*calls, *([PIDOF_CALL] if pidof_run else [])],
            {signal.SIGUSR1} if pidof_run else set(), output)

    def announced(self, *calls: tuple[str, ...], lines: tuple[str, ...] = ()) -> Effects:
        """A successful change that everybody learned of."""
        return self.done(*calls, signal_sent=True, pidof_run=True, lines=lines)

    def memory(self) -> Any:
        """The database as the service tells it; members in alphabetical order."""
        (users,) = self.bus.call("GetUserList")
        names, gids, members = self.bus.call("GetGroupListFull")
        return ({user: self.bus.call("GetUser", "s", user) for user in users}, names, gids,
                [sorted(row) for row in members])


def _name(message: Message) -> str:
    """What a message is: the member of a signal, else "reply" or "error"."""
    return message.member if message.kind == "signal" and message.member else message.kind
