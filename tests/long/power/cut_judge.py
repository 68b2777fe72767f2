"""tests/long/power/cut_judge.py: whether what a power cut left is what may be there.

Each change is on the disk when it is answered, and its files are replaced one after the other. So
what is left is a version between the last answered change and the last begun one, or that of a
change with the first few of its files replaced: passwd before shadow, shadow before group.
"""
from collections.abc import Sequence

from power_plan import FILES
from recorded_run import Change, Version


def allowed_versions(changes: Sequence[Change], answered: int, begun: int) -> list[Version]:
    versions = [changes[answered].version]
    for number in range(answered + 1, begun + 1):
        version = dict(versions[-1])
        for name in changes[number].written:
            version[name] = changes[number].version[name]
            versions.append(dict(version))
    return versions


def faults_in(left: Version, changes: Sequence[Change], answered: int, begun: int) -> list[str]:
    """What is wrong; nothing when all is well."""
    allowed = allowed_versions(changes, answered, begun)
    if left in allowed:
        return _modes_not_kept(left, changes[0].version)
    faults = []
    for name in FILES:
        if all(left[name] != version[name] for version in allowed):
            faults.append(f"{name} {_explain(name, left, changes, answered, begun)}")
    return faults or ["each file is old or new, but they were not replaced in their order: "
                      + ", ".join(f"{name} of {_versions_with(name, left, changes)}"
                                  for name in changes[begun].written)]


def _modes_not_kept(left: Version, first: Version) -> list[str]:
    """The files are compared with those that were read while all was well, and so would be wrong
    together with them; a file keeps the mode it had before anything was changed."""
    return [f"{name} has mode {file[0]:o}, and had {old[0]:o}" for name, file in left.items()
            if file is not None and (old := first[name]) is not None and file[0] != old[0]]


def _versions_with(name: str, left: Version, changes: Sequence[Change]) -> list[int]:
    return [number for number, change in enumerate(changes) if change.version[name] == left[name]]


def _explain(name: str, left: Version, changes: Sequence[Change], answered: int, begun: int) -> str:
    known = _versions_with(name, left, changes)
    if known and max(known) < answered:
        return (f"is as before change {max(known) + 1}, though change {answered} was answered: "
                f"{changes[answered].line}")
    if known:
        return f"is that of change {min(known)}, though only change {begun} was begun"
    file = left[name]
    if file is None:
        return "is gone" if name != "boot" else "has no valid copy"
    mode, owner, group, content = file
    if any(version[name] is not None and version[name][3] == content  # type: ignore[index]
           for version in allowed_versions(changes, answered, begun)):
        return f"has its content, but mode {mode:o} and owner {owner}:{group}"
    return f"is neither old nor new: {len(content)} bytes, {content[:40]!r}"
