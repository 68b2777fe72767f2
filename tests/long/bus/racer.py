"""tests/long/bus/racer.py: a caller that connects, calls and vanishes, over and over.

Runs as the user that it is. The plan, in JSON, is the first line of standard input: the bus's
socket, the bytes with which a connection begins, those of each call, how many connections, and the
seed. The answer is a line: how many connections were made, on how many of them a whole call was
sent, and how many the bus ended first.
"""
import json
import random
import socket
import sys
import time
from collections import Counter
from typing import Any

LONGEST_DELAY = 0.005
ANSWER_SECONDS = 5.0

REFUSAL = b"Authorization check failed"


class ThrownOut(Exception):
    """The bus ended the connection."""


def connect(path: str) -> socket.socket:
    line = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
    line.connect(path)
    line.settimeout(ANSWER_SECONDS)
    return line


def receive(line: socket.socket) -> bytes:
    received = line.recv(1 << 16)
    if not received:
        raise ThrownOut
    return received


def at_once(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin + call)
    return True


def after_a_moment(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin + call)
    time.sleep(random.uniform(0, LONGEST_DELAY))
    return True


def when_greeted(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin)
    receive(line)
    line.sendall(call)
    line.shutdown(socket.SHUT_RDWR)
    return True


def when_answered(line: socket.socket, begin: bytes, call: bytes) -> bool:
    """The answer to the greeting comes first, in one or two parts."""
    line.sendall(begin + call)
    received = b""
    while REFUSAL not in received:
        received += receive(line)
    return True


def in_the_middle(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin + call[:random.randrange(1, len(call))])
    return False


MANNERS = (at_once, after_a_moment, after_a_moment, after_a_moment, when_greeted, when_answered,
           in_the_middle)


def run(plan: dict[str, Any]) -> dict[str, int]:
    random.seed(plan["seed"])
    begin = bytes.fromhex(plan["begin"])
    calls = [bytes.fromhex(call) for call in plan["calls"]]
    counts = Counter(connections=0, calls_sent=0, thrown_out=0)
    for _ in range(plan["connections"]):
        manner, call = random.choice(MANNERS), random.choice(calls)
        counts["connections"] += 1
        with connect(plan["socket"]) as line:
            try:
                counts["calls_sent"] += manner(line, begin, call)
            except (ThrownOut, BrokenPipeError, ConnectionResetError):
                counts["thrown_out"] += 1
            except TimeoutError:
                pass  # answered otherwise or late, which is seen by what came of it
    return dict(counts)


if __name__ == "__main__":
    print(json.dumps(run(json.loads(sys.stdin.readline()))), flush=True)
