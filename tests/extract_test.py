#!/usr/bin/env python3
"""`flvdmx extract`: what comes out has once been decoded to the same pictures and sound by an independent decoder."""
import hashlib
import os
import pty
import subprocess
import time
import unittest

from tool_test import DATA, SAMPLES, TOOL, Case, Expected, run, sample, split_tags

HASHES = {(name, kind): sha for name, kind, sha in
          (line.split() for line in (DATA / "expected" / "extract.txt").read_text().splitlines())}
START = b"\0\0\0\1"


def retag(tag, payload):
    """The tag with another payload and a back-pointer to match."""
    return tag[:1] + len(payload).to_bytes(3, "big") + tag[4:11] + payload + (11 + len(payload)).to_bytes(4, "big")


def nal_units(frame):
    units = []
    while frame:
        size = int.from_bytes(frame[:4], "big")
        units, frame = [*units, frame[4:4 + size]], frame[4 + size:]
    return units


class Extract(Case):
    def extract(self, data, *arguments, stderr="", code=0):
        path = self.write("in.flv", data)
        result = run("extract", path, "-o", path.parent / "out", *arguments)
        self.assertEqual(result.returncode, code, result.stderr)
        self.assertRegex(result.stderr, stderr or r"\A\Z")
        return (path.parent / "out").read_bytes() if code == 0 else path.parent / "out"

    def test_every_sample(self):
        for name in SAMPLES:
            kinds = list(Expected(name).streams)
            extensions = {k: {"h264": "h264", "aac": "aac", "mp3": "mp3"}.get(s["codec"], k)
                          for k, s in Expected(name).streams.items()}
            folder = self.write("base", b"").parent
            for out, files in ((folder / "a", {k: f"a.{e}" if len(kinds) > 1 else "a" for k, e in extensions.items()}),
                               (folder, {k: f"{name}.{e}" for k, e in extensions.items()})):
                with self.subTest(name=name, out=out):
                    result = run("extract", sample(name), "-o", out)
                    self.assertEqual((result.returncode, result.stdout), (0, ""))
                    raw = [k for k in kinds if extensions[k] == k]
                    self.assertEqual(result.stderr.count(" is written raw"), len(raw))
                    for kind in kinds:
                        found = hashlib.sha256((folder / files[kind]).read_bytes()).hexdigest()
                        self.assertEqual(found, HASHES[name, kind])

    def test_annexb(self):
        """Rewritten with each size of lengths, with configurations between, and with damaged lengths."""
        header, tags = split_tags((DATA / "avc_only.flv").read_bytes())
        config, frames = tags[1], [t for t in tags[2:] if t[12] == 1]
        record = config[16:-4]
        sps_end = 8 + int.from_bytes(record[6:8], "big")
        pps_size = int.from_bytes(record[sps_end + 1:sps_end + 3], "big")
        sets = START + record[8:sps_end] + START + record[sps_end + 3:sps_end + 3 + pps_size]
        other = record[:sps_end - 1] + bytes([record[sps_end - 1] ^ 1]) + record[sps_end:]  # still a whole set
        other_sets = sets.replace(record[8:sps_end], other[8:sps_end])
        keys = [i for i, t in enumerate(frames) if t[11] >> 4 == 1]

        def frame(tag, size, damage=b""):
            units = [u[:255] if size == 1 else u for u in nal_units(tag[16:-4])]
            return (retag(tag, tag[11:16] + b"".join(len(u).to_bytes(size, "big") + u for u in units) + damage),
                    b"".join(START + u for u in units))

        def configure(data):
            return retag(config, config[11:16] + data)

        for size, changes, damage in ((1, {}, {}), (2, {}, {}), (4, {keys[1]: record}, {}), (2, {keys[2]: other}, {}),
                                      (4, {keys[1] - 2: other, keys[2]: record}, {}), (4, {5: b"\1broken"}, {}),
                                      (4, {}, {3: b"\xff\xff\xff\xff!", 9: b"\0\0"}), (2, {}, {0: b"\0\0\0\2?"}),
                                      (1, {}, {1: b"\0\0\0\1"})):
            with self.subTest(size=size, changes=changes, damage=damage):
                made, wanted, current, pending = [configure(record[:4] + bytes([252 | size - 1]) + record[5:])], b"", 0, sets
                for i, tag in enumerate(frames):
                    if i in changes:
                        made.append(configure(changes[i][:4] + bytes([252 | size - 1]) + changes[i][5:]))
                        if changes[i] == other or current == other:
                            current, pending = changes[i], other_sets if changes[i] == other else sets
                    if pending and (i in keys or i == 0):
                        wanted, pending = wanted + pending, b""
                    out, stream = frame(tag, size, damage.get(i, b""))
                    made, wanted = [*made, out], wanted + stream
                place = sum(map(len, [header, *made[:1 + min(damage, default=0)]]))
                stderr = (rf"warning: NAL units that do not fit their frame in {len(damage)} frames, the first at byte {place}, "
                          if damage else "configuration is damaged; the one before" if 5 in changes else "")
                self.assertEqual(self.extract(header + b"".join(made), stderr=stderr), wanted)

    def test_refused(self):
        data = (DATA / "aac_only.flv").read_bytes()
        config = data.index(b"\xaf\0") + 2
        for bits, words in ((0x2A88, "object type 21 cannot"),  # the core of HE-AAC (0xF808 | 0x0140, "object type 42 cannot"),
                            (0x1788, "explicit sampling frequency"), (0x1688, "frequency index 13"),
                            (0x1280, "configuration 0 cannot")):
            with self.subTest(bits):
                changed = data[:config] + bits.to_bytes(2, "big") + data[config + 2:]
                self.assertFalse(self.extract(changed, stderr=words, code=1).exists())

    def test_output_that_cannot_be_written(self):
        copy = self.write("copy.flv", (DATA / "aac_only.flv").read_bytes())
        for command in ("extract", "plot"):
            for out, words in ((copy.parent / "none" / "out", "none/out: No such file"), ("/dev/full", "No space left"),
                               (copy, "is the file to be read")):
                result = run(command, copy, "-o", out)
                self.assertEqual((result.returncode, len(result.stderr.splitlines())), (1, 1))
                self.assertIn(words, result.stderr)
        self.assertEqual(copy.read_bytes(), (DATA / "aac_only.flv").read_bytes())
        self.assertEqual(run("extract", "--stream", "video", copy, "-o", copy.parent / "x").returncode, 1)

    def test_bar_appears_after_a_second(self):
        folder = self.write("any", b"").parent
        os.mkfifo(folder / "out")  # nobody takes what is written until a bar could have come
        terminal, end = pty.openpty()
        with subprocess.Popen([TOOL, "extract", sample("aac_only"), "-o", folder / "out"], stderr=end) as process:
            os.close(end)
            time.sleep(3)
            self.assertEqual(hashlib.sha256((folder / "out").read_bytes()).hexdigest(), HASHES["aac_only", "audio"])
            shown = self.shown(terminal)
        self.assertEqual(process.returncode, 0)
        self.assertRegex(shown, rb"\A\r\x1b\[K\S+aac_only.flv \[#* *\] +\d+%.*\r\x1b\[K\Z")


if __name__ == "__main__":
    unittest.main()
