#!/usr/bin/python3
# tests/unit/platform/check_data.py: what data/ says to polkit, the message bus and systemd:
# check_data.py DATA_FOLDER GENERATED_UNIT INTERFACE_XML
import configparser
import pathlib
import re
import subprocess
import sys
import tempfile
import unittest
import xml.etree.ElementTree as ET

DATA, UNIT, INTERFACE = (pathlib.Path(argument) for argument in sys.argv[1:4])
NAME = "com.zintor.PrivaneSystem"
PREFIX = "com.zintor.privane-system."
SERVICE_ACTIONS = {"startservice": "Start", "stopservice": "Stop", "restartservice": "Restart",
                   "reloadservice": "Reload"}
UNIT_ACTIONS = {*SERVICE_ACTIONS, "setdefaulttarget"}
VIEWER_ACTIONS = {"checkgroup", "checkuser", "getgroup", "getgrouplist", "getgrouplistfull", "getuser",
                  "getuserlist"}
# Of the examples, those that grant actions as they are.
ROLES = ("monitor", "operator", "time", "updater", "viewer", "web")
ROOT_ACTIONS = {"addbootblockparam", "adduiduser", "adduser", "chpasswduser", "digest", "modifyuser",
                "pinsrv", "readlogfile"}


def fixed_actions():
    """The actions of the interface's methods; those of a unit have theirs as a parent."""
    methods = {method.get("name") for method in ET.parse(INTERFACE).iter("method")}
    actions = {name.lower() for name in methods}
    actions -= {"addsystemuser", "getactivenetworkinfo"}
    return actions | {"getactivenetworkinfo.all", "getactivenetworkinfo.tcp-udp"}


def read_ini(path):
    parser = configparser.ConfigParser(strict=True, interpolation=None)
    parser.optionxform = str
    with open(path, encoding="utf-8") as file:
        parser.read_file(file)
    return parser


class PolicyChecks:
    """What holds for every .policy file of ours."""

    def test_all_are_refused_by_default(self):
        self.assertGreater(len(self.actions), 0)
        for action in self.actions:
            defaults = {entry.tag: entry.text for entry in action.find("defaults")}
            self.assertEqual(defaults, {"allow_any": "no", "allow_inactive": "no", "allow_active": "no"},
                             action.get("id"))

    def test_all_say_what_they_are(self):
        texts = [action.findtext("description") for action in self.actions]
        self.assertEqual(len(set(texts)), len(texts))
        for action in self.actions:
            self.assertEqual([entry.tag for entry in action], ["description", "message", "defaults"])
            self.assertRegex(action.findtext("description"), r"^[A-Z].*[^. ]$")
            self.assertRegex(action.findtext("message"), r"^Authorization is required for .*[^. ]\.$")


class PolkitPolicy(PolicyChecks, unittest.TestCase):
    def setUp(self):
        self.actions = ET.parse(DATA / "com.zintor.privane-system.policy").getroot().findall("action")

    def test_each_fixed_action_is_declared_once(self):
        declared = [action.get("id") for action in self.actions]
        self.assertEqual(len(declared), 46)
        self.assertEqual(sorted(declared), sorted(PREFIX + name for name in fixed_actions()))


def run_generator(*units):
    return subprocess.run([DATA / "privane-unit-actions", *units], capture_output=True, text=True, check=False)


