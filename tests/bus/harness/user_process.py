"""tests/bus/harness/user_process.py: makes bus calls as the user that it runs as.

Reads a request a line from standard input and answers each with a line; see bus.User. A call that
fails here, such as one that is not answered in time, is an answer too: the process is shared, and
goes on with the next request.
"""
import json
import sys
from typing import Any

from gi.repository import GLib

from harness.bus import Bus, BusError


def answer(bus: Bus, request: dict[str, Any]) -> Any:
    if request["ask"] == "name":
        return bus.unique_name
    if request["ask"] == "own":
        return bus.ask_bus("RequestName", "su", request["name"], 0)[0]
    if request["ask"] == "send":
        return bus.send_alone(request["kind"], request["destination"], request["member"],
                              request["serials"], request["says"])
    return bus.call(request["member"], request["signature"], *request["arguments"],
                    timeout=request["timeout"], destination=request["destination"])


def main() -> None:
    bus = Bus()
    for line in sys.stdin:
        try:
            result = {"reply": answer(bus, json.loads(line))}
        except BusError as error:
            result = {"error": [error.name, error.text]}
        except GLib.Error as error:
            result = {"local": [error.message, error.domain, error.code]}
        print(json.dumps(result), flush=True)


main()
