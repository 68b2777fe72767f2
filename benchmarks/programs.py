"""benchmarks/programs.py: starts what is measured, looks at it, and makes the calls."""
import ast
import grp
import os
import shlex
import signal
import subprocess
import time
from collections.abc import Iterator
from contextlib import ExitStack, contextmanager
from dataclasses import dataclass, field
from pathlib import Path

from gi.repository import Gio, GLib

from benchmarks.worlds import World

SERVICE = "/usr/sbin/privane_system"
SERVICE_UNIT = Path("/usr/lib/systemd/system/privane-system.service")
STOCK_DAEMON = "/usr/libexec/accounts-daemon"
STOCK_UNIT = Path("/usr/lib/systemd/system/accounts-daemon.service")

BUS_NAME = "com.zintor.PrivaneSystem"
OBJECT_PATH = "/com/zintor/PrivaneSystem"
STOCK_NAME = "org.freedesktop.Accounts"

SANDBOX_STATE = Path("/run/bus-sandbox")
PATIENCE_SECONDS = 60
SIGNAL_SECONDS = 5
VISIT_SECONDS = 300


def unit_environment(unit: Path) -> dict[str, str]:
    """What systemd would start the unit's program with."""
    environment = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "LANG": "C.UTF-8"}
    lines = [line.removeprefix("Environment=") for line in unit.read_text().splitlines()
             if line.startswith("Environment=")]
    for assignment in (word for line in lines for word in shlex.split(line)):
        name, _, value = assignment.partition("=")
        environment[name] = value
    return environment


def resident_kib(pid: int) -> int:
    lines = Path(f"/proc/{pid}/smaps_rollup").read_text().splitlines()
    return next(int(line.split()[1]) for line in lines if line.startswith("Rss:"))


def processor_seconds(pid: int) -> float:
    """Of all threads, ended ones too, by the process's own clock (clock_getcpuclockid(3))."""
    return time.clock_gettime((~pid << 3) | 2)


def loaded_libraries(pid: int) -> list[str]:
    paths = {line.split(maxsplit=5)[5] for line in
             Path(f"/proc/{pid}/maps").read_text().splitlines() if len(line.split(maxsplit=5)) == 6}
    return sorted(path for path in paths if ".so" in Path(path).name)


@dataclass
class Daemon:
    """A running daemon; calls go to its connection, whoever owns the name."""

    process: "subprocess.Popen[bytes]"
    unique_name: str

    @property
    def pid(self) -> int:
        return self.process.pid


