"""tests/long/bus/refused_secrets.py: calls with a password that end before they reach a method."""
import os
import random
from collections import Counter
from contextlib import contextmanager
from pathlib import Path
from typing import Any, Iterator

from gi.repository import Gio, GLib

from harness.accounts import CLERK_UID
from harness.bus import INTERFACE, NAME, PATH, BusError
from harness.deadline import wait_for
from harness.device import LLDPCLI, Device
from harness.stage import SIGNATURES, Stage
from harness.wire import Wire, as_user
from pipeline import Answer, Call, Pipeline
from process_secrets import find, forms
from secret_search import SYSTEM, WEB, SecretSearch

# service/intake.h
SENDER_CALLS = 16
CALL_COST = 4 << 20

BUS_ERROR = "org.freedesktop.DBus.Error."
LONG_PATH = 9_000
OPENED = Path("/tmp/opened")


def arguments_of(secret: str) -> dict[str, tuple[Any, ...]]:
    """Of each method that takes a password, or lists of hashes."""
    return {
        "AddUser": ("new", secret, "users", "viewer", "New"),
        "AddUidUser": ("new", secret, "users", "viewer", "New", 5000),
        "AddSystemUser": (SYSTEM, secret, "users", ["viewer"], "/bin/sh", "New"),
        "ModifyUser": (WEB, secret, "users", ["admin"], "", "New"),
        "ChpasswdUser": (WEB, secret),
        "AuthUserBasic": (WEB, secret),
        "Digest": (["create", f"{WEB}:PRIVANE:{secret}\n"],),
    }


MEMBERS = tuple(arguments_of(""))


