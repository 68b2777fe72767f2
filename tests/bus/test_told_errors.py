"""tests/bus/test_told_errors.py: the fixture that compares errors with the interface document."""
import pytest

from harness.bus import domain_error
from harness.told_errors import ToldErrors

LIMITS = "org.freedesktop.DBus.Error.LimitsExceeded"


@pytest.mark.parametrize("member, domain, code, told", [
    ("AddUser", "usermgmt", 6, True), ("AddUser", "usermgmt", 7, False),
    ("AddUser", "corefile", 101, True), ("CheckUser", "usermgmt", 3, False),
    ("CheckUser", "privaneSystemError", 25, True), ("Reboot", "corefile", 101, False),
    ("ReadLogFile", "g-file-error-quark", 2, True), ("Reboot", "g-file-error-quark", 2, False),
    ("Reboot", "fake-authz", 42, True), ("Reboot", "authz", 1, True)])
def test_errors_are_judged_by_method(member: str, domain: str, code: int, told: bool,
                                     told_errors: ToldErrors) -> None:
    assert told_errors.allow(member, domain_error(domain, code, "").name) is told


def test_errors_of_the_bus_are_allowed(told_errors: ToldErrors) -> None:
    assert told_errors.allow("Reboot", LIMITS)
