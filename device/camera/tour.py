"""device/camera/tour.py: shows what the service does by real calls on the camera's own bus."""
from .bus_call import METHODS, NAME, OBJECT, UNIT, USERMGMT_ERROR, call, strings_in
from .change_tour import walk_through_changes
from .machine import Camera
from .system_tour import walk_through_system
from .transcript import Transcript, sync_journal

RULES = "/usr/share/doc/privane-system/examples/60-privane-viewer.rules"
REFUSED = "Authorization check failed: "


def await_rules(camera: Camera, user: str) -> None:
    """Waits until polkit has read its new rules, which it does a moment after they appear."""
    check = call("CheckUser", "root")
    script = f"for try in {{1..50}}; do {check} && exit; sleep 0.1; done; exit 1"
    camera.run(script, user=user).check()


class Tour(Transcript):
    """One walk through a freshly booted camera."""

    def walk(self) -> None:
        self._show_unit()
        self._show_interface()
        self._show_lists()
        self._show_single_accounts()
        walk_through_changes(self)
        self._show_authorization()
        self._show_bus_policy()
        self._show_activation()
        walk_through_system(self)

    def _show_unit(self) -> None:
        self.chapter("The service in the camera")
        self.step(["systemctl", "show", UNIT, "-p", "Type,BusName,ActiveState,SubState,MainPID"],
                  shows=["Type=dbus", f"BusName={NAME}", "ActiveState=active", "SubState=running"],
                  says="systemd started the service at boot and watches its bus name.")
        self.step(["journalctl", "-u", UNIT, "-o", "cat", "-p", "notice..notice"],
                  shows=["Initializing user management library", "Starting privane_system",
                         f"registered with the name '{NAME}' and object '{OBJECT}'"],
                  says="What it said so far: each line is a record of priority notice.")

    def _show_interface(self) -> None:
        self.chapter("Its interface")
        result = self.step(["busctl", "introspect", NAME, OBJECT, NAME],
                           says=f"One interface: {METHODS} methods and one signal.")
        kinds = [line.split()[1] for line in result.out.splitlines()[1:]]
        self.expect(kinds.count("method") == METHODS, result, f"{METHODS} methods")
        self.expect(kinds.count("signal") == 1, result, "one signal")

    def _show_lists(self) -> None:
        self.chapter("Lists of accounts")
        users, groups = self._names_in("/etc/passwd"), self._names_in("/etc/group")
        result = self.step(call("GetUserList"), says="Every user of the camera's /etc/passwd.")
        self.expect(strings_in(result.out) == users, result, f"these users: {users}")
        result = self.step(call("GetGroupList"), says="Every group of its /etc/group.")
        self.expect(strings_in(result.out) == groups, result, f"these groups: {groups}")
        result = self.step(call("GetGroupListFull"),
                           says="Names, GIDs and members of the groups, index by index.")
        names = strings_in(result.out)[:len(groups)]
        self.expect(names == groups, result, f"first these groups: {groups}")

    def _names_in(self, path: str) -> list[str]:
        lines = self.camera.read_file(path).decode().splitlines()
        return [line.split(":")[0] for line in lines]

    def _show_single_accounts(self) -> None:
        self.chapter("Single accounts")
        uid = self.camera.run(["id", "-u", "cam-viewer"]).check().out.strip()
        gid = self.camera.run("getent group privane | cut -d: -f3").check().out.strip()
        self.step(call("GetUser", "cam-viewer"),
                  shows=["(true, 'cam-viewer', ", "'privane'", "'privane-viewer'",
                         f"'Account viewer of the camera', {uid})"],
                  says="Has a password field, primary group, other groups, comment, UID.")
        self.step(call("GetGroup", "privane"),
                  shows=[f"({gid}, [", "'cam-viewer'", "'cam-web'"], says="The GID, the members.")
        self.step(call("CheckUser", "root"), shows=["(true,)"], says="root exists,")
        self.step(call("CheckUser", "nosuch"), shows=["(false,)"],
                  says="and this user does not: an answer, not an error.")
        self.step(call("GetUser", "nosuch"), status=1,
                  shows=[f"{USERMGMT_ERROR}3: Could not retrieve user 'nosuch', user does not "
                         "exist"],
                  says="Here it is an error; its name has the domain, usermgmt, and the code, 3.")

    def _show_authorization(self) -> None:
        self.chapter("Who may do what: polkit")
        self.step(["id", "cam-viewer"], shows=["(privane)", "(privane-viewer)"],
                  says="Members of group privane may talk to the service, no more than that.")
        self.step(call("GetUserList"), user="cam-viewer", status=1,
                  shows=[REFUSED, "com.zintor.privane-system.getuserlist"],
                  says="polkit was asked for the action of this method, and says no.")
        sync_journal(self.camera)
        self.step(["journalctl", "-u", UNIT, "-o", "cat", "-p", "warning..warning", "-n", "1"],
                  shows=[REFUSED], says="Failed and refused requests are in the journal.")
        self.step(["install", "-m", "644", RULES, "/etc/polkit-1/rules.d/"],
                  says="A packaged example: rules that give a group of the system a role.")
        await_rules(self.camera, "cam-viewer")
        self.step(call("GetUserList"), user="cam-viewer", shows=["'root'"],
                  says="cam-viewer is in that group: now the same call is allowed,")
        self.step(call("RemoveUser", "cam-web"), user="cam-viewer", status=1,
                  shows=[REFUSED, "com.zintor.privane-system.removeuser"],
                  says="but no change is, for the role may only look,")
        self.step(call("GetUserList"), user="cam-web", status=1, shows=[REFUSED],
                  says="and cam-web, who is not in that group, stays refused altogether.")

    def _show_bus_policy(self) -> None:
        self.chapter("Who may call at all: the bus")
        self.step(call("CheckUser", "root"), user="cam-other", status=1,
                  shows=["org.freedesktop.DBus.Error.AccessDenied"],
                  says="cam-other is not in group privane: the service hears nothing of it.")

    def _show_activation(self) -> None:
        self.chapter("Started when it is needed")
        self.step(["systemctl", "stop", UNIT], says="The service is stopped,")
        self.step(["systemctl", "is-active", UNIT], status=3, shows=["inactive"], says="really,")
        self.step(call("CheckGroup", "privane"), shows=["(true,)"],
                  says="and a call starts it again: D-Bus activation through systemd.")
