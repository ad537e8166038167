#!/usr/bin/env python3
"""`flvdmx plot`: the drawing read back."""
import re
import unittest
import xml.etree.ElementTree

from tool_test import DATA, SAMPLES, Case, Expected, run, split_tags

SVG = "{http://www.w3.org/2000/svg}"
UNITS = {"bit/s": 1, "kbit/s": 1e3, "Mbit/s": 1e6}


class Plot(Case):
    def plot(self, name, data):
        path = self.write(name, data)
        result = run("plot", path, "-o", path.parent / "out.svg")
        self.assertEqual((result.returncode, result.stdout), (0, ""))
        text = (path.parent / "out.svg").read_text()
        self.assertNotRegex(text, r"\b(nan|inf)\b")
        return xml.etree.ElementTree.fromstring(text)

    @staticmethod
    def texts(root, kind):
        return [t for t in root.iter(f"{SVG}text") if t.get("class") == kind]

    @staticmethod
    def paths(root, kind):
        return [p.get("d") for p in root.iter(f"{SVG}path") if p.get("class") == kind]

    def bits(self, root, kind, seconds):
        """The area under a line, by the labels of its axis."""
        ticks = [(float(t.get("y")) - 4, float(t.text)) for t in self.texts(root, "tick left")]
        unit = UNITS[re.search(r"\((.*)\)", self.texts(root, "heading")[0].text)[1]]
        scale = (ticks[1][1] - ticks[0][1]) / (ticks[1][0] - ticks[0][0]) * unit
        [area] = self.paths(root, f"area-{kind}")
        steps, x, total = re.findall(r"V([\d.]+)H([\d.]+)", area), 90, 0
        for y, end in steps:
            total += (float(y) - ticks[0][0]) * scale * (float(end) - x)
            x = float(end)
        return total * seconds / (x - 90)

    def test_every_sample(self):
        for name in set(SAMPLES) - {"damaged", "truncated"}:
            data, expected = (DATA / f"{name}.flv").read_bytes(), Expected(name)
            with self.subTest(name):
                root = self.plot(f"{name}.flv", data)
                marks = "".join(d for p in root.iter(f"{SVG}path") if p.get("id") == "keyframes" for d in p.get("d"))
                self.assertEqual(marks.count("M"), len(expected.keyframes))
                for time_ms, found in zip(expected.keyframes, re.findall(r"M([\d.]+)", marks)):
                    duration = max(f[1] for f in expected.frames)
                    self.assertAlmostEqual(float(found), 90 + 920 * max(time_ms[0], 0) / duration, delta=0.02 * 920)
                legend = [t.text for t in self.texts(root, "legend")]
                self.assertEqual(legend.count("video") + legend.count("audio"), 2 * len(expected.streams))
                self.assertEqual(len(self.texts(root, "heading")), 1 + len(expected.streams) if len(expected.streams) > 1 else 2)
                duration = max(f[1] for f in expected.frames) / 1000
                for kind in expected.streams:
                    code = {"audio": 8, "video": 9}[kind]
                    sizes = [len(t) - 15 for t in split_tags(data)[1] if t[0] == code]
                    self.assertAlmostEqual(self.bits(root, kind, duration) / (8 * sum(sizes)), 1, delta=0.06)

    def test_time_axis_fits_any_length(self):
        header, tags = split_tags((DATA / "avc_only.flv").read_bytes())
        frames = [tag for tag in tags if tag[0] == 9 and tag[12] < 2]
        for seconds, first, last in ((1, "0.0 s", "1.0 s"), (9, "0 s", "9 s"), (50, "0 s", "50 s"), (300, "0:00", "5:00"),
                                     (5400, "0:00:00", "1:30:00"), (10800, "0:00:00", "3:00:00"),
                                     (2000000, "0:00:00", None)):
            times = [max(i - 1, 0) * seconds * 1000 // (len(frames) - 2) for i in range(len(frames))]
            root = self.plot("long.flv", header + b"".join(
                tag[:4] + (t & 0xFFFFFF).to_bytes(3, "big") + bytes([t >> 24]) + tag[7 + 1:] for tag, t in zip(frames, times)))
            labels = [t.text for t in self.texts(root, "tick mid")]
            labels = labels[:len(labels) // 2]  # of the first diagram
            self.assertTrue(5 <= len(labels) <= 13, labels)
            self.assertEqual((labels[0], labels[-1]), (first, last or labels[-1]))
            steps = self.paths(root, "video")[0].count("H")
            self.assertTrue(10 <= steps <= 201, steps)

    def test_interleaving_shows_streams_that_are_apart(self):
        data = (DATA / "avc_aac.flv").read_bytes()
        header, tags = split_tags(data)
        root = self.plot("apart.flv", header + b"".join(tags[:4] + sorted(tags[4:], key=lambda tag: -tag[0])))
        lead = [float(t.text) for t in self.texts(root, "tick left")[-4:]]
        self.assertLessEqual(min(lead), -2)  # seconds

    def test_any_name(self):
        root = self.plot("a<b>&\"c\udcff.flv", (DATA / "aac_only.flv").read_bytes())
        self.assertEqual(self.texts(root, "title")[0].text, 'a<b>&"c\ufffd.flv')


if __name__ == "__main__":
    unittest.main()
