#!/usr/bin/env python3
"""Compares what the library exports and imports with what it is allowed to.

usage: check_symbols.py NM READELF HEADERS MAP ABSENT LIBRARY

Exports: the names in the version script, which must be the FLVD_API declarations of the public headers, those in HEADERS.
Imports: the memory functions that a compiler may call on its own, and the toolchain's start-up symbols.
Also: the soname, that only the C library is needed, and that the library contains no path of the build machine.
"""
import pathlib
import re
import subprocess
import sys

from differences import differences

nm, readelf, headers, version_script, absent, library = sys.argv[1:]
SONAME, LIBC = ("SONAME", "libflvdmx.so.1"), ("NEEDED", "libc.so.6")
ALLOWED_IMPORTS = {"memcpy", "memmove", "memset", "memcmp", "__cxa_finalize", "__gmon_start__",
                   "_ITM_deregisterTMCloneTable", "_ITM_registerTMCloneTable"}


def output(program, *arguments):
    return subprocess.run([program, *arguments, library], check=True, stdout=subprocess.PIPE, text=True).stdout


def read(path):
    return re.sub(r"/\*.*?\*/", " ", pathlib.Path(path).read_text(encoding="utf-8"), flags=re.DOTALL)


def symbols(which):
    return [line.split()[-1].split("@")[0] for line in output(nm, "-D", which).splitlines()]


# The identifier before the parameter list, or the last one of a variable.
interface = "".join(read(header) for header in sorted(pathlib.Path(headers).glob("*.h")))
declarations = re.findall(r"^FLVD_API\b([^;]*);", interface, re.M)
declared = [re.findall(r"\w+", text.split("(")[0])[-1] for text in declarations]
script = re.findall(r"(\w+)\s*;", re.search(r"global:(.*)local:\s*\*\s*;", read(version_script), re.DOTALL)[1])
exports, imports = symbols("--defined-only"), symbols("--undefined-only")
dynamic = re.findall(r"\((NEEDED|SONAME|RPATH|RUNPATH)\).*\[(.*)\]", output(readelf, "-W", "-d"))

faults = differences("version script", script, declared) + differences("exports", exports, script)
faults += differences("imports", ALLOWED_IMPORTS | set(imports), ALLOWED_IMPORTS)
faults += differences("dynamic section", {LIBC, *dynamic}, {LIBC, SONAME})
if absent.encode() in pathlib.Path(library).read_bytes():
    faults.append(f"the library contains {absent}")
print(*faults, f"{len(exports)} exports, {len(imports)} imports, {len(faults)} faults", sep="\n")
sys.exit(1 if faults or not exports else 0)
