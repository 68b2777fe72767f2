"""tests/bus/harness/checker.py: privane-check on account files that a test writes."""
import os
import subprocess
from pathlib import Path

from harness.accounts import GROUP, PASSWD, SHADOW, replace

NOTHING, CHANGES, USAGE, LOSS, UNUSABLE, UNTOLD = range(6)

GSHADOW = Path("/etc/gshadow")

GOOD_PASSWD = "root:x:0:0:root:/root:/bin/sh\nalice:x:1001:100:Alice:/home:/bin/false\n"
GOOD_SHADOW = "root:*:19000:0:99999:7:0::\nalice:$5$salt$hash:19000:0:99999:7:0::\n"
GOOD_GROUP = "root:x:0:\nusers:x:100:alice\n"


def check(*options: str, **environment: str) -> subprocess.CompletedProcess[str]:
    return subprocess.run(["/usr/sbin/privane-check", *options], capture_output=True, text=True,
                          check=False, env={**os.environ, **environment})


def write(passwd: str = GOOD_PASSWD, shadow: str | None = GOOD_SHADOW,
          group: str = GOOD_GROUP) -> None:
    """As root's, with modes that nobody minds, and no gshadow file."""
    replace(PASSWD, passwd, 0o644, 0)
    replace(GROUP, group, 0o644, 0)
    GSHADOW.unlink(missing_ok=True)
    SHADOW.unlink(missing_ok=True)
    if shadow is not None:
        replace(SHADOW, shadow, 0o600, 0)


def told(*options: str) -> list[str]:
    return check(*options).stdout.splitlines()
