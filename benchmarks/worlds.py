"""benchmarks/worlds.py: private views of /etc and /home with the account files of a device.

A daemon that runs in a world sees the world's folders in the place of the sandbox's own, so that
daemons with different accounts, on different file systems, can run side by side.
"""
import grp
import os
import pwd
import shutil
import subprocess
from collections.abc import Iterator
from contextlib import contextmanager
from dataclasses import dataclass
from pathlib import Path

# Which polkit and the bus must know by name, too.
ALLOWED_USER, REFUSED_USER = "benchallowed", "benchrefused"
ALLOWED_UID, REFUSED_UID = 811, 812

FIRST_UID, LAST_UID = 1000, 60000
ALL_UIDS = LAST_UID - FIRST_UID + 1
# Left free while there is room: other tools look for a free one from the first on, in a time that
# grows with the square of the users before it.
FREE_UID = FIRST_UID

PASSWORD = "benchmark7"
# That password, hashed with SHA-256.
HASH = "$5$benchmark123$rp7CsR0nqx/pRDZgd8AxbHK0dRbXW14L6Z55MHVuZd0"

SMALL_GROUP = "viewer"
# Not "users": Debian's adduser looks up each member of that group, which the stock daemon would pay
# for.
PRIMARY_GROUP = "camera"

# Everything that is bound over the sandbox's own.
FOLDERS = {"etc": "/etc", "home": "/home", "accounts": "/var/lib/AccountsService"}

_ENTER = " && ".join([*(f'mount --bind "$0/{name}" {path}' for name, path in FOLDERS.items()),
                      'exec "$@"'])


@dataclass(frozen=True)
class World:
    path: Path
    users: int

    def command(self, *command: object) -> list[str]:
        """The command in this world, under the process ID that it is started with."""
        return ["unshare", "--mount", "--propagation", "private", "--", "sh", "-c", _ENTER,
                str(self.path), *map(str, command)]


def user_name(number: int) -> str:
    """Of an ordinary user, from 1."""
    return f"b{number:05d}"


def _machine_lines() -> tuple[str, str, str]:
    """The accounts that the bus, polkit and the clients run as."""
    users = [pwd.getpwnam(name) for name in
             ("root", "messagebus", "polkitd", ALLOWED_USER, REFUSED_USER)]
    groups = [grp.getgrnam(name) for name in
              ("root", "shadow", "users", "messagebus", "polkitd", "privane", "www-data")]
    return ("".join(f"{u.pw_name}:x:{u.pw_uid}:{u.pw_gid}::{u.pw_dir}:{u.pw_shell}\n" for u in users),
            "".join(f"{u.pw_name}:!:19000:0:99999:7:::\n" for u in users),
            "".join(f"{g.gr_name}:x:{g.gr_gid}:{','.join(g.gr_mem)}\n" for g in groups))


def _ordinary_groups(users: int, groups: int, taken: set[int]) -> list[str]:
    """The groups of the users, and as many more as make up the number."""
    members = [user_name(number) for number in range(1, users + 1)]
    named = {400: (PRIMARY_GROUP, members), 410: (SMALL_GROUP, members[:5]),
             411: ("operator", members[:1])}
    lines = [f"{name}:x:{gid}:{','.join(listed)}\n" for gid, (name, listed) in named.items()]
    free = (gid for gid in (*range(1, 1000), *range(60001, 60011), 65534)
            if gid not in taken and gid not in named)
    while len(lines) + len(taken) < groups:
        gid = next(free)
        lines.append(f"filler{gid}:x:{gid}:\n")
    return lines


def write_accounts(etc: Path, users: int, groups: int) -> None:
    passwd, shadow, group = _machine_lines()
    taken = {int(line.split(":")[2]) for line in group.splitlines()}
    numbers = range(1, users + 1)
    first = FIRST_UID if users == ALL_UIDS else FREE_UID + 1
    passwd += "".join(f"{user_name(n)}:x:{first + n - 1}:400:Benchmark user:/home/{user_name(n)}:"
                      "/bin/sh\n" for n in numbers)
    shadow += "".join(f"{user_name(n)}:{HASH}:19000:0:99999:7:::\n" for n in numbers)
    # An account without a password, of the type whose password may be cleared.
    passwd += "benchsystem:x:900:400::/:/usr/sbin/nologin\n"
    shadow += "benchsystem:!:19000:0:99999:7:::\n"
    group += "".join(_ordinary_groups(users, groups, taken))
    for name, text, mode in (("passwd", passwd, 0o644), ("shadow", shadow, 0o640),
                             ("group", group, 0o644)):
        (etc / name).write_text(text)
        (etc / name).chmod(mode)
    # The service keeps none, and the shadow tools go by whether it is there.
    (etc / "gshadow").unlink(missing_ok=True)
    digests = etc / "apache2/digest_auth_passwd"
    digests.parent.mkdir(exist_ok=True)
    digests.write_text("".join(f"{user_name(n)}:PRIVANE:{n:032x}\n" for n in range(1, min(users, 25) + 1)))
    digests.chmod(0o640)


