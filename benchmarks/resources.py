"""benchmarks/resources.py: start-up, memory and sizes (goals 14 to 18, 19a and 25)."""
import shutil
import statistics
import subprocess
import time
from pathlib import Path

from benchmarks.account_changes import ADD, REMOVE
from benchmarks.bus_calls import (ALLOWING_POLICY, GET_USER, GET_USER_LIST, LARGE, POLICY_FILE, QUERIES,
                                  REFUSED, SMALL, Context, Figures)
from benchmarks.figures import differences, growth_exponents, ratios, shares, sums
from benchmarks.programs import (BUS_NAME, SERVICE, SERVICE_UNIT, STOCK_DAEMON, STOCK_NAME, STOCK_UNIT,
                                 loaded_libraries, resident_kib, run, unit_environment)
from benchmarks.worlds import PASSWORD, SMALL_GROUP, World, make_world, user_name

# After its name a daemon still has things to do; the memory is read when it has come to rest.
REST_SECONDS = 1.0

LIBRARIES = ("libauthz", "libbootparam", "libdigestentry", "liblogbackend", "libparamcli", "librtcclock")


def start_times(context: Context) -> Figures:
    """Goals 14, 15 and 19a, and what the floor of loading reaches in the place of the service in 15."""
    machine = context.machine
    starts = context.amounts.starts
    worlds = {users: make_world(context.memory, users) for users in (25, SMALL, LARGE)}
    worked: dict[int, list[float]] = {users: [] for users in worlds}

    def service(users: int):
        environment = machine.service_environment("polkit")

        def visit() -> float:
            both = [machine.start_times(worlds[users], BUS_NAME, [SERVICE, "-n"], environment)
                    for _ in range(starts)]
            worked[users].append(statistics.median(time for _, time in both))
            return statistics.median(elapsed for elapsed, _ in both)
        return visit

    def minimal() -> float:
        program, name = machine.minimal_command()
        environment = unit_environment(SERVICE_UNIT)
        return statistics.median(machine.start_times(worlds[25], name, program, environment)[0]
                                 for _ in range(starts))

    def stock() -> float:
        environment = unit_environment(STOCK_UNIT)
        return statistics.median(machine.start_times(worlds[LARGE], STOCK_NAME, [STOCK_DAEMON],
                                                     environment)[0]
                                 for _ in range(context.amounts.stock_starts))

    def floor() -> float:
        """In the service's environment, like the service."""
        command = [machine.program("load_floor"), worlds[LARGE].path / "etc"]
        return statistics.median(float(run(command, env=unit_environment(SERVICE_UNIT)))
                                 for _ in range(starts))

    times = context.interleave({"few": service(25), "minimal": minimal, "small": service(SMALL),
                                "large": service(LARGE), "stock": stock, "floor": floor})
    context.floors["15"] = ratios(sums(times["minimal"], times["floor"]), times["stock"])
    # Loading is what a start with accounts takes beyond a start with next to none: with the fewer so
    # little that it drowns in what the machine does meanwhile, so the processor time is compared.
    return {"14": ratios(times["few"], times["minimal"]),
            "15": ratios(times["large"], times["stock"]),
            "19a": growth_exponents(differences(worked[SMALL], worked[25]),
                                    differences(worked[LARGE], worked[25]), LARGE / SMALL)}


def memory_at_rest(context: Context) -> Figures:
    """Goals 16 and 17."""
    machine = context.machine

    def visit(daemon, world: World):
        def measured() -> float:
            with daemon(world) as running:
                time.sleep(REST_SECONDS)
                return float(resident_kib(running.pid))
        return measured

    few, many = make_world(context.memory, 25), make_world(context.memory, LARGE)
    sizes = context.interleave({
        "service few": visit(machine.service, few), "minimal": visit(machine.minimal, few),
        "stock few": visit(machine.stock, few), "service many": visit(machine.service, many),
        "stock many": visit(machine.stock, many)})
    return {"16a": ratios(sizes["service few"], sizes["minimal"]),
            "16b": ratios(sizes["service few"], sizes["stock few"]),
            "17": ratios(sizes["service many"], sizes["stock many"])}


