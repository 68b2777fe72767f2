"""tests/long/bus/soak_crowd.py: more callers than the policy file's libauthz remembers, who come
and go while the file changes."""
import json
import os
import random
import subprocess
import threading
from collections import Counter
from contextlib import suppress
from pathlib import Path
from typing import Callable

from harness.accounts import replace
from harness.bus import Bus, BusError, domain_error
from harness.interface import ACTION_PREFIX
from harness.policy_file import POLICY, role
from harness.sandbox import PYTHON
from soak_callers import PATIENCE, Sandglass

HERE = Path(__file__).parent

# Callers, of each of whom the library has a match rule; platform/authz/policy/callers.h.
REMEMBERED = 256

# Users of the changing accounts, with one of their groups. Together they make more connections than
# are remembered, and each less than the bus lets a user have, which is 256 as well.
UIDS = (1000, 1001)
OPERATOR_GID = 102
CONNECTIONS_OF_EACH = 150

POLICIES_OF_A_VISIT = 3

REFUSED = 1

GRANTING = (role("crowd", "users=alice;bob", f"actions={ACTION_PREFIX}checkuser"),
            role("crowd", "groups=operator", f"actions={ACTION_PREFIX}*"))
WITHHOLDING = ("", role("crowd", "users=alice;bob", f"actions={ACTION_PREFIX}checkgroup"),
               role("crowd", "users=timer", "groups=viewer", f"actions={ACTION_PREFIX}checkuser"))


def refusal(uid: int) -> BusError:
    return domain_error("authz", REFUSED, f"Authorization check failed: action {ACTION_PREFIX}"
                                          f"checkuser is refused to uid {uid}")


class Group:
    """The connections of one user, in a process of its own."""

    def __init__(self, uid: int, privane_gid: int) -> None:
        self.uid = uid
        self._process = subprocess.Popen(
            ["setpriv", f"--reuid={uid}", f"--regid={uid}",
             f"--groups={privane_gid},{OPERATOR_GID}", "--",
             PYTHON, str(HERE / "crowd_process.py")],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True,
            env={**os.environ, "PYTHONPATH": f"{HERE}:{HERE.parents[1] / 'bus'}"})

    def tell(self, order: str) -> None:
        assert self._process.stdin is not None
        print(order, file=self._process.stdin, flush=True)

    def heard(self) -> Counter[str]:
        assert self._process.stdout is not None
        line = self._process.stdout.readline()
        assert line, f"the crowd of {self.uid} has ended with {self._process.wait(PATIENCE)}"
        return Counter(json.loads(line))

    def close(self) -> int:
        """The status that it ends with."""
        assert self._process.stdin is not None
        with suppress(BrokenPipeError):
            self._process.stdin.close()
        return self._process.wait(PATIENCE)


class Crowd(threading.Thread):
    """Comes, asks under one policy after the other, and leaves, over and over; every answer has to
    be that of the policy that was put there before the question. Root keeps its role throughout."""

    def __init__(self, glass: Sandglass, chance: random.Random, privane_gid: int) -> None:
        super().__init__()
        self._glass = glass
        self._chance = random.Random(chance.random())
        self._packaged = POLICY.read_text()
        self._bus = Bus()  # It does not call the service.
        self._groups = [Group(uid, privane_gid) for uid in UIDS]
        self.counts: Counter[str] = Counter()
        self.failed: BaseException | None = None

    def run(self) -> None:
        try:
            while not self._glass.is_over.is_set():
                self._glass.wait_if_paused()
                self.visit()
        except BaseException as error:  # the test tells
            self.failed = error
            self._glass.give_up()

    def close(self) -> None:
        replace(POLICY, self._packaged, 0o644, 0)
        self._bus.close()
        assert [group.close() for group in self._groups] == [0] * len(self._groups)

    def visit(self) -> None:
        """Under one policy at least; under no more where others wait for the crowd to leave."""
        self._order(f"come {CONNECTIONS_OF_EACH}")
        for number in range(POLICIES_OF_A_VISIT):
            if number > 0 and self._glass.is_pausing():
                break
            self._ask_under_another()
        self._order("leave")
        self.counts["visits"] += 1

    def _order(self, order: str) -> list[Counter[str]]:
        for group in self._groups:
            group.tell(order)
        return [group.heard() for group in self._groups]

    def _ask_under_another(self) -> None:
        is_granting = self._chance.random() < 0.5
        wanted = self._chance.choice(GRANTING if is_granting else WITHHOLDING)
        change: Callable[[str], None] = self._chance.choice((self._put_another, self._edit))
        change(wanted)
        self.counts["policies_granting" if is_granting else "policies_withholding"] += 1
        for group, told in zip(self._groups, self._order("ask")):
            error = refusal(group.uid)
            expected = "" if is_granting else f"{error.name}: {error.text}"
            assert told == {expected: CONNECTIONS_OF_EACH}, (wanted, told)
            self.counts["crowd_calls"] += CONNECTIONS_OF_EACH
        self.counts["max_match_rules"] = max(self.counts["max_match_rules"],
                                             self._bus.match_rules())

    def _put_another(self, text: str) -> None:
        replace(POLICY, self._packaged + text, 0o644, 0)
        self.counts["policies_renamed"] += 1

    def _edit(self, text: str) -> None:
        """In the file itself, which always holds root's role."""
        os.truncate(POLICY, len(self._packaged.encode()))
        with POLICY.open("a") as file:
            file.write(text)
        self.counts["policies_edited"] += 1
