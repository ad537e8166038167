#!/usr/bin/env python3
"""Compares the codes and lines in docs/host-guide.md, and the host kit's texts of the codes, with the sources.

Three codes are results of the navigation and never recorded, so no table has them.
"""
import pathlib
import re
import sys

from differences import differences

ROOT = pathlib.Path(sys.argv[1])


def read(name):
    return (ROOT / name).read_text(encoding="utf-8")


def find(pattern, text):
    """Names, each with its number."""
    return [(name, int(number)) for name, number in re.findall(pattern, text, re.M)]


_, guide_codes, guide_lines = re.split("### (?:Codes|Lines)", read("docs/host-guide.md"))
codes = find(r"^    (FLVD_ERR_(?!NOT_FOUND|AT_FIRST_TAG|END_OF_DATA)\w+) = (-?\d+),? ", read("flvdmx/flvdmx.h"))
rows = re.findall(r"^FLVD_SITE\(\w+, \w+, (\w+), (\d+), (\d+)\)$", read("flvdmx/common/sites.def"), re.M)
sites = [(code, int(line)) for code, *lines in rows for line in lines if line != "0"]
told = re.findall(r"^\| (-?\d+) \| `(FLVD_ERR_\w+)` \| .* \| .* \|$", guide_codes, re.M)
rows = re.findall(r"^\| ([\d, ]+) \| `(FLVD_ERR_\w+)` \| .* \|$", guide_lines, re.M)
told_sites = [(name, int(line)) for lines, name in rows for line in lines.split(",")]

faults = differences("codes in the guide", [(name, int(code)) for code, name in told], codes)
faults += differences("lines in the guide", told_sites, sites)
texts = dict(re.findall(r'^    \{(FLVD_ERR_\w+), "\1",\s+"(.+)"\},$', read("host/src/error_text.c"), re.M))
named = [name for name, _ in codes] + ["FLVD_ERR_HOST_IN_USE", "FLVD_ERR_HOST_INCOMPLETE"]
faults += differences("names of texts", texts, named) + differences("texts", texts.values(), texts.values())
print(*faults, f"{len(codes)} codes, {len(set(sites))} lines, {len(faults)} faults", sep="\n")
sys.exit(1 if faults or not sites or not codes else 0)
