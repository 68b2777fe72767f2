"""benchmarks/__main__.py: runs the measurements in the sandbox that ./bench has made.

    python3 -m benchmarks BUILD RESULTS DISK_FOLDER COMMIT [quick] [NAME...]

COMMIT is told below the table. Without names of measurements all are run, and their figures are left in
the file RESULTS.
Exit status: 0 when no goal is missed by more than its slack.
"""
import datetime
import os
import platform
import subprocess
import sys
import time
from collections.abc import Callable
from pathlib import Path

from gi.repository import Gio

from benchmarks import account_changes, bus_calls, resources, worlds
from benchmarks.bus_calls import Context
from benchmarks.programs import Machine, cfgstore
from benchmarks.report import Results, status_of, terminal_lines
from benchmarks.rounds import FULL, QUICK

# In their order, each with the goals that it yields.
MEASUREMENTS: dict[Callable[[Context], bus_calls.Figures], tuple[str, ...]] = {
    bus_calls.without_authorization: ("1", "2a", "2b", "2c"),
    bus_calls.with_polkit: ("3a", "3b", "3c", "5"),
    bus_calls.with_policy_file: ("4",),
    bus_calls.many_callers: ("6",),
    bus_calls.user_lists: ("7a", "7b", "7c", "7d", "19b", "20a", "20b", "20c"),
    account_changes.chain: ("8", "9"),
    account_changes.few_next_to_stock: ("10a", "11a", "12a", "12b"),
    account_changes.many_next_to_stock: ("10b", "11b"),
    bus_calls.password_check: ("13",),
    resources.start_times: ("14", "15", "19a"),
    resources.memory_at_rest: ("16a", "16b", "17"),
    resources.memory_growth: ("18",),
    account_changes.add_growth: ("19c",),
    bus_calls.many_groups: ("21", "22"),
    account_changes.pidof_spawn: ("23",),
    bus_calls.stopped_polkitd: ("24",),
    resources.stripped_size: ("25a",),
    resources.libraries_with_polkit: ("25b",),
    resources.libraries_with_policy_file: ("25c",),
}

BUDGET_SECONDS = {"full": 30 * 60, "quick": 5 * 60}


def require_sandbox() -> None:
    """The service rewrites the account files of the machine that it runs on."""
    source = subprocess.run(["findmnt", "-no", "SOURCE", "/"], capture_output=True, text=True,
                            check=False).stdout.strip()
    if source != "bus-sandbox":
        sys.exit("not in the sandbox; start it with ./bench")


def measure(context: Context, results: Results, names: list[str]) -> None:
    """One that fails is told in its goals' rows, and the others go on."""
    for measurement, numbers in MEASUREMENTS.items():
        if names and measurement.__name__ not in names:
            continue
        started = time.monotonic()
        reason = "a figure that makes no sense"
        try:
            if started > context.deadline:
                raise TimeoutError("no time was left")
            results.figures |= measurement(context)
        except Exception as error:  # whatever it is, it belongs into the table
            reason = f"{type(error).__name__}: {error}"
        missing = [number for number in numbers if number not in results.figures]
        results.reasons |= {number: reason for number in missing}
        print(f"  {measurement.__name__}: {time.monotonic() - started:.0f} s"
              f"{', failed: ' + reason if missing else ''}", flush=True)
    results.processor = {name: list(spent) for name, spent in context.processor.items()}
    results.floors = context.floors


def main(build: Path, results_file: Path, disk: Path, commit: str, words: list[str]) -> int:
    require_sandbox()
    quick = "quick" in words
    names = [word for word in words if word != "quick"]
    started = time.monotonic()
    worlds.add_clients()
    memory = Path("/tmp/worlds")
    memory.mkdir()
    with worlds.ext4_folder(disk) as (on_disk, file_system):
        results = Results(command="./bench quick" if quick else "./bench", commit=commit,
                          date=datetime.date.today().isoformat(),
                          machine=f"{platform.machine()}, {os.cpu_count()} cores, "
                                  f"Linux {platform.release()}, {file_system}")
        machine = Machine(build, Gio.bus_get_sync(Gio.BusType.SYSTEM, None))
        time.sleep(0.5)  # polkitd takes up the rule
        with cfgstore(machine.program("cfgstore"), memory) as counting:
            context = Context(machine, counting, QUICK if quick else FULL, memory, on_disk,
                              started + BUDGET_SECONDS["quick" if quick else "full"])
            measure(context, results, names)
    results.seconds = time.monotonic() - started
    results.save(results_file)
    print("\n".join(terminal_lines(results)))
    return status_of(results)


if __name__ == "__main__":
    sys.exit(main(Path(sys.argv[1]), Path(sys.argv[2]), Path(sys.argv[3]), sys.argv[4],
                  sys.argv[5:]))
