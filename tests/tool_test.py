#!/usr/bin/env python3
"""Runs the command-line tool as a user does. Needs FLVDMX_TOOL (the program) and FLVDMX_TEST_DATA (the samples)."""
import concurrent.futures
import contextlib
import json
import os
import pathlib
import pty
import random
import subprocess
import tempfile
import threading
import time
import unittest

TOOL = os.environ["FLVDMX_TOOL"]
DATA = pathlib.Path(os.environ["FLVDMX_TEST_DATA"])
SAMPLES = sorted(path.stem for path in DATA.glob("*.flv"))
CODECS = {"h264": "H.264 (AVC)", "flv1": "Sorenson H.263", "flashsv": "screen video", "aac": "AAC", "mp3": "MP3",
          "speex": "Speex", "pcm_s16le": "PCM, little-endian"}
ALWAYS_KEYED = ("flv1", "flashsv")  # their tags never set the first timestamp


def sample(name):
    return str(DATA / f"{name}.flv")


def sample_bytes(name):
    return (DATA / f"{name}.flv").read_bytes()


def run(*arguments, **options):
    return subprocess.run([TOOL, *map(str, arguments)], capture_output=True, text=True, timeout=60, **options)


class Expected:
    """What an independent prober found in a sample; times from the first timestamp, as the library gives them."""

    def __init__(self, name):
        self.streams, self.packets = {}, []
        for line in (DATA / "expected" / f"{name}.txt").read_text().splitlines():
            kind, *fields = line.split(" ")
            fields = dict(field.split("=", 1) for field in fields)
            if kind == "file":
                self.size = int(fields["size"])
            elif kind == "stream":
                self.streams[fields["kind"]] = fields
            else:
                self.packets.append(fields)
        self.first = min((int(p["dts"]) for p in self.packets
                          if self.streams[p["kind"]]["codec"] not in ALWAYS_KEYED), default=0)
        self.frames = [(p["kind"], int(p["dts"]) - self.first, int(p["size"]), p["crc"]) for p in self.packets]
        self.of = {kind: [f for f in self.frames if f[0] == kind] for kind in ("video", "audio")}
        self.keyframes = [(int(p["dts"]) - self.first, int(p["pos"]), i) for i, p in enumerate(self.packets)
                          if p["kind"] == "video" and p["key"] == "1"]


def frames_of(objects):
    return [(o["stream"], o["time_ms"], o["size"], o["crc32"]) for o in objects]


def json_frames(text):
    return frames_of(json.loads(line) for line in text.splitlines())


def milliseconds(text):
    hours, minutes, seconds = text.split(":")
    return round((int(hours) * 3600 + int(minutes) * 60 + float(seconds)) * 1000)


def split_tags(data):
    """The file header, and each tag with its back-pointer."""
    header, position, tags = data[:13], 13, []
    while position < len(data):
        end = position + 15 + int.from_bytes(data[position + 1:position + 4], "big")
        tags.append(data[position:end])
        position = end
    return header, tags


class Case(unittest.TestCase):
    def write(self, name, data):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        path = pathlib.Path(folder.name) / name
        path.write_bytes(data)
        return path

    @staticmethod
    def shown(terminal):
        """All that was written to a pseudo terminal."""
        shown = b""
        with contextlib.suppress(OSError):  # a terminal that is closed on the other side ends with an error
            while more := os.read(terminal, 10000):
                shown += more
        os.close(terminal)
        return shown

    def succeed(self, *arguments, stderr=""):
        result = run(*arguments)
        self.assertEqual((result.returncode, result.stderr), (0, stderr))
        return result.stdout


