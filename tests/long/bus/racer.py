"""tests/long/bus/racer.py: a caller that connects, calls and vanishes, over and over.

Runs as the user that it is. The plan, in JSON, is the first line of standard input: the bus's
socket, the bytes with which a connection begins, those of each call, how often, and the seed. The
answer is a line: how many connections were made, and on how many of them a whole call was sent.
"""
import json
import random
import socket
import sys
import time
from typing import Any

LONGEST_DELAY = 0.005
ANSWER_SECONDS = 5.0


def connect(path: str) -> socket.socket:
    line = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
    line.connect(path)
    return line


def at_once(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin + call)
    return True


def after_a_moment(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin + call)
    time.sleep(random.uniform(0, LONGEST_DELAY))
    return True


def when_greeted(line: socket.socket, begin: bytes, call: bytes) -> bool:
    line.sendall(begin)
    line.recv(1 << 16)
    line.sendall(call)
    line.shutdown(socket.SHUT_RDWR)
    return True


def when_answered(line: socket.socket, begin: bytes, call: bytes) -> bool:
    """The answer to the greeting comes first, in one or two parts."""
    line.sendall(begin + call)
    line.settimeout(ANSWER_SECONDS)
    received = b""
    while b"Authorization check failed" not in received:
        try:
            received += line.recv(1 << 16)
        except TimeoutError:
            break  # answered otherwise, which is seen by what came of it
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
    whole = 0
    for _ in range(plan["trials"]):
        line = connect(plan["socket"])
        whole += random.choice(MANNERS)(line, begin, random.choice(calls))
        line.close()
    return {"trials": plan["trials"], "whole": whole}


if __name__ == "__main__":
    print(json.dumps(run(json.loads(sys.stdin.readline()))), flush=True)
