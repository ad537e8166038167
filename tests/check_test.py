"""`flvdmx check`: files with known faults produce exactly these findings."""
import json
import re
import struct
import subprocess

from flv import split_tags
from tool_test import AVC_BYTES, DATA, HEADER, SAMPLES, TAGS, TOOL, Case, run, sample, sample_bytes

INDEXED = sample_bytes("avc_aac_index")
POSITIONS, TIMES = (INDEXED.index(key) + len(key) for key in (b"filepositions\x0a", b"times\x0a"))  # of counts
BAD_BACK_POINTER, ZEROS, JUNK = b"\0\0\1\0", bytes(4), b"\x55" * 100
RUINED = HEADER + TAGS[1] + TAGS[2] + (TAGS[20] + b"\x55") * 1500 + TAGS[20]


def time_of(tag):
    return int.from_bytes(tag[4:7], "big")


def shift(tag, ms):
    """The tag with a timestamp later by `ms`."""
    return tag[:4] + (time_of(tag) + ms).to_bytes(3, "big") + tag[7:]


def unlink(number, back_pointer=ZEROS):
    """The tag with a different back-pointer, or none."""
    return {number: TAGS[number][:-4] + back_pointer}


def replace(data, at, more):
    return data[:at] + more + data[at + len(more):]


def start(number):
    return len(HEADER) + sum(map(len, TAGS[:number]))


def jump(number, tag):
    """The finding at a tag whose time was changed."""
    return "jump", start(number), "video" if tag[0] == 9 else "audio", time_of(tag)


def members(value):
    """The member names of a JSON document, except those that come from the file or are kinds of findings."""
    if isinstance(value, dict):
        return set(value).union(*(members(v) for name, v in value.items() if name not in ("metadata", "counts")))
    return set().union(*map(members, value)) if isinstance(value, list) else set()


def put(*changes):
    """The sample with some tags replaced."""
    merged = {i: tag for change in changes for i, tag in change.items()}
    return HEADER + b"".join(merged.get(i, tag) for i, tag in enumerate(TAGS))


