"""benchmarks/account_changes.py: what it costs to add and remove a user (goals 8 to 12, 19c and
23)."""
import statistics
from contextlib import ExitStack
from pathlib import Path

from gi.repository import Gio, GLib

from benchmarks.bus_calls import CHECK_USER, LARGE, SMALL, Context, Figures
from benchmarks.figures import differences, growth_exponents, ratios, sums
from benchmarks.programs import STOCK_NAME, Daemon, Machine, run
from benchmarks.rounds import Visit
from benchmarks.worlds import HASH, FREE_UID, PASSWORD, PRIMARY_GROUP, SMALL_GROUP, World, make_world

NEW_USER = "newcomer"
FIELDS = f"'{NEW_USER}', '{PASSWORD}', '{PRIMARY_GROUP}', '{SMALL_GROUP}', 'Added'"
# At most 100 users get an ID of the service's choice.
ADD = ("AddUser", f"({FIELDS})")
ADD_WITH_ID = ("AddUidUser", f"({FIELDS}, {FREE_UID})")
REMOVE = ("RemoveUser", f"('{NEW_USER}',)")

# With 25 users: the goals of which the floor is measured as well, and what each compares.
NEXT_TO_STOCK = {"10a": ("stock", "add"), "11a": ("tools", "add"),
                 "12a": ("stock", "remove"), "12b": ("tools", "remove")}


def add_time(machine: Machine, daemon: Daemon, call: tuple[str, str], changes: int) -> float:
    return machine.microseconds(daemon, *call, calls=changes, warm_up=1, after=REMOVE)


def floor_time(machine: Machine, world: World, item: str, repeats: int) -> float:
    return float(run([machine.program("chain_floor"), item, repeats, world.path / "etc"]))


def floor_world(folder: Path, users: int) -> World:
    """Files of its own, with as many accounts as the other side writes: one more when it has added."""
    own = folder / "floor"
    own.mkdir(exist_ok=True)
    return make_world(own, users)


def chain(context: Context) -> Figures:
    """Goals 8 and 9."""
    machine, changes = context.machine, context.amounts.changes
    on_disk, in_memory = make_world(context.disk, 25), make_world(context.memory, 25)
    disk_floor, memory_floor = floor_world(context.disk, 26), floor_world(context.memory, 26)
    with ExitStack() as stack:
        disk_service = stack.enter_context(machine.service(on_disk))
        memory_service = stack.enter_context(machine.service(in_memory))
        reference = stack.enter_context(machine.reference(in_memory, "polkit"))
        times = context.interleave({
            "disk": lambda: add_time(machine, disk_service, ADD, changes),
            "memory": lambda: add_time(machine, memory_service, ADD, changes),
            "reference": lambda: machine.microseconds(reference, *ADD, calls=changes * 4),
            "chain": lambda: floor_time(machine, disk_floor, "add", changes),
            "hash": lambda: floor_time(machine, memory_floor, "hash", changes * 2),
            "pidof": lambda: floor_time(machine, memory_floor, "pidof", changes * 2)})
    return {"8": ratios(times["disk"], sums(times["chain"], times["reference"])),
            "9": ratios(times["memory"], sums(times["hash"], times["pidof"], times["reference"]))}


class StockDaemon:
    """The accounts daemon's calls, each of which it makes a program run."""

    def __init__(self, machine: Machine, daemon: Daemon) -> None:
        self._bus, self._name = machine.bus, daemon.unique_name
        self._daemon = daemon

    def _call(self, path: str, interface: str, method: str, arguments: GLib.Variant) -> tuple:
        reply = self._bus.call_sync(self._name, path, interface, method, arguments, None,
                                    Gio.DBusCallFlags.NONE, 120_000, None)
        return reply.unpack()

    def add_and_remove(self) -> tuple[float, float]:
        """Microseconds of making the account with its password, and of deleting it."""
        accounts = "/org/freedesktop/Accounts"
        start = GLib.get_monotonic_time()
        path, = self._call(accounts, STOCK_NAME, "CreateUser",
                           GLib.Variant("(ssi)", (NEW_USER, "Added", 0)))
        self._call(path, f"{STOCK_NAME}.User", "SetPassword", GLib.Variant("(ss)", (HASH, "")))
        made = GLib.get_monotonic_time()
        uid = int(path.rpartition("User")[2])
        self._call(accounts, STOCK_NAME, "DeleteUser", GLib.Variant("(xb)", (uid, False)))
        return made - start, GLib.get_monotonic_time() - made


def run_in(machine: Machine, world: World, *programs: list[str], text: str = "") -> float:
    """Microseconds of the programs one after the other, timed inside the world."""
    words = [word for program in programs for word in ("--", *program)][1:]
    return float(run(world.command(machine.program("run_time"), text, *words)))


def shadow_tools(machine: Machine, world: World) -> tuple[float, float]:
    """useradd and chpasswd, which hashes as the service does; then userdel."""
    add = run_in(machine, world, ["useradd", "-M", "-N", "-g", PRIMARY_GROUP, "-G", SMALL_GROUP,
                                  "-c", "Added", NEW_USER],
                 ["chpasswd", "-c", "SHA256"], text=f"{NEW_USER}:{PASSWORD}\n")
    return add, run_in(machine, world, ["userdel", NEW_USER])


