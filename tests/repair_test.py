"""`flvdmx repair`, `index` and `cut`: new files have the same frames, and `check` finds nothing wrong with them."""
import os
import random

from flv import retag, split_tags
from tool_test import DATA, SAMPLES, Case, json_frames, run, sample, sample_bytes

STEP = int(os.environ.get("FLVDMX_SAMPLE", "1"))  # of the damaged copies
HEADER, TAGS = split_tags(sample_bytes("avc_aac"))


def at(tag, time):
    """The tag with another timestamp."""
    return tag[:4] + (time & 0xFFFFFF).to_bytes(3, "big") + bytes([time >> 24]) + tag[8:]


def time_of(tag):
    return int.from_bytes(tag[4:7], "big") | tag[7] << 24


def late_config(kind):
    """A stream that starts with frames; its configuration follows after damage."""
    config = next(tag for tag in TAGS if tag[0] == kind)
    tags = [tag for tag in TAGS if tag is not config]
    return HEADER + b"".join(tags[:60] + [b"\xee" * 100] + tags[60:130] + [config] + tags[130:])


class Rewritten(Case):
    def rewrite(self, command, path, *options, out=None, stderr="(?s:.*)"):
        """The new file, which must not have any findings."""
        out = out or path.parent / "out.flv"
        self.tool(command, path, "-o", out, "--force", *options, stderr=stderr)
        self.tool("check", out)
        tags = split_tags(out.read_bytes())[1][1:]
        self.assertEqual(time_of(tags[0]), min(map(time_of, tags)))  # a configuration is not later than any frame
        return out

    def frames(self, path):
        return json_frames(run("frames", "--json", path).stdout)

    def assertSamePayloads(self, new, old):
        self.assertEqual([(f[0], f[2], f[3]) for f in self.frames(new)], [(f[0], f[2], f[3]) for f in self.frames(old)])


