"""tests/device/test_hardening.py: what the unit takes from the service, and that nothing misses it."""
import errno
import re

import pytest
from calls import ask
from camera import system_tour
from camera.machine import Camera
from camera.tour import METHODS, NAME, UNIT, Tour, call
from camera.transcript import Transcript
from denied_calls import DeniedCalls, Refusal
from drop_in import install_drop_in, unit_properties

MOST_EXPOSURE = 3.5

# A call that the filter refuses ends the program, and is told in the kernel's log. The one exception
# is GLib's, which tries to set its threads' priorities and does without.
STRICT = "[Service]\nSystemCallErrorNumber=kill\nSystemCallFilter=sched_setattr\n"

# What the kernel says of a call that the filter of system calls, an access control or an audit rule
# refused, and of a process that came to an end by it.
DENIALS = r"type=1326|type=14\d\d|apparmor=\"DENIED\"|denied|segfault|traps:"

# What a program may try in vain, and how each is refused: by capability, device rule, hidden
# device, port, read-only mount, and address family.
PERL = "/usr/bin/perl"
ATTEMPTS: dict[str, Refusal] = {
    '$path = "/etc/null"; syscall(133, $path, 020600, 0x103)': (PERL, 133, errno.EPERM),
    'open F, "/dev/vda"': (PERL, 257, errno.EPERM),
    'open F, "/dev/kmsg"': (PERL, 257, errno.EACCES),
    '$to = pack("S n N x8", 2, 81, 0); syscall(49, syscall(41, 2, 1, 0), $to, 16)':
        (PERL, 49, errno.EACCES),
    'open F, ">/usr/made"': (PERL, 257, errno.EROFS),
    "syscall(41, 10, 1, 0)": (PERL, 41, errno.EAFNOSUPPORT),
}

RECORDING_SYSFLASH = b"#!/bin/sh\necho $2 >>/var/lib/sysflash/resets\n"


@pytest.fixture
def denied(camera: Camera) -> DeniedCalls:
    return DeniedCalls(camera)


@pytest.fixture
def strict(camera: Camera, denied: DeniedCalls) -> Camera:
    """A camera whose service may not even try; all that it is refused is recorded."""
    install_drop_in(camera, "strict.conf", STRICT)
    return camera


def denials(camera: Camera) -> list[str]:
    camera.run("journalctl --sync").check()
    shown = camera.run("journalctl --no-pager -o cat _TRANSPORT=kernel + _TRANSPORT=audit").check()
    lines = shown.out.splitlines()
    assert any("Linux version" in line for line in lines)
    return [line for line in lines if re.search(DENIALS, line)]


def test_exposure(camera: Camera) -> None:
    shown = camera.run(["systemd-analyze", "security", "--no-pager", UNIT]).check().out
    match = re.search(rf"Overall exposure level for {UNIT}: (\d+\.\d+) ", shown)
    assert match, shown[-200:]
    assert float(match[1]) <= MOST_EXPOSURE


def reset_without_a_reboot(show: Transcript) -> None:
    """The kernel's log would be lost with one, and the reboot itself is systemd's work."""
    show.camera.put_file("/usr/sbin/sysflash", RECORDING_SYSFLASH, 0o755)
    show.step(call("UpdateReleaseFile", "SOFT_RESET"), shows=["()\n"], says="")
    show.step(call("Reboot"), shows=["(0,)\n"], says="")
    show.step(["cat", "/var/lib/sysflash/resets"], shows=["soft\n"], says="")


def test_all_methods_do_their_work_and_try_nothing_that_is_denied(
        strict: Camera, denied: DeniedCalls, monkeypatch: pytest.MonkeyPatch) -> None:
    monkeypatch.setattr(system_tour, "_show_reboot", reset_without_a_reboot)
    lines: list[str] = []
    Tour(strict, lines.append, bold=False).walk()
    called = set(re.findall(rf"-m {re.escape(NAME)}\.(\w+)", "".join(lines)))
    assert len(called) == METHODS
    assert "strict.conf" in unit_properties(strict, "DropInPaths")["DropInPaths"]
    assert denials(strict) == []
    # That these are all shows that the tour was refused nothing, and that it was recorded.
    try_all(strict)
    assert denied.of_service() == set(ATTEMPTS.values())


@pytest.mark.parametrize("attempt", [
    "perl -e 'syscall(141, 0, 0, 0)'",  # setpriority
    "perl -e 'syscall(165, 0, 0, 0, 0, 0)'",  # mount
    "perl -e 'syscall(105, 1)'",  # setuid
])
def test_a_denial_is_seen(strict: Camera, attempt: str) -> None:
    strict.put_file("/usr/sbin/sysflash", f"#!/bin/sh\n{attempt}\n".encode(), 0o755)
    assert denials(strict) == []
    ask(strict, "Reboot")
    assert [line for line in denials(strict) if 'comm="perl"' in line and "type=1326" in line]


def try_all(camera: Camera) -> None:
    """Through the service, in a tool that it runs. Perl wants variables, not literals."""
    lines = "\n".join(f"perl -e '{attempt}'" for attempt in ATTEMPTS)
    camera.put_file("/usr/sbin/sysflash", f"#!/bin/sh\n{lines}\n".encode(), 0o755)
    ask(camera, "Reboot")


def test_refusals_that_a_program_lives_through_are_seen(
        strict: Camera, denied: DeniedCalls) -> None:
    assert denied.of_service() == set()
    try_all(strict)
    assert denied.of_service() == set(ATTEMPTS.values())
    assert denials(strict) == []


def test_what_another_service_is_refused_is_not_ours(strict: Camera, denied: DeniedCalls) -> None:
    strict.run(["systemd-run", "--wait", "-p", "ProtectSystem=strict", "--",
                "sh", "-c", "! echo >/usr/made"]).check()
    assert denied.of_service() == set()


def test_a_tool_that_is_denied_a_call_is_told_so(camera: Camera) -> None:
    camera.put_file("/usr/sbin/sysflash", b"#!/bin/sh\n"
                    b"exec perl -e 'syscall(105, 1) < 0 or exit 9; exit $!+0'\n", 0o755)
    eperm = 1
    assert ask(camera, "Reboot") == (eperm << 8,)