class Frames(Case):
    def test_every_sample(self):
        for name in SAMPLES:
            expected = Expected(name)
            for arguments in ([], ["--separate-audio"]):
                with self.subTest(name=name, arguments=arguments):
                    result = run("frames", "--json", *arguments, sample(name))
                    self.assertEqual(result.returncode, 0)
                    frames = json_frames(result.stdout)
                    if arguments:
                        self.assertEqual([f[1] for f in frames], sorted(f[1] for f in frames))
                        frames.sort(key=lambda f: f[0] == "audio")
                    self.assertEqual(frames, [*expected.of["video"], *expected.of["audio"]] if arguments else expected.frames)
                    numbers = [json.loads(line)["number"] for line in result.stdout.splitlines()]
                    self.assertEqual(numbers, list(range(1, len(numbers) + 1)))
                    self.assertEqual("no whole tag" in result.stderr, name == "truncated")
                    self.assertEqual("hold no sound tag" in result.stderr, name == "damaged")
            text = run("frames", sample(name)).stdout.splitlines()
            lines = [line.split() for line in text]
            self.assertEqual([(s, milliseconds(t), int(n), c) for _, s, t, n, c in lines], expected.frames)
            self.assertEqual(len({len(line) for line in text}), 1)  # aligned

    def test_selection(self):
        expected = Expected("avc_aac")
        frames, of = expected.frames, expected.of
        start = max(k for k in expected.keyframes if k[0] <= 1500)
        for arguments, wanted in (
                (["--stream", "video"], of["video"]), (["--stream", "audio", "--separate-audio"], of["audio"]),
                (["--count", 7], frames[:7]), (["--count", 0], []), (["--stream", "audio", "--count", 3], of["audio"][:3]),
                (["--to", "0.5"], [f for f in frames if f[1] <= 500]),
                (["--from", "0:01.5"], frames[start[2]:]),
                (["--from", "1.5", "--to", "0:00:01.75"], [f for f in frames[start[2]:] if f[1] <= 1750])):
            with self.subTest(arguments):
                self.assertEqual(json_frames(self.succeed("frames", "--json", sample("avc_aac"), *arguments)), wanted)

    def test_streams_that_are_not_interleaved(self):
        header, tags = split_tags(sample_bytes("avc_aac"))
        path = self.write("apart.flv", header + b"".join(sorted(tags, key=lambda tag: -tag[0])))  # script, video, audio
        expected = Expected("avc_aac")
        first = expected.keyframes[0][0]  # probing ends at the audio configuration and has seen only pictures by then
        frames = [(kind, time_ms - first, size, crc) for kind, time_ms, size, crc in expected.frames]
        apart = [f for f in frames if f[0] == "video"] + [f for f in frames if f[0] == "audio"]
        self.assertLess(min(apart, key=lambda f: f[1])[1], 0)
        for arguments, wanted in (([], apart), (["--to", "0.5"], [f for f in apart if f[1] <= 500]),
                                  (["--separate-audio"], sorted(apart, key=lambda f: f[1]))):
            with self.subTest(arguments):
                self.assertEqual(json_frames(self.succeed("frames", "--json", path, *arguments)), wanted)

    def test_more_unplayed_tags_than_one_request_passes(self):
        header, tags = split_tags(sample_bytes("avc_aac"))
        config = next(tag for tag in tags if tag[0] == 9)
        path = self.write("configs.flv", header + b"".join(tags[:40] + [config] * 250 + tags[40:]))
        self.assertEqual(json_frames(self.succeed("frames", "--json", path)), Expected("avc_aac").frames)


