#!/usr/bin/env python3
"""Checks the plug-in's module: it needs only the C and C++ run-time libraries, and shows only its
C entry point.

usage: check_module.py MODULE     exit code 1 and one line per violation
"""

import re
import subprocess
import sys

RUN_TIME = re.compile(r"^(?:libstdc\+\+|libm|libgcc_s|libc|ld-linux[-a-z0-9_]*)\.so\.\d+$")
ENTRY = "kxsync_plugin_create_client"


def output(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def violations(module):
    dynamic = output("readelf", "--dynamic", "--wide", module)
    for name in re.findall(r"\(NEEDED\).*\[(.*)\]", dynamic):
        if not RUN_TIME.match(name):
            yield f"{module} needs {name}"
    symbols = [line.split()[-1] for line in
               output("nm", "--dynamic", "--defined-only", module).splitlines()]
    for name in symbols:
        if name != ENTRY:
            yield f"{module} shows {name}"
    if ENTRY not in symbols:
        yield f"{module} does not show {ENTRY}"


def main(arguments):
    found = list(violations(arguments[0]))
    print("\n".join(found + [f"{arguments[0]}: {len(found)} violations"]))
    return 1 if found else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
