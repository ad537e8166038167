#!/usr/bin/env python3
"""Compares the tables of codes and lines in docs/host-guide.md, and the codes of the C++ interface, with the sources."""

import pathlib
import re
import sys

SITES = ("sites.h", "front/frame.cpp", "seek/frame_seek.cpp", "seek/time_seek.cpp")
NAVIGATION_ONLY = {"FLVD_ERR_NOT_FOUND", "FLVD_ERR_AT_FIRST_TAG", "FLVD_ERR_END_OF_DATA"}  # results, never recorded


def differences(what, actual, expected):
    twice = sorted({item for item in actual if actual.count(item) > 1})
    missing, extra = sorted(set(expected) - set(actual)), sorted(set(actual) - set(expected))
    return [f"{what}: {item} {fault}" for fault, items in (("is missing", missing), ("is not so", extra),
                                                           ("stands twice", twice)) for item in items]


def main():
    root = pathlib.Path(sys.argv[1])
    library = root / "flvdmx"
    header = (library / "flvdmx.h").read_text(encoding="utf-8")
    guide = (root / "docs/host-guide.md").read_text(encoding="utf-8")
    interface = (library / "flvdmx.hpp").read_text(encoding="utf-8")

    codes = [(name, int(code)) for name, code in re.findall(r"^    (FLVD_ERR_\w+) = (-?\d+),? ", header, re.M)
             if name not in NAVIGATION_ONLY]
    sources = "".join((library / name).read_text(encoding="utf-8") for name in SITES)
    sites = {(name, int(line)) for name, line in re.findall(r"\{(FLVD_ERR_\w+), (\d+)\}", sources)} - {("FLVD_ERR_NONE", 0)}

    guide_codes = [(name, int(code)) for code, name in re.findall(r"^\| (-?\d+) \| `(FLVD_ERR_\w+)` \| .* \| .* \|$",
                                                                  guide.split("### Codes")[1].split("### Lines")[0], re.M)]
    rows = re.findall(r"^\| ([\d, ]+) \| `(FLVD_ERR_\w+)` \| .* \|$", guide.split("### Lines")[1], re.M)
    guide_sites = [(name, int(line)) for lines, name in rows for line in lines.split(",")]
    interface_codes = re.findall(r'\{(FLVD_ERR_\w+), *"\1",', interface)

    faults = differences("codes in the guide", guide_codes, codes)
    faults += differences("lines in the guide", guide_sites, sites)
    faults += differences("codes of the C++ interface", interface_codes, [name for name, _ in codes])
    faults += ["no sites were found"] if not sites or not codes else []
    print(*faults, f"{len(codes)} codes, {len(sites)} lines, {len(faults)} faults", sep="\n")
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
