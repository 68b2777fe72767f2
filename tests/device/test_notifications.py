"""tests/device/test_notifications.py: who is told of a change before its caller gets the answer, by
the bus signal and by SIGUSR1."""
import re
import time

from calls import ask
from camera.bus_call import NAME, OBJECT, UNIT, call
from camera.change_tour import SIGNAL_RECORD, SIGUSR1_RECORD
from camera.machine import Camera
from journal import records

ANNA = ("anna", "Sunny-7", "users", "video", "Anna at the desk")
BOTH, CFGSTORE, NOBODY = {"bus", "cfgstore"}, {"cfgstore"}, set[str]()
# One call after the other, and who is told of each.
STORY: tuple[tuple[tuple[str, ...], set[str]], ...] = (
    (("AddUser", *ANNA), BOTH),
    (("AddUser", *ANNA), NOBODY),  # refused: there is one
    (("AddUidUser", "bert", "Foggy-5", "users", "", "", "5000"), BOTH),
    (("AddSystemUser", "carl", "Sunny-7", "users", "['audio']", "/bin/sh", ""), CFGSTORE),
    (("ModifyUser", "anna", "Rainy-8", "", "[]", "", ""), BOTH),
    (("ModifyUser", "anna", "", "", "[]", "", ""), BOTH),
    (("ModifyUser", "carl", "", "", "[]", "", "moved"), CFGSTORE),
    (("ModifyUser", "root", "Rainy-8", "", "[]", "", ""), BOTH),
    (("ModifyUser", "daemon", "", "", "[]", "", ""), NOBODY),
    (("ClearUserFields", "carl", "true", "false", "false"), BOTH),
    (("ClearUserFields", "anna", "false", "true", "false"), BOTH),
    (("ClearUserFields", "anna", "false", "false", "true"), NOBODY),
    (("ChpasswdUser", "anna", "Windy-9"), NOBODY),
    (("ChpasswdUser", "root", "Windy-9"), NOBODY),
    (("AddGroup", "nightshift"), NOBODY),
    (("RemoveGroup", "nightshift"), NOBODY),
    (("GetUserList",), NOBODY),
    (("RemoveUser", "bert"), BOTH),
    (("RemoveUser", "carl"), CFGSTORE),
)
SIGNAL = f"\t{NAME}\tUserDatabaseUpdated"
MONITOR = f"""
dbus-monitor --system --profile "interface='{NAME}'" type=method_return type=error >/run/bus 2>&1 &
until grep -q NameLost /run/bus; do sleep 0.05; done
"""
# A stopped process keeps the signals that it got: what is pending when the call has returned was
# sent before its answer. Bit 9 stands for SIGUSR1.
CALL_WITH_STOPPED_CFGSTORE = """
pid=$(pidof cfgstore)
kill -STOP $pid
{call} >&2
read -r _ mask < <(grep ShdPnd /proc/$pid/status)
echo $((16#$mask >> 9 & 1))
kill -CONT $pid
until grep -q 'ShdPnd:.0*$' /proc/$pid/status; do sleep 0.05; done
"""


def told_over_the_bus(messages: list[list[str]]) -> list[bool]:
    """For each call that the monitor saw answered: whether the signal came before its answer."""
    told: list[bool] = []
    signals = 0
    caller = ("", "")
    for kind, _, serial, sender, receiver, *rest in messages:
        if kind == "mc":
            caller = (sender, serial)
            signals = 0
        elif kind == "sig":
            signals += 1
        elif (receiver, rest[0]) == caller:
            assert signals <= 1
            told.append(signals == 1)
            signals = 0
        # A signal that came after the answer counts for nothing, or for the next call.
    return told


def monitored(camera: Camera) -> list[list[str]]:
    """The fields of the messages that the bus monitor has written down."""
    lines = camera.read_file("/run/bus").decode().splitlines()
    return [line.split() for line in lines if re.match(r"(mc|mr|err)\t", line) or SIGNAL in line]


def test_who_is_told_of_which_call(camera: Camera) -> None:
    camera.run(MONITOR).check()
    calls = [call(*words) for words, _ in STORY]
    pending = camera.run("".join(CALL_WITH_STOPPED_CFGSTORE.format(call=line) for line in calls),
                         timeout=180).check().out.split()
    cfgstore = [flag == "1" for flag in pending]
    # The monitor may still be writing.
    end = time.monotonic() + 10
    while len(bus := told_over_the_bus(monitored(camera))) < len(STORY) and time.monotonic() < end:
        time.sleep(0.1)
    assert len(bus) == len(cfgstore) == len(STORY)
    seen = [{name for name, told in (("bus", by_bus), ("cfgstore", by_signal)) if told}
            for by_bus, by_signal in zip(bus, cfgstore)]
    assert list(zip(calls, seen)) == list(zip(calls, (expected for _, expected in STORY)))


def test_the_listeners_hear_each_change_once(camera: Camera) -> None:
    """The one on the bus is an ordinary program of the camera, of the group privane."""
    ask(camera, "AddUser", *ANNA)
    ask(camera, "RemoveUser", "anna")
    for path, text in ((SIGNAL_RECORD, f"{OBJECT}: {NAME}.UserDatabaseUpdated ()"),
                       (SIGUSR1_RECORD, "SIGUSR1")):
        # They write on their own time.
        heard = camera.run(f"for i in $(seq 100); do [ $(wc -l <{path}) -lt 2 ] || break; "
                           f"sleep 0.1; done; sleep 0.5; cat {path}").check().out.splitlines()
        assert [line.split(" ", 1)[1] for line in heard] == [text] * 2


def test_the_journal_tells_of_it(camera: Camera) -> None:
    before = records(camera)
    pid = camera.run(["pidof", "cfgstore"]).check().out.strip()
    ask(camera, "AddUser", *ANNA)
    assert records(camera)[len(before):] == [
        (5, "message: Emitted DBus signal to inform the user DB was updated."),
        (5, f"message: Got PID for process 'cfgstore': {pid}'"),
        (5, f"message: Sent SIGUSR1 to cfgstore ({pid})")]


def test_without_cfgstore_a_change_is_made_all_the_same(camera: Camera) -> None:
    camera.run(["systemctl", "stop", "cfgstore.service"]).check()
    before = records(camera)
    ask(camera, "AddUser", *ANNA)
    assert ask(camera, "CheckUser", "'anna'") == (True,)
    assert records(camera)[len(before):] == [
        (5, "message: Emitted DBus signal to inform the user DB was updated."),
        (4, "Could not parse PID for 'cfgstore'"),
        (4, "Could not send signal to cfgstore: Unable to retrieve PID")]
    assert "NRestarts=0" in camera.run(["systemctl", "show", UNIT]).check().out
