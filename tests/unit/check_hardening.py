#!/usr/bin/python3
# tests/unit/check_hardening.py: the service, its libraries, its client and its checker are built
# hardened: check_hardening.py COMPILE_COMMANDS PROGRAM LIBRARY... [PROGRAM]
#
# Each file must be position-independent, have no executable stack, have its relocations and all of
# its bindings read-only before it starts, and check its stack frames; and the checked functions of
# the C library must be in use wherever the file calls one that has them at a size the compiler knows.
# That no file was compiled without the options, which a file may do and not show it, the commands
# tell; and its object file, that where its indirect calls and returns land is checked, if the
# machine has such checks.
import json
import re
import subprocess
import sys
from pathlib import Path

OPTIONS = ["-fstack-protector-strong", "-fstack-clash-protection", "-D_FORTIFY_SOURCE=2"]
OPTIMIZED = re.compile(r" -O(1|2|3|s|g)\b")
FOLDERS = ("check", "client", "service", "methods", "usermgmt", "platform")

# Both of authorization among them.
LIBRARIES = 7

# What -fcf-protection and -mbranch-protection add to an object file. The second is for who builds
# the product: machines before ARMv8.3 know none of it.
X86 = ("Advanced Micro Devices X86-64", "Intel 80386")
X86_FEATURES = {"IBT", "SHSTK"}
AARCH64 = "AArch64"
AARCH64_FEATURES = {"standard": {"BTI", "PAC"}, "bti": {"BTI"}, "pac-ret": {"PAC"}}

# The checked functions that a file imports; those left out have no use for one.
FORTIFIED = {
    "privane_system": {"__explicit_bzero_chk", "__syslog_chk"},
    "privane-check": {"__explicit_bzero_chk", "__fprintf_chk"},
    "privanectl": {"__explicit_bzero_chk", "__fprintf_chk"},
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


def machine_of(path):
    return re.search(r"Machine: +(.*)", output_of("readelf", "-hW", path))[1].strip()


def features_of(path):
    """The checks of jumps that an object file is prepared for, by its property."""
    told = re.search(r"feature: (.*)", output_of("readelf", "-nW", path))
    return set(told[1].strip().split(", ")) if told else set()


def features_asked(machine, command):
    """Those that a file compiled for the machine by this command has to have."""
    if machine in X86:
        return X86_FEATURES
    asked = re.findall(r" -mbranch-protection=(\S+)", command)
    if machine != AARCH64 or not asked:
        return set()
    words = asked[-1].split("+")
    return set().union(*(AARCH64_FEATURES.get(word, set()) for word in words))


def faults_of_features(machine, commands):
    """Of the object files that the commands, by the files, have made."""
    asked = {path: features_asked(machine, command) for path, command in commands.items()}
    of_all = set().union(*asked.values())
    for path in commands:
        if missing := of_all - features_of(path):
            yield f"{path}: no {', '.join(sorted(missing))}"


def faults_of_commands(path, machine):
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
        if machine in X86 and " -fcf-protection " not in command:
            missing.append("-fcf-protection")
        if "-fno-stack-protector" in command or command.count("_FORTIFY_SOURCE=") != 1:
            missing.append("nothing against them")
        if missing:
            yield f"{entry['output']}: compiled without {', '.join(missing)}"
    yield from faults_of_features(machine, {Path(entry["directory"]) / entry["output"]:
                                            entry["command"] for entry in product})


def main():
    commands, *files = sys.argv[1:]
    libraries = [path for path in files if ".so." in Path(path).name]
    faults = list(faults_of_commands(commands, machine_of(files[0])))
    for path in files:
        faults += [f"{path}: {fault}" for fault in faults_of_file(path, path not in libraries)]
    for fault in faults:
        print(fault, file=sys.stderr)
    return 1 if faults or len(libraries) != LIBRARIES else 0


if __name__ == "__main__":
    sys.exit(main())
