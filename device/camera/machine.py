"""device/camera/machine.py: the virtual camera as a running machine: a QEMU process, its control
channels, and what scripts and tests ask of them."""
import hashlib
import socket
import subprocess
from collections.abc import Iterator, Mapping, Sequence
from contextlib import ExitStack, contextmanager
from pathlib import Path
from typing import Any

from .deadline import Deadline
from .errors import CameraError
from .host_tool import run_tool
from .image_layer import DISKS, Image
from .qmp import Qmp
from .root_shell import Result, RootShell

QEMU = "qemu-system-x86_64"
KERNEL_LINE = ("root=/dev/vda rw console=ttyS0 quiet loglevel=4 panic=-1 net.ifnames=0 "
               "mitigations=off random.trust_cpu=on systemd.show_status=auto")
BOOT_SECONDS = 180
COMMAND_SECONDS = 60
SHOW_FAILED_UNITS = """systemctl --failed --no-legend --plain | while read -r unit rest; do
    systemctl status --no-pager --full --lines 20 "$unit"
done"""


def devices(kvm: bool) -> list[str]:
    """The machine, without files and channels. A snapshot fits only the list it was saved with."""
    words = ["-nodefaults", "-no-user-config", "-display", "none"]
    words += ["-machine", "q35", "-m", "512", "-smp", "1"]
    words += ["-accel", "kvm", "-cpu", "host"] if kvm else ["-accel", "tcg", "-cpu", "max"]
    # The guest's clock stands still while it is saved, so nothing times out when it goes on.
    words += ["-rtc", "base=utc,clock=vm", "-append", KERNEL_LINE]
    words += ["-serial", "chardev:serial", "-mon", "chardev=qmp,mode=control"]
    words += ["-device", "virtio-blk-pci,drive=root"]
    # /dev/sda, a disk that knows SMART; and eth0 with a link, on a network of nobody else.
    words += ["-device", "ide-hd,bus=ide.0,drive=storage"]
    words += ["-netdev", "hubport,id=lan,hubid=0", "-device", "e1000,netdev=lan"]
    words += ["-device", "virtio-serial-pci", "-device", "virtconsole,chardev=shell"]
    words += ["-device", "virtio-rng-pci"]
    return words


def machine_key(kvm: bool) -> str:
    """Names what a snapshot depends on beside the image."""
    version = run_tool(QEMU, "--version")
    return hashlib.sha256(f"{version}{devices(kvm)}".encode()).hexdigest()[:16]


