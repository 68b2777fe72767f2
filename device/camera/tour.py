"""device/camera/tour.py: shows what the service does by real calls on the camera's own system bus,
as a transcript a person can follow, and fails where an answer is not the one it should be."""
import re
import shlex
import textwrap
from collections.abc import Callable, Sequence

from .errors import CameraError
from .machine import Camera
from .root_shell import Result

UNIT = "privane-system.service"
NAME = "com.zintor.PrivaneSystem"
OBJECT = "/com/zintor/PrivaneSystem"
METHODS = 46
RULES = "/usr/share/doc/privane-system/examples/60-privane-viewer.rules"
UNKNOWN_USER = "org.gtk.GDBus.UnmappedGError.Quark._usermgmt.Code3"
REFUSED = "Authorization check failed: "
WIDTH = 100


def call(method: str, *arguments: str) -> str:
    """A call of the service, as a person would type it in the camera."""
    return shlex.join(["gdbus", "call", "--system", "-d", NAME, "-o", OBJECT,
                       "-m", f"{NAME}.{method}", *arguments])


def await_rules(camera: Camera, user: str) -> None:
    """Waits until polkit has read its new rules, which it does a moment after they appear."""
    check = call("CheckUser", "root")
    camera.run(f"for try in {{1..50}}; do {check} && exit; sleep 0.1; done; exit 1", user=user).check()


def sync_journal(camera: Camera) -> None:
    """Waits until the journal holds what was logged so far; its daemon may just be starting."""
    camera.run("for try in {1..50}; do journalctl --sync && exit; sleep 0.2; done; exit 1").check()


def strings_in(answer: str) -> list[str]:
    """The quoted words of an answer that gdbus printed."""
    return re.findall(r"'([^']*)'", answer)


