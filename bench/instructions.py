#!/usr/bin/env python3
"""Counts instructions of the library, without host and C library, and of the C++ header: instructions.py PROGRAM
SAMPLE FOLDER.

Fails when a bound is exceeded. PROGRAM is flvdmx-own, SAMPLE the file whose open is counted.
"""

import os
import subprocess
import sys

import flv

BOUNDS = {"small frame": 260, "large frame": 450, "small frame, added by flvdmx.hpp": 160, "open": 8600}  # a more expensive change must fail
SMALL_FRAMES, SMALL_SIZE = 4000, 90
LARGE_FRAMES, LARGE_SIZE = 400, 9000  # larger than the cache


def make_file(path, frames, size):
    with flv.Writer(path) as out:
        out.tag(flv.VIDEO, 0, flv.AVC_CONFIG)
        out.tag(flv.AUDIO, 0, flv.AAC_CONFIG)
        for n in range(frames):
            if n % 2:
                out.tag(flv.VIDEO, n * 20, (b"\x27" if n % 50 > 1 else b"\x17") + b"\1\0\0\0" + bytes([77]) * size)
            else:
                out.tag(flv.AUDIO, n * 20, b"\xaf\1" + bytes([77]) * size)


def own_instructions(profile):
    """Sum of the self costs of the library's functions."""
    total, objects, inside, skip = 0, {}, False, False
    with open(profile) as lines:
        for line in lines:
            if line.startswith("ob="):
                number, _, name = line[3:].strip().partition(" ")
                objects.setdefault(number, name)
                inside = "libflvdmx" in objects[number]
            elif line.startswith(("cob=", "cfi=", "cfl=", "cfn=")):
                if line.startswith("cob="):
                    number, _, name = line[4:].strip().partition(" ")
                    objects.setdefault(number, name)
            elif line.startswith("calls="):
                skip = True  # the next line is the callee's cost
            elif line[:1].isdigit() or line[:1] in "+-*":
                if inside and not skip:
                    total += int(line.split()[1])
                skip = False
    return total


def all_instructions(profile):
    with open(profile) as lines:
        return next(int(line.split()[1]) for line in lines if line.startswith("totals:"))


def count(program, path, function, folder, instructions=own_instructions):
    """Instructions inside `function`, and the number of frames, which the program prints."""
    profile = os.path.join(folder, "callgrind." + function)
    done = subprocess.run(["valgrind", "--tool=callgrind", f"--toggle-collect={function}",
                           f"--callgrind-out-file={profile}", program, path],
                          check=True, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)  # fmt: skip
    return instructions(profile), int(done.stdout)


def measure(program, opens, folder):
    """Instructions per small frame, per large frame, and per open of each file, by name."""
    os.makedirs(folder, exist_ok=True)
    figures = {}
    for name, frames, size in (("small", SMALL_FRAMES, SMALL_SIZE), ("large", LARGE_FRAMES, LARGE_SIZE)):
        path = os.path.join(folder, name + ".flv")
        make_file(path, frames, size)
        total, played = count(program, path, "PlayAll", folder)
        if played != frames:
            sys.exit(f"{name}: {played} frames played of {frames}")
        figures[name + " frame"] = round(total / frames, 1)
    path = os.path.join(folder, "small.flv")
    header, entry = (count(program, path, how, folder, all_instructions)[0] for how in ("PlayByHeader", "PlayAll"))
    figures["small frame, added by flvdmx.hpp"] = round((header - entry) / SMALL_FRAMES, 1)
    for name, path in opens.items():
        figures[name], _ = count(program, path, "OpenFile", folder)
    return figures


def main():
    program, sample, folder = sys.argv[1:4]
    figures = measure(program, {"open": sample}, folder)
    for name, figure in figures.items():
        print(f"{name}: {figure} instructions, at most {BOUNDS[name]}")
    if any(not 0 < figure <= BOUNDS[name] for name, figure in figures.items()):
        sys.exit("more than the library may need")


if __name__ == "__main__":
    main()
