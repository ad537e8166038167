"""`flvdmx extract`: hashes of output that an independent decoder has decoded to the same pictures and samples."""
import fcntl
import hashlib
import os
import pty
import resource
import signal
import struct
import subprocess
import termios
import time
import wave

from flv import retag, split_tags
from tool_test import DATA, SAMPLES, TOOL, WARNINGS, Case, Expected, sample, sample_bytes

HASHES = {tuple(names): sha for *names, sha in map(str.split, (DATA / "expected" / "extract.txt").open())}
START = b"\0\0\0\1"


def nal_units(frame):
    while frame:
        end = 4 + int.from_bytes(frame[:4], "big")
        yield frame[4:end]
        frame = frame[end:]


def sha(path):
    return hashlib.sha256(path.read_bytes()).hexdigest()


class Extract(Case):
    def extract(self, data, **outcome):
        path = self.write("in.flv", data)
        self.tool("extract", path, "-o", path.parent / "out", **outcome)
        return path.parent / "out"

    @staticmethod
    def content(path):
        """The hash to compare with HASHES; for WAV, that of the samples only."""
        data = path.read_bytes()
        return hashlib.sha256(data[44:] if data.startswith(b"RIFF") else data).hexdigest()

    def test_every_sample(self):
        for name in SAMPLES:
            codecs = {kind: stream["codec"] for kind, stream in Expected(name).streams.items()}
            known = {"h264": "h264", "aac": "aac", "mp3": "mp3", "pcm_s16le": "wav"}
            extensions = {kind: known.get(codec, kind) for kind, codec in codecs.items()}
            folder = self.write("base", b"").parent
            for out, base in (("a", "a.{}" if len(codecs) > 1 else "a"), (".", name + ".{}")):
                with self.subTest(name=name, out=out):
                    raw = ".* is written raw.*\n" * sum(extensions[kind] == kind for kind in codecs)
                    told = WARNINGS.get(name, raw)
                    said = self.tool("extract", sample(name), "-o", folder / out, stderr=told)
                    for kind, extension in extensions.items():
                        path = folder / base.format(extension)
                        self.assertEqual(self.content(path), HASHES[name, kind])
                        self.assertIn(f"{path}: {len(Expected(name).of[kind])} frames, {path.stat().st_size} b", said)

    def test_annexb(self):
        """Files with each size of the length fields, with configurations in between, and with damaged lengths."""
        header, (_, config, *tags) = split_tags(sample_bytes("avc_only"))
        frames, record = [tag for tag in tags if tag[12] == 1], config[16:-4]
        sps_end = 8 + int.from_bytes(record[6:8], "big")
        sps, pps = record[8:sps_end], record[sps_end + 3:][:int.from_bytes(record[sps_end + 1:sps_end + 3], "big")]
        other_sps = sps[:-1] + bytes([sps[-1] ^ 1])  # still a complete set
        other = record.replace(sps, other_sps)
        sets = {record: START + sps + START + pps, other: START + other_sps + START + pps}
        keys = [i for i, tag in enumerate(frames) if tag[11] >> 4 == 1]
        for size, changes, damage in ((1, {}, {}), (2, {}, {}), (4, {keys[1]: record}, {}), (2, {keys[2]: other}, {}),
                                      (4, {keys[1] - 2: other, keys[2]: record}, {}), (4, {5: b"\1broken"}, {}),
                                      (4, {}, {3: b"\xff\xff\xff\xff!", 9: b"\0\0"}), (2, {}, {0: b"\0\0\0\2?"}),
                                      (1, {}, {1: b"\0\0\0\1"})):
            with self.subTest(size=size, changes=changes, damage=damage):
                made, wanted, current, pending = [header], b"", None, b""
                for i, tag in enumerate(frames):
                    new = record if i == 0 else changes.get(i)
                    if new:
                        made.append(retag(config, config[11:16] + new[:4] + bytes([252 | size - 1]) + new[5:]))
                    if new in sets and new != current:
                        current, pending = new, sets[new]
                    if i in keys:
                        wanted, pending = wanted + pending, b""
                    if i == min(damage, default=-1):
                        place = sum(map(len, made))
                    units = [unit[:255] if size == 1 else unit for unit in nal_units(tag[16:-4])]
                    lengths = b"".join(len(unit).to_bytes(size, "big") + unit for unit in units)
                    made.append(retag(tag, tag[11:16] + lengths + damage.get(i, b"")))
                    wanted += b"".join(START + unit for unit in units)
                stderr = ".*configuration is damaged; the previous configuration.*\n" if 5 in changes else ""
                if damage:
                    stderr = f".*NAL units that exceed their frame in {len(damage)} frames?, .* at byte {place}\n"
                self.assertEqual(self.extract(b"".join(made), stderr=stderr).read_bytes(), wanted)

    def test_rejected(self):
        data = sample_bytes("aac_only")
        config = data.index(b"\xaf\0") + 2
        for bits, words in ((0x2A88, "object type 21 cannot"),  # the core of HE-AAC
                            (0x1788, "explicit sampling frequency"), (0x1688, "frequency index 13"),
                            (0x1280, "configuration 0 cannot")):
            changed = data[:config] + bits.to_bytes(2, "big") + data[config + 2:]
            self.assertFalse(self.extract(changed, code=1, stderr=f".*{words}.*\n").exists())

    def test_output_that_cannot_be_written(self):
        copy = self.write("copy.flv", sample_bytes("aac_only"))
        for command in ("extract", "plot"):
            for out, words in ((copy.parent / "none" / "out", "none/out: No such file"), ("/dev/full", "No space left"),
                               (copy, "is the input file")):
                self.tool(command, copy, "-o", out, code=1, stderr=f".*{words}.*\n")
        self.assertEqual(copy.read_bytes(), sample_bytes("aac_only"))

        def fill_the_disk():
            signal.signal(signal.SIGXFSZ, signal.SIG_IGN)
            resource.setrlimit(resource.RLIMIT_FSIZE, (len(sample_bytes("pcm_only")) - 300,) * 2)

        wav = copy.parent / "x.wav"  # its header is written last
        self.tool("extract", sample("pcm_only"), "-o", wav, code=1, stderr=".*too large\n", preexec_fn=fill_the_disk)
        self.assertFalse(wav.exists())
        self.tool("extract", "--stream", "video", copy, "-o", copy.parent / "x", code=1, stderr=".+\n")

    def test_files_that_exist_and_streams_without_frames(self):
        header, tags = split_tags(sample_bytes("avc_aac"))
        path = self.write("in.flv", header + b"".join(tag for tag in tags if tag[0] != 9 or tag[12] == 0))
        (path.parent / "out.aac").write_bytes(b"mine")
        self.tool("extract", path, "-o", path.parent / "out", code=1, stderr=".*out.aac exists: use --force.*\n")
        self.assertEqual((path.parent / "out.aac").read_bytes(), b"mine")
        said = self.tool("extract", "--force", path, "-o", path.parent / "out",
                         stderr=".*note: there are no video frames to write: .*out.h264 is not created\n")
        self.assertIn("out.aac: 109 frames", said)
        self.tool("extract", "--stream", "video", path, "-o", path.parent / "out", code=1, stderr=".*no video frames.*\n")
        self.assertFalse((path.parent / "out.h264").exists())

    def test_standard_output_and_wav(self):
        data = subprocess.run([TOOL, "extract", sample("pcm_only"), "-o", "-"], stdout=subprocess.PIPE).stdout
        out = self.write("any", b"").parent / "out.wav"
        self.tool("extract", sample("pcm_only"), "-o", out)
        with wave.open(str(out)) as sound:
            self.assertEqual(sound.getparams()[:3], (1, 2, 11025))
            self.assertEqual(sound.readframes(1 << 20), data[44:])
        self.tool("extract", sample("avc_aac"), "-o", "-", code=1, stderr=".*takes only one stream.*\n")

    def test_nothing_is_left_after_an_interruption(self):
        folder = self.write("any", b"").parent
        os.mkfifo(folder / "out.aac")  # the tool waits for a reader, while the file for the video exists
        with subprocess.Popen([TOOL, "extract", sample("avc_aac"), "-o", folder / "out"]) as process:
            while not list(folder.glob("out.h264.*")):  # its name until it is complete
                time.sleep(0.01)
            process.send_signal(signal.SIGINT)
        self.assertEqual(process.returncode, -signal.SIGINT)
        self.assertEqual([path.name for path in folder.glob("out.*")], ["out.aac"])

    def test_bar_appears_after_a_second_and_fits(self):
        name = "x" * 60 + "é.flv"
        folder = self.write(name, sample_bytes("aac_only")).parent
        os.mkfifo(folder / "out")  # nobody reads the output until a bar should have appeared
        terminal, end = pty.openpty()
        fcntl.ioctl(end, termios.TIOCSWINSZ, struct.pack("HHHH", 24, 60, 0, 0))
        with subprocess.Popen([TOOL, "extract", folder / name, "-o", folder / "out"], stderr=end) as process:
            os.close(end)
            time.sleep(3)
            self.assertEqual(sha(folder / "out"), HASHES["aac_only", "audio"])
            shown = self.shown(terminal)
        self.assertEqual(process.returncode, 0)
        self.assertRegex(shown.decode(), r"\A\r\x1b\[K\S+\.\.\.x+é\.flv \[#* *\] +\d+%.*\r\x1b\[K\Z")
        self.assertTrue(all(len(line) < 60 for line in shown.decode().split("\r\x1b[K")))
