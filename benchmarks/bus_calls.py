"""benchmarks/bus_calls.py: what a call costs next to one of the reference (goals 1 to 7, 13, 20 to
22, 24)."""
import time
from contextlib import ExitStack
from dataclasses import dataclass, field
from pathlib import Path

from benchmarks.figures import growth_exponents, not_below, ratios, sums
from benchmarks.programs import Cfgstore, Daemon, Machine, parsed_answer, processor_seconds, run
from benchmarks.rounds import Amounts, interleave
from benchmarks.worlds import (ALL_UIDS, ALLOWED_UID, PASSWORD, REFUSED_UID, SMALL_GROUP, make_world,
                               user_name)

GET_USER = ("GetUser", f"('{user_name(1)}',)")
CHECK_USER = ("CheckUser", f"('{user_name(1)}',)")
GET_GROUP = ("GetGroup", f"('{SMALL_GROUP}',)")
GET_USER_LIST = ("GetUserList", "()")
QUERIES = {"GetUser": GET_USER, "CheckUser": CHECK_USER, "GetGroup": GET_GROUP}
PING = ("org.freedesktop.DBus.Peer.Ping", "()")
CALLERS = 8

# Options of a caller whom polkit refuses.
REFUSED = {"uid": REFUSED_UID, "fails_with": f"is refused to uid {REFUSED_UID}"}
UNKNOWN_GROUP = "unknown"

SMALL, LARGE = 1000, ALL_UIDS

# Where the policy file's own bench world keeps it.
POLICY_FILE = "etc/privane/authz.conf"
ALLOWING_POLICY = "[role root]\nusers=root\nactions=com.zintor.privane-system.*\n"

Figures = dict[str, list[float]]


@dataclass
class Context:
    """What every measurement gets."""

    machine: Machine
    cfgstore: Cfgstore
    amounts: Amounts
    memory: Path  # a folder on tmpfs
    disk: Path  # a folder on ext4
    deadline: float  # of time.monotonic()
    # Microseconds a call of service, bus and polkitd, a row a candidate.
    processor: dict[str, tuple[float, float, float]] = field(default_factory=dict)
    # What the floor itself reaches in the place of the service, by the number of the goal.
    floors: dict[str, list[float]] = field(default_factory=dict)

    def interleave(self, candidates) -> Figures:
        def check() -> None:
            self.machine.require_alive()
            if time.monotonic() > self.deadline:
                raise TimeoutError("no time was left")

        return interleave(candidates, self.amounts.rounds, check)


def require_same_answers(machine: Machine, daemons: list[Daemon], calls=QUERIES.values()) -> None:
    """The reference is none where it answers something else."""
    for method, arguments in calls:
        answers = [parsed_answer(machine.call_times(daemon, method, arguments, calls=1, show=True))
                   for daemon in daemons]
        if any(answer != answers[0] for answer in answers):
            raise RuntimeError(f"{method}: the answers differ: {str(answers)[:400]}")


def require_same_refusals(machine: Machine, daemons: list[Daemon]) -> None:
    """By polkit of a caller, in the same words."""
    texts = {machine.call_times(daemon, *GET_USER, calls=1, show=True, **REFUSED) for daemon in daemons}
    if len(texts) != 1:
        raise RuntimeError(f"the refusals differ: {str(texts)[:400]}")


def without_authorization(context: Context) -> Figures:
    """Goals 1 and 2."""
    machine, world = context.machine, make_world(context.memory, 25)
    with machine.service(world, "allow_all") as service, machine.reference(world) as reference:
        require_same_answers(machine, [service, reference])

        def visit(daemon: Daemon, call: tuple[str, str]):
            return lambda: machine.microseconds(daemon, *call, calls=context.amounts.calls, warm_up=50)

        candidates = {"Ping": visit(service, PING)}
        for name, call in QUERIES.items():
            candidates[f"service {name}"] = visit(service, call)
            candidates[f"reference {name}"] = visit(reference, call)
        times = context.interleave(candidates)
    return {"1": ratios(times["service GetUser"], times["Ping"]),
            **{number: ratios(times[f"service {name}"], times[f"reference {name}"])
               for number, name in (("2a", "GetUser"), ("2b", "CheckUser"), ("2c", "GetGroup"))}}


