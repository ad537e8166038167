"""Runs the command-line tool as a user does. Needs FLVDMX_TOOL (the program) and FLVDMX_TEST_DATA (the samples)."""
import concurrent.futures
import contextlib
import csv
import json
import operator
import os
import pathlib
import pty
import random
import re
import shlex
import subprocess
import tempfile
import threading
import time
import unittest

from flv import retag, split_tags

TOOL = os.environ["FLVDMX_TOOL"]
DATA = pathlib.Path(os.environ["FLVDMX_TEST_DATA"])
SAMPLES = sorted(path.stem for path in DATA.glob("*.flv"))
WARNINGS = {"truncated": ".*not a complete tag.*\n", "damaged": ".*without a valid tag.*\n"}
CODECS = {"h264": "H.264 (AVC)", "flv1": "Sorenson H.263", "flashsv": "screen video", "aac": "AAC", "mp3": "MP3",
          "speex": "Speex", "pcm_s16le": "PCM, little-endian"}
KIND, TIME = operator.itemgetter(0), operator.itemgetter(1)  # of a frame
ALWAYS_KEYED = ("flv1", "flashsv")  # their tags never set the first timestamp


def sample(name):
    return str(DATA / f"{name}.flv")


def sample_bytes(name):
    return (DATA / f"{name}.flv").read_bytes()


def run(*arguments, **options):
    streams = {"stdout": subprocess.PIPE, "stderr": subprocess.PIPE, **options}
    arguments = (a if isinstance(a, bytes) else str(a) for a in arguments)
    return subprocess.run([TOOL, *arguments], text=True, timeout=60, **streams)


class Expected:
    """What an independent prober found in a sample; times count from the first timestamp, as in the library."""

    def __init__(self, name):
        lines = [line.split(" ") for line in (DATA / "expected" / f"{name}.txt").read_text().splitlines()]
        found = {kind: [dict(field.split("=", 1) for field in fields) for first, *fields in lines if first == kind]
                 for kind in ("file", "stream", "packet")}
        self.size = int(found["file"][0]["size"])
        self.streams = {stream["kind"]: stream for stream in found["stream"]}
        self.tags = [(p["kind"], int(p["dts"]), int(p["size"]), p["crc"]) for p in found["packet"]]
        first = min((t[1] for t in self.tags if self.streams[t[0]]["codec"] not in ALWAYS_KEYED), default=0)
        self.frames = [(kind, dts - first, *rest) for kind, dts, *rest in self.tags]
        self.of = {kind: [f for f in self.frames if f[0] == kind] for kind in ("video", "audio")}
        self.last = max(f[1] for f in self.frames)
        self.keyframes = [(self.frames[i][1], int(p["pos"]), i) for i, p in enumerate(found["packet"])
                          if p["kind"] == "video" and p["key"] == "1"]


def frames_of(objects):
    return [(o["stream"], o["time_ms"], o["size"], o["crc32"]) for o in objects]


def json_frames(text):
    return frames_of(json.loads(line) for line in text.splitlines())


def milliseconds(text):
    hours, minutes, seconds = text.split(":")
    return round((int(hours) * 3600 + int(minutes) * 60 + float(seconds)) * 1000)


# 350 x 242 pixels, which the library misreads.
HIGH_444 = "01f4000dffe1001b67f4000d919b282c10f71f80880000030008000003019078a14cb001000668ebe3c44844fff8f800"
AVC, AVC_BYTES = Expected("avc_aac"), sample_bytes("avc_aac")
HEADER, TAGS = split_tags(AVC_BYTES)
APART = HEADER + b"".join(sorted(TAGS, key=lambda tag: -tag[0]))  # script, video, audio


