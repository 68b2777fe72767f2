"""tests/bus/harness/passwords.py: clear texts of the tests, and crypt(3)."""
import ctypes

_libcrypt = ctypes.CDLL("libcrypt.so.1")
_libcrypt.crypt.restype = ctypes.c_char_p
_libcrypt.crypt.argtypes = (ctypes.c_char_p, ctypes.c_char_p)

# Stands in every clear text that the tests use, so that a leak of any of them is seen.
MARK = "Geheim"

OLD = f"{MARK}-alt"
NEW = f"{MARK}-neu"


def crypt(clear_text: str, setting: str) -> str:
    return _libcrypt.crypt(clear_text.encode(), setting.encode()).decode()


def is_hash_of(hashed: str, clear_text: str) -> bool:
    return crypt(clear_text, hashed) == hashed


# The hash of OLD, as the account files of the tests hold it for those who have a password.
OLD_HASH = crypt(OLD, "$5$standardsalt$")