def make_world(folder: Path, users: int, groups: int = 20) -> World:
    """A world with that many ordinary users."""
    path = folder / f"users{users}groups{groups}"
    if not path.exists():
        shutil.copytree("/etc", path / "etc", symlinks=True)
        (path / "home").mkdir()
        (path / "accounts/users").mkdir(parents=True)
        (path / "accounts/icons").mkdir()
        write_accounts(path / "etc", users, groups)
    return World(path, users)


def add_clients() -> None:
    """The users that clients run as, in the sandbox's own files, with a rule for one of them."""
    group = Path("/etc/group")
    lines = group.read_text().splitlines()
    opened = [f"{line}{'' if line.endswith(':') else ','}{ALLOWED_USER},{REFUSED_USER}"
              if line.startswith("privane:") else line for line in lines]
    if opened == lines:
        raise RuntimeError("there is no group privane")
    group.write_text("\n".join(opened) + "\n")
    with Path("/etc/passwd").open("a") as passwd:
        for name, uid in ((ALLOWED_USER, ALLOWED_UID), (REFUSED_USER, REFUSED_UID)):
            passwd.write(f"{name}:x:{uid}:65534::/:/usr/sbin/nologin\n")
    rule = Path("/etc/polkit-1/rules.d/60-bench.rules")
    rule.write_text('polkit.addRule(function (action, subject) {\n'
                    '    if (action.id.indexOf("com.zintor.privane-system.") == 0 &&\n'
                    f'        subject.user == "{ALLOWED_USER}")\n'
                    '        return polkit.Result.YES;\n});\n')
    shutil.chown(rule, "polkitd")
    for path in FOLDERS.values():
        Path(path).mkdir(parents=True, exist_ok=True)


@contextmanager
def ext4_folder(disk: Path) -> Iterator[tuple[Path, str]]:
    """A folder on ext4, where a sync means one of the disk, and what the file system lies on: the disk
    that the given folder is on, or where that has another file system an image in it."""
    kind = subprocess.run(["findmnt", "-no", "FSTYPE", "-T", disk], capture_output=True, text=True,
                          check=True).stdout.strip()
    if kind == "ext4":
        folder = disk / "worlds"
        shutil.rmtree(folder, ignore_errors=True)  # of a run that was killed
        folder.mkdir(mode=0o700)  # the worlds are made from this machine's /etc
        try:
            yield folder, "ext4 on the disk"
        finally:
            shutil.rmtree(folder)
        return
    image, target = disk / "ext4.img", Path("/tmp/ext4")
    _make_ext4(image)
    target.mkdir(parents=True)
    _make_loop_devices()
    subprocess.run(["mount", "-o", "loop", image, target], check=True)
    try:
        yield target, f"ext4 in a file on {kind}"
    finally:
        subprocess.run(["umount", target], check=True)
        image.unlink()


def _make_ext4(image: Path, megabytes: int = 512) -> None:
    """All of it is allocated, and nothing is put off until it is used."""
    image.unlink(missing_ok=True)
    with image.open("wb") as file:
        os.posix_fallocate(file.fileno(), 0, megabytes << 20)
    subprocess.run(["mkfs.ext4", "-q", "-F", "-E", "lazy_itable_init=0,lazy_journal_init=0", image],
                   check=True)


def _make_loop_devices() -> None:
    """The sandbox has a nearly empty /dev."""
    for name, kind, major, minor in [("loop-control", "c", 10, 237),
                                     *((f"loop{n}", "b", 7, n) for n in range(64))]:
        if not Path("/dev", name).exists():
            subprocess.run(["mknod", "-m", "0600", f"/dev/{name}", kind, str(major), str(minor)],
                           check=True)
