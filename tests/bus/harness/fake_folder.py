"""tests/bus/harness/fake_folder.py: the test's side of the fakes that talk through a folder."""
import os
from dataclasses import dataclass
from pathlib import Path
from typing import Mapping
from urllib.parse import quote, unquote

from harness.sandbox import fake_library

STAND_INS = Path("/run/stand-ins")


@dataclass(frozen=True)
class Call:
    """A call of a fake: when it came, in nanoseconds, and its name followed by its arguments."""

    time: int
    words: tuple[str, ...]


class FakeFolder:
    """See tests/fakes/folder/fake_folder.h for the files."""

    def __init__(self, directory: Path) -> None:
        directory.mkdir(parents=True, exist_ok=True)
        self.directory = directory

    def environment(self) -> dict[str, str]:
        """What a service's environment needs to use the fake."""
        return {}

    def answer(self, name: str, content: str | bytes | int) -> None:
        """Makes one of the files that the fake obeys."""
        raw = content if isinstance(content, bytes) else str(content).encode()
        new = self.directory / f"{name}.new"
        new.write_bytes(raw)
        new.rename(self.directory / name)

    def before_answering(self, script: str) -> None:
        """The lines of a shell script that run before a call of the fake answers."""
        hook = self.directory / "hook"
        new = self.directory / "hook.new"
        new.write_text(f"#!/bin/sh\nset -e\n{script}\n")
        new.chmod(0o755)
        new.rename(hook)

    def calls(self) -> list[Call]:
        """All calls since the last forget()."""
        record = self.directory / "calls"
        lines = record.read_text().splitlines() if record.exists() else []
        return [Call(int(time), tuple(map(unquote, words)))
                for time, *words in (line.split(" ") for line in lines)]

    def record(self, call: Call) -> None:
        """As a fake does it."""
        with (self.directory / "calls").open("a") as record:
            record.write(" ".join((str(call.time), *map(quote, call.words))) + "\n")

    def forget(self) -> None:
        (self.directory / "calls").unlink(missing_ok=True)


class FakeDigest(FakeFolder):
    """A digest library that succeeds until told otherwise."""

    def environment(self) -> dict[str, str]:
        library = fake_library("digest_entry/libdigestentry.so.1")
        return {"LD_LIBRARY_PATH": str(library.parent),
                "FAKE_DIGEST_DIRECTORY": str(self.directory)}

    def fail(self, number: int) -> None:
        self.answer("result", number)


class FakeParamcli(FakeFolder):
    """A parameter store that succeeds until told otherwise."""

    def environment(self) -> dict[str, str]:
        library = fake_library("paramcli/libparamcli.so.1")
        return {"LD_LIBRARY_PATH": str(library.parent),
                "FAKE_PARAMCLI_DIRECTORY": str(self.directory)}

    def fail_to_set(self, number: int) -> None:
        self.answer("set-error", number)

    def fail_to_sync(self, number: int) -> None:
        self.answer("sync-error", number)


class FakeBootparam(FakeFolder):
    """A boot block that succeeds, and holds nothing, until told otherwise."""

    def environment(self) -> dict[str, str]:
        library = fake_library("bootparam/libbootparam.so.1")
        return {"LD_LIBRARY_PATH": str(library.parent),
                "FAKE_BOOTPARAM_DIRECTORY": str(self.directory)}

    def fail(self, function: str, result: int, error: int = 0, errno: int = 0) -> None:
        """function: "set-chip", "read" or "write"."""
        self.answer("error", error)
        self.answer("errno", errno)
        self.answer(f"{function}-result", result)

    def hold(self, value: str | bytes) -> None:
        self.answer("value", value)


class FakeClock(FakeFolder):
    """The system's clock, which is set without being set."""

    def environment(self) -> dict[str, str]:
        return {"LD_PRELOAD": str(fake_library("clock/libclock.so")),
                "FAKE_CLOCK_DIRECTORY": str(self.directory)}


class FakeRtcClock(FakeFolder):
    """A hardware clock that succeeds until told otherwise."""

    def environment(self) -> dict[str, str]:
        library = fake_library("rtc_clock/librtcclock.so.1")
        return {"LD_LIBRARY_PATH": str(library.parent),
                "FAKE_RTC_CLOCK_DIRECTORY": str(self.directory)}


class StandInTool(FakeFolder):
    """A program in a tool's place, which prints nothing and succeeds until told otherwise."""

    def __init__(self, path: str) -> None:
        self.path = Path(path)
        super().__init__(STAND_INS / self.path.name)
        self.path.parent.mkdir(parents=True, exist_ok=True)
        self._aside = self.path.with_name(self.path.name + ".aside")
        if os.path.lexists(self.path) and not os.path.lexists(self._aside):
            self.path.rename(self._aside)
        # A copy, since the stand-in knows itself by its file's name.
        self.path.write_bytes(fake_library("tool/stand_in_tool").read_bytes())
        self.path.chmod(0o755)

    def print(self, output: str | bytes) -> None:
        self.answer("output", output)

    def print_error(self, output: str | bytes) -> None:
        self.answer("error-output", output)

    def exit_with(self, status: int) -> None:
        self.answer("status", status)

    def descriptors(self) -> dict[int, str]:
        """Those with which its last run was started, and what each leads to."""
        lines = (self.directory / "descriptors").read_text().splitlines()
        return {int(number): target for number, target in (line.split(" ", 1) for line in lines)}

    def surroundings(self) -> bytes:
        """The environment of its last run, as /proc/PID/environ shows it."""
        return (self.directory / "environment").read_bytes()

    def remove(self) -> None:
        """The tool is not there at all."""
        self.path.unlink()

    @property
    def is_installed(self) -> bool:
        """Until close()."""
        return self.directory.exists()

    def close(self) -> None:
        """Puts the tool back."""
        if not self.is_installed:
            return
        if self.path.is_dir():
            self.path.rmdir()
        self.path.unlink(missing_ok=True)
        if os.path.lexists(self._aside):
            self._aside.rename(self.path)
        for file in self.directory.iterdir():
            file.unlink()
        self.directory.rmdir()


def together(*environments: Mapping[str, str]) -> dict[str, str]:
    """The environment of a service that uses all of these fakes."""
    joined: dict[str, str] = {}
    for environment in environments:
        for name, value in environment.items():
            is_path = name == "LD_LIBRARY_PATH" and name in joined
            joined[name] = f"{joined[name]}:{value}" if is_path else value
    return joined