class Case(unittest.TestCase):
    def write(self, name, data):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        path = pathlib.Path(folder.name) / name
        path.write_bytes(data)
        return path

    @staticmethod
    def shown(terminal):
        """Returns all that was written to a pseudo terminal."""
        shown = b""
        with contextlib.suppress(OSError):  # reading ends with an error when the other side is closed
            while more := os.read(terminal, 10000):
                shown += more
        os.close(terminal)
        return shown

    def tool(self, *arguments, code=0, stderr="", **streams):
        """Returns the tool's output; its exit code must be `code`, and standard error must match the pattern."""
        result = run(*arguments, **streams)
        self.assertEqual(result.returncode, code, result.stderr)
        self.assertRegex(result.stderr, rf"\A{stderr}\Z")
        return result.stdout


class Frames(Case):
    def test_every_sample(self):
        for name in SAMPLES:
            with self.subTest(name):
                expected, stderr = Expected(name), WARNINGS.get(name, "")
                whole = self.tool("frames", "--json", sample(name), stderr=stderr)
                self.assertEqual(json_frames(whole), expected.frames)
                numbers = [json.loads(line)["number"] for line in whole.splitlines()]
                self.assertEqual(numbers, list(range(1, len(numbers) + 1)))
                by_time = json_frames(self.tool("frames", "--json", "--separate-audio", sample(name), stderr=stderr))
                self.assertEqual(by_time, sorted(by_time, key=TIME))
                self.assertEqual(sorted(by_time, key=KIND), sorted(expected.frames, key=KIND))
                heading, *text = self.tool("frames", sample(name), stderr=stderr).splitlines()
                fields = [line.replace(" key ", " ").split() for line in text]
                found = [(kind, milliseconds(t), int(size), crc) for _, kind, t, _, size, _, crc in fields]
                self.assertEqual(found, expected.frames)
                keyframes = [(milliseconds(f[2]), int(f[5])) for f, line in zip(fields, text) if " key " in line]
                self.assertEqual(keyframes, [k[:2] for k in expected.keyframes])
                self.assertEqual({len(line) for line in text}, {len(heading)})  # aligned

    def test_selection(self):
        frames, of, whole = AVC.frames, AVC.of, sample("avc_aac")
        start = max(k for k in AVC.keyframes if k[0] <= 1500)[2]
        # Probing ends at the audio configuration; if all audio follows the video, it has seen only video frames then.
        late = [(kind, time_ms - AVC.keyframes[0][0], *rest) for kind, time_ms, *rest in of["video"] + of["audio"]]
        self.assertLess(min(f[1] for f in late), 0)
        apart = self.write("apart.flv", APART)
        # More tags without frames than one request skips.
        configs = self.write("configs.flv", HEADER + b"".join([*TAGS[:40], *[TAGS[1]] * 250, *TAGS[40:]]))
        for file, arguments, wanted in (
                (whole, "--stream video", of["video"]), (whole, "--stream audio --separate-audio", of["audio"]),
                (whole, "--count 7", frames[:7]), (whole, "--count 0", []),
                (whole, "--stream audio --count 3", of["audio"][:3]),
                (whole, "--to 0.5", [f for f in frames if f[1] <= 500]), (whole, "--from 0:01.5", frames[start:]),
                (whole, "--keyframes", [frames[k[2]] for k in AVC.keyframes]),
                (whole, "--stream audio --from 1.5 --to 1.6", [f for f in of["audio"] if 1500 <= f[1] <= 1600]),
                (whole, "--from 1.5 --to 0:00:01.75", [f for f in frames[start:] if f[1] <= 1750]),
                (apart, "", late), (apart, "--to 0.5", [f for f in late if f[1] <= 500]),
                (apart, "--separate-audio", sorted(late, key=TIME)), (configs, "", frames)):
            with self.subTest(file=file, arguments=arguments):
                self.assertEqual(json_frames(self.tool("frames", "--json", file, *arguments.split())), wanted)


    def test_fields(self):
        """Presentation times of a stream with B-frames, in both formats for programs."""
        objects = [json.loads(line) for line in self.tool("frames", "--json", sample("avc_bframes_aac")).splitlines()]
        rows = list(csv.DictReader(self.tool("frames", "--csv", sample("avc_bframes_aac")).splitlines()))
        self.assertEqual([{**row, "keyframe": bool(int(row["keyframe"]))} for row in rows],
                         [{key: value if key == "keyframe" else str(value) for key, value in o.items()} for o in objects])
        self.assertTrue(any(o["presentation_ms"] > o["time_ms"] for o in objects))


