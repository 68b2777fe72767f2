"""benchmarks/measure.py: measures the service in the sandbox that ./bench has made.

    measure.py BUILD_DIR

Prints a table. Times are of this machine at this moment; the ratios are what can be compared, since both
sides are measured in turns within one run.
"""
import os
import statistics
import subprocess
import sys
import time
from contextlib import contextmanager
from pathlib import Path

from gi.repository import Gio, GLib

SERVICE = "/usr/sbin/privane_system"
BUS_NAME = "com.zintor.PrivaneSystem"
STARTS = 15
ROUNDS = 7
CALLS = 500


def owner_pid(bus):
    """The process that owns the service's name, or None."""
    try:
        reply = bus.call_sync("org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                              "GetConnectionUnixProcessID", GLib.Variant("(s)", (BUS_NAME,)), None,
                              Gio.DBusCallFlags.NONE, -1, None)
        return reply.unpack()[0]
    except GLib.Error:
        return None


@contextmanager
def service(bus, library_path=None):
    """The service, from when it owns its name; yields the process and its start-up in ms."""
    environment = dict(os.environ)
    if library_path:
        environment["LD_LIBRARY_PATH"] = str(library_path)
    begin = time.monotonic()
    process = subprocess.Popen([SERVICE, "-n"], env=environment, stdout=subprocess.DEVNULL)
    try:
        while owner_pid(bus) != process.pid:
            if process.poll() is not None or time.monotonic() > begin + 10:
                sys.exit("the service did not take its name")
            time.sleep(0.0002)
        yield process, (time.monotonic() - begin) * 1000
    finally:
        process.terminate()
        status = process.wait(timeout=10)
    if status != 0:
        sys.exit(f"the service ended with status {status}")


def memory_of(process):
    """Kilobytes by kind, from proc(5)."""
    lines = Path(f"/proc/{process.pid}/smaps_rollup").read_text().splitlines()[1:]
    sizes = {line.split(":")[0]: int(line.split()[1]) for line in lines}
    return sizes["Rss"], sizes["Pss"], sizes["Private_Dirty"]


def round_trips(build):
    """Microseconds a call, a list of rounds for each kind."""
    output = subprocess.run([build / "benchmarks" / "round_trip", str(ROUNDS), str(CALLS)],
                            check=True, capture_output=True, text=True).stdout
    return {name: [float(value) for value in values]
            for name, *values in (line.split() for line in output.splitlines())}


def show(name, unit, values):
    middle, low, high = statistics.median(values), min(values), max(values)
    print(f"{name:44} {middle:9.2f} {unit:6} ({low:.2f} to {high:.2f}, {len(values)} rounds)")


def show_round_trips(title, rounds):
    ratios = [call / ping for call, ping in zip(rounds["CheckUser"], rounds["Ping"])]
    show(f"Ping of the same process, {title}", "us", rounds["Ping"])
    show(f"CheckUser, {title}", "us", rounds["CheckUser"])
    show(f"CheckUser / Ping, {title}", "times", ratios)


def main(build):
    bus = Gio.bus_get_sync(Gio.BusType.SYSTEM, None)

    starts = []
    for _ in range(STARTS):
        with service(bus) as (process, milliseconds):
            starts.append(milliseconds)
            resident, proportional, private = memory_of(process)
    show("start-up, from fork to owning the name", "ms", starts)
    print(f"{'memory at rest, resident':44} {resident:9} KiB")
    print(f"{'memory at rest, proportional share':44} {proportional:9} KiB")
    print(f"{'memory at rest, private and dirty':44} {private:9} KiB")

    with service(bus):
        show_round_trips("polkit asked", round_trips(build))
    with service(bus, build / "benchmarks"):
        show_round_trips("allowed at once", round_trips(build))


if __name__ == "__main__":
    main(Path(sys.argv[1]))