@dataclass
class Machine:
    """The sandbox's bus and polkitd, the build, and the daemons that run."""

    build: Path
    bus: Gio.DBusConnection
    _names: int = 0
    _running: list = field(default_factory=list)

    @property
    def bus_pid(self) -> int:
        return int((SANDBOX_STATE / "dbus-daemon.pid").read_text())

    @property
    def polkitd_pid(self) -> int:
        return int((SANDBOX_STATE / "polkitd.pid").read_text())

    def program(self, name: str) -> Path:
        path = self.build / "benchmarks" / name
        if not path.exists():
            raise RuntimeError(f"{path} is missing")
        return path

    def service_environment(self, authz: str) -> dict[str, str]:
        """With the packaged libauthz ("polkit"), or another one in its place."""
        environment = unit_environment(SERVICE_UNIT)
        folders = {"polkit": None, "allow_all": "benchmarks/allow_all",
                   "short_deadline": "benchmarks/short_deadline",
                   "policy_file": "platform/authz/policy"}
        if folders[authz] is not None:
            library = self.build / folders[authz] / "libauthz.so.1"
            if not library.exists():
                raise RuntimeError(f"there is no {folders[authz]}/libauthz.so.1")
            environment["LD_LIBRARY_PATH"] = str(library.parent)
        return environment

    def ask_bus(self, method: str, *names: str) -> object:
        signature = "(" + "s" * len(names) + ")"
        reply = self.bus.call_sync("org.freedesktop.DBus", "/org/freedesktop/DBus",
                                   "org.freedesktop.DBus", method, GLib.Variant(signature, names),
                                   None, Gio.DBusCallFlags.NONE, -1, None)
        return reply.unpack()[0]

    def connection_of(self, pid: int, name: str) -> str | None:
        """The unique name under which the process owns the name or waits for it."""
        try:
            owners = self.ask_bus("ListQueuedOwners", name)
            return next((owner for owner in owners
                         if self.ask_bus("GetConnectionUnixProcessID", owner) == pid), None)
        except GLib.Error:
            return None

    @contextmanager
    def daemon(self, command: list[str], environment: dict[str, str], name: str) -> Iterator[Daemon]:
        """Runs from when it has asked for its name."""
        deadline = time.monotonic() + PATIENCE_SECONDS
        process = subprocess.Popen(command, env=environment, stdin=subprocess.DEVNULL,
                                   stdout=subprocess.DEVNULL)
        try:
            while (unique_name := self.connection_of(process.pid, name)) is None:
                if process.poll() is not None or time.monotonic() > deadline:
                    raise RuntimeError(f"{command[-1]} did not ask for {name}")
                time.sleep(0.005)
            running = Daemon(process, unique_name)
            self._running.append(running)
            yield running
            self.require_alive()
        finally:
            self._running = [other for other in self._running if other.process is not process]
            process.terminate()
            process.wait(timeout=PATIENCE_SECONDS)

    @contextmanager
    def service(self, world: World, authz: str = "polkit") -> Iterator[Daemon]:
        environment = self.service_environment(authz)
        with self.daemon(world.command(SERVICE, "-n"), environment, BUS_NAME) as running:
            folder = environment.get("LD_LIBRARY_PATH", "/usr/lib")
            library, = (path for path in loaded_libraries(running.pid)
                        if Path(path).name.startswith("libauthz.so"))
            if not Path(library).is_relative_to(folder):
                raise RuntimeError(f"the service runs with {library}, and not with {authz}")
            yield running

    def reference(self, world: World, checks: str = "none", names: Path | None = None):
        """Each call is allowed ("none") or checked ("polkit"); in the service's environment."""
        self._names += 1
        name = f"com.zintor.PrivaneBench.r{self._names}"
        command = [self.program("reference"), name, checks, *([names] if names else [])]
        return self.daemon(world.command(*command), unit_environment(SERVICE_UNIT), name)

    def minimal_command(self) -> tuple[list[str], str]:
        """The minimal daemon, and the name that it takes."""
        self._names += 1
        name = f"com.zintor.PrivaneBench.r{self._names}"
        return [str(self.program("minimal")), name], name

    def minimal(self, world: World):
        command, name = self.minimal_command()
        return self.daemon(world.command(*command), unit_environment(SERVICE_UNIT), name)

    def stock(self, world: World):
        if not Path(STOCK_DAEMON).exists():
            raise RuntimeError(f"there is no {STOCK_DAEMON}; run: tools/install_dependencies bench")
        return self.daemon(world.command(STOCK_DAEMON), unit_environment(STOCK_UNIT), STOCK_NAME)

    def require_alive(self) -> None:
        """A round in which somebody died measured nothing."""
        for running in self._running:
            if running.process.poll() is not None:
                raise RuntimeError(f"{running.process.args[-1]} ended with {running.process.returncode}")
        for pid in (self.bus_pid, self.polkitd_pid):
            os.kill(pid, 0)

    def call_times(self, daemon: Daemon, method: str, arguments: str, *, calls: int, warm_up: int = 5,
                   callers: int = 1, uid: int = 0, fails_with: str | None = None, show: bool = False,
                   after: tuple[str, str] | None = None, path: str = OBJECT_PATH) -> str:
        """Runs the client; what it printed. Each call must succeed, or fail with the text."""
        full_name = method if "." in method else f"{BUS_NAME}.{method}"
        command = [self.program("call_times"), f"--destination={daemon.unique_name}", f"--path={path}",
                   f"--calls={calls}", f"--warm-up={warm_up}", f"--callers={callers}"]
        command += [f"--fails-with={fails_with}"] * (fails_with is not None) + ["--show"] * show
        if after is not None:
            command += [f"--after={BUS_NAME}.{after[0]}", f"--after-arguments={after[1]}"]
        identity = {"user": uid, "group": 65534, "extra_groups": [privane_gid()]} if uid else {}
        return run([*command, full_name, arguments], **identity)

    def microseconds(self, daemon: Daemon, method: str, arguments: str, **options) -> float:
        return float(self.call_times(daemon, method, arguments, **options))

    def start_times(self, world: World, name: str, command: list[str],
                    environment: dict[str, str]) -> tuple[float, float]:
        """Microseconds from the fork of a daemon to its name, and its processor time in them; the
        world is entered before."""
        if self.ask_bus("NameHasOwner", name):
            raise RuntimeError(f"{name} is owned already")
        elapsed, worked = run(world.command(self.program("start_time"), name, *command),
                              env=environment).split()
        return float(elapsed), float(worked)

    @contextmanager
    def polkitd_stopped(self) -> Iterator[None]:
        os.kill(self.polkitd_pid, signal.SIGSTOP)
        try:
            yield
        finally:
            os.kill(self.polkitd_pid, signal.SIGCONT)


def privane_gid() -> int:
    return grp.getgrnam("privane").gr_gid


def run(command: list, **options) -> str:
    """What a program printed; it must succeed."""
    done = subprocess.run([str(word) for word in command], capture_output=True, text=True,
                          stdin=subprocess.DEVNULL, timeout=VISIT_SECONDS, **options)
    if done.returncode != 0:
        raise RuntimeError(f"{Path(str(command[0])).name} failed with {done.returncode}: "
                           f"{done.stderr.strip()[-300:]}")
    return done.stdout


class Cfgstore:
    """The process of that name, to which every change of an account sends a signal."""

    def __init__(self, count_file: Path) -> None:
        self._count_file = count_file

    def signals(self) -> int:
        """How many have come since it runs."""
        return int(self._count_file.read_text())

    def require_signals(self, expected: int) -> None:
        """The last may still be on its way."""
        deadline = time.monotonic() + SIGNAL_SECONDS
        while self.signals() < expected and time.monotonic() < deadline:
            time.sleep(0.002)
        if self.signals() != expected:
            raise RuntimeError(f"cfgstore got {self.signals()} signals in all, and not {expected}")


@contextmanager
def cfgstore(program: Path, folder: Path) -> Iterator[Cfgstore]:
    """Runs it."""
    count_file = folder / "cfgstore-signals"
    with ExitStack() as stack:
        process = subprocess.Popen([program, count_file], stdin=subprocess.DEVNULL)
        stack.callback(process.wait)
        stack.callback(process.kill)
        deadline = time.monotonic() + PATIENCE_SECONDS
        while not count_file.exists() or not count_file.read_text():
            if process.poll() is not None or time.monotonic() > deadline:
                raise RuntimeError("cfgstore does not count")
            time.sleep(0.005)
        yield Cfgstore(count_file)
        if process.poll() is not None:
            raise RuntimeError("cfgstore has ended")


def parsed_answer(text: str) -> object:
    """An answer in GVariant's text format, its lists sorted: their order is nobody's promise."""
    python = text.strip().replace("true", "True").replace("false", "False").replace("@as ", "")
    return tuple(sorted(part) if isinstance(part, list) else part for part in ast.literal_eval(python))
