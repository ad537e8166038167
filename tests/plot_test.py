"""`flvdmx plot`: checks what the drawing shows."""
import re
import xml.etree.ElementTree

from flv import split_tags
from tool_test import APART, SAMPLES, Case, Expected, sample_bytes

UNITS = {"bit/s": 1, "kbit/s": 1e3, "Mbit/s": 1e6}
LEFT, WIDTH = 90, 920  # of the diagrams


class Plot(Case):
    def plot(self, name, data, stderr=""):
        path = self.write(name, data)
        self.assertEqual(self.tool("plot", path, "-o", path.parent / "out.svg", stderr=stderr), "")
        text = (path.parent / "out.svg").read_text()
        self.assertNotRegex(text, r"\b(nan|inf)\b")
        return xml.etree.ElementTree.fromstring(text)

    @staticmethod
    def of(root, kind):
        """The texts or paths of a class."""
        return [content for e in root.iter() if e.get("class") == kind and (content := e.text or e.get("d"))]

    def bits(self, root, kind, seconds):
        """The area under a line, by the labels of its axis."""
        ticks = [(float(e.get("y")) - 4, float(e.text)) for e in root.iter() if e.get("class") == "tick left"]
        unit = UNITS[re.search(r"\((.*)\)", self.of(root, "heading")[0])[1]]
        scale = (ticks[1][1] - ticks[0][1]) / (ticks[1][0] - ticks[0][0]) * unit
        steps = [(float(y), float(x)) for y, x in re.findall(r"V([\d.]+)H([\d.]+)", *self.of(root, f"area-{kind}"))]
        starts = [LEFT, *(x for _, x in steps)]
        return sum((y - ticks[0][0]) * scale * (x - start) for (y, x), start in zip(steps, starts)) * seconds / WIDTH

    def test_every_sample(self):
        for name in set(SAMPLES) - {"damaged", "truncated"}:
            data, expected = sample_bytes(name), Expected(name)
            with self.subTest(name):
                root = self.plot(f"{name}.flv", data)
                marks = re.findall(r"M([\d.]+)", "".join(self.of(root, "keyframe")[:1]))
                self.assertEqual(len(marks), len(expected.keyframes))
                for (time_ms, *_), found in zip(expected.keyframes, marks):
                    share = max(time_ms, 0) / expected.last
                    self.assertAlmostEqual(float(found), LEFT + WIDTH * share, delta=0.02 * WIDTH)
                legend, streams = self.of(root, "legend"), len(expected.streams)
                self.assertEqual(legend.count("video") + legend.count("audio"), streams * streams)
                self.assertEqual(len(self.of(root, "heading")), 3 if streams > 1 else 1)
                for kind in expected.streams:
                    code = {"audio": 8, "video": 9}[kind]
                    size = sum(len(tag) - 15 for tag in split_tags(data)[1] if tag[0] == code)
                    self.assertAlmostEqual(self.bits(root, kind, expected.last / 1000) / (8 * size), 1, delta=0.06)

    def test_time_axis_fits_any_length(self):
        header, tags = split_tags(sample_bytes("avc_only"))
        frames = [tag for tag in tags if tag[0] == 9 and tag[12] < 2]
        frames += frames[1:] * 80
        for seconds, first, last in (
                (1, "0.0 s", "1.0 s"), (9, "0 s", "9 s"), (50, "0 s", "50 s"), (300, "0:00", "5:00"),
                (5400, "0:00:00", "1:30:00"), (10800, "0:00:00", "3:00:00"), (2000000, "0:00:00", None)):
            times = [max(i - 1, 0) * seconds * 1000 // (len(frames) - 2) for i in range(len(frames))]
            stamps = [(t & 0xFFFFFF).to_bytes(3, "big") + bytes([t >> 24]) for t in times]
            tags = [tag[:4] + stamp + tag[8:] for tag, stamp in zip(frames, stamps)]
            root = self.plot("long.flv", b"".join([header, *tags]))
            labels = self.of(root, "tick mid")
            self.assertTrue(5 <= len(labels) <= 13, labels)
            self.assertEqual((labels[0], labels[-1]), (first, last or labels[-1]))
            self.assertTrue(10 <= self.of(root, "video")[0].count("H") <= 201)

    def test_interleaving_shows_streams_that_are_apart(self):
        lead = self.of(self.plot("apart.flv", APART), "tick left")[-4:]
        self.assertLessEqual(min(map(float, lead)), -2)  # seconds

    def test_marks_break_the_curves(self):
        header, tags = split_tags(sample_bytes("avc_aac"))
        late = [tag[:4] + (int.from_bytes(tag[4:7], "big") + 9000).to_bytes(3, "big") + tag[7:] for tag in tags[100:]]
        damaged = b"".join([header, *tags[:100], bytes(sum(map(len, tags[100:120]))), *tags[120:]])
        for name, data, kind, ticks, stderr in (
                ("gap", b"".join([header, *tags[:100], *late]), "gap", 11, ""),
                ("damage", damaged, "damage", 2.6, ".*skipped.*\n"),
                ("restart", header + b"".join(tags + tags[1:] + tags[1:]), "jump", 8, "")):
            with self.subTest(name):
                root = self.plot(f"{name}.flv", data, stderr)
                self.assertEqual({c for c in ("gap", "damage", "jump") if len(self.of(root, c)) > 1}, {kind})
                self.assertTrue(all(any("L" in path and path.count("M") > 1 for path in self.of(root, c))
                                    for c in ("video", "audio dots")))
                self.assertLessEqual(float(self.of(root, "tick mid")[-1].split()[0]), ticks)  # of the last one
        lead = [float(y) for y in re.findall(r" (-?[\d.]+)", self.of(root, "lead")[0])]
        self.assertLess(max(lead) - min(lead), 110)  # the height of its diagram is 120

    def test_many_keyframes_do_not_become_a_solid_bar(self):
        header, tags = split_tags(sample_bytes("avc_only"))
        key = next(tag for tag in tags if tag[0] == 9 and tag[11] == 0x17 and tag[12] == 1)
        many = [key[:4] + (i * 1000 & 0xFFFFFF).to_bytes(3, "big") + key[7:] for i in range(7200)]
        root = self.plot("many.flv", b"".join([header, *tags[:3], *many]))
        self.assertIn("7201 keyframes", self.of(root, "legend"))
        places = [float(x) for x in re.findall(r"M([\d.]+)", self.of(root, "keyframe")[0])]
        self.assertGreaterEqual(min(b - a for a, b in zip(places, places[1:])), 2)

    def test_output(self):
        path = self.write("in.flv", sample_bytes("aac_only"))
        self.tool("plot", path, "-o", "x.PNG", code=1, stderr=".*the drawing is an SVG.*\n")
        drawing = self.tool("plot", path, "-o", "-")
        (path.parent / "out.svg").write_text("mine")
        self.tool("plot", path, "-o", path.parent / "out.svg", code=1, stderr=".*exists.*\n")
        self.tool("plot", "--force", path, "-o", path.parent / "out.svg")
        self.assertEqual((path.parent / "out.svg").read_text(), drawing)

    def test_any_name(self):
        root = self.plot("a<b>&\"c\udcff.flv", sample_bytes("aac_only"))
        self.assertEqual(self.of(root, "title")[0], r'a<b>&"c\xff.flv')
        root = self.plot("n" * 200 + ".flv", sample_bytes("aac_only"))
        self.assertRegex(self.of(root, "title")[0], r"\An{30,40}\.\.\.n{30,40}\.flv\Z")