def modify_groups(names: list[str]) -> tuple[str, str]:
    return "ModifyUser", f"('{user_name(1)}', '', '', {names}, '', '')"


# It writes, but its list names the user's own groups again and again, so that it changes nothing.
LARGE_CALL = modify_groups([SMALL_GROUP, "operator"] * 1500)
# What goal 18 mixes: how many of 1,000 calls, the call, and who makes it with which end.
MIXED_CALLS = (
    (260, GET_USER, {}),
    (200, QUERIES["CheckUser"], {}),
    (200, QUERIES["GetGroup"], {}),
    (150, GET_USER_LIST, {}),
    (80, ("GetUser", "('nobodyknows',)"), {"fails_with": "user does not exist"}),
    (80, GET_USER, REFUSED),
    (20, ("AuthUserBasic", f"('{user_name(1)}', '{PASSWORD}')"), {}),
    (5, LARGE_CALL, {}),
    (5, modify_groups([f"unknown{number}" for number in range(3000)]), {"fails_with": "unknown"}),
)
# So often the kinds take turns, at each size of the work.
TURNS = 5


def memory_growth(context: Context) -> Figures:
    """Goal 18, in one run: growth has no rounds."""
    machine, amounts = context.machine, context.amounts
    with machine.service(make_world(context.memory, 25)) as service:
        def work(part: int) -> None:
            counts = shares(amounts.mixed_calls // part, [weight for weight, _, _ in MIXED_CALLS])
            for turn in range(TURNS):
                for count, (_, call, options) in zip(counts, MIXED_CALLS):
                    calls = count * (turn + 1) // TURNS - count * turn // TURNS
                    if calls > 0:
                        machine.microseconds(service, *call, calls=calls, warm_up=0, **options)
                machine.microseconds(service, *ADD, calls=amounts.pairs // part // TURNS, warm_up=0,
                                     after=REMOVE)
            machine.require_alive()

        def at_rest() -> int:
            """What was freed last is with the allocator until a large call ends: it does on both sides."""
            machine.microseconds(service, *LARGE_CALL, calls=3, warm_up=0)
            time.sleep(REST_SECONDS)
            return resident_kib(service.pid)

        work(10)
        before = at_rest()
        work(1)
        return {"18": [float(at_rest() - before)]}


def stripped_size(context: Context) -> Figures:
    """Goal 25a."""
    files = [Path(SERVICE)]
    for name in LIBRARIES:
        found = [path for path in Path("/usr/lib").glob(f"**/{name}.so.1") if path.exists()]
        if len(found) != 1:
            raise RuntimeError(f"{name}: {found}")
        files.append(found[0].resolve())
    total = 0
    for file in files:
        stripped = context.memory / f"{file.name}.stripped"
        shutil.copyfile(file, stripped)
        subprocess.run(["strip", stripped], check=True)
        total += stripped.stat().st_size
    return {"25a": [total / 1000]}


def libraries_with_polkit(context: Context) -> Figures:
    """Goal 25b: after a call, which may load more."""
    machine = context.machine
    with machine.service(make_world(context.memory, 25)) as service:
        machine.microseconds(service, *GET_USER, calls=1)
        return {"25b": [float(len(loaded_libraries(service.pid)))]}


def libraries_with_policy_file(context: Context) -> Figures:
    """Goal 25c."""
    machine, world = context.machine, make_world(context.memory, 25)
    policy = world.path / POLICY_FILE
    policy.parent.mkdir(exist_ok=True)
    policy.write_text(ALLOWING_POLICY)
    with machine.service(world, "policy_file") as service:
        machine.microseconds(service, *GET_USER, calls=1)
        return {"25c": [float(len(loaded_libraries(service.pid)))]}
