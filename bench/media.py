#!/usr/bin/env python3
"""Generates the bench's media, once: media.py FOLDER [SCALE]. ffmpeg encodes a few seconds, which are then repeated."""

import os
import subprocess
import sys

import flv

MIB = 1 << 20
SMALL_TAGS, SMALL_SECONDS = 1_000_000, 10
HD_SECONDS, HD_REPEATS = 4, 20
DAMAGED_TAGS, HOLE_EVERY, HOLE_TAGS = 200_000, 1000, 40
TAIL_TAGS, TAIL_ZEROS = 100_000, 8 * MIB
LONG_BYTES, LONG_TAG = 3_000_000_000, 1_000_000
HOSTILE_BYTES = 4 * MIB
SOUND_8 = 8  # an audio codec byte that is also an audio tag's type: every byte in a run of it starts a plausible header


def encode(path, size, rate, seconds, video, audio):
    noise = ",noise=alls=20:allf=t" if size == "1920x1080" else ""
    subprocess.run(
        ["ffmpeg", "-loglevel", "error", "-y", "-f", "lavfi", "-i", f"testsrc2=size={size}:rate={rate}{noise}",
         "-f", "lavfi", "-i", "sine=frequency=440:sample_rate=44100", "-t", str(seconds), "-pix_fmt", "yuv420p",
         "-c:v", "libx264", *video, "-c:a", "aac", *audio, "-flvflags", "no_duration_filesize", path],
        check=True)  # fmt: skip


def small_base(folder):
    path = os.path.join(folder, "small_base.flv")
    encode(path, "160x120", 25, SMALL_SECONDS, ["-preset", "veryfast", "-b:v", "18k", "-g", "50"], ["-b:a", "32k"])
    return flv.read_tags(path)


def hd_base(folder):
    path = os.path.join(folder, "hd_base.flv")
    rate = ["-preset", "ultrafast", "-b:v", "20M", "-maxrate", "20M", "-bufsize", "20M", "-g", "25"]
    encode(path, "1920x1080", 25, HD_SECONDS, rate, ["-b:a", "128k"])
    return flv.read_tags(path)


def write(path, tags, keyframes=(), metadata=True):
    with flv.Writer(path) as out:
        if metadata:
            out.tag(flv.SCRIPT, 0, flv.metadata(keyframes))
        for entry in tags:
            out.tag(*entry)
        return out.keyframes


def write_small(path, base, scale):
    write(path, flv.repeated(base, int(SMALL_TAGS * scale), SMALL_SECONDS * 1000))


def write_hd(path, indexed_path, base, scale):
    frames = sum(kind != flv.SCRIPT and not flv.is_config(kind, data) for kind, _, data in base)
    count = frames * max(1, int(HD_REPEATS * scale))
    keyframes = write(path, flv.repeated(base, count, HD_SECONDS * 1000))
    shift = len(flv.metadata(keyframes)) - len(flv.metadata())
    keyframes = [(time, place + shift) for time, place in keyframes]
    write(indexed_path, flv.repeated(base, count, HD_SECONDS * 1000), keyframes)


def write_damaged(path, base, scale):
    """Replaces whole tags by zeros at regular intervals, so that all players lose the same frames."""
    tags = flv.repeated(base, int(DAMAGED_TAGS * scale), SMALL_SECONDS * 1000)
    with flv.Writer(path) as out:
        out.tag(flv.SCRIPT, 0, flv.metadata())
        for n, (kind, time, data) in enumerate(tags):
            if n >= HOLE_EVERY and n % HOLE_EVERY < HOLE_TAGS:
                out.file.write(bytes(len(flv.tag(kind, time, data))))
            else:
                out.tag(kind, time, data)


def write_tail(path, base, scale):
    write(path, flv.repeated(base, int(TAIL_TAGS * scale), SMALL_SECONDS * 1000))
    append(path, bytes(TAIL_ZEROS))


def append(path, data):
    with open(path, "ab") as out:
        out.write(data)


def write_long(path, scale):
    """One picture per second, with audio; only the first bytes of each picture are written."""
    with flv.Writer(path) as out:
        out.tag(flv.SCRIPT, 0, flv.metadata())
        for kind, data in ((flv.VIDEO, flv.AVC_CONFIG), (flv.AUDIO, flv.AAC_CONFIG)):
            out.tag(kind, 0, data)
        for n in range(int(LONG_BYTES * scale) // LONG_TAG):
            out.sparse_tag(flv.VIDEO, 1000 * n, b"\x17\x01\0\0\0", LONG_TAG)
            out.tag(flv.AUDIO, 1000 * n, b"\xaf\x01" + bytes([77]) * 400)


def sounds(first):
    """Audio tags whose codec byte is 8."""
    return b"".join(flv.tag(flv.AUDIO, first + 40 * n, bytes([SOUND_8]) + bytes([77]) * 200) for n in range(20))


def chain(base, first=0, kinds=(flv.AUDIO, flv.VIDEO)):
    """A few hundred ordinary tags."""
    tags = [entry for entry in base if entry[0] in kinds][:300]
    return b"".join(flv.tag(kind, first + time, data) for kind, time, data in tags)


def hostile(base):
    """Name and contents of each worst case."""
    start = flv.FILE_HEADER + chain(base)
    keyframes = b"\x02" + flv.string("onMetaData") + b"\x03" + flv.string("keyframes") + b"\x03"
    endless = b"\x0a\xff\xff\xff\xff"
    arrays = keyframes + flv.string("times") + endless + (b"\0" + bytes(8)) * 9000 + flv.string("filepositions") + endless
    sound_file = flv.FILE_HEADER[:4] + b"\x04" + flv.FILE_HEADER[5:]
    yield "false_headers", sound_file + sounds(0) + bytes([SOUND_8]) * HOSTILE_BYTES + sounds(0x10000000)
    yield "zeros", start + bytes(HOSTILE_BYTES)
    yield "small_distances", start + b"\0\0\0\x0f" * (HOSTILE_BYTES // 4)
    yield "slide", start + b"\0\0\0\x0f" * (HOSTILE_BYTES // 4) + chain(base, 0, [flv.AUDIO])
    yield "endless_arrays", flv.FILE_HEADER + flv.tag(flv.SCRIPT, 0, arrays + bytes(HOSTILE_BYTES)) + chain(base)


def make(folder, scale):
    os.makedirs(folder, exist_ok=True)
    done = os.path.join(folder, "complete")
    if os.path.exists(done):
        return
    base = small_base(folder)

    def path(name):
        return os.path.join(folder, name + ".flv")

    write_small(path("small"), base, scale)
    write_hd(path("hd"), path("hd_index"), hd_base(folder), scale)
    write_damaged(path("damaged"), base, scale)
    write_tail(path("tail"), base, scale)
    write_long(path("long"), scale)
    for name, contents in hostile(base):
        with open(path(name), "wb") as out:
            out.write(contents)
    open(done, "w").close()


if __name__ == "__main__":
    make(sys.argv[1], float(sys.argv[2]) if len(sys.argv) > 2 else 1.0)