class Info(Case):
    def test_every_sample(self):
        result = run("info", "--json", "missing.flv", *map(sample, SAMPLES))  # one bad file among good ones
        bad, *files = json.loads(result.stdout)["files"]
        self.assertEqual((result.returncode, bad["file"], bad["error"]["code"]), (1, "missing.flv", -5))
        for name, found in zip(SAMPLES, files, strict=True):
            with self.subTest(name):
                expected = Expected(name)
                head = (found["file"], found["container"], found["size"])
                self.assertEqual(head, (sample(name), "FLV", expected.size))
                self.assertTrue(0 <= found["duration_ms"] - expected.last <= 100, (expected.last, found["duration_ms"]))
                self.assertEqual(found["seek_method"], "index" if name == "avc_aac_index" else "scan")
                self.assertEqual({"video", "audio"} & found.keys(), expected.streams.keys())
                for kind, stream in expected.streams.items():
                    self.assertEqual(found[kind]["codec"], CODECS[stream["codec"]])
                    self.assertEqual(found[kind]["config"] or "", stream["extradata"])
                    same = {"video": (("width", "width"), ("height", "height")),
                            "audio": (("sample_rate", "rate"), ("channels", "channels"))}[kind]
                    self.assertEqual([found[kind][a] for a, _ in same], [int(stream[b]) for _, b in same])

    def test_text(self):
        text = self.tool("info", sample("avc_aac_index"), sample("mp3_only"))
        for line in (r"size +30584 bytes", r"streams +video and audio", r"duration +0:00:0[23]\.\d{3}",
                     r"seek method +by the keyframe index", r"keyframe index +\d+ entries", r"picture size +160 x 120",
                     r"frame rate +25 frames/s", r"profile +High, level 1.1", r"object type +2 \(AAC LC\)", r"sample rate +44100 Hz", r"channels +1",
                     r"configuration +\d+ bytes: 01", r"audio +MP3", r"streams +audio only", r"data rate +32 kbit/s"):
            self.assertRegex(text, line)


    def test_details(self):
        """What the file states about itself, and what a scan adds."""
        [plain, scanned] = [json.loads(self.tool("info", "--json", *scan, sample("avc_aac_index")))["files"][0]
                            for scan in ([], ["--scan"])]
        self.assertEqual((plain["metadata"]["hasKeyframes"], plain["metadata"]["lasttimestamp"]), (True, 2.96))
        self.assertEqual((plain["video"]["profile"], plain["video"]["level"]), ("High", "1.1"))
        self.assertEqual((plain["audio"]["object_type"], plain["first_timestamp_ms"]), (2, 0))
        indexed = Expected("avc_aac_index")
        counts = [scanned["video"]["frames"], scanned["video"]["keyframes"], scanned["audio"]["frames"]]
        self.assertEqual(counts, [len(indexed.of["video"]), len(indexed.keyframes), len(indexed.of["audio"])])
        times = [k[0] for k in indexed.keyframes]
        self.assertEqual(scanned["video"]["last_keyframe_ms"], times[-1])
        longest = max(b - a for a, b in zip(times, times[1:]))
        self.assertEqual(scanned["video"]["keyframe_distance_ms"]["longest"], longest)
        unknown = json.loads(self.tool("info", "--json", sample("avc_aac")))["files"][0]
        self.assertIsNone(unknown["video"]["last_keyframe_ms"])

    def test_why_a_stream_is_not_played(self):
        def put(change):
            return self.write("in.flv", HEADER + b"".join(map(change, TAGS)))

        def large(tag):
            if tag[0] != 9 or tag[12] != 0:
                return tag
            length = int.from_bytes(tag[22:24], "big")
            sps = tag[24:24 + length] + bytes(150)
            return retag(tag, tag[11:22] + len(sps).to_bytes(2, "big") + sps + tag[24 + length:-4])

        def enhanced(tag):
            return retag(tag, bytes([tag[11] & 0x70 | 0x81]) + b"hvc1" + tag[16:-4]) if tag[0] == 9 else tag

        def late(tag):
            return retag(tag, bytes([tag[11] ^ 1]) + tag[12:-4]) if tag[0] == 8 and tag[5] > 3 else tag

        def empty(tag):
            return retag(tag, b"") if tag[0] == 8 and tag[5] > 3 else tag

        def nonsense(tag):
            return retag(tag, b"\xf7" + tag[12:-4]) if tag[0] == 9 and tag[5] > 3 else tag

        for change, words, scan in ((enhanced, "enhanced FLV \\(HEVC, FourCC 'hvc1'", ""),
                                    (large, "parameter sets are larger than the supported 128 bytes", ""),
                                    (late, "another codec byte than the audio stream", None),
                                    (empty, "it is empty", None), (nonsense, "codec byte is invalid: 0xf7", None)):
            with self.subTest(words):
                path = put(change)
                if scan is not None:
                    self.tool("info", path, stderr=f".*the video is not played: .*{words}.*\n")
                document = json.loads(self.tool("info", "--json", "--scan", path, stderr="(.*\n)?"))["files"][0]
                [result] = json.loads(self.tool("check", "--json", path, code=1))["files"]
                [finding] = result["findings"]  # one finding for all of them
                self.assertRegex(finding["text"], words)
                self.assertEqual((document["bytes_left_out"], "video" in document),
                                 (result["lost_bytes"], scan is None))
                self.assertEqual(finding["count"], sum(change(tag) != tag for tag in TAGS)
                                 if change is not large else sum(tag[0] == 9 for tag in TAGS))

        video, audio = (b"".join(tag for tag in TAGS if tag[0] == kind) for kind in (9, 8))
        for data, words, code in ((b"".join(enhanced(tag) for tag in TAGS if tag[0] != 8), "; video: it is enhanced", 1),
                                  (video, "audio is not played: the file header announces it", 0),
                                  (video * 2 + audio, "audio is not played: it starts after the first 102 tags", 0)):
            self.tool("info", self.write("in.flv", HEADER + data), code=code, stderr=f"(.*\n)?.*{words}.*\n")
        other = put(lambda tag: retag(tag, bytes([tag[11] & 0xF0 | 12]) + tag[12:-4]) if tag[0] == 9 else tag)
        self.assertRegex(self.tool("info", other, stderr=".*is not defined by FLV.*\n"), r"video +HEVC \(CodecID 12\)")

    def test_facts_that_the_tag_headers_do_not_contain(self):
        header, [script, *tags] = split_tags(sample_bytes("pcm_only"))
        for byte, rate, size in ((0x70, 8000, 16), (0x80, 8000, 16), (0x40, 16000, 16), (0x50, 8000, 16),
                                 (0x3c, 44100, 8), (0x3e, 44100, 16)):
            data = header + script + b"".join(retag(tag, bytes([byte]) + tag[12:-4]) for tag in tags)
            [found] = json.loads(self.tool("info", "--json", self.write("in.flv", data)))["files"]
            self.assertEqual((found["audio"]["sample_rate"], found["audio"]["sample_size"]), (rate, size), hex(byte))
        path = self.write("in.flv", HEADER + TAGS[0] + retag(TAGS[1], TAGS[1][11:16] + bytes.fromhex(HIGH_444))
                          + b"".join(TAGS[2:]))
        video = json.loads(self.tool("info", "--json", path, stderr="(.*cut short.*\n)?"))["files"][0]["video"]
        self.assertEqual((video["profile"], video["width"], video["height"]), ("High 4:4:4 Predictive", 350, 242))

    def test_timestamps_that_restart(self):
        last = max(f[1] for f in AVC.frames)
        early = [tag for tag in TAGS[1:] if int.from_bytes(tag[4:7], "big") < 1000]
        found = json.loads(self.tool("info", "--json", self.write("two.flv", AVC_BYTES + b"".join(early)),
                                     stderr=".*timestamps jump: the last one is 0:00:00.9.*\n"))["files"][0]
        self.assertLess(found["duration_ms"], 1000)
        self.assertAlmostEqual(found["played_duration_ms"], last + 1000, delta=60)
        self.assertEqual(found["timestamp_restarts"], 1)