class Tour:
    """One walk through a freshly booted camera; `write` gets the transcript."""

    def __init__(self, camera: Camera, write: Callable[[str], object], bold: bool) -> None:
        self._camera = camera
        self._write = write
        self._bold = bold
        self._chapters = 0

    def walk(self) -> None:
        self._show_unit()
        self._show_interface()
        self._show_lists()
        self._show_single_accounts()
        self._show_authorization()
        self._show_bus_policy()
        self._show_activation()

    def _show_unit(self) -> None:
        self._chapter("The service in the camera")
        self._step(["systemctl", "show", UNIT, "-p", "Type,BusName,ActiveState,SubState,MainPID"],
                   shows=["Type=dbus", f"BusName={NAME}", "ActiveState=active", "SubState=running"],
                   says="systemd started the service at boot and watches its bus name.")
        self._step(["journalctl", "-u", UNIT, "-o", "cat", "-p", "notice..notice"],
                   shows=["Initializing user management library", "Starting privane_system",
                          f"registered with the name '{NAME}' and object '{OBJECT}'"],
                   says="What it said so far: each line is a record of priority notice.")

    def _show_interface(self) -> None:
        self._chapter("Its interface")
        result = self._step(["busctl", "introspect", NAME, OBJECT, NAME],
                            says=f"One interface: {METHODS} methods and one signal.")
        kinds = [line.split()[1] for line in result.out.splitlines()[1:]]
        self._expect(kinds.count("method") == METHODS, result, f"{METHODS} methods")
        self._expect(kinds.count("signal") == 1, result, "one signal")

    def _show_lists(self) -> None:
        self._chapter("Lists of accounts")
        users, groups = self._names_in("/etc/passwd"), self._names_in("/etc/group")
        result = self._step(call("GetUserList"), says="Every user of the camera's /etc/passwd.")
        self._expect(strings_in(result.out) == users, result, f"these users: {users}")
        result = self._step(call("GetGroupList"), says="Every group of its /etc/group.")
        self._expect(strings_in(result.out) == groups, result, f"these groups: {groups}")
        result = self._step(call("GetGroupListFull"),
                            says="Names, GIDs and members of the groups, index by index.")
        names = strings_in(result.out)[:len(groups)]
        self._expect(names == groups, result, f"first these groups: {groups}")

    def _names_in(self, path: str) -> list[str]:
        lines = self._camera.read_file(path).decode().splitlines()
        return [line.split(":")[0] for line in lines]

    def _show_single_accounts(self) -> None:
        self._chapter("Single accounts")
        uid = self._camera.run(["id", "-u", "cam-viewer"]).check().out.strip()
        gid = self._camera.run("getent group privane | cut -d: -f3").check().out.strip()
        self._step(call("GetUser", "cam-viewer"),
                   shows=["(true, 'cam-viewer', ", "'privane'", "'privane-viewer'",
                          f"'Account viewer of the camera', {uid})"],
                   says="Has a password field, primary group, other groups, comment, UID.")
        self._step(call("GetGroup", "privane"),
                   shows=[f"({gid}, [", "'cam-viewer'", "'cam-web'"], says="The GID, the members.")
        self._step(call("CheckUser", "root"), shows=["(true,)"], says="root exists,")
        self._step(call("CheckUser", "nosuch"), shows=["(false,)"],
                   says="and this user does not: an answer, not an error.")
        self._step(call("GetUser", "nosuch"), status=1,
                   shows=[f"{UNKNOWN_USER}: Could not retrieve user 'nosuch', user does not exist"],
                   says="Here it is an error; its name has the domain, usermgmt, and the code, 3.")

    def _show_authorization(self) -> None:
        self._chapter("Who may do what: polkit")
        self._step(["id", "cam-viewer"], shows=["(privane)", "(privane-viewer)"],
                   says="Members of group privane may talk to the service, no more than that.")
        self._step(call("GetUserList"), user="cam-viewer", status=1,
                   shows=[REFUSED, "com.zintor.privane-system.getuserlist"],
                   says="polkit was asked for the action of this method, and says no.")
        sync_journal(self._camera)
        self._step(["journalctl", "-u", UNIT, "-o", "cat", "-p", "warning..warning"],
                   shows=[REFUSED], says="Failed and refused requests are in the journal.")
        self._step(["install", "-m", "644", RULES, "/etc/polkit-1/rules.d/"],
                   says="A packaged example: rules that give the group privane-viewer a role.")
        await_rules(self._camera, "cam-viewer")
        self._step(call("GetUserList"), user="cam-viewer", shows=["'root'"],
                   says="The same call by the same user is allowed now,")
        self._step(call("GetUserList"), user="cam-web", status=1, shows=[REFUSED],
                   says="while cam-web, who has no role, stays refused.")

    def _show_bus_policy(self) -> None:
        self._chapter("Who may call at all: the bus")
        self._step(call("CheckUser", "root"), user="cam-other", status=1,
                   shows=["org.freedesktop.DBus.Error.AccessDenied"],
                   says="cam-other is not in group privane: the service hears nothing of it.")

    def _show_activation(self) -> None:
        self._chapter("Started when it is needed")
        self._step(["systemctl", "stop", UNIT], says="The service is stopped,")
        self._step(["systemctl", "is-active", UNIT], status=3, shows=["inactive"], says="really,")
        self._step(call("CheckGroup", "privane"), shows=["(true,)"],
                   says="and a call starts it again: D-Bus activation through systemd.")

    def _chapter(self, title: str) -> None:
        self._chapters += 1
        heading = f"{self._chapters}. {title}"
        underline = "=" * len(heading)
        self._write(f"\n\033[1m{heading}\033[0m\n" if self._bold else f"\n{heading}\n{underline}\n")

    def _step(self, command: str | Sequence[str], *, user: str = "root", status: int = 0,
              shows: Sequence[str] = (), says: str) -> Result:
        """Runs a command as a user, prints it all, checks its status and what it must show."""
        command = command if isinstance(command, str) else shlex.join(command)
        typed = command if len(command) < WIDTH else command.replace(" -m ", " \\\n    -m ")
        self._write(f"\n{user}@camera{'#' if user == 'root' else '$'} {typed}\n")
        result = self._camera.run(command, user=user)
        answer = result.out + result.err
        for line in answer.rstrip().splitlines():
            self._write(textwrap.fill(line, WIDTH, subsequent_indent="  ", break_long_words=False,
                                      break_on_hyphens=False) + "\n")
        self._write(f"  -> {says}\n")
        self._expect(result.status == status, result, f"status {status}, not {result.status}")
        for text in shows:
            self._expect(text in answer, result, f"an answer with {text!r}")
        return result

    @staticmethod
    def _expect(holds: bool, result: Result, what: str) -> None:
        if not holds:
            raise CameraError(f"the tour stops: this should have given {what}:\n  {result.command}")
