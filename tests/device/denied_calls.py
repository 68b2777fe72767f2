"""tests/device/denied_calls.py: the system calls that the service and what it starts were refused,
by capabilities, device rules, read-only mounts or filters. The kernel's tracing records them."""
import errno
import re

from camera.machine import Camera

PROGRAM = "/usr/sbin/privane_system"
TRACING = "/sys/kernel/tracing"
REFUSALS = (errno.EPERM, errno.EACCES, errno.EROFS, errno.EAFNOSUPPORT)

EVENTS = ("raw_syscalls/sys_exit", "sched/sched_process_fork", "sched/sched_process_exec")
LINE = re.compile(r" *.+-(?P<pid>\d+) +\[\d+\] +\S+ +[\d.]+: (?P<event>\w+): (?P<text>.*)")
FORK = re.compile(r"comm=.* pid=(\d+) child_comm=.* child_pid=(\d+)")
EXEC = re.compile(r"filename=(.*) pid=(\d+) old_pid=(\d+)")
EXIT = re.compile(r"NR (-?\d+) = -(\d+)")

# Of a whole tour, on a busy machine.
READ_SECONDS = 300

# A program, the number of a system call, and what it was answered.
Refusal = tuple[str, int, int]


class DeniedCalls:
    """Sees those of every service that is started from now on."""

    def __init__(self, camera: Camera) -> None:
        self._camera = camera
        script = ["set -e", f"cd {TRACING}", "echo 8192 >buffer_size_kb"]
        refused = " || ".join(f"ret == -{number}" for number in REFUSALS)
        script.append(f"echo '{refused}' >events/{EVENTS[0]}/filter")
        # Those of the tests' own commands are most, and reading takes long.
        script.append(f"echo 'parent_comm != \"camera-shell\"' >events/{EVENTS[1]}/filter")
        script += [f"echo 1 >events/{event}/enable" for event in EVENTS]
        camera.run("\n".join(script)).check()

    def of_service(self) -> set[Refusal]:
        lost = self._camera.run(f"cat {TRACING}/per_cpu/cpu*/stats").check().out
        assert set(re.findall(r"(?:overrun|dropped events): (\d+)", lost)) == {"0"}, lost
        programs: dict[int, str] = {}  # of the service's threads and their descendants' alone
        refusals = set()
        services = 0
        recorded = self._camera.run(f"grep -v '^#' {TRACING}/trace", timeout=READ_SECONDS).check().out
        for line in recorded.splitlines():
            match = LINE.fullmatch(line)
            assert match, f"the kernel records in another way: {line}"
            pid = int(match["pid"])
            if match["event"] == "sched_process_exec":
                path = _only(EXEC, match["text"])[0]
                services += path == PROGRAM
                if path == PROGRAM or pid in programs:
                    programs[pid] = path
            elif match["event"] == "sched_process_fork":
                child = int(_only(FORK, match["text"])[1])
                programs.pop(child, None)  # a number may be given again
                if pid in programs:
                    programs[child] = programs[pid]
            elif pid in programs:
                call, answer = _only(EXIT, match["text"])
                refusals.add((programs[pid], int(call), int(answer)))
        assert services, "no service was started since"
        return refusals


def _only(pattern: re.Pattern[str], text: str) -> tuple[str, ...]:
    match = pattern.fullmatch(text)
    assert match, f"the kernel records in another way: {text}"
    return match.groups()
