#!/usr/bin/env python3
"""Runs the bench and writes its table: summary.py BIN MEDIA TARGETS ROUNDS, BIN the folder of the programs.

Each round runs everything once, the players of one medium side by side. A ratio is taken within a round; what is shown is
the median of the rounds, with the least and the largest. The tables go into docs/performance.md and README.md, between
their marks. TARGETS is a file with the target's footprint as JSON; it may be missing.
"""

import datetime
import json
import os
import pathlib
import platform
import statistics
import subprocess
import sys

import instructions

ROOT = pathlib.Path(__file__).resolve().parent.parent
HOSTS = {"stdio": "C streams", "posix": "POSIX"}
HOSTILE = ("false_headers", "zeros", "small_distances", "slide", "endless_arrays")
PLAYED = ("small", "hd", "long", "damaged", "tail")
SOUND = ("small", "hd", "long")
MANY_PROPERTIES = "open a file with ten metadata properties"
NANOSECONDS = 1e9


def run(*command):
    return subprocess.run([str(word) for word in command], check=True, stdout=subprocess.PIPE, text=True).stdout


class Times:
    """Nanoseconds of each benchmark, a list by rounds, and what its last round counted."""

    def __init__(self, program, media, rounds):
        self.times, self.counters = {}, {}
        for number in range(rounds):
            print(f"round {number + 1} of {rounds}", file=sys.stderr)
            for entry in json.loads(run(program, media, "--benchmark_format=json"))["benchmarks"]:
                name = "/".join(entry["name"].split("/")[:3])
                self.counters[name] = entry
                if not entry.get("error_occurred"):
                    self.times.setdefault(name, []).append(entry["real_time"])

    def ratio(self, one, other):
        """Median, least and largest of `one` over `other`; None when either did not run."""
        pairs = [a / b for a, b in zip(self.times.get(one, ()), self.times.get(other, ()))]
        return (statistics.median(pairs), min(pairs), max(pairs)) if pairs else None

    def same_frames(self, one, other):
        return all(self.counters[one].get(key) == self.counters[other].get(key) for key in ("frames", "bytes"))


def row(what, goal, measured, met):
    return f"| {what} | {goal} | {measured} | {'yes' if met else '**no**'} |"


def ratio_row(times, what, one, other, goal):
    ratio = times.ratio(one, other)
    if ratio is None:
        return f"| {what} | ≤ {goal} | not measured | |"
    note = "" if times.same_frames(one, other) or "replay" in other or "open" in one else ", other frames"
    return row(what, f"≤ {goal}", f"{ratio[0]:.3g} ({ratio[1]:.3g} to {ratio[2]:.3g}){note}", ratio[0] <= goal and not note)


def time_rows(times):
    """The goals that are ratios of times."""
    yield ratio_row(times, "play `small`, C streams, to libavformat", "play/small/flvdmx-stdio", "play/small/libavformat", 0.16)
    yield ratio_row(times, "… to the trusting loop", "play/small/flvdmx-stdio", "play/small/trusting", 1.15)
    yield ratio_row(times, "play `small`, POSIX, to libavformat", "play/small/flvdmx-posix", "play/small/libavformat", 0.08)
    yield ratio_row(times, "… to the trusting loop", "play/small/flvdmx-posix", "play/small/trusting", 0.60)
    for host, host_name in HOSTS.items():
        what = f"play `small`, {host_name}, through flvdmx.hpp to the C entry point"
        yield ratio_row(times, what, f"play/small/header-{host}", f"play/small/flvdmx-{host}", 1.5)
    for medium in ("hd", "long"):
        name = f"play/{medium}/flvdmx-posix"
        yield ratio_row(times, f"play `{medium}`, POSIX, to libavformat", name, f"play/{medium}/libavformat", 1.0)
        yield ratio_row(times, "… to the trusting loop", name, f"play/{medium}/trusting", 1.3)
    yield ratio_row(times, "play `hd`, C streams, to libavformat", "play/hd/flvdmx-stdio", "play/hd/libavformat", 1.15)
    for medium in SOUND:
        for host, host_name in HOSTS.items():
            what = f"play `{medium}`, {host_name}, to its host calls alone"
            goal = 1.15 if medium == "small" else 1.03
            yield ratio_row(times, what, f"play/{medium}/flvdmx-{host}", f"play/{medium}/replay-{host}", goal)
    for medium in ("damaged", "tail"):
        for host, host_name in HOSTS.items():
            what = f"play `{medium}`, {host_name}, to libavformat"
            yield ratio_row(times, what, f"play/{medium}/flvdmx-{host}", f"play/{medium}/libavformat", 0.5)
    yield ratio_row(times, "open `small`, POSIX, to libavformat", "open/small/flvdmx-posix", "open/small/libavformat", 0.25)
    yield ratio_row(times, "… C streams", "open/small/flvdmx-stdio", "open/small/libavformat", 0.43)
    what = "… C streams, to libavformat with least stream information"
    yield ratio_row(times, what, "open/small/flvdmx-stdio", "open/small/libavformat-info", 0.04)
    for how, what, medium, goal in (("seek_memory", "seek by index in memory", "hd_index", 0.71),
                                    ("seek_file", "seek by index in the file", "hd_index", 0.75),
                                    ("seek_scan", "seek by scan", "hd", 0.02),
                                    ("seek_scan", "seek by scan", "small", 0.0005)):
        name = f"{how}/{medium}"
        yield ratio_row(times, f"first {what} and its frame, `{medium}`", f"{name}/flvdmx-stdio", f"{name}/libavformat", goal)