class Camera:
    """A running camera. Use it in a `with` block: leaving it ends QEMU and removes its files."""

    def __init__(self, image: Image, *, disks: Mapping[str, Path] | None = None,
                 snapshot: str = "", kvm: bool = False) -> None:
        """Boots the image, or goes on from the named snapshot that the qcow2 files hold."""
        self._cleanup = ExitStack()
        self._folder = self._cleanup.enter_context(image.cache.run_folder())
        self.disks = {name: self._folder / f"{name}.qcow2" for name in DISKS}
        try:
            for name, path in self.disks.items():
                if disks is None:
                    run_tool("qemu-img", "create", "-q", "-f", "qcow2", "-F", "raw",
                             "-b", image.disk_from_beside(name), path)
                else:
                    # A copy: this run takes snapshots in it, and its crash harms no other.
                    run_tool("cp", "--reflink=auto", "--sparse=always", disks[name], path)
            self._process = self._launch(image, snapshot, kvm)
            with self._explained():
                self._wait_until_up(booting=not snapshot)
        except BaseException:
            self.close()
            raise

    def _launch(self, image: Image, snapshot: str, kvm: bool) -> subprocess.Popen[bytes]:
        ours_qmp, qemus_qmp = socket.socketpair()
        ours_shell, qemus_shell = socket.socketpair()
        self.qmp = Qmp(ours_qmp)
        self.shell = RootShell(ours_shell)
        # setpriv: the machine dies with us, however we die.
        argv = ["setpriv", "--pdeathsig", "KILL", "--", QEMU, *devices(kvm)]
        argv += ["-kernel", str(image.kernel), "-initrd", str(image.initrd)]
        for name, path in self.disks.items():
            argv += ["-drive", f"if=none,id={name},format=qcow2,cache=unsafe,file={_escaped(path)}"]
        argv += ["-chardev", f"file,id=serial,path={_escaped(self._folder / 'serial.log')}"]
        argv += ["-chardev", f"socket,id=qmp,fd={qemus_qmp.fileno()}"]
        argv += ["-chardev", f"socket,id=shell,fd={qemus_shell.fileno()}"]
        argv += ["-loadvm", snapshot] if snapshot else []
        with qemus_qmp, qemus_shell, open(self._folder / "qemu.log", "wb") as log:
            # A session of its own: Ctrl-C on the terminal is for us, who then end it in order.
            process = subprocess.Popen(argv, stdin=subprocess.DEVNULL, stdout=log, stderr=log,
                                       pass_fds=(qemus_qmp.fileno(), qemus_shell.fileno()),
                                       start_new_session=True)
        self._cleanup.callback(_end, process)
        return process

    def _wait_until_up(self, booting: bool) -> None:
        deadline = Deadline(BOOT_SECONDS, "starting the camera")
        self.qmp.greet(deadline)
        if booting:
            self._wait_until_booted(deadline)
        self.shell.run("true", deadline).check()

    def _wait_until_booted(self, deadline: Deadline) -> None:
        self.shell.wait_until_ready(deadline)
        state = self.shell.run("systemctl is-system-running --wait", deadline).out.strip()
        if state != "running":
            failed = self.shell.run(SHOW_FAILED_UNITS, deadline).out
            raise CameraError(f"the camera is up, but {state}:\n{failed}")

    @property
    def running(self) -> bool:
        return self._process.poll() is None

    @property
    def pid(self) -> int:
        return self._process.pid

    def run(self, command: str | Sequence[str], *, user: str = "root",
            timeout: float = COMMAND_SECONDS) -> Result:
        """Runs a shell script or the words of a command as a user of the camera."""
        if user != "root":
            words = ["bash", "-c", command] if isinstance(command, str) else list(command)
            command = ["setpriv", f"--reuid={user}", f"--regid={user}", "--init-groups",
                       "--inh-caps=-all", "--reset-env", "--", *words]
        with self._explained():
            return self.shell.run(command, Deadline(timeout, f"in the camera: {command}"))

    def read_file(self, path: str) -> bytes:
        return self.run(["cat", "--", path]).check().out_bytes

    def put_file(self, path: str, content: bytes, mode: int = 0o644) -> None:
        with self._explained():
            self.shell.put(path, content, mode, Deadline(COMMAND_SECONDS, f"writing {path}"))

    def save(self, name: str) -> None:
        """Keeps memory and disk as they are now, replacing an older snapshot of that name."""
        with self._explained():
            self.qmp.monitor(f"savevm {name}", Deadline(COMMAND_SECONDS, "saving the camera"))

    def restore(self, name: str) -> None:
        with self._explained():
            deadline = Deadline(COMMAND_SECONDS, "restoring the camera")
            self.qmp.monitor(f"loadvm {name}", deadline)
            # A machine that stood still before goes on standing still otherwise.
            self.qmp.execute("cont", deadline)
            self.shell.run("true", deadline).check()

    def cut_power(self) -> None:
        """Takes the power away for a moment; returns when the camera is up again from its disk."""
        with self._explained():
            deadline = Deadline(BOOT_SECONDS, "booting the camera after a power cut")
            self.qmp.execute("system_reset", deadline)
            self._wait_until_rebooted(deadline)

    def wait_for_reboot(self) -> None:
        """Returns when the camera, which is about to reboot by itself, is up again."""
        with self._explained():
            self._wait_until_rebooted(Deadline(BOOT_SECONDS, "waiting for the camera to reboot"))

    def _wait_until_rebooted(self, deadline: Deadline) -> None:
        self.qmp.wait_for_event("RESET", deadline)
        self._wait_until_booted(deadline)

    def power_off(self, timeout: float = 60) -> dict[str, Any]:
        """Presses the power button, waits until QEMU is gone, and returns its event about it."""
        with self._explained():
            deadline = Deadline(timeout, "powering the camera off")
            # Not a command: the shell may be busy with what somebody left running in it.
            self.qmp.execute("system_powerdown", deadline)
            event = self.qmp.wait_for_event("SHUTDOWN", deadline)
            self._wait_for_end(deadline)
            return event

    def quit(self) -> None:
        """Pulls the plug, but with the disk's file closed in order."""
        with self._explained():
            deadline = Deadline(20, "ending QEMU")
            self.qmp.execute("quit", deadline)
            self._wait_for_end(deadline)

    def _wait_for_end(self, deadline: Deadline) -> None:
        try:
            self._process.wait(deadline.left())
        except subprocess.TimeoutExpired:
            raise deadline.missed() from None

    def close(self) -> None:
        """Ends QEMU if it still runs, and removes the files of this run."""
        self._cleanup.close()

    @contextmanager
    def _explained(self) -> Iterator[None]:
        """Adds what the machine said last to an error about it."""
        try:
            yield
        except (CameraError, OSError) as error:
            text = str(error)
            for log in (self._folder / "serial.log", self._folder / "qemu.log"):
                lines = log.read_text(errors="replace").splitlines() if log.exists() else []
                if lines:
                    text += f"\n--- the end of {log.name}\n" + "\n".join(lines[-20:])
            raise CameraError(text) from None

    def __enter__(self) -> "Camera":
        return self

    def __exit__(self, *error: object) -> None:
        self.close()


def _end(process: subprocess.Popen[bytes]) -> None:
    if process.poll() is None:
        process.kill()
        process.wait()


def _escaped(path: Path) -> str:
    """QEMU reads a comma as the end of a path."""
    return str(path).replace(",", ",,")
