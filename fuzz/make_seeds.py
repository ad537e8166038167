#!/usr/bin/env python3
"""Writes first inputs for every target to FOLDER/TARGET/: pieces of the sample files with control bytes behind them.

usage: make_seeds.py FOLDER
"""

import pathlib
import random
import struct
import sys

SAMPLES = pathlib.Path(__file__).resolve().parent.parent / "tests" / "data"
HEAD = 2600  # bytes of a sample: short files make fast sessions
OPTIONS = (0, 1, 2, 4, 5, 6, 8, 9, 12, 13, 0x70, 0x80)


def tag(kind, time, data):
    head = bytes([kind]) + struct.pack(">I", len(data))[1:] + struct.pack(">I", time)[1:] + bytes([time >> 24, 0, 0, 0])
    return head + data + struct.pack(">I", len(data) + 11)


def number(value):
    return b"\0" + struct.pack(">d", value)


def key(name):
    return struct.pack(">H", len(name)) + name.encode()


def metadata(times, positions):
    arrays = b"".join(key(name) + b"\x0a" + struct.pack(">I", len(values)) + b"".join(map(number, values))
                      for name, values in (("times", times), ("filepositions", positions)))
    properties = key("width") + number(320) + key("duration") + number(3) + key("keyframes") + b"\x03" + arrays
    return b"\x02" + key("onMetaData") + b"\x08" + struct.pack(">I", 3) + properties + b"\0\0\x09\0\0\x09"


def chain(rng, pictures, size, sound, indexed):
    """AVC and AAC with a keyframe every four pictures, the configurations taken from a sample."""
    sample = (SAMPLES / "avc_aac.flv").read_bytes()
    at, configurations = 13, []
    while at < len(sample) and len(configurations) < 2:
        length = int.from_bytes(sample[at + 1:at + 4], "big")
        if sample[at] != 18 and sample[at + 12] == 0:
            configurations.append(sample[at:at + length + 15])
        at += length + 15
    body = configurations[:]
    for i in range(pictures):
        frame_type = b"\x17" if i % 4 == 0 else b"\x27"
        body.append(tag(9, i * 40, frame_type + b"\1\0\0\0" + rng.randbytes(size)))
        body.append(tag(8, i * 40 + 5, b"\xaf\1" + rng.randbytes(sound)))
    head = b"FLV\1\5\0\0\0\x09\0\0\0\0"
    if not indexed:
        return head + b"".join(body)
    keyframes = range(0, pictures, 4)
    at = len(head) + len(tag(18, 0, metadata(keyframes, keyframes)))
    times, positions = [], []
    for piece in body:
        if piece[0] == 9 and piece[11:13] == b"\x17\1":
            times.append(int.from_bytes(piece[4:7], "big") / 1000)
            positions.append(at)
        at += len(piece)
    return head + tag(18, 0, metadata(times, positions)) + b"".join(body)


def with_control(payload, control):
    return payload + bytes(control) + bytes([len(control)])


def files(rng):
    result = {path.stem: path.read_bytes()[:HEAD] for path in sorted(SAMPLES.glob("*.flv"))}
    result["chain"] = chain(rng, 10, 20, 8, False)
    result["index"] = chain(rng, 12, 20, 8, True)
    result["large"] = chain(rng, 5, 500, 20, True)
    result["hole"] = result["chain"][:300] + rng.randbytes(60) + result["chain"][340:]
    result["tail"] = result["chain"] + rng.randbytes(200)
    return result


def session_commands(rng, options):
    """Open, then frames, seeks, faults and growth."""
    commands = [0, options, rng.choice((0, 1, 3, 4)), 8, 0]
    if options & 2 == 0:
        commands = commands[:3]
    if options & 4:
        commands = [0x13, rng.randrange(3), rng.randrange(256)] + commands
    for _ in range(rng.randrange(4, 10)):
        commands += rng.choice((
            [0xDA], [0x6A], [0xCA],
            [2, 7, rng.randrange(0xD0, 256), rng.choice((0, 1, 2, 0x10, 6, 9))],
            [3, 1, 0], [4 + 0x10, rng.randrange(12)], [0x85, rng.randrange(6), 1], [6], [7, 9], [rng.randrange(16) << 4 | 8, 0],
        ))
    return commands


def seeds(rng):
    media = files(rng)
    for name, data in media.items():
        for options in OPTIONS:
            yield "session", f"{name}_{options}", with_control(data, session_commands(rng, options))
        commands = [value for _ in range(12) for value in (rng.randrange(16), rng.randrange(4), rng.randrange(256))]
        yield "navigation", name, with_control(data, [0, 9] + commands)
        yield "reader", name, with_control(data[:300], commands)
        yield "audio", name, with_control(data[200:260], [rng.choice((2, 10, 14))])
    for name in ("avc_aac_index", "index", "h263_mp3"):
        data = media[name]
        script = data[24:24 + int.from_bytes(data[14:17], "big")]
        for options in (0, 8):
            yield "script", f"{name}_{options}", with_control(script, [options, 1, 9])
    at = media["chain"].find(b"\1", 26)
    yield "avc", "record", with_control(media["chain"][at - 1:at + 60], [7, 128, 1])
    yield "audio", "aac", with_control(bytes.fromhex("1210"), [10])
    for codec, data in ((2, "000084000420"), (4, "0012340f141000"), (5, "00000012340f141000")):
        yield "avc", f"codec{codec}", with_control(bytes.fromhex(data) + rng.randbytes(12), [codec, 128, 0])


def main():
    folder = pathlib.Path(sys.argv[1])
    for target, name, data in seeds(random.Random(1)):
        (folder / target).mkdir(parents=True, exist_ok=True)
        (folder / target / name).write_bytes(data)


if __name__ == "__main__":
    main()