class RefusedSecrets(SecretSearch):
    """Each of the ways makes a call in which the member carries a new secret, and looks for it."""

    def __init__(self, stage: Stage, device: Device, privane_gid: int, chance: random.Random,
                 figures: Counter[str]) -> None:
        super().__init__(stage, chance, figures)
        self._tool = device.tools[LLDPCLI]
        self._gid = privane_gid

    def _answer(self, line: Pipeline, call: Call) -> Answer:
        line.start(call)
        while not (pairs := line.arrived()):
            pass
        [(_, answer)] = pairs
        return answer

    def _refused(self, call: Call, secret: str, error: BusError) -> None:
        """A call of root that fails with an error, of whose text the beginning will do."""
        line = Pipeline()
        try:
            got = self._answer(line, call).error
        finally:
            line.close()
        assert got is not None and got.name == error.name, (call, got)
        assert got.text.startswith(error.text), (call, got)
        self.look(f"{call.kind}: {call.member}", secret)

    def by_polkit(self, member: str) -> None:
        secret = self.draw()
        with as_user(CLERK_UID, [self._gid]):
            line = Pipeline()
        try:
            got = self._answer(line, Call("by polkit", member, SIGNATURES[member],
                                          arguments_of(secret)[member])).error
        finally:
            line.close()
        assert got is not None and got.text.endswith(f"is refused to uid {CLERK_UID}"), got
        self.look(f"by polkit: {member}", secret)

    def for_a_descriptor(self, member: str) -> None:
        secret = self.draw()
        message = Gio.DBusMessage.new_method_call(NAME, PATH, INTERFACE, member)
        message.set_body(GLib.Variant(f"({SIGNATURES[member]})", arguments_of(secret)[member]))
        descriptor = os.open("/dev/null", os.O_RDONLY)
        message.set_unix_fd_list(Gio.UnixFDList.new_from_array([descriptor]))
        reply, _ = self.stage.bus.connection.send_message_with_reply_sync(
            message, Gio.DBusSendMessageFlags.NONE, 10_000, None)
        assert reply.get_error_name() == f"{BUS_ERROR}InvalidArgs", reply
        self.look(f"for a descriptor: {member}", secret)

    def for_its_size(self, member: str) -> None:
        """The password is at the beginning: what a call holds beyond the largest size stays."""
        secret = self.draw()
        call = Call("for its size", member, SIGNATURES[member] + "s",
                    (*arguments_of(secret)[member], "x" * CALL_COST))
        self._refused(call, secret, BusError(f"{BUS_ERROR}LimitsExceeded",
                                             "The arguments of the call are too large"))

    def for_many_calls(self, member: str) -> None:
        """While the service is busy, when nothing else has come yet that could overwrite it."""
        secret = self.draw()
        wanted = forms(secret)
        wire = Wire()
        try:
            with self._busy():
                for _ in range(SENDER_CALLS):
                    wire.send("CheckUser", "s", "root")
                serial = wire.send(member, SIGNATURES[member], *arguments_of(secret)[member])
                message = wire.until_reply(serial)[-1]
                assert message.answer() == BusError(f"{BUS_ERROR}LimitsExceeded",
                                                    "Too many calls are waiting"), message
                wait_for(f"{member} to be gone while the service is busy",
                         lambda: not find(self.stage.service.pid, wanted))
            for _ in range(SENDER_CALLS):
                assert wire.receive().answer() == (True,)
        finally:
            wire.close()
        self.look(f"for many calls: {member}", secret)

    @contextmanager
    def _busy(self) -> Iterator[None]:
        """A tool holds the main loop up."""
        started = self._tool.directory / "descriptors"
        started.unlink(missing_ok=True)
        self._tool.before_answering(f"while [ ! -e {OPENED} ]; do sleep 0.01; done")
        wire = Wire()
        wire.send("ExecuteLldpcli", "s", "show-neighbors")
        try:
            wait_for("the tool", started.exists)
            yield
        finally:
            OPENED.touch()
            wire.receive()
            wire.close()
            OPENED.unlink()

    def for_its_signature(self, member: str) -> None:
        """One argument too few, too many, or all of them in one."""
        secret = self.draw()
        signature, arguments = SIGNATURES[member], arguments_of(secret)[member]
        choices = [(signature + "i", (*arguments, 1)), (f"({signature})", (arguments,)),
                   ("v", (GLib.Variant("s", secret),)), ("as", ([secret, "other"],)),
                   ("ay", (secret.encode(),))]
        signature, arguments = self.chance.choice(
            [choice for choice in choices if choice[0] != SIGNATURES[member]])
        self._refused(Call("for its signature", member, signature, arguments), secret,
                      BusError(f"{BUS_ERROR}InvalidArgs", ""))

    def for_its_member(self, member: str) -> None:
        """There is none of that name."""
        secret = self.draw()
        name = self.chance.choice((member + "2", member.lower(), "Set" + member, "Login"))
        self._refused(Call("for its member", name, SIGNATURES[member],
                           arguments_of(secret)[member]),
                      secret, BusError(f"{BUS_ERROR}UnknownMethod", ""))

    def with_a_password_as_member(self, member: str) -> None:
        secret = "".join(filter(str.isalpha, self.draw().encode("ascii", "ignore").decode()))
        self._refused(Call("with a password as member", member + secret, SIGNATURES[member],
                           arguments_of(secret)[member]),
                      secret, BusError(f"{BUS_ERROR}UnknownMethod", ""))

    def for_its_object(self, member: str) -> None:
        """Another object, or another interface."""
        secret = self.draw()
        path, interface = self.chance.choice(((f"{PATH}2", INTERFACE), ("/", INTERFACE),
                                              (PATH, f"{INTERFACE}2"), (PATH, "org.example.Some"),
                                              ("/" + "x" * LONG_PATH, INTERFACE)))
        self._refused(Call("for its object", member, SIGNATURES[member],
                           arguments_of(secret)[member], path, interface),
                      secret, BusError(f"{BUS_ERROR}UnknownMethod", ""))

    def without_an_answer(self, member: str) -> None:
        """Nobody is told that there is no such method."""
        secret = self.draw()
        line = Pipeline()
        try:
            line.start(Call("without an answer", member + "2", SIGNATURES[member],
                            arguments_of(secret)[member], wants_reply=False))
            assert self._answer(line, Call("", "CheckUser", "s", ("root",))).error is None
        finally:
            line.close()
        self.look(f"without an answer: {member}", secret)

    WAYS = (by_polkit, for_a_descriptor, for_its_size, for_many_calls, for_its_signature,
            for_its_member, with_a_password_as_member, for_its_object, without_an_answer)