def few_next_to_stock(context: Context) -> Figures:
    """Goals 10a, 11a and 12, and what the floor reaches in the place of the service."""
    machine, changes = context.machine, context.amounts.changes
    added, removed = floor_world(context.disk, 26), floor_world(context.disk, 25)
    with machine.reference(make_world(context.memory, 25), "polkit") as reference:
        few = _next_to_stock(context, 25, ADD, {
            "floor add": lambda: floor_time(machine, added, "add", changes),
            "floor remove": lambda: floor_time(machine, removed, "remove", changes),
            "reference add": lambda: machine.microseconds(reference, *ADD, calls=changes * 4),
            "reference remove": lambda: machine.microseconds(reference, *REMOVE, calls=changes * 4)})
    for number, (tool, change) in NEXT_TO_STOCK.items():
        floor = sums(few[f"floor {change}"], few[f"reference {change}"])
        context.floors[number] = ratios(few[f"{tool} {change}"], floor)
    return {number: ratios(few[f"{tool} {change}"], few[f"service {change}"])
            for number, (tool, change) in NEXT_TO_STOCK.items()}


def many_next_to_stock(context: Context) -> Figures:
    """Goals 10b and 11b."""
    many = _next_to_stock(context, 10_000, ADD_WITH_ID, {})
    return {"10b": ratios(many["stock add"], many["service add"]),
            "11b": ratios(many["tools add"], many["service add"])}


def _next_to_stock(context: Context, users: int, add: tuple[str, str],
                   others: dict[str, Visit]) -> Figures:
    """Microseconds of each side's adding and removing, and of what else is to be visited in turn."""
    machine, amounts = context.machine, context.amounts
    changes = amounts.changes if users < 100 else amounts.stock_changes
    worlds = {}
    for name in ("service", "stock", "tools"):
        folder = context.disk / name
        folder.mkdir(exist_ok=True)
        worlds[name] = make_world(folder, users)
    removals: Figures = {f"{name} remove": [] for name in worlds}

    def in_pairs(name: str, add_and_remove) -> float:
        """The median of adding; that of removing is kept for the same round."""
        pairs = [add_and_remove() for _ in range(amounts.stock_changes)]
        removals[f"{name} remove"].append(statistics.median(second for _, second in pairs))
        return statistics.median(first for first, _ in pairs)

    with machine.service(worlds["service"]) as service, machine.stock(worlds["stock"]) as stock:
        accounts_daemon = StockDaemon(machine, stock)
        # What either does once is done before the first visit.
        accounts_daemon.add_and_remove()
        shadow_tools(machine, worlds["tools"])

        def service_visit() -> float:
            machine.microseconds(service, *add, calls=1, warm_up=0)
            removals["service remove"].append(
                machine.microseconds(service, *REMOVE, calls=changes, warm_up=1, after=add))
            machine.microseconds(service, *REMOVE, calls=1, warm_up=0)
            return add_time(machine, service, add, changes)

        return removals | context.interleave({
            "service add": service_visit,
            "stock add": lambda: in_pairs("stock", accounts_daemon.add_and_remove),
            "tools add": lambda: in_pairs("tools", lambda: shadow_tools(machine, worlds["tools"])),
            **others})


def add_growth(context: Context) -> Figures:
    """Goal 19c: with one user less, so that there is an ID left."""
    machine, changes = context.machine, context.amounts.large_changes
    worlds = {users: make_world(context.memory, users - 1) for users in (SMALL, LARGE)}
    with ExitStack() as stack:
        services = {users: stack.enter_context(machine.service(world, "allow_all"))
                    for users, world in worlds.items()}
        times = context.interleave({
            "small": lambda: add_time(machine, services[SMALL], ADD_WITH_ID, changes * 8),
            "large": lambda: add_time(machine, services[LARGE], ADD_WITH_ID, changes),
            "hash": lambda: floor_time(machine, worlds[SMALL], "hash", 20),
            "pidof": lambda: floor_time(machine, worlds[SMALL], "pidof", 20)})
    constant = sums(times["hash"], times["pidof"])
    return {"19c": growth_exponents(differences(times["small"], constant),
                                    differences(times["large"], constant), LARGE / SMALL)}


def pidof_spawn(context: Context) -> Figures:
    """Goal 23: a password that is absent is cleared, so nothing is written, and cfgstore is told, who
    counts it: pidof has found it each time. A query's time is taken off."""
    machine, calls = context.machine, context.amounts.slow_calls
    clear = ("ClearUserFields", "('benchsystem', true, false, false)")
    with ExitStack() as stack:
        services = {users: stack.enter_context(
            machine.service(make_world(context.memory, users), "allow_all")) for users in (25, LARGE)}
        def visit(daemon: Daemon, call: tuple[str, str], signals: int):
            def visited() -> float:
                before = context.cfgstore.signals()
                microseconds = machine.microseconds(daemon, *call, calls=calls, warm_up=1)
                context.cfgstore.require_signals(before + signals)
                return microseconds
            return visited

        candidates = {}
        for users, daemon in services.items():
            candidates[f"clear {users}"] = visit(daemon, clear, calls + 1)
            candidates[f"query {users}"] = visit(daemon, CHECK_USER, 0)
        times = context.interleave(candidates)
    few, many = (differences(times[f"clear {users}"], times[f"query {users}"]) for users in (25, LARGE))
    return {"23": ratios(many, few)}
