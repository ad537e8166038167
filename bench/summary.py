#!/usr/bin/env python3
"""Runs the bench and writes its tables: summary.py BIN MEDIA TARGETS ROUNDS. BIN is the folder of the programs.

Each round runs everything once, all players of a medium in succession. Ratios are computed within a round; the tables
show the median of the rounds, with the smallest and the largest value. They replace the text between the marks in
docs/performance.md and README.md. TARGETS is a file with the target's footprint as JSON; it may be missing.
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
VALID = ("small", "hd", "long")
MANY_PROPERTIES = "open a file with ten metadata properties"
NANOSECONDS = 1e9


def run(*command):
    return subprocess.run([str(word) for word in command], check=True, stdout=subprocess.PIPE, text=True).stdout


class Pipelines:
    """Seconds per frame in GStreamer, a list by rounds for each medium and demuxer; empty if it was not built."""

    def __init__(self, programs, media, rounds):
        self.times, self.frames = {}, {}
        program = programs / "flvdmx-gst-bench"
        for _ in range(rounds if program.exists() else 0):
            for entry in json.loads(run(program, media)):
                name = entry["medium"], entry["demuxer"]
                self.times.setdefault(name, []).append(entry["seconds"] / entry["frames"])
                self.frames[name] = entry["frames"]

    def rows(self):
        for medium in ("small", "hd"):
            ours, theirs = (medium, "flvdmxdemux"), (medium, "flvdemux")
            if ours not in self.times:
                continue
            ratios = [a / b for a, b in zip(self.times[ours], self.times[theirs])]
            speeds = [f"{1 / statistics.median(self.times[name]):,.0f}" for name in (ours, theirs)]
            note = "" if self.frames[ours] == self.frames[theirs] else ", other frames"
            ratio = statistics.median(ratios)
            text = f"{ratio:.3g} ({min(ratios):.3g} to {max(ratios):.3g}), {' to '.join(speeds)} frames per second{note}"
            yield row(f"`filesrc ! flvdmxdemux ! fakesink`, `{medium}`, to `flvdemux`", "≤ 1.0", text, ratio <= 1 and not note)


class Times:
    """Nanoseconds of each benchmark, one value per round, and the counters of its last round."""

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
        """Median, smallest and largest ratio of `one` to `other`; None when either did not run."""
        pairs = [a / b for a, b in zip(self.times.get(one, ()), self.times.get(other, ()))]
        return (statistics.median(pairs), min(pairs), max(pairs)) if pairs else None

    def same_frames(self, one, other):
        return all(self.counters[one].get(key) == self.counters[other].get(key) for key in ("frames", "bytes"))


def row(what, goal, measured, met):
    return f"| {what} | {goal} | {measured} | {'yes' if met else '**no**'} |"


def measured(what, value):
    """A row without a goal, because the operation's host calls decide it, not the way in which the library makes them."""
    return f"| {what} | | {value} | |"


def ratio_row(times, what, one, other, goal=None):
    ratio = times.ratio(one, other)
    if ratio is None:
        return measured(what, "not measured")
    note = "" if times.same_frames(one, other) or "replay" in other or "open" in one else ", other frames"
    text = f"{ratio[0]:.3g} ({ratio[1]:.3g} to {ratio[2]:.3g}){note}"
    return measured(what, text) if goal is None else row(what, f"≤ {goal}", text, ratio[0] <= goal and not note)


def play_row(times, medium, host, other, goal=None):
    names = {"libavformat": "libavformat", "trusting": "the trusting loop", f"replay-{host}": "its host calls alone"}
    what = f"play `{medium}`, {HOSTS[host]}, to {names[other]}"
    return ratio_row(times, what, f"play/{medium}/flvdmx-{host}", f"play/{medium}/{other}", goal)


