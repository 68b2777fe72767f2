"""tests/bus/harness/service.py: the installed service, started and stopped as a user would."""
import os
import signal
import subprocess
import tempfile
from pathlib import Path
from typing import Mapping, Sequence

from harness import fake_authz, process
from harness.bus import Bus
from harness.deadline import wait_for
from harness.sandbox import BINARY, SYSTEM_BUS, require_sandbox

INITIALIZING = "Initializing user management library"
STARTING = "Starting privane_system"
REGISTERED = ("Policy Server now registered with the name 'com.zintor.PrivaneSystem' "
              "and object '/com/zintor/PrivaneSystem'")

# Enough for huge account files; that the service ended instead is noticed at once.
START_SECONDS = 30.0

# A quit signal has ended the service by then.
STOP_SECONDS = 1.0
TRACED_STOP_SECONDS = 10.0

COMM = "privane_system"

# A folder of its own: what a service prints changes none of those that a test watches.
OUTPUTS = Path("/tmp/service-output")


class Service:
    """One run of the binary. The process that is started either is the service ("-n" alone) or
    leaves it behind, in which case it comes to us as the adopter of orphans."""

    # How many of all had one of our own libauthz.
    with_own_authz = 0

    def __init__(self, arguments: Sequence[str] = ("-n",),
                 environment: Mapping[str, str] | None = None, wrapper: Sequence[str] = (),
                 ignored: Sequence[signal.Signals] = (),
                 stop_seconds: float | None = None) -> None:
        require_sandbox()
        if fake_authz.VARIABLE not in (environment or {}):
            Service.with_own_authz += 1
        self.in_foreground = list(arguments) == ["-n"]
        self._stop_seconds = stop_seconds or (TRACED_STOP_SECONDS if wrapper else STOP_SECONDS)
        self.status: int | None = None
        self._pid: int | None = None
        self._others = process.children()
        OUTPUTS.mkdir(exist_ok=True)
        self._output = tempfile.NamedTemporaryFile(dir=OUTPUTS)
        self._forgotten = 0
        # A critical of GLib's tells a broken assumption, which ends the service here.
        surroundings = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "G_DEBUG": "fatal-criticals",
                        "DBUS_SYSTEM_BUS_ADDRESS": SYSTEM_BUS, **(environment or {})}

        def ignore_signals() -> None:
            for number in ignored:
                signal.signal(number, signal.SIG_IGN)

        self.started = subprocess.Popen([*wrapper, BINARY, *arguments], env=surroundings,
                                        stdin=subprocess.DEVNULL, stdout=self._output,
                                        stderr=subprocess.STDOUT, preexec_fn=ignore_signals)

    @property
    def pid(self) -> int:
        """The process that serves. Waits for the detaching where there is one."""
        if self.in_foreground:
            return self.started.pid
        if self._pid is None:
            assert self.launcher_status() == 0, f"not detached: {self.output()}"
            self._pid = wait_for("the detached service", self._orphans)[0]
        return self._pid

    def _orphans(self) -> list[int]:
        return [child for child in process.children() - self._others
                if process.name(child) == COMM]

    def launcher_status(self) -> int:
        """The exit status of the process that was started."""
        return self.started.wait(START_SECONDS)

    def output(self) -> list[str]:
        """The lines on standard output and standard error, in their order."""
        return Path(self._output.name).read_text(errors="backslashreplace").splitlines()

    def forget_output(self) -> bytes:
        """What was printed since it was last forgotten, which from now on output() leaves out and
        takes no room."""
        with Path(self._output.name).open("rb") as printed:
            printed.seek(self._forgotten)
            new = printed.read()
        self._forgotten += len(new)
        os.truncate(self._output.name, 0)
        return new

    def is_running(self) -> bool:
        if self.status is None:
            self.status = (self.started.poll() if self.in_foreground
                           else process.wait_for_child(self.pid, 0))
        return self.status is None

    def wait_registered(self, bus: Bus) -> None:
        """Waits until the service owns its name, which it does with the object exported."""
        def is_owner() -> bool:
            assert self.is_running(), f"the service ended: {self.status}, {self.output()}"
            owner = bus.owner()
            return owner is not None and bus.pid_of(owner) == self.pid
        wait_for("the service's bus name", is_owner, START_SECONDS)

    def wait(self, seconds: float = START_SECONDS) -> int:
        """The exit status of a service that ends by itself."""
        wait_for("the end of the service", lambda: not self.is_running(), seconds)
        assert self.status is not None
        return self.status

    def kill(self, number: signal.Signals) -> None:
        os.kill(self.pid, number)

    def stop(self, number: signal.Signals = signal.SIGTERM) -> int:
        """The exit status after a quit signal, which acts promptly."""
        self.kill(number)
        return self.wait(self._stop_seconds)

    def discard(self) -> None:
        """Ends what is left of the run."""
        if self.started.poll() is None:
            self.started.kill()
            self.started.wait(5)
        if not self.in_foreground and self.status is None:
            for orphan in [self._pid] if self._pid is not None else self._orphans():
                os.kill(orphan, signal.SIGKILL)
                process.wait_for_child(orphan, 5)
        self._output.close()
