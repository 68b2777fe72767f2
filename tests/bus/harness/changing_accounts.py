"""tests/bus/harness/changing_accounts.py: the account files of the tests that change them.

There is a user of every type and a group of every type. The texts are what the service itself would
write, so that a rewrite alone shows no difference.
"""
import re
import time
from dataclasses import dataclass
from pathlib import Path
from typing import Callable

from harness.accounts import GROUP, PASSWD, SHADOW, AccountFiles
from harness.passwords import OLD_HASH

PASSWD_TEXT = """\
root:x:0:0:root:/root:/bin/sh
daemon:x:1:1:daemon:/usr/sbin:/usr/sbin/nologin
anonymous:x:300:100:Visitor::/bin/false
timer:x:998:998:Keeps time:/var/lib/timer:/usr/sbin/nologin
alice:x:1000:100:Alice Liddell:/home/alice:/bin/false
bob:x:1001:100:Bob::/bin/false
nobody:x:65534:65534:nobody:/nonexistent:/usr/sbin/nologin
"""
SHADOW_TEXT = f"""\
root:{OLD_HASH}:19000:0:99999:7:0::
daemon:{OLD_HASH}:19000:0:99999:7:0::
anonymous:{OLD_HASH}:19000:0:99999:7:0::
timer:{OLD_HASH}:19000:0:99999:7:0::
alice:{OLD_HASH}:19000:0:99999:7:0::
bob:{OLD_HASH}:19000:0:99999:7:0::
nobody:*:19000:0:99999:7:0::
"""
GROUP_TEXT = """\
root:x:0:
daemon:x:1:
users:x:100:alice
viewer:x:101:
operator:x:102:alice
admin:x:103:timer
timer:x:998:
nogroup:x:65534:
recorder:x:60005:
"""

SECONDS_PER_DAY = 86400
HASH = re.compile(r"\$5\$[./0-9A-Za-z]{12}\$[./0-9A-Za-z]{43}")


@dataclass(frozen=True)
class Texts:
    """The three files, with whatever differs from run to run replaced: a fresh hash by "HASH", the
    day of a change that was made just now by "TODAY", and members in alphabetical order."""

    passwd: str = PASSWD_TEXT
    shadow: str = SHADOW_TEXT
    group: str = GROUP_TEXT


def is_today(day: str) -> bool:
    """Whether the day of a shadow line is the one on which the test runs."""
    today = int(time.time()) // SECONDS_PER_DAY
    # Around midnight the change may have been made yesterday.
    return day in (str(today), str(today - 1))


def _mask_shadow(line: str) -> str:
    name, password, day, *rest = line.split(":")
    if is_today(day):
        day = "TODAY"
    if password != OLD_HASH:
        password = HASH.sub("HASH", password)
    return ":".join([name, password, day, *rest])


def _sort_members(line: str) -> str:
    head, _, members = line.rpartition(":")
    return f"{head}:{','.join(sorted(members.split(',')))}"


def _each_line(change: Callable[[str], str], path: Path) -> str:
    *lines, rest = path.read_text().split("\n")
    return "".join(f"{change(line)}\n" for line in lines) + rest


def read_texts() -> Texts:
    return Texts(PASSWD.read_text(), _each_line(_mask_shadow, SHADOW),
                 _each_line(_sort_members, GROUP))


def write_changing_accounts(files: AccountFiles) -> None:
    files.write_exactly(PASSWD_TEXT, SHADOW_TEXT, GROUP_TEXT)


def stored_hash(name: str) -> str:
    """The password field of the shadow file."""
    fields = [line.split(":") for line in SHADOW.read_text().splitlines()]
    (found,) = [row[1] for row in fields if row[0] == name]
    return found


def edit(text: str, old: str, new: str) -> str:
    """The text with one place changed, which must be there once."""
    assert text.count(old) == 1, (old, text)
    return text.replace(old, new)
