"""device/camera/change_tour.py: the part of the tour that changes accounts: what each change does
to the files, to the web server's verdict, and who is told of it."""
import hashlib
import shlex
import time

from .bus_call import NAME, OBJECT, PRIVANE_ERROR, UNIT, USERMGMT_ERROR, call
from .transcript import Transcript, sync_journal

REALM = "PRIVANE"
DIGEST_FILE = "/etc/apache2/digest_auth_passwd"
FILES = ("/etc/passwd", "/etc/shadow", "/etc/group", DIGEST_FILE)
SIGNAL_RECORD = "/run/account-watcher/signals"
SIGUSR1_RECORD = "/run/cfgstore/signals"
BEFORE = "/run/before"


def visit(user: str, password: str) -> str:
    """Asks the camera's web server for its page, and prints the status of the answer."""
    return shlex.join(["curl", "-s", "-o", "/dev/null", "-w", r"%{http_code}\n", "--digest", "-u",
                       f"{user}:{password}", "http://localhost/"])


def digest_line(user: str, password: str) -> str:
    """A user's line in the web server's file."""
    digest = hashlib.md5(f"{user}:{REALM}:{password}".encode()).hexdigest()
    return f"{user}:{REALM}:{digest}"


def walk_through_changes(show: Transcript) -> None:
    _show_new_user(show)
    _show_password_check(show)
    _show_modified_user(show)
    _show_password_of_the_account(show)
    _show_groups(show)
    _show_removed_user(show)
    _show_refusals(show)
    _show_who_was_told(show)
    _show_other_additions(show)


def _show_new_user(show: Transcript) -> None:
    show.chapter("A new user")
    show.step(f"mkdir {BEFORE}; cp {' '.join(FILES)} {BEFORE}",
              says="The files as they are, to compare with later.")
    show.step(visit("anna", "Sunny-7"), shows=["401\n"],
              says="The camera's web server does not know anna yet.")
    show.step(call("AddUser", "anna", "Sunny-7", "users", "privane-viewer", "Anna at the desk"),
              shows=["()\n"], says="Name, password, primary group, other groups, comment: done.")
    show.step(visit("anna", "sunny-7"), shows=["401\n"],
              says="The web server refuses a wrong password,")
    show.step(visit("anna", "Sunny-7"), shows=["200\n"],
              says="and accepts the right one. Nothing had to be restarted.")
    show.step(f"for file in {' '.join(FILES)}; do\n"
              f"    diff -U0 {BEFORE}/${{file##*/}} $file | grep anna\n"
              "done",
              shows=["+anna:x:1000:100:Anna at the desk::/bin/false\n", "\n+anna:$5$",
                     "\n+users:x:100:anna\n", "\n+privane-viewer:x:",
                     f"\n+{digest_line('anna', 'Sunny-7')}\n"],
              says="Her lines: an unused UID, a salted SHA-256 hash, two groups, the web's hash.")


def _show_password_check(show: Transcript) -> None:
    show.chapter("Is this the password?")
    show.step(call("AuthUserBasic", "anna", "Sunny-7"), shows=["()\n"],
              says="A program that may not read the shadow file asks the service: yes,")
    show.step(call("AuthUserBasic", "anna", "sunny-7"), status=1,
              shows=[f"{PRIVANE_ERROR}7: No valid password for user anna"], says="and no.")


def _show_modified_user(show: Transcript) -> None:
    show.chapter("A user changes")
    show.step(call("ModifyUser", "anna", "Rainy-8", "", "[]", "", "Anna in the yard"),
              shows=["()\n"], says="A new password and comment; what is empty stays as it is.")
    show.step(visit("anna", "Sunny-7"), shows=["401\n"], says="The old password is refused,")
    show.step(visit("anna", "Rainy-8"), shows=["200\n"], says="the new one accepted.")
    show.step(call("GetUser", "anna"),
              shows=["(true, 'users', ['privane-viewer'], 'Anna in the yard', 1000)\n"],
              says="Her groups and her UID are as before.")


def _show_password_of_the_account(show: Transcript) -> None:
    show.chapter("The password of the account alone")
    show.step(call("ChpasswdUser", "anna", "Windy-9"), shows=["()\n"],
              says="This method leaves the web server's file alone, and tells nobody.")
    show.step(call("AuthUserBasic", "anna", "Windy-9"), shows=["()\n"],
              says="It is the account's password now,")
    show.step(visit("anna", "Windy-9"), shows=["401\n"], says="but not the one for the web,")
    show.step(visit("anna", "Rainy-8"), shows=["200\n"], says="which is still the one before.")