class Info(Case):
    def test_every_sample(self):
        document = json.loads(run("info", "--json", *map(sample, SAMPLES)).stdout)
        self.assertEqual([f["file"] for f in document["files"]], [sample(name) for name in SAMPLES])
        for name, found in zip(SAMPLES, document["files"]):
            with self.subTest(name):
                self.check_file(found, Expected(name), name)

    def check_file(self, found, expected, name):
        self.assertEqual((found["container"], found["size"]), ("FLV", expected.size))
        last = max(f[1] for f in expected.frames)
        self.assertTrue(last <= found["duration_ms"] <= last + 100, (last, found["duration_ms"]))
        self.assertEqual(found["seek_method"], "index" if name == "avc_aac_index" else "scan")
        self.assertEqual([kind for kind in ("video", "audio") if kind in found], sorted(expected.streams, reverse=True))
        for kind, stream in expected.streams.items():
            self.assertEqual(found[kind]["codec"], CODECS[stream["codec"]])
            self.assertEqual(found[kind]["config"] or "", stream["extradata"])
        if "video" in found:
            size = [int(expected.streams["video"][key]) for key in ("width", "height")]
            self.assertEqual([found["video"]["width"], found["video"]["height"]], size)
        if "audio" in found and name != "speex_only":  # a header byte has no word for 16000 Hz
            stream = [int(expected.streams["audio"][key]) for key in ("rate", "channels")]
            self.assertEqual([found["audio"]["sample_rate"], found["audio"]["channels"]], stream)

    def test_text(self):
        text = self.succeed("info", sample("avc_aac_index"), sample("mp3_only"))
        for line in (r"size +30584 bytes", r"streams +video and audio", r"duration +0:00:0[23]\.\d{3}",
                     r"seek method +by the keyframe index", r"keyframe index +\d+ entries", r"picture size +160 x 120",
                     r"frame rate +25 frames/s", r"sample rate +44100 Hz", r"channels +1",
                     r"configuration +\d+ bytes: 01", r"audio +MP3", r"streams +audio only", r"data rate +32 kbit/s"):
            self.assertRegex(text, line)


class Seek(Case):
    def seek(self, *arguments):
        result = run("seek", "--json", "--count", 1000, *arguments)
        return json.loads(result.stdout), result

    def test_lands_on_the_right_keyframe(self):
        for name in ("avc_bframes_aac", "h263_mp3"):
            expected = Expected(name)
            for target in range(1, expected.keyframes[-1][0] + 200, 233):
                # Backward from before the first keyframe: the start of the tags.
                backward = [(0, 9, 0), *(k for k in expected.keyframes if k[0] <= target)][-1:]
                forward = [k for k in expected.keyframes if k[0] >= target][:1]
                for mode, place in (("backward", backward), ("forward", forward), ("auto", forward)):
                    with self.subTest(name=name, target=target, mode=mode):
                        self.check_landing(expected, place, *self.seek("--mode", mode, sample(name), target / 1000))

    def check_landing(self, expected, place, found, result):
        if not place:
            self.assertEqual((result.returncode, found["landed"]), (1, None))
            return
        [(time_ms, position, number)] = place
        self.assertEqual((result.returncode, result.stderr), (0, ""))
        self.assertEqual(found["landed"], {"time_ms": time_ms, "position": position, "keyframe": True})
        self.assertEqual(frames_of(found["frames"]), expected.frames[number:])

    def test_relative_goes_from_the_last_picture_played(self):
        expected = Expected("avc_aac")
        current = [f for f in expected.frames[:150] if f[0] == "video"][-1][1]
        earlier = max(k[0] for k in expected.keyframes if k[0] <= current - 300)
        for text, time_ms, keyframe in (("-0.3", earlier, True), ("0", current, False)):
            found, _ = self.seek("--play", 150, "--relative", sample("avc_aac"), text)
            self.assertEqual((found["landed"]["time_ms"], found["landed"]["keyframe"]), (time_ms, keyframe))
        self.assertEqual(frames_of(found["frames"]), expected.frames[150:])

    def test_times(self):
        for text, time_ms in (("1.0226", 1023), ("1.9996", 2000), ("0:01.5", 1500), ("0:0:1", 1000),
                              ("00:00:01.25", 1250), ("+1", 1000), ("90", 90000), ("1:30", 90000),
                              ("01:00:02.003", 3602003)):
            self.assertEqual(self.seek(sample("avc_aac"), text)[0]["time_ms"], time_ms, text)

    def test_misses_in_words(self):
        last_keyframe = Expected("avc_aac").keyframes[-1]
        behind = (last_keyframe[0] + 10) / 1000
        for arguments, miss, words in (
                (["99"], "beyond_end", "seek to 0:01:39.000 missed: that is beyond the end at 0:00:0"),
                (["99", "--end-on-miss"], "beyond_end", "code -2003, line 3161"),
                (["--mode", "forward", behind], "no_keyframe", "no keyframe lies at or after it")):
            with self.subTest(arguments):
                found, result = self.seek(sample("avc_aac"), *arguments)
                self.assertEqual((result.returncode, found["landed"], found["miss"]), (1, None, miss))
                self.assertIn(words, result.stderr)
                size = Expected("avc_aac").size
                self.assertEqual(found["position"] == size, "--end-on-miss" in arguments)
        found, result = self.seek(sample("avc_aac"), "--mode", "forward", "--retry-backward", behind)
        self.assertEqual((result.returncode, found["landed"]["position"]), (0, last_keyframe[1]))

    def test_text(self):
        time_ms, position, _ = Expected("avc_aac").keyframes[1]
        text = self.succeed("seek", "--count", 2, "--mode", "forward", sample("avc_aac"), time_ms / 1000)
        self.assertRegex(text, rf"landed +0:00:0\d\.\d{{3}}\nkeyframe +yes\nposition +byte {position}\n")
        self.assertEqual(len(text.splitlines()), 6)