def cost_rows(cost):
    """The goals that are host calls, bytes and the worst files' processor time."""
    small = cost["small"]
    tells, share = small["play"]["tells"] / small["frames"], small["play"]["bytes"] / small["size"]
    yield row("`small`: position queries a frame", "2", f"{tells:.4f}", tells < 2.001)
    yield row("`small`: seeks while playing", "≤ 1", small["play"]["seeks"], small["play"]["seeks"] <= 1)
    yield row("`small`: host bytes to the file's", "≤ 1.001", f"{share:.4f}", share <= 1.001)
    for medium in ("small", "hd", "long"):
        paid = cost[medium]["open"]
        met = paid["reads"] <= 10 and paid["bytes"] <= 12 * 1024
        yield row(f"open `{medium}`", "≤ 10 reads, 12 KiB", f"{paid['reads']} reads, {paid['bytes']} bytes", met)
    for name in HOSTILE:
        for host, paid in (("C streams", cost[name]), ("POSIX", cost[name]["posix"])):
            opening, request = (paid.get(what, {}).get("seconds", 0) for what in ("open", "request"))
            what = f"`{name}`, {host}: processor time of opening, of the longest request"
            yield row(what, "≤ 2 s, ≤ 3 s", f"{opening:.2f} s, {request:.2f} s", opening <= 2 and request <= 3)


def figure_rows(figures, bounds, unit):
    for name, bound in bounds.items():
        if name in figures:
            yield row(name, f"≤ {bound} {unit}", f"{figures[name]:.0f}", figures[name] <= bound)


def frame_table(times):
    """What one frame takes, and how fast the bytes of the frames go by."""
    yield "| Medium | " + " | ".join([*HOSTS.values(), "trusting loop", "libavformat"]) + " |"
    yield "|---|" + "---:|" * (len(HOSTS) + 2)
    for medium in PLAYED:
        cells = []
        for player in [f"flvdmx-{host}" for host in HOSTS] + ["trusting", "libavformat"]:
            name = f"play/{medium}/{player}"
            if name not in times.times:
                cells.append("")
                continue
            taken, counted = statistics.median(times.times[name]), times.counters[name]
            user = counted["user"] * NANOSECONDS / counted["frames"]
            cells.append(f"{taken / counted['frames']:,.0f} ns, {user:,.0f} ns, {counted['bytes'] / taken:.2f} GB/s")
        yield f"| `{medium}` | " + " | ".join(cells) + " |"


def call_table(cost):
    yield "| Medium | Open | Play all, a frame | First seek and its frame | Memory held |"
    yield "|---|---:|---:|---:|---:|"
    for name, paid in sorted(cost.items()):
        if not paid["opened"]:
            continue
        play, frames = paid["play"], max(paid["frames"], 1)
        yield (f"| `{name}` | {paid['open']['calls']:,} calls, {paid['open']['bytes']:,} bytes "
               f"| {play['calls'] / frames:.2f} calls, {play['bytes'] / frames:,.0f} bytes "
               f"| {paid['first_seek']['calls']:,} calls, {paid['first_seek']['bytes']:,} bytes "
               f"| {play['held']:,} bytes |")  # fmt: skip


def machine():
    names = [line.split(":")[1].strip() for line in open("/proc/cpuinfo") if line.startswith("model name")]
    compiler = run("c++", "--version").splitlines()[0]
    return (f"{names[0] if names else platform.machine()}, {os.cpu_count()} cores, Linux {platform.release()}, {compiler}, "
            f"{datetime.date.today().isoformat()}")  # fmt: skip


def put(path, mark, text):
    """Replaces what stands between the marks."""
    before, begin, rest = path.read_text().partition(f"<!-- {mark} -->\n")
    _, end, after = rest.partition(f"<!-- end of {mark} -->\n")
    if not begin or not end:
        sys.exit(f"{path} has no place for {mark}")
    path.write_text(before + begin + text + end + after)


def main():
    programs, media, targets, rounds = pathlib.Path(sys.argv[1]), sys.argv[2], pathlib.Path(sys.argv[3]), int(sys.argv[4])
    times = Times(programs / "flvdmx-bench", media, rounds)
    cost = json.loads(run(programs / "flvdmx-cost", media))
    opens = {"open `small`": f"{media}/small.flv", MANY_PROPERTIES: ROOT / "tests/data/avc_aac.flv"}
    own = instructions.measure(programs / "flvdmx-own", opens, programs.parent / "instructions")
    goals = ["| What | Goal | Measured | Met |", "|---|---|---|---|", *time_rows(times), *cost_rows(cost)]
    bounds = {"small frame": 320, "large frame": 400, "open `small`": 6000, MANY_PROPERTIES: 6000}
    goals += figure_rows(own, bounds, "instructions")
    if targets.exists():
        bounds = {"code and constants": 24576, "static data": 512, "instance": 1024, "deepest stack": 8192}
        goals += figure_rows(json.loads(targets.read_text()), bounds, "bytes on the target")
    frames = list(frame_table(times))
    where = f"{machine()}; medians of {rounds} rounds.\n\n"
    whole = where + "\n".join(goals) + "\n\n" + "\n".join(frames) + "\n\n" + "\n".join(call_table(cost)) + "\n"
    put(ROOT / "docs/performance.md", "figures", whole)
    put(ROOT / "README.md", "figures", "\n".join(frames[:4]) + "\n\n" + where.rstrip() + "\n")
    print(whole)


if __name__ == "__main__":
    main()