class ProcessorClock:
    """Microseconds a call of a daemon, the bus and polkitd, by the rounds' visits."""

    def __init__(self, machine: Machine) -> None:
        self._machine = machine
        self.rows: dict[str, list[tuple[float, ...]]] = {}

    def visit(self, name: str, daemon: Daemon, call: tuple[str, str], calls: int, **options):
        warm_up = 10
        pids = (daemon.pid, self._machine.bus_pid, self._machine.polkitd_pid)

        def timed() -> float:
            before = [processor_seconds(pid) for pid in pids]
            microseconds = self._machine.microseconds(daemon, *call, calls=calls, warm_up=warm_up,
                                                      **options)
            spent = [processor_seconds(pid) - start for pid, start in zip(pids, before)]
            self.rows.setdefault(name, []).append(
                tuple(seconds * 1e6 / (calls + warm_up) for seconds in spent))
            return microseconds

        return timed

    def medians(self) -> dict[str, tuple[float, float, float]]:
        return {name: tuple(sorted(column)[len(column) // 2] for column in zip(*rows))
                for name, rows in self.rows.items()}


def with_polkit(context: Context) -> Figures:
    """Goals 3 and 5."""
    machine, world = context.machine, make_world(context.memory, 25)
    clock = ProcessorClock(machine)
    callers = {"root": {}, "allowed by a rule": {"uid": ALLOWED_UID},
               "refused": REFUSED}
    with ExitStack() as stack:
        service = stack.enter_context(machine.service(world))
        reference = stack.enter_context(machine.reference(world, "polkit"))
        allowing = stack.enter_context(machine.service(world, "allow_all"))
        plain = stack.enter_context(machine.reference(world))
        require_same_answers(machine, [service, reference, allowing, plain])
        require_same_refusals(machine, [service, reference])
        candidates = {}
        for caller, options in callers.items():
            for name, daemon in (("service", service), ("reference", reference)):
                key = f"{name}, polkit, {caller}"
                candidates[key] = clock.visit(key, daemon, GET_USER, context.amounts.slow_calls, **options)
        for name, daemon in (("service", allowing), ("reference", plain)):
            key = f"{name}, everything allowed"
            candidates[key] = clock.visit(key, daemon, GET_USER, context.amounts.calls)
        times = context.interleave(candidates)
    context.processor |= clock.medians()
    figures = {number: ratios(times[f"service, polkit, {caller}"], times[f"reference, polkit, {caller}"])
               for number, caller in zip(("3a", "3b", "3c"), callers)}
    spent = {name: [row[0] for row in clock.rows[f"{name}, polkit, allowed by a rule"]]
             for name in ("service", "reference")}
    return figures | {"5": ratios(spent["service"], spent["reference"])}


def with_policy_file(context: Context) -> Figures:
    """Goal 4."""
    machine, world = context.machine, make_world(context.memory, 25)
    policy = world.path / POLICY_FILE
    policy.parent.mkdir(exist_ok=True)
    policy.write_text(ALLOWING_POLICY)
    with machine.service(world, "policy_file") as service, machine.reference(world) as reference:
        require_same_answers(machine, [service, reference])
        times = context.interleave({
            name: lambda daemon=daemon: machine.microseconds(daemon, *GET_USER, warm_up=50,
                                                             calls=context.amounts.calls)
            for name, daemon in (("service", service), ("reference", reference))})
    return {"4": ratios(times["service"], times["reference"])}


def many_callers(context: Context) -> Figures:
    """Goal 6: calls a second, which is the other way round than the time of one."""
    machine, world = context.machine, make_world(context.memory, 25)
    with machine.service(world) as service, machine.reference(world, "polkit") as reference:
        require_same_answers(machine, [service, reference])
        times = context.interleave({
            name: lambda daemon=daemon: machine.microseconds(daemon, *GET_USER, callers=CALLERS,
                                                             calls=context.amounts.slow_calls // 3)
            for name, daemon in (("service", service), ("reference", reference))})
    return {"6": ratios(times["reference"], times["service"])}


def user_lists(context: Context) -> Figures:
    """Goals 7, 19b and 20."""
    machine = context.machine
    sizes = {"7a": 100, "7b": SMALL, "7c": 10_000, "7d": LARGE}
    with ExitStack() as stack:
        candidates, services = {}, {}
        for users in sizes.values():
            world = make_world(context.memory, users)
            services[users] = stack.enter_context(machine.service(world, "allow_all"))
            listed, = parsed_answer(machine.call_times(services[users], *GET_USER_LIST, calls=1, show=True))
            if len(listed) < users:
                raise RuntimeError(f"GetUserList names {len(listed)} of {users} users")
            names = context.memory / f"names{users}"
            names.write_text("".join(f"{name}:\n" for name in listed))
            reference = stack.enter_context(machine.reference(world, names=names))
            require_same_answers(machine, [services[users], reference], [GET_USER_LIST])
            calls = max(context.amounts.list_calls, min(300, context.amounts.calls * 300 // users))
            for name, daemon in (("service", services[users]), ("reference", reference)):
                candidates[f"{name} {users}"] = (
                    lambda daemon=daemon, calls=calls: machine.microseconds(
                        daemon, *GET_USER_LIST, calls=calls, warm_up=3))
        for users in (SMALL, LARGE):
            for name, call in QUERIES.items():
                candidates[f"{name} {users}"] = (
                    lambda daemon=services[users], call=call: machine.microseconds(
                        daemon, *call, calls=context.amounts.calls, warm_up=50))
        times = context.interleave(candidates)

    def exponents(name: str) -> list[float]:
        return growth_exponents(times[f"{name} {SMALL}"], times[f"{name} {LARGE}"], LARGE / SMALL)

    return {**{number: ratios(times[f"service {users}"], times[f"reference {users}"])
               for number, users in sizes.items()},
            "19b": exponents("service"),
            "20a": exponents("GetUser"), "20b": exponents("CheckUser"), "20c": exponents("GetGroup")}


def password_check(context: Context) -> Figures:
    """Goal 13."""
    machine, world = context.machine, make_world(context.memory, 25)
    call = ("AuthUserBasic", f"('{user_name(1)}', '{PASSWORD}')")
    calls = context.amounts.slow_calls
    with machine.service(world, "allow_all") as service, machine.reference(world) as reference:
        require_same_answers(machine, [service, reference], [call])
        times = context.interleave({
            "service": lambda: machine.microseconds(service, *call, calls=calls),
            "reference": lambda: machine.microseconds(reference, *call, calls=calls),
            "hash": lambda: float(run([machine.program("chain_floor"), "hash", calls,
                                       world.path / "etc"]))})
    return {"13": ratios(times["service"], sums(times["hash"], times["reference"]))}


def many_groups(context: Context) -> Figures:
    """Goals 21 and 22. No more groups exist than 1,010, so that the longer list names each twice."""
    machine = context.machine
    few, many = make_world(context.memory, 25, 20), make_world(context.memory, 25, 1010)
    group_lines = (many.path / "etc/group").read_text().splitlines()
    known = [line.split(":")[0] for line in group_lines if line.startswith("filler")]

    def modify(count: int) -> tuple[str, str]:
        names = [known[i % len(known)] for i in range(count - 1)] + [UNKNOWN_GROUP]
        return "ModifyUser", f"('{user_name(1)}', '', '', {names}, '', '')"

    with machine.service(few, "allow_all") as small, machine.service(many, "allow_all") as large:
        require_same_answers(machine, [small, large])
        calls, slow = context.amounts.calls, context.amounts.slow_calls
        times = context.interleave({
            "few": lambda: machine.microseconds(small, *GET_USER, calls=calls, warm_up=50),
            "many": lambda: machine.microseconds(large, *GET_USER, calls=calls, warm_up=50),
            "short": lambda: machine.microseconds(large, *modify(200), calls=slow,
                                                  fails_with=UNKNOWN_GROUP),
            "long": lambda: machine.microseconds(large, *modify(2000), calls=slow,
                                                 fails_with=UNKNOWN_GROUP)})
    return {"21": ratios(times["many"], times["few"]), "22": ratios(times["long"], times["short"])}


def stopped_polkitd(context: Context) -> Figures:
    """Goal 24, with a libauthz that was built with a shorter deadline."""
    deadline = 1_000_000.0
    machine, world = context.machine, make_world(context.memory, 25)
    with machine.service(world, "short_deadline") as service:
        def visit() -> float:
            machine.microseconds(service, *GET_USER, calls=1)
            with machine.polkitd_stopped():
                return machine.microseconds(service, *GET_USER, calls=1, warm_up=0,
                                            fails_with="no answer in time")

        times = context.interleave({"refusal": visit})
    return {"24": ratios(not_below(times["refusal"], 0.95 * deadline), [deadline] * context.amounts.rounds)}