class Seek(Case):
    def seek(self, *arguments, **outcome):
        return json.loads(self.tool("seek", "--json", "--count", 1000, *arguments, **outcome))

    def test_lands_on_the_right_keyframe(self):
        for name in ("avc_bframes_aac", "h263_mp3"):
            expected = Expected(name)
            for target in range(1, expected.keyframes[-1][0] + 200, 233):
                # Backward from before the first keyframe: the start of the tags.
                backward = [(0, 9, 0), *(k for k in expected.keyframes if k[0] <= target)][-1]
                forward = next((k for k in expected.keyframes if k[0] >= target), None)
                for mode, place in (("", backward), ("--mode=forward", forward), ("--mode=auto", forward)):
                    with self.subTest(name=name, target=target, mode=mode):
                        outcome = {} if place else {"code": 1, "stderr": ".+\n"}
                        found = self.seek(*mode.split(), sample(name), target / 1000, **outcome)
                        landed = place and {"time_ms": place[0], "position": place[1], "keyframe": True}
                        self.assertEqual(found["landed"], landed)
                        frames = expected.frames[place[2]:] if place else []
                        self.assertEqual(frames_of(found.get("frames", [])), frames)

    def test_relative_counts_from_the_last_video_frame(self):
        current = [f for f in AVC.frames[:150] if f[0] == "video"][-1][1]
        earlier = max(k[0] for k in AVC.keyframes if k[0] <= current - 300)
        for text, time_ms, keyframe in (("-0.3", earlier, True), ("0", current, False)):
            found = self.seek("--play", 150, "--mode", "auto", "--relative", sample("avc_aac"), text)
            self.assertEqual((found["landed"]["time_ms"], found["landed"]["keyframe"]), (time_ms, keyframe))
        self.assertEqual(frames_of(found["frames"]), AVC.frames[150:])

    def test_times(self):
        for text, time_ms in (("1.0226", 1023), ("1.9996", 2000), ("0:01.5", 1500), ("0:0:1", 1000), ("+1", 1000),
                              ("00:00:01.25", 1250), ("90", 90000), ("1:30", 90000), ("01:00:02.003", 3602003)):
            found = json.loads(run("seek", "--json", sample("avc_aac"), text).stdout)
            self.assertEqual(found["time_ms"], time_ms, text)

    def test_wrong_index(self):
        data = sample_bytes("avc_aac_index")
        positions = data.index(b"filepositions") + 18
        path = self.write("in.flv", data[:positions] + bytes(9) * 4 + data[positions + 36:])
        keyframe = Expected("avc_aac_index").keyframes[2]
        landed = self.seek(path, keyframe[0] / 1000 + 0.1, stderr=".*the tags were searched instead\n")["landed"]
        self.assertEqual((landed["time_ms"], landed["position"]), keyframe[:2])

    def test_miss_messages(self):
        behind = (AVC.keyframes[-1][0] + 10) / 1000
        for arguments, miss, words in (
                (["99"], "beyond_end", "seek to 0:01:39.000 missed: that is beyond the end at 0:00:0"),
                (["99", "--end-on-miss", "--verbose"], "beyond_end", r"\(code -2003, line 3161\)"),
                (["--mode", "forward", behind], "no_keyframe", "is at or after it; --mode backward lands at 0:00:0")):
            found = self.seek(sample("avc_aac"), *arguments, code=1, stderr=f".*{words}.*\n")
            self.assertEqual((found["landed"], found["miss"]), (None, miss))
            self.assertEqual(found["position"] == AVC.size, "--end-on-miss" in arguments)
        found = self.seek(sample("avc_aac"), "--mode", "forward", "--retry-backward", behind)
        self.assertEqual(found["landed"]["position"], AVC.keyframes[-1][1])
        text = self.tool("seek", "--count", 2, "--mode", "forward", sample("avc_aac"), "0.1")
        self.assertRegex(text, rf"\Asought .*\nlanded .*\nkeyframe +yes\nposition +byte {AVC.keyframes[1][1]}\n number(.*\n){{3}}\Z")


