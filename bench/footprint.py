#!/usr/bin/env python3
"""Measures the library's footprint on its target: footprint.py PREFIX LIBRARY OBJECTS [--json].

PREFIX is the prefix of the binutils, OBJECTS a folder with the compiler's call graphs (.ci) of the library's sources
and the object of instance_size.cpp. Fails when a bound is exceeded. The stack of host functions does not count.
"""

import glob
import json
import os
import re
import subprocess
import sys

BOUNDS = {"code and constants": 24 * 1024, "static data": 512, "instance": 1024, "deepest stack": 8 * 1024}
CODE = (".text", ".rodata", ".ARM.exidx", ".ARM.extab", ".plt")
DATA = (".data", ".bss", ".data.rel.ro")
SCRIPT_NESTING = 64  # recursion happens only for containers in script data, up to this depth


def sections(prefix, library):
    listing = subprocess.run([prefix + "size", "-A", library], check=True, stdout=subprocess.PIPE, text=True).stdout
    return {name: int(size) for name, size in re.findall(r"^(\.\S+)\s+(\d+)", listing, re.M)}


def instance(prefix, objects):
    found = glob.glob(os.path.join(objects, "**", "instance_size.cpp.o*"), recursive=True)
    listing = subprocess.run([prefix + "nm", "-S", found[0]], check=True, stdout=subprocess.PIPE, text=True).stdout
    return int(re.search(r"^\w+ (\w+) \w flvd_instance_size", listing, re.M).group(1), 16)


class CallGraph:
    """Stack size of each function, and the functions that each one calls."""

    def __init__(self, objects):
        self.stack, self.calls, self.known = {}, {}, {}
        for path in glob.glob(os.path.join(objects, "**", "*.ci"), recursive=True):
            with open(path) as file:
                self.read(file.read())
        if not self.stack:
            sys.exit("no call graphs in " + objects)

    def read(self, text):
        for title, label in re.findall(r'node: \{ title: "([^"]+)" label: "([^"]*)"', text):
            frame = re.search(r"(\d+) bytes \((\w+)", label)
            if frame:
                if frame.group(2).startswith("dynamic"):
                    sys.exit(f"{title}: its stack has no bound")
                self.stack[title] = int(frame.group(1))
        for source, target in re.findall(r'edge: \{ sourcename: "([^"]+)" targetname: "([^"]+)"', text):
            self.calls.setdefault(source, set()).add(target)

    def deepest(self, function, above=()):
        """Stack bytes and call path; a cycle is followed as often as script data may nest."""
        if function in above:
            cycle = above[above.index(function) :]
            return (SCRIPT_NESTING - 1) * sum(self.stack.get(name, 0) for name in cycle), (f"{len(cycle)} again",)
        if not above and function in self.known:
            return self.known[function]
        below = [self.deepest(name, above + (function,)) for name in self.calls.get(function, ())]
        depth, path = max(below, default=(0, ()))
        return self.stack.get(function, 0) + depth, (function,) + path


def measure(prefix, library, objects):
    size = sections(prefix, library)
    graph = CallGraph(objects)
    depth, path = max(graph.deepest(function) for function in graph.stack)
    figures = {
        "code and constants": sum(size.get(name, 0) for name in CODE),
        "static data": sum(size.get(name, 0) for name in DATA),
        "instance": instance(prefix, objects),
        "deepest stack": depth,
    }
    return figures, path


def main():
    figures, path = measure(*sys.argv[1:4])
    if "--json" in sys.argv:
        print(json.dumps(figures))
        return
    for name, figure in figures.items():
        print(f"{name}: {figure} bytes, at most {BOUNDS[name]}")
    print("deepest: " + " > ".join(path))
    if any(not 0 < figure <= BOUNDS[name] for name, figure in figures.items()):
        sys.exit("larger than the target allows")


if __name__ == "__main__":
    main()