class Repair(Rewritten):
    def test_every_sample(self):
        for name in SAMPLES:
            with self.subTest(name=name):
                out = self.rewrite("repair", self.write("in.flv", sample_bytes(name)))
                self.assertEqual(self.frames(out), self.frames(sample(name)))

    def test_damaged_copies(self):
        """Bytes are changed, inserted and removed; from a copy that cannot be opened, nothing is written."""
        for seed in range(0, 200, STEP):
            random.seed(seed)
            data = bytearray(sample_bytes(random.choice(SAMPLES)))
            for _ in range(random.randint(1, 6)):
                place, size = random.randrange(400, len(data)), random.randint(1, 300)
                data[place:place + random.choice((0, size))] = random.randbytes(random.choice((0, size)))
            path = self.write("in.flv", bytes(data))
            with self.subTest(seed=seed):
                if run("frames", path).returncode == 0:
                    self.assertSamePayloads(self.rewrite("repair", path), path)

    def test_times(self):
        """A recording that restarts, one with a gap, a single wrong time, two slides, and a small step back (jitter)."""
        media = [tag for tag in TAGS if tag[0] != 18]
        last = time_of(media[-1])
        slide = next(tag for tag in TAGS if tag[0] == 9 and tag[12] == 1)
        for name, tags, duration in (
                ("restart", TAGS + media, 2 * last + 23),
                ("gap", TAGS + [at(tag, time_of(tag) + 100_000) for tag in media], 2 * last + 23),
                ("wrong", TAGS[:50] + [at(TAGS[50], 900_000)] + TAGS[51:], last),
                ("wraps", [TAGS[0]] + [at(tag, (time_of(tag) - 1000) % 2**32) for tag in media], last),
                ("slides", TAGS[:2] + [slide, at(slide, 15_000)], 15_000),
                ("video first", TAGS[:3] + [TAGS[4], TAGS[3]] + TAGS[5:], last),
                ("jitter", TAGS[:50] + [at(TAGS[50], time_of(TAGS[50]) - 200)] + TAGS[51:], last)):
            path = self.write("in.flv", HEADER + b"".join(tags))
            with self.subTest(name=name):
                out = self.rewrite("repair", path)
                self.assertSamePayloads(out, path)
                self.assertAlmostEqual(self.frames(out)[-1][1], duration, delta=80)
        kept = path.parent / "kept.flv"
        self.tool("repair", "--keep-times", path, "-o", kept)
        self.assertEqual(self.frames(kept), self.frames(path))

    def test_metadata_and_configurations(self):
        """Properties are kept unless they are wrong now; each frame has its configuration."""
        script = (b"\2\0\x0d@setDataFrame\2\0\x0aonMetaData\x08\0\0\0\4\0\5title\2\0\1T\0\4cues\x0a\0\0\0\1\3\0\1a\5\0\0\x09"
                  b"\0\3big\x0c\0\x90\0\0" + bytes(9 << 20) +  # too large to leave room for the index
                  b"\0\x08datasize\5\0\x08duration\0\x7f\xef" + bytes(6) + b"\0\0\x09")
        config = next(tag for tag in TAGS if tag[0] == 9)
        changed = retag(config, config[11:14] + bytes(2) + config[16:17] + b"\x4d" + config[18:-4])
        cue = retag(TAGS[0], b"\2\0\x0aonCuePoint\5")
        tags = [retag(TAGS[0], script)] + TAGS[1:60] + [cue] + TAGS[60:90] + [changed] + TAGS[90:]
        out = self.rewrite("repair", self.write("in.flv", HEADER + b"".join(tags)))
        data = out.read_bytes()
        self.assertIn(b"\0\5title\2\0\1T\0\4cues\x0a\0\0\0\1\3\0\1a\5\0\0\x09", data)
        counts = {name: data.count(name) for name in (b"duration", b"onCuePoint", b"datasize", b"@setDataFrame", b"big")}
        self.assertEqual(list(counts.values()), [1, 1, 0, 0, 0], counts)
        for kind in (8, 9):  # a configuration comes before the first frame that needs it
            self.assertEqual([tag[11:] for tag in split_tags(data)[1] if tag[0] == kind],
                             [tag[11:] for tag in tags if tag[0] == kind and tag[12] != 2])  # 2: end of sequence

    def test_what_misleads(self):
        """A damaged configuration before the first frame, and a size that ends where a later tag starts."""
        bad = retag(TAGS[1], TAGS[1][11:16] + b"\0")
        long = TAGS[40][:1] + (sum(map(len, TAGS[40:43])) - 15).to_bytes(3, "big") + TAGS[40][4:]
        for tags in (TAGS[:2] + [bad] + TAGS[2:], TAGS[:40] + [long] + TAGS[41:]):
            path = self.write("in.flv", HEADER + b"".join(tags))
            self.assertSamePayloads(self.rewrite("repair", path), path)

    def test_late_streams(self):
        """A stream or configuration that comes after the tags that players search is found in the new file."""
        media = [at(tag, time_of(tag) + 2600 * i) for i in range(3) for tag in TAGS[1:] if tag[0] == 9 or i == 2]
        out = self.rewrite("repair", self.write("in.flv", HEADER + b"".join(media)))
        self.assertEqual(sum(f[0] == "audio" for f in self.frames(out)), 109)
        for kind in (8, 9):
            path = self.write("in.flv", late_config(kind))
            self.assertSamePayloads(self.rewrite("repair", path), sample("avc_aac"))
        none = self.write("in.flv", HEADER + b"".join(tag for tag in TAGS if tag[0] != 8 or tag[12] != 0))
        self.tool("repair", none, "-o", none.parent / "x", stderr=".*x: warning: the audio .* cannot be decoded\n")

    def test_output(self):
        """Only a complete file has the requested name."""
        path = self.write("in.flv", sample_bytes("avc_aac"))
        old = path.parent / "old.flv"
        old.write_bytes(b"old")
        for options, words in (((path, "-o", old), "exists"), ((path, "-o", path, "--force"), "is the input file"),
                               ((path, "-o", "/dev/full"), "No space left"),
                               ((self.write("x", b"FLV"), "-o", old, "--force"), "damaged or cut short")):
            self.tool("repair", *options, code=1, stderr=f".*{words}.*\n")
        self.assertRegex(self.tool("repair", "--dry-run", path), "^would write: 63 video frames and 109 audio")
        self.assertEqual((old.read_bytes(), sorted(os.listdir(path.parent))), (b"old", ["in.flv", "old.flv"]))
        self.assertEqual(path.read_bytes(), sample_bytes("avc_aac"))
        link = path.parent / "link.flv"
        link.symlink_to("old.flv")
        self.rewrite("repair", path, out=link)
        self.assertTrue(link.is_symlink() and old.read_bytes().startswith(b"FLV"))


class IndexAndCut(Rewritten):
    def test_index(self):
        tags = [tag[:8] + b"\0\0\5" + tag[11:] for tag in TAGS]  # StreamID
        out = self.rewrite("index", self.write("in.flv", HEADER + b"".join(tags)))
        self.assertEqual(split_tags(out.read_bytes())[1][1:], tags[1:])
        self.assertIn("3 entries", self.tool("info", out))

    def test_cut(self):
        """Consecutive parts contain every frame once."""
        whole = self.frames(sample("avc_aac_index"))
        path = self.write("in.flv", sample_bytes("avc_aac_index"))
        for times, end in ((("--from", "0", "--to", "1"), 1223), (("--from", "1.3"), 10_000), (("--to", "0.5"), 823),
                           (("--to", "0.423"), 423)):
            out = self.rewrite("cut", path, "--keep-times", *times)
            first = min(time_of(tag) for tag in split_tags(out.read_bytes())[1][1:])
            kept = [(kind, time + first, *rest) for kind, time, *rest in self.frames(out)]
            self.assertEqual(sorted(kept), sorted((k, t, *r) for k, t, *r in whole if first <= t < end))
            moved = self.frames(self.rewrite("cut", path, *times))
            self.assertEqual([f[1] for f in moved], [f[1] - first for f in kept])

    def test_refused(self):
        """Times of which one file has several, and damage, are the business of `repair`."""
        restart = HEADER + b"".join(TAGS + TAGS[1:])
        for command, data in (("cut", restart), ("cut", late_config(9)), ("index", restart), ("index", (DATA / "damaged.flv").read_bytes())):
            path = self.write("in.flv", data)
            self.tool(command, path, "-o", path.parent / "x", code=1, stderr=".*use 'flvdmx repair'( first)?\n")
