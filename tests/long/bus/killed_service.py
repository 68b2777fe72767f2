"""tests/long/bus/killed_service.py: a service that is killed and started again amid files of its
own.
"""
import signal
from typing import Any, Callable

from account_history import REPEATED, Call, History
from harness.account_rules import digest_line
from harness.accounts import AccountFiles
from harness.bus import Bus, BusError, domain_error
from harness.changing_accounts import write_changing_accounts
from harness.checker import NOTHING, check
from harness.fake_authz import FakeAuthz
from harness.interface import METHODS
from harness.passwords import OLD
from harness.service import Service
from harness.stage_fixtures import DIGEST_FILE
from harness.syslog_socket import SyslogSocket
from kept_files import (BOOT_BLOCK, BOOT_CONFIG, BOOT_COPY, BOOT_LOCK, PARAMETERS, PRIVATE,
                        Access, Hashes, Place, judge, read_version, restore_files, save_files)

SIGNATURES = {method.member: method.signature for method in METHODS}

# Cut off between the files, they leave members without an account, or an account without a shadow
# line. The next start warns of nothing else.
REMOVALS = ("RemoveUser",)
ADDITIONS = ("AddUser", "AddUidUser", "AddSystemUser")

# Of an account that is half gone: a group that lists it. Of one that is half there: no group.
HalfDone = tuple[str, str | None]


def make_files(files: AccountFiles) -> None:
    """A user and a group of every type, known to the web server, and a parameter and a boot block,
    which is blank."""
    write_changing_accounts(files)
    PARAMETERS.parent.mkdir(exist_ok=True)
    BOOT_LOCK.parent.mkdir(exist_ok=True)
    contents = {DIGEST_FILE: digest_line("alice", OLD) + digest_line("bob", OLD),
                PARAMETERS: "root.System.RootPwdSet=no\n",
                BOOT_CONFIG: "".join(f"{BOOT_BLOCK} {start:#x} {BOOT_COPY:#x}\n"
                                     for start in (0, BOOT_COPY))}
    for path, content in contents.items():
        path.write_text(content)
        path.chmod(PRIVATE)
    BOOT_BLOCK.write_bytes(b"\xff" * 2 * BOOT_COPY)


def same_error(error: BusError, refusal: tuple[str, int]) -> bool:
    return error.name == domain_error(*refusal, "").name


class KilledService:
    """Keeps what all kills have in common. start is the fixture's."""

    def __init__(self, start: Callable[..., Service], bus: Bus, authz: FakeAuthz,
                 syslog: SyslogSocket, files: AccountFiles) -> None:
        self._start = start
        self._environment = authz.environment()
        self._half_done: set[HalfDone] = set()
        self.bus = bus
        self.syslog = syslog
        self.hashes = Hashes()
        make_files(files)
        self.start()
        # The first parameters: a blank boot block has no version to fall back on.
        for value in ("first", "second"):
            self.call(("AddBootblockParam", "COLOR", value))
        self.stop()
        self.fresh = save_files()
        self.access = Access()

    def start(self) -> None:
        """It owns its name afterwards. The unit asks the checker first."""
        asked = check("--guard")
        assert (asked.returncode, asked.stdout, asked.stderr) == (NOTHING, "", "")
        self.syslog.forget()
        self.service = self._start(environment=self._environment)
        self.service.wait_registered(self.bus)

    def start_on(self, saved: dict[Any, Any], cut_off: Call | None = None) -> History:
        """With these files, as this call left them, or a sound service."""
        restore_files(saved)
        self._half_done = set()
        history = History(self.hashes)
        self.start()
        self._check_warnings(history, cut_off)
        return history

    def restart_on(self, saved: dict[Any, Any]) -> History:
        if self.service.is_running():
            self.stop()
        return self.start_on(saved)

    def stop(self) -> None:
        assert self.service.stop() == 0
        self.service.discard()

    def kill(self) -> None:
        self.service.kill(signal.SIGKILL)
        self.await_death()

    def await_death(self) -> None:
        assert self.service.wait(5) == -signal.SIGKILL, self.service.output()
        self.service.discard()

    def call(self, call: Call) -> tuple[str, int] | BusError | None:
        """None is a success."""
        try:
            self.bus.call(call[0], SIGNATURES[call[0]], *call[1:])
        except BusError as error:
            return error
        return None

    def make(self, history: History, call: Call) -> BusError | None:
        """A call that must be answered as the model says, and is on disk by then."""
        refusal = history.begin(call)
        error = self.call(call)
        if refusal is None:
            assert error is None, f"{call}: {error}"
        else:
            assert isinstance(error, BusError) and same_error(error, refusal), (call, error)
        self.judge(history, history.newest)
        return error

    def judge(self, history: History, answered: int) -> Place:
        place = judge(read_version(self.hashes), history.versions, answered)
        self.access.check()
        return place

    def recover(self, call: Call | None) -> History:
        """Starts the service on what a kill left, and makes the killed call again."""
        history = History(self.hashes)
        self.start()
        self._check_warnings(history, call)
        assert self.bus.call("GetUserList") == (list(history.model.users),)
        if call is None:
            return history
        error = self.make(history, call)
        if error is not None:
            assert any(same_error(error, refusal) for refusal in REPEATED), (call, error)
        return history

    def repair(self, history: History) -> None:
        """Rids the groups of the users who are gone, as one is told to."""
        for name in {name for names in history.ghosts().values() for name in names}:
            self.make(history, ("AddUser", name, OLD, "users", "", ""))
            self.make(history, ("RemoveUser", name))
        assert not History(self.hashes).ghosts()
        self._half_done.clear()

    def _check_warnings(self, history: History, cut_off: Call | None) -> None:
        """The start tells of all that is half done, and of nothing else; and what was not half done
        before is so by the call that was cut off."""
        told = [text for _, text in self.syslog.texts()]
        told += [line for line in self.service.output() if not line.startswith("message: ")]
        ghosts, shadowless = history.ghosts(), history.shadowless()
        bare = {f"Failed to parse user '{name}': no corresponding shadow entry was found for "
                f"'{name}'" for name in shadowless}
        assert bare <= set(told) and len(told) == len(bare) + len(ghosts), (told, ghosts, bare)
        for text in set(told) - bare:
            assert text.startswith("Group '"), text
            group = text.split("'")[1]
            assert group in ghosts and text.split("'")[3] in ghosts[group], (text, ghosts)
            assert len(ghosts[group]) == 1 or f"{len(ghosts[group])} members" in text, text

        half_done: set[HalfDone] = {(name, group) for group in ghosts for name in ghosts[group]}
        half_done |= {(name, None) for name in shadowless}
        for name, group in half_done - self._half_done:
            causes = ADDITIONS if group is None else REMOVALS
            assert cut_off is not None and cut_off[0] in causes and cut_off[1] == name, (
                f"{told} is not left by {cut_off}")
        self._half_done = half_done