class Failures(Case):
    def test_unusable_files(self):
        header = b"FLV\x01\x05\x00\x00\x00\x09"
        folder = self.write("any", b"").parent
        for path, words in (
                (folder / "missing.flv", "No such file or directory"),
                (folder, "Is a directory"),
                (self.write("empty.flv", b""), "the file is empty"),
                (self.write("tiny.flv", b"FLV\x01\x05"), "damaged or cut short (the file has 5 bytes)"),
                (self.write("text.flv", b"no video here\n" * 9), "does not start with the signature"),
                (self.write("bare.flv", header), "damaged or cut short (the file has 9 bytes)"),
                (self.write("header.flv", header + bytes(4)), "audio stream was found"),
                ("/dev/null", "a pipe or device")):
            for text in ("info FILE", "info --json FILE", "frames FILE", "frames --json FILE", "seek --json FILE 1",
                         "check FILE", "check --json FILE", "extract FILE -o OUT", "plot FILE -o OUT"):
                with self.subTest(path=path, arguments=text):
                    if path == folder and text.startswith("check"):
                        continue  # folders are checked
                    found = self.tool(
                        *({"FILE": path, "OUT": folder / "out"}.get(word, word) for word in text.split()), code=1,
                        stderr=f"flvdmx: {path}: .*{re.escape(words)}.*\n")
                    if text in ("info --json FILE", "check --json FILE"):  # documents of many files
                        [entry] = json.loads(found)["files"]
                        self.assertTrue(entry["file"] == str(path) and entry["error"]["code"] < 0)
                    else:
                        self.assertEqual(found, "")

    def test_missing_stream(self):
        for arguments in ([], ["--separate-audio"]):
            self.assertEqual("", self.tool("frames", "--stream", "video", sample("mp3_only"), *arguments, code=1,
                                           stderr=".*the file has no video stream.*\n"))

    def test_streams_closed_or_full(self):
        out = self.write("any", b"").parent / "out"
        for closed, codes in (("2>&-", b"0 1\n"), ("2>/dev/full", b"0 1\n"), (">&- 2>&-", b"1 1\n")):
            command = f'"$0" extract --force "$1" -o "$2" {closed}; a=$?; "$0" info missing.flv {closed}; echo $a $?'
            arguments = ["sh", "-c", command, TOOL, sample("pcm_only"), out]
            self.assertTrue(subprocess.run(arguments, stdout=subprocess.PIPE).stdout.endswith(codes), closed)
            self.assertNotIn(b"flvdmx", out.read_bytes())  # the note about raw streams

    def test_two_files_in_one(self):
        frames = json_frames(self.tool("frames", "--json", self.write("two.flv", AVC_BYTES + b"".join(TAGS[:60]))))
        again = [f for f in AVC.frames if f[1] <= max(f[1] for f in frames[-40:])]
        self.assertEqual(frames, AVC.frames + again[:len(frames) - 172])

    def test_usage_errors(self):
        for text in ("", "play FILE", "info", "info --count 1 FILE", "frames", "frames FILE FILE",
                     "frames --count x FILE", "frames --stream subtitles FILE", "frames --count -1 FILE",
                     "frames --timeout 1 FILE", "frames --follow --timeout -1 FILE", "frames --from soon FILE",
                     "seek FILE", "seek FILE -1", "seek FILE 1:60", "seek FILE 1:2:3:4", "seek FILE 1.", "seek FILE ''",
                     "seek FILE 3000000", "seek FILE 99999999999999999999", "seek --mode up FILE 1", "extract FILE",
                     "extract -o '' FILE", "extract FILE -o x --stream all", "plot FILE", "check",
                     "frames --from -1 FILE", "frames --from 2 --to 1 FILE", "cut --to -1 FILE -o x", "check --jobs 0 FILE", "check --jump -1 FILE", "check --jump nan FILE"):
            with self.subTest(text):
                arguments = (sample("avc_aac") if word == "FILE" else word for word in shlex.split(text))
                told = r"flvdmx: .+\nTry 'flvdmx .*--help'\.\n"
                self.assertEqual(self.tool(*arguments, code=2, stderr=told), "")

    def test_choices_and_dashes_are_explained(self):
        folder = self.write("-x.flv", AVC_BYTES).parent
        for arguments, words in ((["frames", "--stream", "all", "x"], "'all' is not one of: audio, video"),
                                 (["seek", "--mode", "up", "x", "1"], "not one of: auto, backward, forward"),
                                 (["help", "me"], "not one of: check, cut, extract"),
                                 (["info", "-x.flv"], "that begins with a dash: flvdmx COMMAND -- -x.flv")):
            self.assertIn(words, run(*arguments, cwd=folder).stderr)
        self.tool("info", "--", "-x.flv", cwd=folder)

    def test_help_and_version(self):
        for option in ("--version", "-V"):
            self.assertRegex(self.tool(option), r"\Aflvdmx \d+\.\d+\.\d+\n\Z")
        for arguments in ([], ["info"], ["frames"], ["seek"], ["extract"], ["check"], ["plot"]):
            self.assertIn("Usage: flvdmx", self.tool(*arguments, "--help"))
            self.assertEqual(self.tool("help", *arguments), self.tool(*arguments, "--help"))

    def test_names_are_escaped(self):
        self.tool("info", b"a\x1b[1m\xff\xc3\xa9\n", code=1, stderr=r"flvdmx: a\\x1b\[1m\\xffé\\x0a: .*\n")


