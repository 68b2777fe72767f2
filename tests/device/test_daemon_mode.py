"""tests/device/test_daemon_mode.py: the service started by hand without arguments: it detaches,
logs to syslog, and quits on each of its three signals."""
import pytest
from calls import BusError, ask, owner_pid, wait_for_owner
from camera.machine import Camera
from camera.tour import NAME, OBJECT, UNIT
from journal import records, started

DAEMON = "/usr/sbin/privane_system"


@pytest.fixture
def daemon(camera: Camera) -> Camera:
    camera.run(["systemctl", "stop", UNIT]).check()
    # The parent leaves as soon as the daemon is on its own.
    camera.run([DAEMON], timeout=10).check()
    return camera


def test_detached(daemon: Camera) -> None:
    pid = wait_for_owner(daemon)
    parent, terminal, *command = daemon.run(
        ["ps", "-o", "ppid=,tty=,args=", "-p", str(pid)]).check().out.split()
    assert (parent, terminal, command) == ("1", "?", [DAEMON])
    links = daemon.run(f"cd /proc/{pid} && readlink cwd fd/0 fd/1 fd/2").check().out.split()
    assert links == ["/", "/dev/null", "/dev/null", "/dev/null"]


def test_logs_to_syslog(daemon: Camera) -> None:
    pid = wait_for_owner(daemon)
    with pytest.raises(BusError) as caught:
        ask(daemon, "GetUserList", user="cam-web")
    assert records(daemon, "_TRANSPORT=syslog", f"_PID={pid}") == [
        *started(NAME, OBJECT), (4, f"warning: {caught.value.text}")]
    assert records(daemon, f"_PID={pid}") == records(daemon, "_TRANSPORT=syslog", f"_PID={pid}")


def test_more_arguments_are_the_daemon_mode_too(camera: Camera) -> None:
    camera.run(["systemctl", "stop", UNIT]).check()
    camera.run([DAEMON, "-n", "more"], timeout=10).check()
    pid = wait_for_owner(camera)
    assert camera.run(["systemctl", "is-active", UNIT]).out == "inactive\n"
    assert records(camera, "_TRANSPORT=syslog", f"_PID={pid}") == started(NAME, OBJECT)


@pytest.mark.parametrize("signal", ["HUP", "INT", "TERM"])
def test_quits_on(daemon: Camera, signal: str) -> None:
    pid = wait_for_owner(daemon)
    assert ask(daemon, "CheckUser", "'root'") == (True,)
    microseconds = daemon.run(f"""
        start=${{EPOCHREALTIME/./}}
        kill -{signal} {pid}
        for try in {{1..500}}; do
            [ -e /proc/{pid} ] || break
            sleep 0.01
        done
        echo $((${{EPOCHREALTIME/./}} - start))""").check().out
    assert int(microseconds) < 1_000_000
    assert daemon.run(["test", "-e", f"/proc/{pid}"]).status == 1
    assert owner_pid(daemon) == 0


def test_a_signal_right_after_the_start_is_not_lost(camera: Camera) -> None:
    """The parent has returned, the daemon may still be reading its files."""
    camera.run(["systemctl", "stop", UNIT]).check()
    camera.run(f"""
        {DAEMON} || exit
        pid=$(pgrep -f '^{DAEMON}$') || exit
        kill -TERM $pid
        for try in {{1..500}}; do
            [ -e /proc/$pid ] || exit 0
            sleep 0.01
        done
        exit 1""").check()
