"""tests/long/bus/crowd_process.py: many connections of the user that it is, which call when told.

Reads an order a line from standard input, and answers each with a line of JSON. "come N" makes so
many connections; "ask" has each of them make a call, and tells how many got which error, "" being
none; "leave" closes them all.
"""
import json
import sys
from collections import Counter

from pipeline import Answer, Call, Pipeline, exchange

# The service has a place for 192 calls of as many connections, and others call meanwhile.
AT_ONCE = 40

QUESTION = Call("question", "CheckUser", "s", ("root",))


def ask(lines: list[Pipeline]) -> Counter[str]:
    told: Counter[str] = Counter()

    def note(_: Call, answer: Answer) -> None:
        told[f"{answer.error.name}: {answer.error.text}" if answer.error else ""] += 1

    for begin in range(0, len(lines), AT_ONCE):
        some = lines[begin:begin + AT_ONCE]
        exchange(some, [QUESTION] * len(some), note)
    return told


def main() -> None:
    lines: list[Pipeline] = []
    for order in sys.stdin:
        word, *numbers = order.split()
        told: Counter[str] = Counter()
        if word == "come":
            lines += [Pipeline() for _ in range(int(numbers[0]))]
        elif word == "ask":
            told = ask(lines)
        else:
            while lines:
                lines.pop().close()
        print(json.dumps(told), flush=True)


main()