class Output(Case):
    def test_closed_pipe_ends_quietly_and_a_full_disk_is_reported(self):
        full = "flvdmx: cannot write: No space left on device\n"
        for text in ("frames FILE", "frames --json FILE", "info FILE", "frames --follow --timeout 30 FILE", "--help",
                     "--version", "extract FILE --stream video -o -", "plot FILE -o -"):
            reading, writing = os.pipe()
            os.close(reading)
            arguments = text.replace("FILE", sample("avc_aac")).split()
            with self.subTest(text), os.fdopen(writing), open("/dev/full", "wb") as disk:
                self.tool(*arguments, stdout=writing)
                self.tool(*arguments, stdout=disk, code=1, stderr=full)
                closed = subprocess.run(["sh", "-c", '"$@" >&-', "sh", TOOL, *arguments], stderr=subprocess.PIPE)
                self.assertEqual((closed.returncode, closed.stderr), (1, b"flvdmx: cannot write: Bad file descriptor\n"))

    def test_standard_input(self):
        frames = self.tool("frames", sample("avc_aac"))
        with open(sample("avc_aac"), "rb") as file:
            self.assertEqual(self.tool("frames", "-", stdin=file), frames)
        with subprocess.Popen(["cat", sample("avc_aac")], stdout=subprocess.PIPE) as pipe:
            self.assertEqual(self.tool("frames", "-", stdin=pipe.stdout), frames)
        self.tool("frames", "--follow", "-", code=1, stderr=".*cannot be followed.*\n")

    def test_progress_only_on_a_terminal(self):
        terminal, end = pty.openpty()
        result = run("frames", sample("avc_aac"), stderr=end)
        os.close(end)
        self.assertRegex(self.shown(terminal), rb"\A\r\x1b\[K1 frame, 0:00:00\.\d{3}.*\r\x1b\[K\Z")
        self.assertEqual(len(result.stdout.splitlines()), 1 + len(AVC.frames))


