"""benchmarks/account_changes.py: what it costs to add and remove a user (goals 8 to 12, 19c and
23)."""
import itertools
import statistics
from contextlib import ExitStack

from gi.repository import Gio, GLib

from benchmarks.bus_calls import CHECK_USER, LARGE, SMALL, Context, Figures
from benchmarks.figures import differences, growth_exponents, ratios, sums
from benchmarks.programs import STOCK_NAME, Daemon, Machine, run
from benchmarks.worlds import HASH, FREE_UID, PASSWORD, PRIMARY_GROUP, SMALL_GROUP, World, make_world

NEW_USER = "newcomer"
FIELDS = f"'{NEW_USER}', '{PASSWORD}', '{PRIMARY_GROUP}', '{SMALL_GROUP}', 'Added'"
# At most 100 users get an ID of the service's choice.
ADD = ("AddUser", f"({FIELDS})")
ADD_WITH_ID = ("AddUidUser", f"({FIELDS}, {FREE_UID})")
REMOVE = ("RemoveUser", f"('{NEW_USER}',)")


def add_time(machine: Machine, daemon: Daemon, call: tuple[str, str], changes: int) -> float:
    return machine.microseconds(daemon, *call, calls=changes, warm_up=1, after=REMOVE)


def floor_time(machine: Machine, world: World, item: str, repeats: int) -> float:
    return float(run([machine.program("chain_floor"), item, repeats, world.path / "etc"]))


def floor_world(context: Context, folder_name: str) -> World:
    """Files of its own, with the account that is added on the other side."""
    folder = getattr(context, folder_name) / "floor"
    folder.mkdir(exist_ok=True)
    return make_world(folder, 26)


def chain(context: Context) -> Figures:
    """Goals 8 and 9."""
    machine, changes = context.machine, context.amounts.changes
    on_disk, in_memory = make_world(context.disk, 25), make_world(context.memory, 25)
    disk_floor, memory_floor = floor_world(context, "disk"), floor_world(context, "memory")
    with ExitStack() as stack:
        disk_service = stack.enter_context(machine.service(on_disk))
        memory_service = stack.enter_context(machine.service(in_memory))
        reference = stack.enter_context(machine.reference(in_memory, "polkit"))
        times = context.interleave({
            "disk": lambda: add_time(machine, disk_service, ADD, changes),
            "memory": lambda: add_time(machine, memory_service, ADD, changes),
            "reference": lambda: machine.microseconds(reference, *ADD, calls=changes * 4),
            "chain": lambda: floor_time(machine, disk_floor, "chain", changes),
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


def run_in(world: World, *commands: list[str], text: str = "") -> float:
    """Microseconds of the commands one after the other, timed inside the world."""
    script = ("import subprocess, sys, time\nstart = time.monotonic()\n"
              f"for command in {list(commands)!r}:\n"
              f"    subprocess.run(command, input={text!r}, text=True, check=True,\n"
              "                   stdout=subprocess.DEVNULL)\n"
              "print((time.monotonic() - start) * 1e6)")
    return float(run(world.command("/usr/bin/python3", "-c", script)))


def shadow_tools(world: World) -> tuple[float, float]:
    """useradd and chpasswd, which hashes as the service does; then userdel."""
    add = run_in(world, ["useradd", "-M", "-N", "-g", PRIMARY_GROUP, "-G", SMALL_GROUP, "-c", "Added",
                         NEW_USER], ["chpasswd", "-c", "SHA256"], text=f"{NEW_USER}:{PASSWORD}\n")
    return add, run_in(world, ["userdel", NEW_USER])


def few_next_to_stock(context: Context) -> Figures:
    """Goals 10a, 11a and 12."""
    few = _next_to_stock(context, 25, ADD)
    return {"10a": few["stock add"], "11a": few["tools add"],
            "12a": few["stock remove"], "12b": few["tools remove"]}


def many_next_to_stock(context: Context) -> Figures:
    """Goals 10b and 11b."""
    many = _next_to_stock(context, 10_000, ADD_WITH_ID)
    return {"10b": many["stock add"], "11b": many["tools add"]}


def _next_to_stock(context: Context, users: int, add: tuple[str, str]) -> Figures:
    machine, amounts = context.machine, context.amounts
    changes = amounts.changes if users < 100 else amounts.stock_changes
    worlds = {}
    for name in ("service", "stock", "tools"):
        folder = context.disk / name
        folder.mkdir(exist_ok=True)
        worlds[name] = make_world(folder, users)
    removals: Figures = {"service": [], "stock": [], "tools": []}

    def in_pairs(name: str, add_and_remove) -> float:
        """The median of adding; that of removing is kept for the same round."""
        pairs = [add_and_remove() for _ in range(amounts.stock_changes)]
        removals[name].append(statistics.median(second for _, second in pairs))
        return statistics.median(first for first, _ in pairs)

    with machine.service(worlds["service"]) as service, machine.stock(worlds["stock"]) as stock:
        accounts_daemon = StockDaemon(machine, stock)
        # It reads the accounts when it is first asked.
        accounts_daemon.add_and_remove()
        shadow_tools(worlds["tools"])

        def service_visit() -> float:
            machine.microseconds(service, *add, calls=1, warm_up=0)
            removals["service"].append(machine.microseconds(service, *REMOVE, calls=changes, warm_up=1,
                                                            after=add))
            machine.microseconds(service, *REMOVE, calls=1, warm_up=0)
            return add_time(machine, service, add, changes)

        adding = context.interleave({
            "service": service_visit,
            "stock": lambda: in_pairs("stock", accounts_daemon.add_and_remove),
            "tools": lambda: in_pairs("tools", lambda: shadow_tools(worlds["tools"]))})
    return {**{f"{name} add": ratios(adding[name], adding["service"]) for name in ("stock", "tools")},
            **{f"{name} remove": ratios(removals[name], removals["service"])
               for name in ("stock", "tools")}}


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
            "hash": lambda: floor_time(machine, worlds[SMALL], "hash", 20)})
    return {"19c": growth_exponents(differences(times["small"], times["hash"]),
                                    differences(times["large"], times["hash"]), LARGE / SMALL)}


def pidof_spawn(context: Context) -> Figures:
    """Goal 23: a password that is absent is cleared, so nothing is written, and cfgstore is told. A
    query's time is taken off."""
    machine, calls = context.machine, context.amounts.slow_calls
    clear = ("ClearUserFields", "('benchsystem', true, false, false)")
    with ExitStack() as stack:
        services = {users: stack.enter_context(
            machine.service(make_world(context.memory, users), "allow_all")) for users in (25, LARGE)}
        candidates = {}
        for users, (name, call) in itertools.product(
                services, (("clear", clear), ("query", CHECK_USER))):
            candidates[f"{name} {users}"] = (
                lambda daemon=services[users], call=call: machine.microseconds(daemon, *call, calls=calls))
        times = context.interleave(candidates)
    few, many = (differences(times[f"clear {users}"], times[f"query {users}"]) for users in (25, LARGE))
    return {"23": ratios(many, few)}