class UnitActions(PolicyChecks, unittest.TestCase):
    """The policy that privane-unit-actions prints."""

    UNITS = ["sshd.service", "recorder@.service", "multi-user.target", "a" * 64 + ".service", "-0.service"]

    def setUp(self):
        result = run_generator(*self.UNITS)
        self.assertEqual((result.returncode, result.stderr), (0, ""))
        self.text = result.stdout
        self.actions = ET.fromstring(self.text.encode()).findall("action")

    def test_a_service_has_four_actions_and_a_target_has_one(self):
        parts = ["sshd", "recorder.any", "a" * 64, "-0"]
        expected = [f"{action}.{part}" for part in parts for action in SERVICE_ACTIONS]
        self.assertEqual(sorted(action.get("id") for action in self.actions),
                         sorted(PREFIX + name for name in [*expected, "setdefaulttarget.multi-user"]))

    def test_texts_name_verb_and_unit(self):
        texts = {action.get("id"): (action.findtext("description"), action.findtext("message"))
                 for action in self.actions}
        for action, verb in SERVICE_ACTIONS.items():
            description, message = texts[f"{PREFIX}{action}.sshd"]
            self.assertEqual(description, f"{verb} sshd.service")
            self.assertRegex(message, rf" {verb.lower()[:4]}\w*ing sshd\.service\.$")
            self.assertEqual(texts[f"{PREFIX}{action}.recorder.any"][0],
                             f"{verb} any instance of recorder@.service")
        self.assertEqual(texts[PREFIX + "setdefaulttarget.multi-user"][0], "Boot into multi-user.target")

    def test_declaration_is_that_of_the_packaged_policy(self):
        packaged = (DATA / "com.zintor.privane-system.policy").read_text(encoding="utf-8")
        head = re.compile(r".*?(?=<!--)", re.DOTALL)
        self.assertEqual(head.match(self.text).group(), head.match(packaged).group())

    def test_order_repetition_and_locale_change_nothing(self):
        self.assertEqual(run_generator(*reversed(self.UNITS), *self.UNITS).stdout, self.text)
        foreign = subprocess.run([DATA / "privane-unit-actions", *self.UNITS], check=True,
                                 capture_output=True, text=True, env={"LC_ALL": "C.UTF-8"})
        self.assertEqual(foreign.stdout, self.text)

    def test_unit_that_no_caller_could_name_is_refused(self):
        cases = {
            "": "neither a .service nor a .target", "sshd": "neither a .service nor a .target",
            "dbus.socket": "neither a .service nor a .target",
            "sshd.service ": "neither a .service nor a .target",
            ".service": "no name", "@.service": "no name", "@.target": "no name",
            "getty@tty1.service": "an instance has its template's action, getty@",
            "a@@.service": "an instance has its template's action, a@",
            "@a.service": "an instance has its template's action, @",
            "a" * 65 + ".service": "longer than 64 characters",
            **{f"{name}.service": "no caller could give that name" for name in (
                "Sshd", "a.b", "a_b", "a b", "a\nb", "a&b", "<a>", "a--\u00e9", "a/b", "a:b", "a\\b", "a*")},
        }
        for unit, reason in cases.items():
            for units in ((unit,), ("sshd.service", unit)):
                result = run_generator(*units)
                self.assertEqual((result.returncode, result.stdout), (1, ""), unit)
                self.assertTrue(result.stderr.startswith(f"privane-unit-actions: '{unit}': "), unit)
                self.assertIn(reason, result.stderr)

    def test_wrong_call_is_told_the_right_one(self):
        for units in ((), ("--help",), ("-h", "sshd.service")):
            result = run_generator(*units)
            self.assertEqual((result.returncode, result.stdout), (2, ""))
            self.assertRegex(result.stderr, r"^usage: privane-unit-actions ")


class ExampleRules(unittest.TestCase):
    def granted(self, role):
        text = (DATA / "examples" / f"60-privane-{role}.rules").read_text(encoding="utf-8")
        self.assertIn(f'subject.isInGroup("privane-{role}")', text)
        listed = re.search(r"var granted = \[(.*?)\];", text, re.DOTALL).group(1)
        names = re.findall(r'"([^"]*)"', listed)
        self.assertEqual(names, sorted(set(names)))
        return set(names), text

    def test_viewer_holds_the_account_queries(self):
        names, _ = self.granted("viewer")
        self.assertEqual(names, VIEWER_ACTIONS)

    def test_every_role_holds_declared_actions(self):
        for role in ROLES:
            names, _ = self.granted(role)
            self.assertGreater(len(names), 0)
            self.assertLessEqual(names, fixed_actions())

    def test_what_amounts_to_root_is_named_and_not_granted(self):
        for role in ROLES:
            self.assertFalse((ROOT_ACTIONS | UNIT_ACTIONS) & self.granted(role)[0], role)
        _, text = self.granted("operator")
        comment = "\n".join(line for line in text.splitlines() if line.startswith("//"))
        for name in ROOT_ACTIONS:
            self.assertIn(name, comment)

    def test_units_are_compared_whole_and_for_their_actions(self):
        text = (DATA / "examples" / "60-privane-units.rules").read_text(encoding="utf-8")
        listed = re.search(r"var granted = \{(.*?)\};", text, re.DOTALL).group(1)
        granted = dict(re.findall(r'"(\w+)": \["([-a-z0-9]+@?)"\]', listed))
        self.assertEqual(granted, {"reloadservice": "sshd", "restartservice": "sshd",
                                   "startservice": "recorder@", "stopservice": "recorder@"})
        self.assertIn('.indexOf(action.lookup("unit")) >= 0', text)
        self.assertIn('subject.isInGroup("privane-units")', text)

    def test_sysusers_makes_their_groups(self):
        lines = (DATA / "examples" / "privane-roles.sysusers.conf").read_text(encoding="utf-8").splitlines()
        self.assertEqual([line for line in lines if not line.startswith("#")],
                         [f"g privane-{role} -" for role in (
                             "viewer", "operator", "units", "web", "time", "updater", "monitor")])


