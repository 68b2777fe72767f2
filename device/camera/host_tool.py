"""device/camera/host_tool.py: runs the tools of this machine that make the camera."""
import os
import shlex
import signal
import subprocess
import tempfile
from pathlib import Path

from .errors import CameraError

# depmod and mkfs.ext4 stand where an ordinary user's search path does not lead.
ENVIRONMENT = {**os.environ, "PATH": os.environ.get("PATH", os.defpath) + ":/usr/sbin:/sbin"}


def run_tool(*argv: str | Path) -> str:
    """Runs a tool quietly and returns its output; a failure shows all it said."""
    words = [str(word) for word in argv]
    with tempfile.TemporaryFile() as output:
        try:
            process = subprocess.Popen(words, stdin=subprocess.DEVNULL, stdout=output,
                                       stderr=subprocess.STDOUT, env=ENVIRONMENT,
                                       start_new_session=True)
        except FileNotFoundError:
            raise CameraError(f"{words[0]} is not installed; this installs all that is needed: "
                              "tools/install_dependencies build camera") from None
        try:
            process.wait()
        except BaseException:
            # Not SIGKILL: mmdebstrap has mounts and folders to take away first. To all of them, since
            # unshare(1) does not pass it on.
            os.killpg(process.pid, signal.SIGTERM)
            process.wait()
            raise
        output.seek(0)
        text = output.read().decode(errors="replace")
    if process.returncode != 0:
        raise CameraError(f"{text}\nstatus {process.returncode}: {shlex.join(words)}")
    return text
