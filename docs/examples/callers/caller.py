#!/usr/bin/python3
"""docs/examples/callers/caller.py: a caller in Python, with GIO from python3-gi."""
import sys

from gi.repository import Gio, GLib

NAME = "com.zintor.PrivaneSystem"
PATH = "/com/zintor/PrivaneSystem"

# Longer than the service itself waits for whoever decides about the call.
TIMEOUT_MS = 60000


class Service:
    """The service as an object: each method takes and returns Python's own values."""

    def __init__(self) -> None:
        self.bus = Gio.bus_get_sync(Gio.BusType.SYSTEM)

    def call(self, method: str, signature: str = "", *arguments: object) -> tuple:
        reply = self.bus.call_sync(NAME, PATH, NAME, method,
                                   GLib.Variant(f"({signature})", arguments), None,
                                   Gio.DBusCallFlags.NONE, TIMEOUT_MS)
        return reply.unpack()


def is_error(error: GLib.Error, domain: str, code: int) -> bool:
    return error.matches(GLib.quark_from_string(domain), code)


def text_of(error: GLib.Error) -> str:
    """What a caller can act on first; else the service's text, domain and code."""
    name = Gio.DBusError.get_remote_error(error)
    text = error.message.removeprefix(f"GDBus.Error:{name}: ")
    if is_error(error, "usermgmt", 6):
        return "there is such an account already"
    if is_error(error, "authz", 1):
        return f"not allowed: {text}"
    return f"{text} ({error.domain} {error.code})"


def list_users(service: Service) -> None:
    (users,) = service.call("GetUserList")
    for user in users:
        print(user, flush=True)


def read_password() -> str:
    """The first line of standard input, which no other user can see, as an argument could be."""
    return sys.stdin.readline().rstrip("\n")


def check_password(service: Service, user: str) -> None:
    try:
        service.call("AuthUserBasic", "ss", user, read_password())
    except GLib.Error as error:
        if not is_error(error, "privaneSystemError", 7):
            raise
        print("wrong")
    else:
        print("right")


def add_user(service: Service, user: str, group: str) -> None:
    no_groups = no_comment = ""
    service.call("AddUser", "sssss", user, read_password(), group, no_groups, no_comment)
    print("added", user)


def watch(service: Service) -> None:
    """Until the program is ended. The list is read after the subscription: a change in between
    would be missed."""
    service.bus.signal_subscribe(NAME, NAME, "UserDatabaseUpdated", PATH, None,
                                 Gio.DBusSignalFlags.NONE,
                                 lambda *signal: print(signal[4], flush=True))
    list_users(service)
    GLib.MainLoop().run()


COMMANDS = {("list", 0): list_users, ("check", 1): check_password, ("add", 2): add_user,
            ("watch", 0): watch}


def main(name: str = "", *arguments: str) -> int:
    command = COMMANDS.get((name, len(arguments)))
    if command is None:
        print("usage: caller list | check USER | add USER GROUP | watch", file=sys.stderr)
        return 2
    try:
        command(Service(), *arguments)
    except GLib.Error as error:
        print(text_of(error), file=sys.stderr)
        return 1
    return 0


if __name__ == "__main__":
    sys.exit(main(*sys.argv[1:]))