class PolicyFiles(unittest.TestCase):
    def roles_of(self, name):
        roles = read_ini(DATA / name)
        return {section: {key: value.split(";") for key, value in roles[section].items()}
                for section in roles.sections()}

    def test_default_grants_root_alone_everything(self):
        self.assertEqual(self.roles_of("authz.conf"), {
            "role root": {"users": ["root"], "actions": [PREFIX + "*"]}})

    def test_example_grants_what_the_rules_do(self):
        roles = self.roles_of("examples/privane-authz-roles.conf")
        rules = ExampleRules()
        units = {f"{PREFIX}{action}.{unit}" for action, unit in (
            ("reloadservice", "sshd"), ("restartservice", "sshd"),
            ("startservice", "recorder.any"), ("stopservice", "recorder.any"))}
        expected = {name: {PREFIX + action for action in rules.granted(name)[0]}
                    for name in ROLES} | {"units": units}
        self.assertEqual(roles.pop("role root"), {"users": ["root"], "actions": [PREFIX + "*"]})
        self.assertEqual({name: role["groups"] for name, role in roles.items()},
                         {f"role {name}": [f"privane-{name}"] for name in expected})
        self.assertEqual({name: set(role["actions"]) for name, role in roles.items()},
                         {f"role {name}": actions for name, actions in expected.items()})
        for role in roles.values():
            self.assertEqual(set(role), {"groups", "actions"})
            self.assertEqual(role["actions"], sorted(set(role["actions"])))

    def test_example_names_what_amounts_to_root(self):
        text = (DATA / "examples" / "privane-authz-roles.conf").read_text(encoding="utf-8")
        comment = "\n".join(line for line in text.splitlines() if line.startswith("#"))
        for name in ROOT_ACTIONS:
            self.assertIn(name, comment)


class BusLimits(unittest.TestCase):
    def test_example_lowers_limits_and_does_nothing_else(self):
        # dbus-daemon(1), those of the system bus.
        defaults = {"max_message_size": 32 << 20, "max_outgoing_bytes": 127 << 20,
                    "max_incoming_bytes": 127 << 20}
        root = ET.parse(DATA / "examples" / "privane-bus-limits.conf").getroot()
        self.assertEqual(root.tag, "busconfig")
        self.assertEqual([limit.tag for limit in root], ["limit"] * len(defaults))
        self.assertEqual({limit.get("name") for limit in root}, set(defaults))
        for limit in root:
            self.assertLess(int(limit.text), defaults[limit.get("name")])


class BusFiles(unittest.TestCase):
    def rules_of(self, **context):
        root = ET.parse(DATA / f"{NAME}.conf").getroot()
        policies = [policy for policy in root if policy.attrib == context]
        self.assertEqual(len(policies), 1, context)
        return [(rule.tag, rule.attrib) for rule in policies[0]]

    def test_only_root_owns_the_name(self):
        self.assertIn(("deny", {"own": NAME}), self.rules_of(context="default"))
        self.assertIn(("allow", {"own": NAME}), self.rules_of(user="root"))
        self.assertFalse([rule for rule in self.rules_of(group="privane") if "own" in rule[1]])

    def test_root_and_the_group_call_it_and_nobody_else(self):
        anything = {"send_destination": NAME}
        call = {"send_destination": NAME, "send_type": "method_call"}
        hear = {"receive_sender": NAME, "receive_type": "signal"}
        self.assertIn(("deny", anything), self.rules_of(context="default"))
        self.assertNotIn("allow", [verdict for verdict, _ in self.rules_of(context="default")])
        for context, may_send in (({"user": "root"}, anything), ({"group": "privane"}, call)):
            self.assertEqual(sorted(self.rules_of(**context), key=str), sorted(
                [("allow", may_send), ("allow", hear)]
                + [("allow", {"own": NAME})] * ("user" in context), key=str))

    def test_there_are_no_further_policies(self):
        self.assertEqual(len(list(ET.parse(DATA / f"{NAME}.conf").getroot())), 3)

    def test_activation_goes_through_the_unit(self):
        service = read_ini(DATA / f"{NAME}.service")["D-BUS Service"]
        self.assertEqual(dict(service), {"Name": NAME, "Exec": "/bin/false", "User": "root",
                                         "SystemdService": "privane-system.service"})

    def test_sysusers_makes_the_group(self):
        lines = (DATA / "privane-system.sysusers.conf").read_text(encoding="utf-8").splitlines()
        self.assertEqual([line for line in lines if not line.startswith("#")], ["g privane 480"])


