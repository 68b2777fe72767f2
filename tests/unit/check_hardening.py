#!/usr/bin/python3
# tests/unit/check_hardening.py: the service and its libraries are built hardened:
# check_hardening.py COMPILE_COMMANDS PROGRAM LIBRARY...
#
# Each file must be position-independent, have no executable stack, have its relocations and all of
# its bindings read-only before it starts, and check its stack frames; and the checked functions of
# the C library must be in use wherever the file calls one that has them at a size the compiler knows.
# That no file was compiled without the options, which a file may do and not show it, the commands
# tell.
import json
import re
import subprocess
import sys
from pathlib import Path

OPTIONS = ["-fstack-protector-strong", "-fstack-clash-protection", "-fcf-protection",
           "-D_FORTIFY_SOURCE=2"]
OPTIMIZED = re.compile(r" -O(1|2|3|s|g)\b")
FOLDERS = ("service", "methods", "usermgmt", "platform")

# The checked functions that a file imports; those left out have no use for one.
FORTIFIED = {
    "privane_system": {"__explicit_bzero_chk", "__syslog_chk"},
    "libdigestentry": {"__explicit_bzero_chk"},
    "liblogbackend": {"__syslog_chk"},
    "libparamcli": {"__explicit_bzero_chk"},
}


def output_of(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def segment_flags(path):
    """The access of each program header, by its type."""
    lines = [line.split() for line in output_of("readelf", "-lW", path).splitlines()]
    headers = [words for words in lines if len(words) >= 8 and words[1].startswith("0x")]
    return {words[0]: "".join(words[6:-1]) for words in headers}


def faults_of_file(path, is_program):
    header = output_of("readelf", "-hW", path)
    dynamic = output_of("readelf", "-dW", path)
    imports = {line.split()[-1].split("@")[0]
               for line in output_of("nm", "-D", "--undefined-only", path).splitlines()}
    flags = segment_flags(path)

    if not re.search(r"Type: +DYN ", header):
        yield "not position-independent"
    if is_program and not re.search(r"\(FLAGS_1\).*\bPIE\b", dynamic):
        yield "no position-independent executable"
    if "TEXTREL" in dynamic:
        yield "its code is relocated"
    if "E" in flags.get("GNU_STACK", "E"):
        yield f"an executable stack: {flags.get('GNU_STACK', 'not said otherwise')}"
    if "GNU_RELRO" not in flags:
        yield "relocations stay writable"
    if not re.search(r"\(FLAGS\).*\bBIND_NOW\b|\(FLAGS_1\).*\bNOW\b|\(BIND_NOW\)", dynamic):
        yield "bindings stay writable"
    if any("W" in access and "E" in access for access in flags.values()):
        yield "a segment that can be written and run"
    if "__stack_chk_fail" not in imports:
        yield "stack frames are not checked"
    for name in sorted(FORTIFIED.get(Path(path).name.split(".")[0], set()) - imports):
        yield f"does not import {name}"


def faults_of_commands(path):
    """Of what goes into the product, which is what does not belong to the tests."""
    with open(path, encoding="utf-8") as file:
        commands = json.load(file)
    product = [entry for entry in commands
               if entry["output"].split("/")[0].split(".")[0] in ("privane_system", *FOLDERS)]
    if len(product) < 40:
        yield f"{path}: only {len(product)} commands for the product"
    for entry in product:
        command = entry["command"]
        missing = [option for option in OPTIONS if f" {option} " not in command]
        if not OPTIMIZED.search(command):
            missing.append("-O")
        if "-fno-stack-protector" in command or command.count("_FORTIFY_SOURCE=") != 1:
            missing.append("nothing against them")
        if missing:
            yield f"{entry['output']}: compiled without {', '.join(missing)}"


def main():
    commands, program, *libraries = sys.argv[1:]
    faults = list(faults_of_commands(commands))
    for path in (program, *libraries):
        faults += [f"{path}: {fault}" for fault in faults_of_file(path, path == program)]
    for fault in faults:
        print(fault, file=sys.stderr)
    return 1 if faults or len(libraries) != 6 else 0


if __name__ == "__main__":
    sys.exit(main())
