"""tools/reference/sources.py: the methods' actions and commands, from the code that decides them."""
import re
from pathlib import Path

from reference.interface import ROOT, Fault

ACTION_PREFIX = "com.zintor.privane-system."

# The five methods on units: where their action stands, and what its last part names.
UNIT_JOB = re.compile(r'inline constexpr unit_job (\w+) = \{"(\w+)", "\.(\w+)"')
LAST_PART = {"service": "UNIT", "target": "TARGET"}

# The function that makes an action ID from a mode.
DERIVED = re.compile(r'"%s(\w+)\.%s", ACTION_PREFIX\.text, (\w+)')

ROW = re.compile(
    r'^    (?:method<"(?P<action>\w+)", [\w<>]+>|method_with_derived_action<(?P<derived>\w+), \w+>|'
    r'unit_method<(?P<job>\w+)>)\(\s*"handle-(?P<signal>[a-z-]+)"\),$', re.MULTILINE)

NOUN = re.compile(r'\.noun = "([\w-]+)"')
COMMAND = re.compile(r"\n    \{(\.noun = .*?)\},(?=\n)", re.DOTALL)
# Of a command without arguments.
PLAIN = re.compile(r'\n    plain\("([\w-]+)", "([\w-]+)", "(\w+)", "[^"]*"\),(?=\n)')


def signal_of(member: str) -> str:
    """As gdbus-codegen names it: CheckUser is "check-user"."""
    return re.sub(r"(?<!^)([A-Z])", r"-\1", member).lower()


def method_rows(root: Path = ROOT) -> dict[str, str]:
    """Of each row of the method table the signal and the action ID, in the table's order."""
    units = (root / "methods/system/unit_control.h").read_text()
    jobs = {job: f"{action}.{LAST_PART[suffix]}" for job, action, suffix in UNIT_JOB.findall(units)}
    derived = DERIVED.findall((root / "methods/system/diagnostics.cpp").read_text())
    if len(jobs) != 5 or len(derived) != 1:
        raise Fault("the actions that depend on an argument are not where they were")
    table = (root / "service/method_table.cpp").read_text()
    body = table.partition("method_table[] = {\n")[2].partition("\n};")[0] + "\n"
    rows = {}
    for row in ROW.finditer(body):
        last = (row["action"] or jobs.get(row["job"] or "")
                or f"{derived[0][0]}.{derived[0][1].upper()}")
        rows[row["signal"]] = ACTION_PREFIX + last
    if len(rows) != body.count('"handle-'):
        raise Fault("service/method_table.cpp: there is a row of a form that is not known here")
    return rows


def field(row: str, name: str) -> str:
    found = re.search(rf'\.{name} = "([^"]*)"', row)
    return found[1] if found else ""


def commands(root: Path = ROOT) -> dict[str, list[str]]:
    """Of each method the commands of privanectl that call it, from the table of its verbs."""
    text = (root / "client/verb_table.cpp").read_text().partition("COMMANDS[] = {")[2]
    found: dict[str, list[str]] = {}
    text = PLAIN.sub(r'\n    {.noun = "\1", .verb = "\2", .method = "\3"},', text)
    rows = COMMAND.findall(text)
    if len(rows) != len(NOUN.findall(text)) or "plain(" in text:
        raise Fault("client/verb_table.cpp: there is a row of a form that is not known here")
    for row in rows:
        method = field(row, "method")
        if not method:
            continue
        selector = re.search(r"\.selector = OPTION_(\w+)", row)
        words = [field(row, "noun"), field(row, "verb"),
                 f"--{selector[1].lower()}" if selector else ""]
        found.setdefault(method, []).append(" ".join(word for word in words if word))
    return found


def manual_commands(root: Path = ROOT) -> dict[str, list[str]]:
    """The same from the manual page of privanectl, with the arguments."""
    text = (root / "client/privanectl.1").read_text().replace("\\-", "-")
    section = text.partition(".SH COMMANDS\n")[2].partition("\n.SH ")[0]
    found: dict[str, list[str]] = {}
    for usage, method in re.findall(r"\.B (.+)\n.+\nCalls\n\.BR (\w+) \.", section):
        found.setdefault(method, []).append(usage)
    return found


def policy_actions(root: Path = ROOT) -> list[str]:
    text = (root / "data/com.zintor.privane-system.policy").read_text()
    return re.findall(r'<action id="([^"]+)">', text)