class Check(Case):
    def check(self, data, *arguments):
        result = run("check", "--json", self.write("file.flv", data), *arguments)
        [document] = json.loads(result.stdout)["files"]
        self.assertEqual((result.returncode, result.stderr), (0 if document["sound"] else 1, ""))
        self.assertEqual(document["sound"], document["findings"] == [])
        self.assertEqual(sum(document["counts"].values()),
                         sum(f["count"] for f in document["findings"]) + document["unlisted"])
        return document

    def test_undamaged_samples(self):
        for name in set(SAMPLES) - {"damaged", "truncated"}:
            data = sample_bytes(name)
            found = self.check(data)
            self.assertEqual((found["sound"], found["tags"], found["size"], found["lost_bytes"]),
                             (True, len(split_tags(data)[1]), len(data), 0), name)

    def test_faults(self):
        size, whole, damaged = [len(tag) for tag in TAGS], put(), sample_bytes("damaged")
        touched = [i for i, tag in enumerate(TAGS) if damaged[start(i):start(i + 1)] != tag]
        late = {i: shift(tag, 60000) for i, tag in enumerate(TAGS) if i >= 100}
        firsts = [next(i for i in late if TAGS[i][0] == kind) for kind in (8, 9)]
        video = [i for i, tag in enumerate(TAGS) if tag[0] == 9 and tag[12] == 1]
        back = shift(TAGS[video[30]], -500)
        for name, data, arguments, findings, lost in (
                ("overwritten", damaged, [], [("gap", start(touched[0]), start(touched[-1] + 1) - start(touched[0]))],
                 sum(size[i] for i in touched)),
                ("size", replace(whole, start(40) + 1, b"\xff\xff\xff"), [], [("gap", start(40), size[40])], size[40]),
                ("wrong", put(unlink(50, BAD_BACK_POINTER)), [], [("back_pointer", start(51) - 4)], size[50]),
                ("wrong script", put(unlink(0)), [], [("back_pointer", start(1) - 4)], 0),
                ("wrong last", put(unlink(175)), [], [("back_pointer", len(whole) - 4)], size[175]),
                ("two wrong", put(unlink(50), unlink(51)), [],
                 [("back_pointer", start(51) - 4, start(52) - 4)], size[50] + size[51]),
                ("first", replace(whole, 9, BAD_BACK_POINTER), [], [("back_pointer", 9)], 0),
                ("cut", whole[:start(90) + 50], [], [("cut_short", start(90), 50)], 50),
                ("cut in header", whole[:start(90) + 5], [], [("cut_short", start(90), 5)], 5),
                ("cut in the end", whole[:start(90) - 1], [], [("cut_short", start(89), size[89] - 1)], size[89] - 1),
                ("cut between", whole[:start(90)], [], [], 0),
                ("another codec", replace(whole, start(video[9]) + 11, b"\x22"), [],
                 [("passed_over", start(video[9]))], size[video[9]]),
                ("forward", put(late), [], [(*jump(min(firsts), late[min(firsts)]), start(max(firsts)))], 0),
                ("allowed", put(late), ["--jump", "60.1"], [], 0),
                ("back", put({video[30]: back}), [], [jump(video[30], back)], 0),
                ("many", put({20: JUNK + TAGS[20]}, unlink(50), unlink(60, b"")) + JUNK, [],
                 [("gap", start(20), 100), ("back_pointer", start(51) + 96), ("no_back_pointer", start(61) + 96),
                  ("gap", len(whole) + 96, 100)], 200 + size[50] + size[60] - 4)):
            with self.subTest(name):
                found = self.check(data, *arguments)
                keys = ("kind", "offset", "bytes", "stream", "to_ms", "last_offset")
                self.assertEqual([tuple(f[key] for key in keys if key in f) for f in found["findings"]], findings)
                self.assertEqual(found["lost_bytes"], lost)

    def test_wrong_index(self):
        tags = split_tags(INDEXED)[1]
        delta = 13 + sum(map(len, tags[:next(i for i, t in enumerate(tags) if t[0] == 9 and t[11] >> 4 == 2)]))
        for array, number, value, words in (
                (POSITIONS, 3, 9999, "points to byte 9999, where there is no keyframe"),
                (POSITIONS, 2, delta, f"byte {delta}, where there is no keyframe"), (POSITIONS, 1, -5, "byte -5, which"),
                (POSITIONS, 5, 1e9, "byte 1000000000, which is not in the file"),
                (POSITIONS, 4, float("nan"), "byte nan"), (TIMES, 1, 1.5, "states 0:00:01.500, but the keyframe at byte"),
                (TIMES, 4, float("inf"), "states inf s"), (TIMES, 2, 1.2, None)):
            with self.subTest(array=array, value=value):
                found = self.check(replace(INDEXED, array + 4 + 9 * number + 1, struct.pack(">d", value)))["findings"]
                self.assertEqual([(f["kind"], f["entry"]) for f in found], [("index", number + 1)] if words else [])
                self.assertIn(words or "", (found or [{"text": ""}])[0]["text"])
        for array, words in ((POSITIONS, "has no times"), (TIMES, r"has \d+ times and \d+ positions")):
            fewer = bytes([INDEXED[array + 3] - 1])
            [found] = self.check(replace(INDEXED, array + 3, fewer))["findings"]
            self.assertRegex(found["text"], words)
        cut = self.check(INDEXED[:-len(tags[-1]) - len(tags[-2])])
        self.assertEqual([(f["kind"], f["offset"]) for f in cut["findings"]], [("cut_short", cut["size"])])

    def test_all_back_pointers_wrong(self):
        found = self.check(put(*map(unlink, range(len(TAGS)))))
        self.assertEqual(found["counts"], {"not_playable": 1, "back_pointer": len(TAGS)})

    def test_two_files_in_one(self):
        """The bytes that `check` counts as lost are those of frames that a player does not deliver."""
        found = self.check(AVC_BYTES + b"".join(TAGS[1:60]))
        self.assertEqual({"jump", "passed_over"}, set(found["counts"]))
        late = [len(tag) for tag in TAGS if time_of(tag) > max(map(time_of, TAGS[1:60]))]
        self.assertEqual((found["lost_bytes"], found["counts"]["passed_over"]), (sum(late), len(late)))
        self.assertEqual(len(found["findings"]), 2)

    def test_limits_and_notes(self):
        config, video = TAGS[1], [tag for tag in TAGS if tag[0] == 9 and tag[12] == 1]
        key = start(next(i for i, tag in enumerate(TAGS) if tag == [v for v in video if v[11] >> 4 == 1][1]))
        apart = HEADER + b"".join(sorted(TAGS, key=lambda tag: -tag[0]))
        for data, arguments, kinds, position in (
                (put(), ["--max-gap", "1.2"], [], None), (put(), ["--max-gap", "0.9"], ["keyframe_distance"], key),
                (apart, ["--max-gap", "1.2"], ["interleaving"], None), (apart, [], [], None)):
            found = self.check(data, *arguments)["findings"]
            self.assertEqual([f["kind"] for f in found], kinds)
            if position:
                self.assertEqual(found[0]["offset"], position)
        other = config[:-5] + bytes([config[-5] ^ 1]) + config[-4:]
        found = self.check(HEADER + b"".join(TAGS[:90]) + shift(other, time_of(TAGS[90])) + b"".join(TAGS[90:]))
        self.assertEqual([(f["kind"], f["offset"]) for f in found["notes"]], [("configuration", start(90))])

    def test_manual_has_every_member_of_the_documents(self):
        manual = (DATA.parent.parent / "docs/man/flvdmx.1").read_text().split(".Sh JSON OUTPUT")[1].split("\n.Sh")[0]
        documented = set(re.findall(r"\w+", " ".join(re.findall(r"^(?:\.It )?\.?Va (.*)$", manual, re.M))))
        streams = [self.write("one.flv", HEADER + b"".join(t for t in TAGS if t[0] != kind)) for kind in (8, 9)]
        bad = self.write("bad.flv", replace(INDEXED, POSITIONS + 14, struct.pack(">d", 5)) + JUNK)
        found = set()
        for text in ("info --scan", "check", "frames", "seek --separate-audio 1", "seek 99"):
            command, *arguments = text.split()
            files = [sample("avc_aac")] if command in ("frames", "seek") else [
                *streams, bad, self.write("two.flv", AVC_BYTES + AVC_BYTES[13:]), "missing.flv"]
            printed = run(command, "--json", *files, *arguments).stdout
            found |= members([json.loads(line) for line in printed.splitlines()] if command == "frames"
                             else json.loads(printed))
        self.assertEqual(found, documented)

    def test_folders(self):
        root = self.write("b.flv", AVC_BYTES).parent
        (root / "sub").mkdir()
        for name, data in (("sub/a", AVC_BYTES), ("sub/text", b"no FLV"), ("c.flv", b"")):
            (root / name).write_bytes(data)
        result = run("check", "--json", root)
        self.assertEqual([d["file"] for d in json.loads(result.stdout)["files"]],
                         [f"{root}/b.flv", f"{root}/c.flv", f"{root}/sub/a"])
        self.assertRegex(result.stderr, rf"{root}: note: skipped 1 file that is not FLV\n.*c.flv: .*is empty\n\Z")
        (root / "sub/a").unlink()
        self.tool("check", root / "sub", code=1, stderr=".*this folder contains no FLV file\n")

    def test_jobs_do_not_change_the_output(self):
        files = [*map(sample, SAMPLES), "missing.flv", DATA / "make_samples.sh", self.write("ruined.flv", RUINED)] * 3
        for arguments in ([], ["--json"]):
            alone = run("check", *arguments, *files)
            self.assertEqual((alone.returncode, len(alone.stderr.splitlines())), (1, 6))
            for jobs in (2, 5, 200):
                many = run("check", *arguments, "--jobs", jobs, *files)
                self.assertEqual((many.returncode, many.stdout, many.stderr), (1, alone.stdout, alone.stderr))
        documents = json.loads(alone.stdout)["files"]
        self.assertEqual([document["file"] for document in documents], list(map(str, files)))
        self.assertEqual([d["error"]["code"] for d in documents if d.get("error")], [-5, -1004] * 3)
        ruined = documents[-1]  # not all findings are listed
        self.assertEqual((ruined["counts"], len(ruined["findings"]), ruined["unlisted"]), ({"gap": 1500}, 1000, 500))
        text = self.tool("check", sample("aac_only"), "--jobs", 9)
        self.assertEqual(text, f"{sample('aac_only')}: ok; 66 tags, 9549 bytes, all playable\n")

    def test_jobs_end_when_the_pipe_is_closed(self):
        files = [self.write("ruined.flv", RUINED)] * 20
        with subprocess.Popen([TOOL, "check", "--jobs", "2", *files], stdout=subprocess.PIPE) as process:
            process.stdout.close()
            self.assertEqual(process.wait(20), 0)
