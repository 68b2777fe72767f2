#!/usr/bin/python3
# tests/unit/platform/check_library.py: a platform library exports its header's functions, and what
# else is named, and stays replaceable: check_library.py LIBRARY HEADER SONAME [SYMBOL...]
import re
import subprocess
import sys


def output_of(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def declared_functions(header):
    with open(header, encoding="utf-8") as file:
        text = re.sub(r"/\*.*?\*/", "", file.read(), flags=re.DOTALL)
    text = re.sub(r"^\s*#.*$", "", text, flags=re.MULTILINE)
    return set(re.findall(r"(\w+)\s*\([^()]*\)\s*;", text))


def exported_symbols(library):
    lines = output_of("nm", "-D", "--defined-only", library).splitlines()
    return {line.split()[-1] for line in lines}


def check(library, header, soname, *others):
    faults = []
    declared = declared_functions(header)
    exported = exported_symbols(library)
    dynamic = output_of("readelf", "-dW", library)

    if not declared:
        faults.append(f"no function found in {header}")
    declared.update(others)
    faults += [f"{name} is declared but not exported" for name in sorted(declared - exported)]
    faults += [f"{name} is exported but not declared" for name in sorted(exported - declared)]
    if f"Library soname: [{soname}]" not in dynamic:
        faults.append(f"the soname is not {soname}")
    if "SYMBOLIC" in dynamic:
        faults.append("linked with -Bsymbolic: its functions cannot be replaced")
    return faults


def main():
    faults = check(*sys.argv[1:])
    for fault in faults:
        print(f"{sys.argv[1]}: {fault}", file=sys.stderr)
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