def _show_groups(show: Transcript) -> None:
    show.chapter("Groups")
    show.step(call("AddGroup", "nightshift"), shows=["()\n"], says="The service chooses a GID.")
    show.step(call("ModifyUser", "anna", "", "", "['nightshift']", "", ""), shows=["()\n"],
              says="All of anna's other groups: privane-viewer is not among them any more.")
    show.step(["id", "anna"], shows=["uid=1000(anna) gid=100(users) groups=100(users),",
                                     "(nightshift)\n"], says="The C library agrees.")
    show.step(call("RemoveGroup", "nightshift"), shows=["()\n"],
              says="Gone again, and with it her membership.")
    show.step(call("RemoveGroup", "users"), status=1,
              shows=[f"{USERMGMT_ERROR}11: Failed to delete group 'users', group type "
                     "'permanent system' with GID 100 cannot be deleted"],
              says="A group that the device cannot do without stays.")


def _show_removed_user(show: Transcript) -> None:
    show.chapter("A user leaves")
    show.step(call("RemoveUser", "anna"), shows=["()\n"], says="Out of every file,")
    show.step(visit("anna", "Rainy-8"), shows=["401\n"], says="and refused by the web server.")
    result = show.step(["grep", "-c", "anna", *FILES], status=1, says="Not a line is left.")
    show.expect(result.out == "".join(f"{path}:0\n" for path in FILES), result, "no lines")


def _show_refusals(show: Transcript) -> None:
    show.chapter("What is refused")
    show.step(call("AddUser", "anna.k", "Sunny-7", "users", "", ""), status=1,
              shows=[f"{USERMGMT_ERROR}3: Failed to add user 'anna.k', username contains invalid "
                     "characters"],
              says="An error's name has its domain and its code: usermgmt and 3,")
    show.step(call("AddUser", "bert", "Sunny-7", "nosuch", "", ""), status=1,
              shows=[f"{USERMGMT_ERROR}4: Failed to add user 'bert', primary group 'nosuch' does "
                     "not exist"],
              says="usermgmt and 4,")
    show.step(call("RemoveUser", "nosuch"), status=1,
              shows=[f"{PRIVANE_ERROR}14: User deletion failed, user type could not be determined"],
              says="privaneSystemError and 14.")


def _show_who_was_told(show: Transcript) -> None:
    show.chapter("Who was told")
    # Passwords of the account alone, groups and refusals are announced to nobody.
    announced = ("AddUser", "ModifyUser", "ModifyUser", "RemoveUser")
    _wait_for_lines(show, SIGNAL_RECORD, len(announced))
    _wait_for_lines(show, SIGUSR1_RECORD, len(announced))
    result = show.step(["cat", SIGNAL_RECORD], says="What a client on the bus heard: "
                       f"{', '.join(announced)}.")
    show.expect(_ends(result.out) == [f"{NAME}.UserDatabaseUpdated ()"] * len(announced), result,
                f"{len(announced)} signals")
    result = show.step(["cat", SIGUSR1_RECORD],
                       says="What cfgstore, the device's parameter store, got each time.")
    show.expect(_ends(result.out) == ["SIGUSR1"] * len(announced), result,
                f"{len(announced)} signals")
    sync_journal(show.camera)
    show.step(["journalctl", "-u", UNIT, "-o", "cat", "-p", "notice..warning", "-n", "7"],
              shows=["Sent SIGUSR1 to cfgstore", "User deletion failed, user type could not be"],
              says="The service's own words on the last calls.")


def _show_other_additions(show: Transcript) -> None:
    show.chapter("Other ways to add a user")
    show.step(call("AddUidUser", "bert", "Foggy-5", "users", "", "", "5000"), shows=["()\n"],
              says="Like AddUser, with a UID of the caller's choice.")
    show.step(["id", "-u", "bert"], shows=["5000\n"], says="It was free, so he has it.")
    show.step(call("AddSystemUser", "technician", "Sunny-7", "users", "['audio']", "/bin/sh",
                   "Field service"), shows=["()\n"],
              says="A user of the system: with a shell, and unknown to the web server.")
    show.step(call("ClearUserFields", "technician", "true", "true", "true"), shows=["()\n"],
              says="Password, other groups and comment are taken away.")
    show.step(call("GetUser", "technician"), shows=["(false, 'users', @as [], '', "],
              says="Nobody logs in as technician now.")
    for name in ("bert", "technician"):
        show.step(call("RemoveUser", name), shows=["()\n"], says="Gone again.")


def _ends(lines: str) -> list[str]:
    """The lines without their first word, the time, and without the object that gdbus names."""
    return [line.split(" ", 1)[1].removeprefix(f"{OBJECT}: ") for line in lines.splitlines()]


def _wait_for_lines(show: Transcript, path: str, count: int) -> None:
    """The listeners write on their own time."""
    end = time.monotonic() + 10
    while len(show.camera.read_file(path).splitlines()) < count and time.monotonic() < end:
        time.sleep(0.1)
