"""`flvdmx extract`: what comes out has once been decoded to the same pictures and sound by an independent decoder."""
import hashlib
import os
import pty
import subprocess
import time

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
        """What HASHES tells: for WAV of the samples alone."""
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
        """Rewritten with each size of lengths, with configurations between, and with damaged lengths."""
        header, (_, config, *tags) = split_tags(sample_bytes("avc_only"))
        frames, record = [tag for tag in tags if tag[12] == 1], config[16:-4]
        sps_end = 8 + int.from_bytes(record[6:8], "big")
        sps, pps = record[8:sps_end], record[sps_end + 3:][:int.from_bytes(record[sps_end + 1:sps_end + 3], "big")]
        other_sps = sps[:-1] + bytes([sps[-1] ^ 1])  # still a whole set
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
                stderr = ".*configuration is damaged; the one before.*\n" if 5 in changes else ""
                if damage:
                    stderr = f".*NAL units that do not fit their frame in {len(damage)} frames?, .* at byte {place}, .*\n"
                self.assertEqual(self.extract(b"".join(made), stderr=stderr).read_bytes(), wanted)

    def test_refused(self):
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
                               (copy, "is the file to be read")):
                self.tool(command, copy, "-o", out, code=1, stderr=f".*{words}.*\n")
        self.assertEqual(copy.read_bytes(), sample_bytes("aac_only"))
        self.tool("extract", "--stream", "video", copy, "-o", copy.parent / "x", code=1, stderr=".+\n")

    def test_bar_appears_after_a_second(self):
        folder = self.write("any", b"").parent
        os.mkfifo(folder / "out")  # nobody takes what is written until a bar could have come
        terminal, end = pty.openpty()
        with subprocess.Popen([TOOL, "extract", sample("aac_only"), "-o", folder / "out"], stderr=end) as process:
            os.close(end)
            time.sleep(3)
            self.assertEqual(sha(folder / "out"), HASHES["aac_only", "audio"])
            shown = self.shown(terminal)
        self.assertEqual(process.returncode, 0)
        self.assertRegex(shown, rb"\A\r\x1b\[K\S+aac_only.flv \[#* *\] +\d+%.*\r\x1b\[K\Z")
