"""tests/packages/test_install_from_source.py: the README's commands for a device that has no packages,
as they stand there, in a root file system of their own. Needs root for its namespaces."""
import os
import shutil
import subprocess
from dataclasses import dataclass
from pathlib import Path

import pytest
from conftest import TREE
from document_blocks import block

SANDBOX = TREE / "tests/bus/sandbox.sh"
SECONDS = 1200

# Stands for systemd, which the sandbox has not: it records its calls, and passes on what the bus is told.
SYSTEMCTL = """\
#!/bin/sh
echo "$*" >>/run/systemctl-calls
[ "$*" != "reload dbus" ] || kill -HUP "$(cat /run/bus-sandbox/dbus-daemon.pid)"
"""

# A device has the files of accounts, the group not yet, and nothing that systemd-sysusers would find in use.
FORGET_GROUP = """\
awk -F: '$1 != "privane" && $3 != 480' /etc/group >/run/group
cat /run/group >/etc/group
rm -f /etc/gshadow /etc/gshadow-
"""

# Who is in the group gets past the bus, and hears of polkit; who is not does not.
CALLS = """\
/usr/sbin/privane_system -n >log 2>&1 &
gdbus wait --system --timeout 20 com.zintor.PrivaneSystem
call="gdbus call --system -d com.zintor.PrivaneSystem -o /com/zintor/PrivaneSystem
      -m com.zintor.PrivaneSystem.CheckGroup privane"
$call
setpriv --reuid=nobody --regid=nogroup --groups=480 -- $call 2>&1 | grep -o '_authz.Code1'
setpriv --reuid=nobody --regid=nogroup --clear-groups -- $call 2>&1 | grep -o 'Error.AccessDenied'
"""


@dataclass(frozen=True)
class Installed:
    folder: Path

    def said(self, name: str) -> str:
        return (self.folder / name).read_text()


@pytest.fixture(scope="module")
def installed(tmp_path_factory: pytest.TempPathFactory) -> Installed:
    """What the block left, twice: on a device as it should be, and on one that has a gshadow file."""
    folder = tmp_path_factory.mktemp("install")
    sources, layer = folder / "sources", folder / "layer"
    shutil.copytree(TREE, sources, symlinks=True, ignore=shutil.ignore_patterns(".git", "build*"))
    (layer / "usr/bin").mkdir(parents=True)
    (layer / "usr/bin/systemctl").write_text(SYSTEMCTL)
    (layer / "usr/bin/systemctl").chmod(0o755)
    (folder / "block").write_text(block("README.md", "meson setup build"))
    (folder / "script").write_text(f"""\
trap 'cat /run/bus-sandbox/*.log >&2; rm -rf {sources}' EXIT
cd {sources}
{FORGET_GROUP}
bash -eu ../block >../block.log 2>&1
cp /etc/group ..
ls /etc >../etc
stat -c '%a %U' /run/lock/fw_printenv.lock >../lock
mv /run/systemctl-calls ..
({CALLS}) >../calls
{FORGET_GROUP}
echo 'root:*::' >/etc/gshadow
bash -eu ../block >../block.log 2>&1
cp /etc/gshadow ..
""")
    as_root = [] if os.geteuid() == 0 else ["sudo", "--"]
    done = subprocess.run([*as_root, SANDBOX, "-l", layer, "-w", folder, "--", "bash", "-eu",
                           folder / "script"], capture_output=True, text=True, timeout=SECONDS)
    log = folder / "block.log"
    assert done.returncode == 0, done.stderr + (log.read_text()[-4000:] if log.exists() else "")
    return Installed(folder)


def test_group_is_permanent(installed: Installed) -> None:
    assert "privane:x:480:" in installed.said("group").splitlines()


def test_no_gshadow_file_is_left_where_there_was_none(installed: Installed) -> None:
    assert {"passwd", "group"} <= set(installed.said("etc").splitlines())
    assert "gshadow" not in installed.said("etc").splitlines()


def test_gshadow_file_that_was_there_is_kept(installed: Installed) -> None:
    assert "root:*::" in installed.said("gshadow").splitlines()


def test_lock_of_the_boot_block_is_roots(installed: Installed) -> None:
    assert installed.said("lock") == "600 root\n"


def test_systemd_and_the_bus_are_told(installed: Installed) -> None:
    assert installed.said("systemctl-calls") == "daemon-reload\nreload dbus\n"


def test_service_answers_and_the_bus_lets_the_group_in(installed: Installed) -> None:
    assert installed.said("calls") == "(true,)\n_authz.Code1\nError.AccessDenied\n"
