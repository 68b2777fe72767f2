"""tests/bus/test_error_decoding.py: what the callers' examples make of the names of errors.

Only such names are here as the bus carries; tests/unit/client has others.
"""
import ctypes
from typing import Iterator

import pytest

from harness.bus import INTERFACE, NAME, PATH
from harness.fake_service import FakeService
from harness.privanectl import Run, failed, privanectl
from test_examples import CALLERS, run

DOMAIN = "org.gtk.GDBus.UnmappedGError.Quark._"

# What GIO makes of a name that it does not know: a code of its own domain.
UNKNOWN_TO_GIO = "g-io-error-quark 36"

TOO_LARGE = 99999999999

# Of each name, what is decoded by our own decoders, which refuse it where that is None, and by GIO.
# GIO reads the code as atoi does. No service writes such a name, so no example looks for it.
NAMES = [
    (f"{DOMAIN}usermgmt.Code3", "usermgmt 3", "usermgmt 3"),
    (f"{DOMAIN}usermgmt.Code0", "usermgmt 0", "usermgmt 0"),
    (f"{DOMAIN}usermgmt.Code2147483647", "usermgmt 2147483647", "usermgmt 2147483647"),
    (f"{DOMAIN}g_2dfile_2derror_2dquark.Code24", "g-file-error-quark 24",
     "g-file-error-quark 24"),
    (f"{DOMAIN}a_5fb_2ec_20d.Code1", "a_b.c d 1", "a_b.c d 1"),
    (f"{DOMAIN}usermgmt.Code", None, "usermgmt 0"),
    (f"{DOMAIN}usermgmt.Code3x", None, "usermgmt 3"),
    (f"{DOMAIN}usermgmt.Codex", None, "usermgmt 0"),
    (f"{DOMAIN}usermgmt.Code{TOO_LARGE}", None,
     f"usermgmt {ctypes.CDLL(None).atoi(str(TOO_LARGE).encode())}"),
    (f"{DOMAIN}usermgmt.code6", None, UNKNOWN_TO_GIO),
    (f"{DOMAIN}a_2.Code6", None, UNKNOWN_TO_GIO),
    (f"{DOMAIN}a_zz.Code6", None, UNKNOWN_TO_GIO),
    (f"{DOMAIN}a_2z.Code6", None, UNKNOWN_TO_GIO),
    (f"{DOMAIN}a.b.Code6", None, UNKNOWN_TO_GIO),
    ("org.gtk.GDBus.UnmappedGError.Quark.usermgmt.Code6", None, UNKNOWN_TO_GIO),
    ("com.example.Code6", None, UNKNOWN_TO_GIO),
]


@pytest.fixture
def other_service() -> Iterator[FakeService]:
    """What has the service's name and sends errors of any."""
    running = FakeService(NAME, PATH, INTERFACE, lambda call: None)
    yield running
    running.close()


@pytest.mark.parametrize("name, own, of_gio", NAMES, ids=[name for name, _, _ in NAMES])
def test_name_is_decoded(name: str, own: str | None, of_gio: str,
                         other_service: FakeService) -> None:
    other_service.fail(name, "text")

    told = f"text ({own})" if own else "text"
    assert run(CALLERS["C++"], "list") == Run(1, "", f"{told}\n")
    for language in ("C", "Python"):
        assert run(CALLERS[language], "list") == Run(1, "", f"text ({of_gio})\n")
    assert privanectl("user", "list") == failed(f"text ({own or name})")
