#!/usr/bin/env python3
"""`flvdmx check`: a file with known faults gives exactly these findings."""
import json
import struct
import subprocess
import unittest

from tool_test import DATA, SAMPLES, TOOL, Case, run, sample, split_tags

HEADER, TAGS = split_tags((DATA / "avc_aac.flv").read_bytes())
INDEXED = (DATA / "avc_aac_index.flv").read_bytes()
BAD_BACK_POINTER, ZEROS = b"\0\0\1\0", bytes(4)


def shift(tag, ms):
    """The tag at another time."""
    time = int.from_bytes(tag[4:7], "big") + ms
    return tag[:4] + time.to_bytes(3, "big") + tag[7:]


def index_entry(array, number, value):
    """The indexed sample with another value in its index."""
    first = INDEXED.index(array) + len(array) + 4
    return INDEXED[:first + 9 * number + 1] + struct.pack(">d", value) + INDEXED[first + 9 * number + 9:]


def start(number):
    return len(HEADER) + sum(map(len, TAGS[:number]))


def put(changes):
    """The sample with other tags at some places."""
    return HEADER + b"".join(changes.get(i, tag) for i, tag in enumerate(TAGS))


class Check(Case):
    def check(self, data, *arguments):
        result = run("check", "--json", self.write("file.flv", data), *arguments)
        [document] = json.loads(result.stdout)["files"]
        self.assertEqual((result.returncode, result.stderr), (0 if document["sound"] else 1, ""))
        self.assertEqual(document["sound"], document["findings"] == [])
        self.assertEqual(sum(document["counts"].values()), len(document["findings"]) + document["unlisted"])
        return document

    def test_sound_samples(self):
        for name in set(SAMPLES) - {"damaged", "truncated"}:
            data = (DATA / f"{name}.flv").read_bytes()
            found = self.check(data)
            self.assertEqual((found["sound"], found["tags"], found["size"], found["lost_bytes"]),
                             (True, len(split_tags(data)[1]), len(data), 0), name)

    def test_faults(self):
        size, junk, jumped = {i: len(tag) for i, tag in enumerate(TAGS)}, b"\x55" * 100, 100
        whole, damaged = put({}), (DATA / "damaged.flv").read_bytes()
        touched = [i for i in size if damaged[start(i):start(i + 1)] != TAGS[i]]
        late = {i: shift(tag, 60000) for i, tag in enumerate(TAGS) if i >= jumped}
        firsts = sorted(next(i for i in late if TAGS[i][0] == kind) for kind in (8, 9))
        video = [i for i, tag in enumerate(TAGS) if tag[0] == 9 and tag[12] == 1]
        forged = {40: TAGS[40][:1] + b"\xff\xff\xff" + TAGS[40][4:]}
        for name, data, arguments, findings, lost in (
                ("garbage between", put({40: junk + TAGS[40]}), [], [("gap", start(40), 100)], 100),
                ("garbage behind", whole + junk, [], [("gap", len(whole), 100)], 100),
                ("overwritten", damaged, [], [("gap", start(touched[0]), start(touched[-1] + 1) - start(touched[0]))],
                 sum(size[i] for i in touched)),
                ("size", put(forged), [], [("gap", start(40), size[40])], size[40]),
                ("wrong", put({50: TAGS[50][:-4] + BAD_BACK_POINTER}), [], [("back_pointer", start(51) - 4)], size[50]),
                ("wrong script", put({0: TAGS[0][:-4] + ZEROS}), [], [("back_pointer", start(1) - 4)], 0),
                ("wrong last", put({175: TAGS[175][:-4] + ZEROS}), [], [("back_pointer", len(whole) - 4)], size[175]),
                ("two wrong", put({50: TAGS[50][:-4] + ZEROS, 51: TAGS[51][:-4] + ZEROS}), [],
                 [("back_pointer", start(51) - 4), ("back_pointer", start(52) - 4)], size[50] + size[51]),
                ("first", whole[:9] + BAD_BACK_POINTER + whole[13:], [], [("back_pointer", 9)], 0),
                ("none", put({60: TAGS[60][:-4]}), [], [("no_back_pointer", start(61) - 4)], size[60] - 4),
                ("cut", whole[:start(90) + 50], [], [("cut_short", start(90), 50)], 50),
                ("cut in header", whole[:start(90) + 5], [], [("cut_short", start(90), 5)], 5),
                ("cut in back-pointer", whole[:start(90) - 1], [], [("cut_short", start(89), size[89] - 1)], size[89] - 1),
                ("cut between", whole[:start(90)], [], [], 0),
                ("another codec", put({video[9]: TAGS[video[9]][:11] + b"\x22" + TAGS[video[9]][12:]}), [],
                 [("passed_over", start(video[9]))], size[video[9]]),
                ("forward", put(late), [], [("jump", start(i)) for i in firsts], 0),
                ("allowed", put(late), ["--jump", "60.1"], [], 0),
                ("back", put({video[30]: shift(TAGS[video[30]], -500)}), [], [("jump", start(video[30]))], 0),
                ("many", put({20: junk + TAGS[20], 50: TAGS[50][:-4] + ZEROS, 60: TAGS[60][:-4]}) + junk, [],
                 [("gap", start(20), 100), ("back_pointer", start(51) + 96), ("no_back_pointer", start(61) + 96),
                  ("gap", len(whole) + 96, 100)], 200 + size[50] + size[60] - 4)):
            with self.subTest(name):
                found = self.check(data, *arguments)
                self.assertEqual([(f["kind"], f["offset"], *([f["bytes"]] if "bytes" in f else []))
                                  for f in found["findings"]], findings)
                self.assertEqual(found["lost_bytes"], lost)
                for jump in (f for f in found["findings"] if f["kind"] == "jump"):
                    to = int.from_bytes(data[jump["offset"] + 4:jump["offset"] + 7], "big")
                    self.assertEqual((jump["stream"] == "video", jump["to_ms"]), (data[jump["offset"]] == 9, to))

    def test_lying_index(self):
        positions, times = b"filepositions\x0a", b"times\x0a"
        tags = split_tags(INDEXED)[1]
        delta = 13 + sum(map(len, tags[:next(i for i, t in enumerate(tags) if t[0] == 9 and t[11] >> 4 == 2)]))
        for array, number, value, words in ((positions, 3, 9999, "leads to byte 9999, where no keyframe is"),
                                            (positions, 2, delta, f"byte {delta}, where no keyframe is"),
                                            (positions, 5, 1e9, "byte 1000000000, which the file does not have"),
                                            (positions, 1, -5, "byte -5, which"), (positions, 4, float("nan"), "byte nan"),
                                            (times, 1, 1.5, "says 0:00:01.500, the keyframe at byte"),
                                            (times, 4, float("inf"), "says inf s"), (times, 2, 1.2, None)):
            with self.subTest(array=array, value=value):
                found = self.check(index_entry(array, number, value))["findings"]
                self.assertEqual([(f["kind"], f["entry"]) for f in found], [("index", number + 1)] if words else [])
                self.assertIn(words or "", (found or [{"text": ""}])[0]["text"])
        for array, words in ((positions, "has no times"), (times, r"has \d+ times and \d+ positions")):
            count = INDEXED.index(array) + len(array) + 3
            [found] = self.check(INDEXED[:count] + bytes([INDEXED[count] - 1]) + INDEXED[count + 1:])["findings"]
            self.assertRegex(found["text"], words)
        cut = self.check(INDEXED[:-len(tags[-1]) - len(tags[-2])])
        self.assertEqual([(f["kind"], f["offset"]) for f in cut["findings"]], [("cut_short", cut["size"])])

    def test_no_right_back_pointer_at_all(self):
        found = self.check(HEADER + b"".join(tag[:-4] + ZEROS for tag in TAGS))
        self.assertEqual(found["counts"], {"not_playable": 1, "back_pointer": len(TAGS)})

    def test_player_of_two_files_in_one(self):
        """What `check` calls lost is what frames of a player lack."""
        found = self.check(HEADER + b"".join(TAGS + TAGS[1:60]))
        self.assertEqual({"jump", "passed_over"}, set(found["counts"]))
        times = [t for t in map(lambda t: int.from_bytes(t[4:7], "big"), TAGS[1:60])]
        late = [len(t) for t in TAGS if int.from_bytes(t[4:7], "big") > max(times)]
        self.assertEqual(found["lost_bytes"], sum(late))

    def test_ruined_file_is_not_listed_whole(self):
        found = self.check(HEADER + TAGS[1] + TAGS[2] + b"".join(TAGS[20] + b"\x55" for _ in range(1500)) + TAGS[20])
        self.assertEqual((found["counts"], len(found["findings"]), found["unlisted"]), ({"gap": 1500}, 1000, 500))

    def test_jobs_say_the_same_as_one(self):
        ruined = self.write("ruined.flv", HEADER + TAGS[1] + TAGS[2] + (TAGS[20] + b"\x55") * 1500)
        files = [*map(sample, SAMPLES), "missing.flv", str(DATA / "make_samples.sh"), ruined] * 3
        for arguments in ([], ["--json"]):
            alone = run("check", *arguments, *files)
            self.assertEqual((alone.returncode, len(alone.stderr.splitlines())), (1, 6))
            for jobs in (2, 5, 200):
                many = run("check", *arguments, "--jobs", jobs, *files)
                self.assertEqual((many.returncode, many.stdout, many.stderr), (1, alone.stdout, alone.stderr))
        self.assertEqual([f["file"] for f in json.loads(alone.stdout)["files"]], list(map(str, files)))
        text = self.succeed("check", sample("aac_only"), "--jobs", 9)
        self.assertEqual(text, f"{sample('aac_only')}: sound; 66 tags, 9549 bytes, 0 of them lost\n")

    def test_jobs_end_when_nobody_reads(self):
        ruined = self.write("ruined.flv", HEADER + TAGS[1] + TAGS[2] + (TAGS[20] + b"\x55") * 1500)
        with subprocess.Popen([TOOL, "check", "--jobs", "2", *[ruined] * 20], stdout=subprocess.PIPE) as process:
            process.stdout.close()
            self.assertEqual(process.wait(20), 0)


if __name__ == "__main__":
    unittest.main()