class Failures(Case):
    def test_unusable_files(self):
        header = b"FLV\x01\x05\x00\x00\x00\x09"
        folder = self.write("any", b"").parent
        for path, words in (
                (folder / "missing.flv", "No such file or directory (code -5, line 2386)"),
                (folder, "Is a directory (code -5, line 2386)"),
                (self.write("empty.flv", b""), "the file is empty (code -1004, line 2423)"),
                (self.write("tiny.flv", b"FLV\x01\x05"), "damaged or cut short (the file has 5 bytes) (code -1004"),
                (self.write("text.flv", b"no video here\n" * 9), "this is not an FLV file (code -1004, line 2423)"),
                (self.write("bare.flv", header), "damaged or cut short (the file has 9 bytes)"),
                (self.write("header.flv", header + bytes(4)), "nor an audio stream was found (code -1002, line 2458)"),
                ("/dev/null", "a pipe or device")):
            for arguments in (["info"], ["info", "--json"], ["frames"], ["frames", "--json"], ["seek", "--json"],
                              ["check"], ["check", "--json"], ["extract"], ["plot"]):
                with self.subTest(path=path, arguments=arguments):
                    more = {"seek": ["1"], "extract": ["-o", folder / "out"], "plot": ["-o", folder / "out"]}
                    result = run(*arguments, path, *more.get(arguments[0], []))
                    self.assertEqual(result.returncode, 1)
                    self.assertTrue(result.stderr.startswith(f"flvdmx: {path}: "), result.stderr)
                    self.assertIn(words, result.stderr)
                    self.assertEqual(len(result.stderr.splitlines()), 1)
                    if arguments[0] in ("info", "check") and arguments[1:]:
                        [entry] = json.loads(result.stdout)["files"]
                        self.assertTrue(entry["file"] == str(path) and entry["error"]["code"] < 0)
                    else:
                        self.assertEqual(result.stdout, "")

    def test_one_bad_file_among_good_ones(self):
        result = run("info", "--json", sample("aac_only"), "missing.flv", sample("avc_only"))
        self.assertEqual((result.returncode, len(result.stderr.splitlines())), (1, 1))
        self.assertEqual(["error" in f for f in json.loads(result.stdout)["files"]], [False, True, False])

    def test_any_cut_ends_cleanly(self):
        data = sample_bytes("avc_aac_index")
        for cut in (*range(14, 1500, 371), *range(1500, len(data), 5999)):
            result = run("frames", "--json", self.write("cut.flv", data[:cut]))
            self.assertIn(result.returncode, (0, 1))
            self.assertRegex(result.stderr, r"\Aflvdmx: .*cut\.flv: ", cut)
            frames = json_frames(result.stdout)
            self.assertEqual(frames, Expected("avc_aac_index").frames[:len(frames)])

    def test_stream_that_is_not_there(self):
        for arguments in ([], ["--separate-audio"]):
            result = run("frames", "--stream", "video", sample("mp3_only"), *arguments)
            self.assertEqual((result.returncode, result.stdout), (1, ""))
            self.assertIn("the file has no video stream", result.stderr)

    def test_streams_closed_or_full(self):
        out = self.write("any", b"").parent / "out"
        for closed in ("2>&-", "2>/dev/full", ">&- 2>&-"):
            command = f'"$0" extract "$1" -o "$2" {closed}; a=$?; "$0" info missing.flv {closed}; echo $a $?'
            status = subprocess.run(["sh", "-c", command, TOOL, sample("pcm_only"), out], stdout=subprocess.PIPE, text=True)
            self.assertEqual(status.stdout, "0 1\n", closed)
            self.assertNotIn(b"flvdmx", out.read_bytes())  # the note about raw streams

    def test_file_that_another_was_appended_to(self):
        data = sample_bytes("avc_aac")
        header, tags = split_tags(data)
        path = self.write("two.flv", data + b"".join(tags[:60]))
        frames = json_frames(self.succeed("frames", "--json", path))
        again = [f for f in Expected("avc_aac").frames if f[1] <= max(f[1] for f in frames[-40:])]
        self.assertEqual(frames[:172], Expected("avc_aac").frames)
        self.assertEqual(frames[172:], again[:len(frames) - 172])

    def test_wrong_use(self):
        file = sample("avc_aac")
        for arguments in ([], ["play", file], ["info"], ["info", "--count", "1", file], ["frames"],
                          ["frames", file, file], ["frames", "--stream", "subtitles", file],
                          ["check", "--jump", "nan", file], ["extract", "-o", "", file],
                          ["frames", "--count", "-1", file],
                          ["frames", "--count", "x", file], ["frames", "--timeout", "1", file],
                          ["frames", "--follow", "--timeout", "-1", file], ["frames", "--from", "soon", file],
                          ["seek", file], ["seek", file, "-1"], ["seek", file, "1:60"], ["seek", file, "1:2:3:4"],
                          ["seek", file, "1."], ["seek", file, ""], ["seek", file, "3000000"],
                          ["seek", file, "99999999999999999999"], ["seek", "--mode", "up", file, "1"],
                          ["extract", file], ["extract", file, "-o", "x", "--stream", "all"], ["plot", file], ["check"],
                          ["check", "--jobs", "0", file], ["check", "--jump", "-1", file]):
            with self.subTest(arguments):
                result = run(*arguments)
                self.assertEqual((result.returncode, result.stdout), (2, ""))
                self.assertRegex(result.stderr, r"\Aflvdmx: .+\nTry 'flvdmx .*--help'\.\n\Z")

    def test_help_and_version(self):
        self.assertRegex(self.succeed("--version"), r"\Aflvdmx \d+\.\d+\.\d+\n\Z")
        for arguments in ([], *([c] for c in ("info", "frames", "seek", "extract", "check", "plot"))):
            self.assertIn("Usage: flvdmx", self.succeed(*arguments, "--help"))


