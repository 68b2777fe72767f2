"""device/camera/bus_call.py: the service's names on the bus, and its calls as people type them."""
import re
import shlex

UNIT = "privane-system.service"
NAME = "com.zintor.PrivaneSystem"
OBJECT = "/com/zintor/PrivaneSystem"
METHODS = 46
# The names of errors, to which the code is added.
PRIVANE_ERROR = "org.gtk.GDBus.UnmappedGError.Quark._privaneSystemError.Code"
USERMGMT_ERROR = "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code"


def call(method: str, *arguments: str) -> str:
    """A call of the service, as a person would type it in the camera."""
    return " ".join(["gdbus call --system -d", NAME, "-o", OBJECT, "-m", f"{NAME}.{method}",
                     *map(_quoted, arguments)])


def strings_in(answer: str) -> list[str]:
    """The quoted words of an answer that gdbus printed."""
    return re.findall(r"'([^']*)'", answer)


def _quoted(word: str) -> str:
    """A word for the shell; one with single quotes, which gdbus likes, stays readable."""
    return f'"{word}"' if "'" in word and not set(word) & set('"$`\\!') else shlex.quote(word)