def time_rows(times):
    """Ratios of times."""
    for host, to_libavformat, to_trusting in (("stdio", 1.00, 1.25), ("posix", 0.90, 1.15)):
        yield play_row(times, "hd", host, "libavformat", to_libavformat)
        yield play_row(times, "hd", host, "trusting", to_trusting)
    for medium in ("small", "long", "damaged", "tail"):
        for host in HOSTS:
            yield play_row(times, medium, host, "libavformat")
            if medium in VALID:
                yield play_row(times, medium, host, "trusting")
    for medium in VALID:
        for host in HOSTS:
            yield play_row(times, medium, host, f"replay-{host}")
    for host, host_name in HOSTS.items():
        play, replay = (times.times.get(f"play/small/{player}-{host}") for player in ("flvdmx", "replay"))
        if play and replay:
            frames = times.counters[f"play/small/flvdmx-{host}"]["frames"]
            own = statistics.median([(a - b) / frames for a, b in zip(play, replay)])
            yield row(f"a small frame, {host_name}, without its host calls", "≤ 10 ns", f"{own:.1f} ns", own <= 10)
    for host, host_name in HOSTS.items():
        what = f"play `small`, {host_name}, through flvdmx.hpp to the C entry point"
        yield ratio_row(times, what, f"play/small/header-{host}", f"play/small/flvdmx-{host}", 1.5)
    name = "seek_memory/hd_index"
    what = "first seek by index in memory and its frame, `hd_index`, POSIX, to libavformat"
    yield ratio_row(times, what, f"{name}/flvdmx-posix", f"{name}/libavformat", 1.00)
    for how, what, medium in (("seek_memory", "seek by index in memory", "hd_index"),
                              ("seek_file", "seek by index in the file", "hd_index"),
                              ("seek_scan", "seek by scan", "hd"), ("seek_scan", "seek by scan", "small")):
        what = f"first {what} and its frame, `{medium}`, C streams, to libavformat"
        yield ratio_row(times, what, f"{how}/{medium}/flvdmx-stdio", f"{how}/{medium}/libavformat")
    for host, host_name in HOSTS.items():
        what = f"open `small`, {host_name}, to libavformat"
        yield ratio_row(times, what, f"open/small/flvdmx-{host}", "open/small/libavformat")
        yield ratio_row(times, what + " with least stream information", f"open/small/flvdmx-{host}",
                        "open/small/libavformat-info")


def cost_rows(cost):
    """Host calls, bytes, and processor time of the worst-case files."""
    for medium in VALID:
        play, share = cost[medium]["play"], cost[medium]["play"]["bytes"] / cost[medium]["size"]
        yield row(f"`{medium}`: seeks while playing", "≤ 3", play["seeks"], play["seeks"] <= 3)
        yield row(f"`{medium}`: host bytes to the file's", "≤ 1.001", f"{share:.4f}", share <= 1.001)
    tells = cost["small"]["play"]["tells"] / cost["small"]["frames"]
    yield row("`small`: position queries per frame", "2", f"{tells:.4f}", tells < 2.001)
    for medium in VALID:
        paid = cost[medium]["open"]
        yield measured(f"open `{medium}`", f"{paid['reads']} reads, {paid['bytes']} bytes")
    for name in HOSTILE:
        for host, paid in (("C streams", cost[name]), ("POSIX", cost[name]["posix"])):
            request, what = paid.get("request", {}), f"`{name}`, {host}: longest request"
            met = request["calls"] <= 100_000 and request["seconds"] <= 0.5
            text = f"{request['calls']:,} calls, {request['seconds']:.2f} s"
            yield row(what, "≤ 100,000 calls, ≤ 0.5 s of processor time", text, met)
            yield measured(f"`{name}`, {host}: opening", f"{paid['open']['calls']:,} calls, {paid['open']['seconds']:.2f} s")


def figure_rows(figures, bounds, unit):
    for name, bound in bounds.items():
        if name in figures:
            yield row(name, f"≤ {bound} {unit}", f"{figures[name]:.0f}", figures[name] <= bound)


def frame_table(times):
    """Time per frame, and bytes per second."""
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
    yield "| Medium | Open | Play all, per frame | First seek and its frame | Memory held |"
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
    """Replaces the text between the markers."""
    before, begin, rest = path.read_text().partition(f"<!-- {mark} -->\n")
    _, end, after = rest.partition(f"<!-- end of {mark} -->\n")
    if not begin or not end:
        sys.exit(f"{path} has no place for {mark}")
    path.write_text(before + begin + text + end + after)


def use_plugin(build):
    """Lets GStreamer find the plugin of this build."""
    os.environ["GST_PLUGIN_PATH"] = str(build / "lib/gstreamer-1.0")
    os.environ["GST_REGISTRY"] = str(build / "bench/gst-registry.bin")


def main():
    programs, media, targets, rounds = pathlib.Path(sys.argv[1]), sys.argv[2], pathlib.Path(sys.argv[3]), int(sys.argv[4])
    use_plugin(programs.parent)
    times = Times(programs / "flvdmx-bench", media, rounds)
    cost = json.loads(run(programs / "flvdmx-cost", media))
    opens = {"open `small`": f"{media}/small.flv", MANY_PROPERTIES: ROOT / "tests/data/avc_aac.flv"}
    own = instructions.measure(programs / "flvdmx-own", opens, programs.parent / "instructions")
    goals = ["| What | Goal | Measured | Met |", "|---|---|---|---|", *time_rows(times), *cost_rows(cost)]
    goals += Pipelines(programs, media, rounds).rows()
    goals += figure_rows(own, {"small frame": 260, "large frame": 450, "small frame, added by flvdmx.hpp": 160}, "instructions")
    goals += [measured(name, f"{own[name]:.0f} instructions") for name in opens]
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
