"""tests/bus/harness/bus_limits.py: how much the sandbox's bus takes, as its configuration says."""
import xml.etree.ElementTree as ET
from pathlib import Path

from harness.sandbox import STATE

# dbus-daemon(1), those of the system bus.
DEFAULTS = {"max_message_size": 32 << 20, "max_outgoing_bytes": 127 << 20,
            "max_incoming_bytes": 127 << 20}


def bus_limits() -> dict[str, int]:
    """By name, in bytes; of several files the last one decides."""
    included = [Path(element.text or "") for element in ET.parse(STATE / "bus.conf").iter("include")]
    limits = dict(DEFAULTS)
    for file in included:
        if file.is_file():
            limits |= {limit.attrib["name"]: int(limit.text or "")
                       for limit in ET.parse(file).iter("limit")}
    return limits