class Output(Case):
    def test_closed_pipe_ends_quietly(self):
        for arguments in (["frames"], ["frames", "--json"], ["info"], ["frames", "--follow", "--timeout", "30"]):
            reading, writing = os.pipe()
            os.close(reading)
            with self.subTest(arguments):
                result = subprocess.run([TOOL, *arguments, sample("avc_aac")], stdout=writing, stderr=subprocess.PIPE,
                                        timeout=20)
                self.assertEqual((result.returncode, result.stderr), (0, b""))
            os.close(writing)

    def test_full_disk_is_told(self):
        with open("/dev/full", "wb") as full:
            result = subprocess.run([TOOL, "frames", sample("avc_aac")], stdout=full, stderr=subprocess.PIPE, text=True)
        self.assertEqual((result.returncode, result.stderr), (1, "flvdmx: cannot write: No space left on device\n"))

    def test_progress_only_on_a_terminal(self):
        terminal, end = pty.openpty()
        result = subprocess.run([TOOL, "frames", sample("avc_aac")], stdout=subprocess.PIPE, stderr=end)
        os.close(end)
        self.assertRegex(self.shown(terminal), rb"\A\r\x1b\[K1 frames, 0:00:00\.\d{3}.*\r\x1b\[K\Z")
        self.assertEqual(len(result.stdout.splitlines()), len(Expected("avc_aac").frames))


