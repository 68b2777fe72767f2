"""tests/bus/test_harness_users.py: the helpers that call as other users outlive what goes wrong."""
import os
import signal

import pytest
from gi.repository import Gio, GLib

from harness.bus import BusError, User, error_of
from harness.service import Service


def test_call_that_is_answered_late_fails_alone(service: Service, clerk: User) -> None:
    os.kill(service.pid, signal.SIGSTOP)
    try:
        with pytest.raises(GLib.Error) as late:
            clerk.call("CheckUser", "s", "root", timeout=0.2)
    finally:
        os.kill(service.pid, signal.SIGCONT)

    assert late.value.matches(Gio.io_error_quark(), Gio.IOErrorEnum.TIMED_OUT)
    # The late answer comes in front of this one, and is nobody's.
    assert clerk.call("CheckUser", "s", "marker") == (False,)
    assert isinstance(error_of(clerk.call, "Nothing"), BusError)