class Follow(Case):
    """A thread acts as the writer; the file starts empty and grows in uneven steps."""

    def follow(self, data, arguments):
        path, gate = self.write("growing.flv", b""), threading.Event()

        def grow():
            rng, position = random.Random(7), 0
            with open(path, "ab", buffering=0) as file:
                while position < len(data) and (position < AVC.size // 4 or gate.wait(10)):
                    position += file.write(data[position:position + rng.choice((1, 13, 700, 2500))])
                    time.sleep(0.01)

        writer = threading.Thread(target=grow)
        command = [TOOL, "frames", "--json", path, "--follow", "--timeout", *arguments]
        with subprocess.Popen(command, stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True) as process:
            writer.start()
            lines = [process.stdout.readline()]
            gate.set()  # the rest is written only after the first frame has been seen
            lines += process.stdout.readlines()
            stderr = process.stderr.read()
        writer.join()
        return json_frames("".join(lines)), process.returncode, stderr

    def test_growing_file(self):
        """Files that are completed, and writers that stop. They run in parallel, as most wait for a timeout."""
        early = sum(f[1] <= 300 for f in AVC.frames)
        broken = r"flvdmx: .*warning: the last \d+ bytes are not a complete frame, or are damaged; .*\n"
        cases = [("avc_aac", None, "4", None, ""), ("avc_aac", None, "4 --separate-audio", None, ""),
                 ("h263_mp3", None, "4", None, ""), ("avc_aac_index", None, "4 --separate-audio", None, ""),
                 ("aac_only", None, "4", None, ""), ("truncated", None, "4", None, broken),
                 ("avc_aac", None, "20 --count 9", 9, ""), ("avc_aac", None, "20 --to 0.3", early, ""),
                 ("avc_aac", 8, "4", 0, ".*damaged or cut short.*\n"),
                 ("avc_aac", 30, "4", 0, ".*(stream was found|data ended).*\n")]
        start = time.monotonic()
        with concurrent.futures.ThreadPoolExecutor(len(cases)) as pool:
            results = list(pool.map(lambda case: self.follow(sample_bytes(case[0])[:case[1]], case[2].split()), cases))
        self.assertLess(time.monotonic() - start, 15)  # nothing waits after the last requested frame
        for (name, size, arguments, count, words), (frames, code, stderr) in zip(cases, results):
            with self.subTest(name=name, size=size, arguments=arguments):
                tags = Expected(name).tags[:count]
                if "--separate-audio" in arguments:
                    tags, frames = sorted(tags, key=KIND), sorted(frames, key=KIND)
                self.assertEqual((code, frames), (1 if count == 0 else 0, tags))
                self.assertRegex(stderr, rf"\A{words}\Z")

    def test_file_that_is_created_later(self):
        path = self.write("any", b"").parent / "later.flv"
        writer = threading.Timer(0.5, path.write_bytes, [AVC_BYTES])
        writer.start()
        self.assertEqual(json_frames(self.tool("frames", "--json", "--follow", "--timeout", "3", path,
                                               stderr=".*note: waiting for the file\n")), AVC.tags)
        writer.join()
        self.tool("frames", "--follow", "--timeout", "0.1", "never.flv", code=1, stderr=".*\n.*No such file.*\n")

    def test_start_is_searched_without_an_index(self):
        arguments = ("frames", "--json", "--from", "2", sample("avc_aac"))
        self.assertEqual(self.tool(*arguments, "--follow", "--timeout", "1"), self.tool(*arguments))
