#!/usr/bin/env python3
"""Writes expected/NAME.txt for every sample: what ffprobe finds in it, in lines of `kind key=value ...`.

file    size= duration_ms=           duration as ffprobe reports it (0: unknown)
stream  kind= codec= width= height= rate= channels= extradata=
packet  kind= pos= dts= pts= size= crc= key=   in file order; pos is the tag's start, dts the tag's timestamp in ms

Every packet is compared with the tag at its position, so that no change by the prober goes unnoticed. The truncated
and the damaged sample must deliver the packets of avc_aac.flv whose tags are complete and undamaged.

With the tool's program as argument, also writes expected/extract.txt: `NAME video|audio SHA-256` of the streams that
the tool extracts. First, streams in formats that ffmpeg reads must decode to the same pictures and samples as the
sample file (if that is damaged, as its complete tags); the others must consist of its frames, one after the other.
"""
import hashlib
import json
import pathlib
import subprocess
import sys
import tempfile
import zlib

HERE = pathlib.Path(__file__).resolve().parent
SAMPLES = sorted(HERE.glob("*.flv"))
TAG_HEADER, BACK_POINTER = 11, 4
KINDS, CODEC_BYTES = {8: "audio", 9: "video"}, {(9, 7): 5, (8, 10): 2}  # before the frame; otherwise 1
BROKEN = ["truncated", "damaged"]
DEMUXERS = {"h264": ["-f", "h264"], "aac": ["-f", "aac"], "mp3": ["-f", "mp3"],
            "pcm_s16le": ["-f", "s16le", "-ar", "11025", "-ac", "1"]}


def probe(path):
    command = ["ffprobe", "-v", "error", "-show_format", "-show_streams", "-show_packets", "-show_data",
               "-show_data_hash", "CRC32", "-of", "json", str(path)]
    return json.loads(subprocess.run(command, check=True, capture_output=True, text=True).stdout)


def all_tags(data):
    """Each tag with its back-pointer, following only the sizes: {offset: bytes}."""
    tags, pos = {}, 13
    while pos < len(data):
        tags[pos] = data[pos:pos + TAG_HEADER + int.from_bytes(data[pos + 1:pos + 4], "big") + BACK_POINTER]
        pos += len(tags[pos])
    return tags


def media_tags(data):
    """All tags that carry a frame: {offset: (kind, timestamp, frame bytes)}."""
    media = {}
    for pos, tag in all_tags(data).items():
        if tag[0] in KINDS:
            body, timestamp = tag[TAG_HEADER:-BACK_POINTER], int.from_bytes(tag[4:7], "big") | tag[7] << 24
            codec_bytes = CODEC_BYTES.get((tag[0], body[0] & 15 if tag[0] == 9 else body[0] >> 4), 1)
            if codec_bytes == 1 or body[1] not in (0, 2):
                media[pos] = (KINDS[tag[0]], timestamp, body[codec_bytes:])
    return media


def kept_tags(path):
    """The complete tags of a sample, without those affected by damage or a missing end: {offset: bytes}."""
    data = path.read_bytes()
    whole = all_tags((HERE / "avc_aac.flv").read_bytes() if path.stem in BROKEN else data)
    return {pos: tag for pos, tag in whole.items() if data[pos:pos + len(tag)] == tag}


def stream_line(stream):
    width, height, rate, channels = (stream.get(key, 0) for key in ("width", "height", "sample_rate", "channels"))
    extradata = "".join(line[10:50] for line in stream.get("extradata", "").splitlines()).replace(" ", "")  # of a dump
    return (f"stream kind={stream['codec_type']} codec={stream['codec_name']} width={width} height={height} "
            f"rate={rate} channels={channels} extradata={extradata}")


def packet_line(packet, tag):
    kind, timestamp, frame = tag
    crc, key = packet["data_hash"].split(":")[1], int(packet["flags"][0] == "K")
    found = (packet["codec_type"], packet["dts"], int(packet["size"]), int(crc, 16))
    assert found == (kind, timestamp, len(frame), zlib.crc32(frame)), packet
    return (f"packet kind={kind} pos={packet['pos']} dts={timestamp} pts={packet['pts']} size={len(frame)} crc={crc} "
            f"key={key}")


def undamaged_file(path):
    tags, found = media_tags(path.read_bytes()), probe(path)
    assert [int(p["pos"]) for p in found["packets"]] == list(tags), path
    duration = round(float(found["format"].get("duration", 0)) * 1000)
    packets = {pos: packet_line(p, tags[pos]) for pos, p in zip(tags, found["packets"])}
    return duration, [stream_line(s) for s in found["streams"]], packets


def decoded(kind, path, *demuxer):
    """The hashes of the pictures, or one of all samples."""
    command = ["ffmpeg", "-nostdin", "-v", "error", *demuxer, "-i", str(path), "-map", f"0:{kind[0]}", "-vsync", "0",
               "-f", "framehash" if kind == "video" else "hash", "-"]
    lines = subprocess.run(command, check=True, capture_output=True, text=True).stdout.splitlines()
    return [line.split(",")[-1].strip() for line in lines if line[0] != "#"]


def extracted(tool, path, folder):
    kept, out = folder / "kept.flv", folder / "out"
    kept.write_bytes(b"".join([path.read_bytes()[:13], *kept_tags(path).values()]))
    for kind, codec in ((s["codec_type"], s["codec_name"]) for s in probe(path)["streams"]):
        subprocess.run([tool, "extract", "--stream", kind, path, "-o", out], check=True, capture_output=True)
        if codec in DEMUXERS:
            frames = decoded(kind, kept)
            assert frames and decoded(kind, out, *DEMUXERS[codec]) == frames, (path, kind)
        else:
            assert out.read_bytes() == b"".join(t[2] for t in media_tags(kept.read_bytes()).values() if t[0] == kind)
        yield f"{path.stem} {kind} {hashlib.sha256(out.read_bytes()).hexdigest()}\n"


def main():
    for path in SAMPLES:
        broken = path.stem in BROKEN
        duration, streams, packets = undamaged_file(HERE / "avc_aac.flv" if broken else path)
        lines = [f"file size={path.stat().st_size} duration_ms={0 if broken else duration}", *streams,
                 *(packets[pos] for pos in kept_tags(path) if pos in packets)]
        (HERE / "expected" / f"{path.stem}.txt").write_text("\n".join(lines) + "\n")
    for tool in sys.argv[1:]:
        with tempfile.TemporaryDirectory() as folder:
            lines = [line for path in SAMPLES for line in extracted(tool, path, pathlib.Path(folder))]
        (HERE / "expected" / "extract.txt").write_text("".join(lines))


if __name__ == "__main__":
    main()
