"""tests/long/power/loaded_accounts.py: whether the service would start with the account files
that are left, and know everybody who has an account before and after the change that was cut."""
import subprocess
from collections.abc import Callable, Sequence
from pathlib import Path

from recorded_run import Change, Version

ACCOUNT_FILES = ("passwd", "shadow", "group")
ROOT, ROOT_UID = "root", 0
READ_SECONDS = 60

# What is loaded of three files: a UID and a hash for each name.
Users = dict[str, tuple[int, str]]


class NotLoadedError(Exception):
    """The service would not start."""


class AccountReader:
    """Asks the program for each three files once: most states leave what another one has left."""

    def __init__(self, program: Path, folder: Path) -> None:
        self._program = program
        self._folder = folder
        (folder / "etc").mkdir()
        self._known: dict[tuple[bytes | None, ...], Users | NotLoadedError] = {}

    def __call__(self, left: Version) -> Users:
        """Raises NotLoadedError."""
        contents = tuple(None if (file := left[name]) is None else file[3]
                         for name in ACCOUNT_FILES)
        if contents not in self._known:
            try:
                self._known[contents] = self._load(contents)
            except NotLoadedError as error:
                self._known[contents] = error
        known = self._known[contents]
        if isinstance(known, NotLoadedError):
            raise known
        return known

    def _load(self, contents: Sequence[bytes | None]) -> Users:
        for name, content in zip(ACCOUNT_FILES, contents, strict=True):
            path = self._folder / "etc" / name
            path.unlink(missing_ok=True)
            if content is not None:
                path.write_bytes(content)
        done = subprocess.run([self._program, self._folder], stdin=subprocess.DEVNULL,
                              capture_output=True, timeout=READ_SECONDS, check=False)
        if done.returncode != 0:
            raise NotLoadedError(f"status {done.returncode}: "
                                 f"{done.stderr.decode(errors='replace')[-300:].strip()}")
        users: Users = {}
        for line in done.stdout.decode(errors="surrogateescape").splitlines():
            name, uid, password = line.split(" ", 2)
            users[name] = int(uid), password
        return users


def faults_of_loading(left: Version, read: Callable[[Version], Users], changes: Sequence[Change],
                      answered: int, begun: int) -> list[str]:
    """What the service would miss; nothing when all is well."""
    try:
        loaded = read(left)
    except NotLoadedError as error:
        return [f"the service would not load the accounts: {error}"]
    faults = []
    # An account that is just made or removed may be there in part.
    lasting = names_in(changes[answered].version)
    for number in range(answered + 1, begun + 1):
        lasting &= names_in(changes[number].version)
    if lost := sorted(lasting - set(loaded)):
        faults.append(f"the service would not load {', '.join(lost)}")
    uid, password = loaded.get(ROOT, (None, ""))
    if uid != ROOT_UID or not password:
        faults.append(f"root is loaded with UID {uid}, "
                      f"{'a' if password else 'and without any'} password")
    return faults


def names_in(version: Version) -> set[str]:
    file = version["passwd"]
    lines = [] if file is None else file[3].decode(errors="surrogateescape").splitlines()
    return {line.split(":")[0] for line in lines if line}
