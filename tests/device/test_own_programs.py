"""tests/device/test_own_programs.py: the example drop-in for devices whose programs need more."""
import pytest
from calls import ask
from camera.machine import Camera
from camera.tour import UNIT
from drop_in import FOLDER, install_drop_in

EXAMPLE = "/usr/share/doc/privane-system/examples/privane-own-programs.conf"

# What a sysflash may have to do beyond the unit: a word for each, and the command.
NEEDS = {
    "state": "touch /var/lib/sysflash/probe",
    "cache": "touch /var/cache/sysflash/probe",
    "elsewhere": "touch /srv/firmware/probe",
    "home": "grep -q there /root/probe",
    "network": "bash -c 'echo >/dev/udp/127.0.0.1/9'",
    "ipv6": "perl -e 'socket(S, 10, 2, 0) or exit 1'",
    "netlink": "perl -e 'socket(S, 16, 3, 0) or exit 1'",
    "device": "bash -c ': <>/dev/ttyS1'",
    "reboot": "perl -e 'syscall(169, 0xfee1dead, 672274793, 0) == 0 or exit 1'",  # as it is set
    "user": "setpriv --reuid=1 --regid=1 --clear-groups true",
    "priority": "chrt --batch 0 true",
}
SYSFLASH = "#!/bin/sh\nexec 2>/etc/sysflash.errors\n: >/etc/sysflash.done\n" + "".join(
    f"({command}) && echo {word} >>/etc/sysflash.done\n" for word, command in NEEDS.items()) + "true\n"


@pytest.fixture
def maker(camera: Camera) -> Camera:
    """A camera with a needy sysflash."""
    camera.put_file("/usr/sbin/sysflash", SYSFLASH.encode(), 0o755)
    camera.put_file("/root/probe", b"there\n")
    camera.run("mkdir -p /srv/firmware /var/lib/sysflash /var/cache/sysflash").check()
    # The camera's own drop-in gives sysflash a folder.
    camera.run(f"rm {FOLDER}/camera.conf && systemctl daemon-reload").check()
    camera.run(["systemctl", "restart", UNIT]).check()
    return camera


def done(camera: Camera) -> list[str]:
    """What the service's sysflash could do."""
    assert ask(camera, "Reboot") == (0,)
    return camera.read_file("/etc/sysflash.done").decode().split()


def test_the_plain_unit_denies_it_all(maker: Camera) -> None:
    assert done(maker) == []


def test_the_example_allows_it_all(maker: Camera) -> None:
    install_drop_in(maker, "own-programs.conf", maker.read_file(EXAMPLE).decode())
    allowed = done(maker)
    assert allowed == list(NEEDS), maker.read_file("/etc/sysflash.errors").decode()


def test_the_example_is_clean(maker: Camera) -> None:
    install_drop_in(maker, "own-programs.conf", maker.read_file(EXAMPLE).decode())
    result = maker.run(["systemd-analyze", "verify", "--man=no", UNIT])
    assert (result.status, result.out, result.err) == (0, "", "")
    shown = maker.run(["systemctl", "show", "--value", "-p", "WatchdogUSec", UNIT]).check().out
    assert shown == "15min\n"


def test_everything_outside_of_the_service_can_do_it_anyway(maker: Camera) -> None:
    """So that it is the unit that denies it."""
    maker.run(["/usr/sbin/sysflash"]).check()
    assert maker.read_file("/etc/sysflash.done").decode().split() == list(NEEDS)