class BootEnvironmentLock(unittest.TestCase):
    def test_is_made_before_anybody_else_can(self):
        lines = (DATA / "privane-system.tmpfiles.conf").read_text(encoding="utf-8").splitlines()
        self.assertEqual([line for line in lines if not line.startswith("#")],
                         ["f /run/lock/fw_printenv.lock 0600 root root -"])


class Unit(unittest.TestCase):
    def setUp(self):
        self.text = UNIT.read_text(encoding="utf-8")

    def value_of(self, key):
        return re.findall(rf"^{key}=(.*)$", self.text, re.MULTILINE)

    def test_systemd_accepts_every_line(self):
        programs = [self.value_of(key)[0].split()[0] for key in ("ExecCondition", "ExecStart")]
        with tempfile.TemporaryDirectory() as folder:
            # Where the programs are not installed, that would be the complaint.
            copy = pathlib.Path(folder) / "privane-system.service"
            text = self.text
            for program in programs:
                text = text.replace(program, "/bin/true")
            copy.write_text(text, encoding="utf-8")
            result = subprocess.run(
                ["systemd-analyze", "verify", "--man=no", "--recursive-errors=no", str(copy)],
                capture_output=True, text=True, check=False)
        self.assertEqual((result.returncode, result.stdout + result.stderr), (0, ""))

    def test_capabilities_are_known(self):
        # systemd passes over a wrong name in silence.
        header = pathlib.Path("/usr/include/linux/capability.h").read_text(encoding="utf-8")
        known = set(re.findall(r"#define (CAP_\w+)\s+\d+", header))
        kept = set(" ".join(self.value_of("CapabilityBoundingSet")).split())
        self.assertGreater(len(kept), 0)
        self.assertLessEqual(kept, known)

    def test_looks_at_the_accounts_before_it_starts(self):
        self.assertEqual(len(self.value_of("ExecCondition")), 1)
        self.assertRegex(self.value_of("ExecCondition")[0], r"^/[^@ ]*/privane-check --guard$")

    def test_runs_the_service_in_the_foreground_under_its_name(self):
        self.assertRegex(self.value_of("ExecStart")[0], r"^/[^@ ]*/privane_system -n$")
        self.assertEqual(self.value_of("Type"), ["dbus"])
        self.assertEqual(self.value_of("BusName"), [NAME])

    def test_comes_back_and_leaves_what_it_started(self):
        self.assertEqual(self.value_of("Restart"), ["always"])
        self.assertEqual(self.value_of("KillMode"), ["process"])

    def test_nothing_that_breaks_a_method_is_set_and_the_unit_says_why(self):
        comments = "\n".join(line for line in self.text.splitlines() if line.startswith("#"))
        for key in ("MemoryMax", "NoExecPaths", "PrivateDevices", "PrivateNetwork", "PrivateTmp", "PrivateUsers",
                    "ProcSubset", "ProtectClock", "RestrictFileSystems", "RootDirectory", "TasksMax",
                    "UMask", "User"):
            self.assertEqual(self.value_of(key), [], key)
            self.assertIn(key, comments)

    def test_leaves_no_image_of_its_memory(self):
        self.assertEqual(self.value_of("LimitCORE"), ["0"])
        self.assertEqual(self.value_of("WatchdogSignal"), ["SIGKILL"])


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
