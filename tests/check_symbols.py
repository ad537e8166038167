#!/usr/bin/env python3
"""Compares what the library exports and imports with what it is allowed to.

Exports: the names in the version script, which must be the FLVD_API declarations of the public header.
Imports: the memory functions that a compiler may call on its own, and the toolchain's start-up symbols.
Also: the soname, no library needed but the C library, and no path of the build machine inside.
"""

import argparse
import pathlib
import re
import subprocess
import sys

SONAME = "libflvdmx.so.1"
COMPILER_IMPORTS = {"memcpy", "memmove", "memset", "memcmp"}
STARTUP_IMPORTS = {
    "__cxa_finalize",
    "__gmon_start__",
    "_ITM_deregisterTMCloneTable",
    "_ITM_registerTMCloneTable",
}
ALLOWED_NEEDED = {"libc.so.6"}


def run(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def without_comments(text):
    return re.sub(r"/\*.*?\*/", " ", text, flags=re.DOTALL)


def header_names(path):
    """Names declared FLVD_API: the identifier before the parameter list, or the last one of a variable."""
    text = re.sub(r"^\s*#.*$", "", without_comments(path.read_text(encoding="utf-8")), flags=re.MULTILINE)
    declarations = re.findall(r"\bFLVD_API\b([^;]*);", text)
    return [re.findall(r"\w+", declaration.split("(")[0])[-1] for declaration in declarations]


def map_names(path):
    text = without_comments(path.read_text(encoding="utf-8"))
    names = re.search(r"global:(.*?)local:\s*\*\s*;", text, flags=re.DOTALL).group(1)
    return [name.strip() for name in names.split(";") if name.strip()]


def nm_names(nm, which, library):
    lines = run(nm, "-D", which, str(library)).splitlines()
    return [line.split()[-1].split("@")[0] for line in lines if line.strip()]


def differences(what, actual, expected):
    return [f"{what}: {name} is missing" for name in sorted(expected - actual)] + [
        f"{what}: {name} should not be there" for name in sorted(actual - expected)
    ]


def dynamic_faults(readelf, library):
    entries = re.findall(r"\((NEEDED|SONAME|RPATH|RUNPATH)\).*\[(.*)\]", run(readelf, "-W", "-d", str(library)))
    faults = [] if ("SONAME", SONAME) in entries else [f"soname is not {SONAME}"]
    for tag, value in entries:
        if tag.endswith("PATH") or (tag == "NEEDED" and value not in ALLOWED_NEEDED):
            faults.append(f"dynamic section: {tag} {value}")
    return faults


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("library", type=pathlib.Path)
    parser.add_argument("--header", type=pathlib.Path, required=True)
    parser.add_argument("--map", type=pathlib.Path, required=True)
    parser.add_argument("--nm", default="nm")
    parser.add_argument("--readelf", default="readelf")
    parser.add_argument("--absent", default=[], action="append", help="text that the library must not contain")
    args = parser.parse_args()

    script = map_names(args.map)
    exports = nm_names(args.nm, "--defined-only", args.library)
    imports = set(nm_names(args.nm, "--undefined-only", args.library))

    faults = [f"version script: {name} stands twice" for name in sorted(set(script)) if script.count(name) > 1]
    faults += differences("version script against header", set(script), set(header_names(args.header)))
    faults += differences("exports", set(exports), set(script))
    faults += [f"imports: {name} should not be there" for name in sorted(imports - COMPILER_IMPORTS - STARTUP_IMPORTS)]
    faults += dynamic_faults(args.readelf, args.library)
    content = args.library.read_bytes()
    faults += [f"{text} stands in the library" for text in args.absent if text.encode() in content]

    for fault in faults:
        print(fault)
    print(f"{len(exports)} exports, {len(imports)} imports, {len(faults)} faults")
    return 1 if faults or not exports else 0


if __name__ == "__main__":
    sys.exit(main())
