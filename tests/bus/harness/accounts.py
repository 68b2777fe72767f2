"""tests/bus/harness/accounts.py: the account files that the service reads."""
import grp
import os
import pwd
from dataclasses import dataclass
from pathlib import Path

PASSWD = Path("/etc/passwd")
SHADOW = Path("/etc/shadow")
GROUP = Path("/etc/group")

SHADOW_GID = 42

# The users and groups that dbus-daemon and polkitd run as, and the group that may call the service.
SYSTEM_USERS = ("messagebus", "polkitd")
SYSTEM_GROUPS = ("messagebus", "polkitd", "privane")

# A hash as crypt(3) writes it; nobody knows its password.
HASH = "$5$fixedsalt$Gcm6FsVtF/Qa77ZKD.iwsJlCVPY0XSMgLJL0Hnww/c1"


@dataclass(frozen=True)
class SystemAccounts:
    """This machine's own lines of the accounts that have to stay."""

    passwd: str
    shadow: str
    group: str

    @classmethod
    def read(cls) -> "SystemAccounts":
        users = [pwd.getpwnam(name) for name in SYSTEM_USERS]
        groups = [grp.getgrnam(name) for name in SYSTEM_GROUPS]
        return cls(
            "".join(f"{u.pw_name}:x:{u.pw_uid}:{u.pw_gid}:{u.pw_gecos}:{u.pw_dir}:{u.pw_shell}\n"
                    for u in users),
            "".join(f"{name}:!*:19000:0:99999:7:::\n" for name in SYSTEM_USERS),
            "".join(f"{g.gr_name}:x:{g.gr_gid}:\n" for g in groups))


def replace(path: Path, content: str | bytes, mode: int, gid: int) -> None:
    """A new file in the old one's place, whole at every moment."""
    new = path.with_name(path.name + ".new")
    new.write_bytes(content.encode() if isinstance(content, str) else content)
    os.chmod(new, mode)
    os.chown(new, 0, gid)
    new.rename(path)


class AccountFiles:
    """Writes the three files. What a test leaves out of them is gone for the whole sandbox, so
    tests in which polkitd or other users take part keep the system accounts."""

    def __init__(self) -> None:
        self._system = SystemAccounts.read()

    def write_exactly(self, passwd: str | bytes, shadow: str | bytes | None,
                      group: str | bytes | None) -> None:
        """The files as given; None is no file."""
        files = ((PASSWD, passwd, 0o644, 0), (SHADOW, shadow, 0o640, SHADOW_GID),
                 (GROUP, group, 0o644, 0))
        for path, content, mode, gid in files:
            if content is None:
                path.unlink(missing_ok=True)
            else:
                replace(path, content, mode, gid)

    def write(self, passwd: str = "", shadow: str = "", group: str = "") -> None:
        """The given lines, followed by the system's."""
        self.write_exactly(passwd + self._system.passwd, shadow + self._system.shadow,
                           group + self._system.group)


# The hash of "secret", which is clerk's password.
SECRET_HASH = "$5$fixedsalt$K4ZxUsO9XaK31A5jPFIJg99Zd5sm7kTwAIilfyWVLg/"

# The users that tests call as: all but stranger are in group privane, two also have a role.
CLERK_UID, STRANGER_UID, VIEWER_UID, OPERATOR_UID = 701, 702, 703, 704
VIEWER_ROLE_GID, OPERATOR_ROLE_GID = 750, 751

STANDARD_PASSWD = f"""\
root:x:0:0:root:/root:/bin/sh
clerk:x:{CLERK_UID}:{CLERK_UID}:Calls without a role:/:/usr/sbin/nologin
stranger:x:{STRANGER_UID}:{STRANGER_UID}:May not call:/:/usr/sbin/nologin
viewer:x:{VIEWER_UID}:{VIEWER_UID}:Has a role:/:/usr/sbin/nologin
operator:x:{OPERATOR_UID}:{OPERATOR_UID}:Has another role:/:/usr/sbin/nologin
"""
STANDARD_SHADOW = f"""\
root:{HASH}:19000:0:99999:7:::
clerk:{SECRET_HASH}:19000:0:99999:7:::
stranger:!:19000:0:99999:7:::
viewer:!:19000:0:99999:7:::
operator:!:19000:0:99999:7:::
"""
STANDARD_GROUP = f"""\
root:x:0:
clerk:x:{CLERK_UID}:
stranger:x:{STRANGER_UID}:
viewer:x:{VIEWER_UID}:
operator:x:{OPERATOR_UID}:
privane-viewer:x:{VIEWER_ROLE_GID}:viewer
privane-operator:x:{OPERATOR_ROLE_GID}:operator
"""