class Follow(Case):
    """A thread plays the writer; the file starts empty and grows in uneven steps."""

    def follow(self, data, *arguments, gate_at=None):
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder) / "growing.flv"
            path.touch()
            gate = threading.Event()
            writer = threading.Thread(target=self.write, args=(path, data, gate_at, gate))
            with subprocess.Popen([TOOL, "frames", "--json", "--follow", path, *arguments], stdout=subprocess.PIPE,
                                  stderr=subprocess.PIPE, text=True) as process:
                writer.start()
                lines = [process.stdout.readline()]
                gate.set()  # the rest is written only after the first frame has been seen
                lines += process.stdout.readlines()
                stderr = process.stderr.read()
            writer.join()
        return json_frames("".join(lines)), process.returncode, stderr

    @staticmethod
    def write(path, data, gate_at, gate):
        rng, position = random.Random(7), 0
        with open(path, "ab", buffering=0) as file:
            while position < len(data):
                if gate_at is not None and position >= gate_at and not gate.wait(10):
                    return
                step = rng.choice((1, 13, 700, 2500))
                file.write(data[position:position + step])
                position += step
                time.sleep(0.01)

    def follow_all(self, calls):
        """Runs the calls side by side, since each one waits for a timeout that a busy machine must not reach early."""
        with concurrent.futures.ThreadPoolExecutor(len(calls)) as pool:
            return list(pool.map(lambda call: self.follow(*call[0], **call[1]), calls))

    def test_growing_file(self):
        cases = (("avc_aac", []), ("avc_aac", ["--separate-audio"]), ("h263_mp3", []), ("aac_only", []),
                 ("avc_aac_index", ["--separate-audio"]))
        data = {name: sample_bytes(name) for name, _ in cases}
        results = self.follow_all([((data[name], "--timeout", "4", *arguments), {"gate_at": len(data[name]) // 2})
                                   for name, arguments in cases])
        for (name, arguments), (frames, code, stderr) in zip(cases, results):
            with self.subTest(name=name, arguments=arguments):
                self.assertEqual((code, stderr), (0, ""))
                wanted = [(p["kind"], int(p["dts"]), int(p["size"]), p["crc"]) for p in Expected(name).packets]
                for kind in ("video", "audio"):
                    self.assertEqual([f for f in frames if f[0] == kind], [f for f in wanted if f[0] == kind])

    def test_ends_at_the_wanted_frame_without_waiting(self):
        data = sample_bytes("avc_aac")
        for arguments, last in ((["--count", "9"], None), (["--to", "0.3"], 300)):
            start = time.monotonic()
            frames, code, _ = self.follow(data, "--timeout", "20", *arguments)
            self.assertEqual(code, 0)
            self.assertEqual(frames, Expected("avc_aac").frames[:9] if last is None else
                             [f for f in Expected("avc_aac").frames if f[1] <= last])
            self.assertLess(time.monotonic() - start, 15)

    def test_start_is_searched_in_what_is_there(self):
        arguments = ("frames", "--json", "--from", "2", sample("avc_aac_index"))
        self.assertEqual(self.succeed(*arguments, "--follow", "--timeout", "1"), self.succeed(*arguments))

    def test_writer_that_stops(self):
        data = sample_bytes("avc_aac")
        cases = ((len(data) // 2 + 3, 0, r"warning: the last \d+ bytes hold no whole frame"),
                 (8, 1, "damaged or cut short"), (30, 1, "stream was found|ends too early"))
        results = self.follow_all([((data[:size], "--timeout", "4"), {}) for size, _, _ in cases])
        for (size, code, words), (frames, found_code, stderr) in zip(cases, results):
            with self.subTest(size):
                self.assertEqual(found_code, code)
                self.assertRegex(stderr, words)
                self.assertEqual(frames, Expected("avc_aac").frames[:len(frames)])


if __name__ == "__main__":
    unittest.main()
