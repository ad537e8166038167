"""Reads and writes FLV files for the bench: repeated tags of ffmpeg's files, worst cases, sparse files."""

import struct

HEADER_SIZE, TAG_HEADER, BACK_POINTER = 9, 11, 4
AUDIO, VIDEO, SCRIPT = 8, 9, 18
FILE_HEADER = b"FLV\x01\x05\0\0\0\x09\0\0\0\0"

AVC_CONFIG = b"\x17\0\0\0\0" + bytes.fromhex("0142C028FFE1000B6742C028DA01E0089F951001000468CE3C80")
AAC_CONFIG = b"\xaf\0\x12\x10"


def tag_header(kind, time, size):
    return bytes([kind]) + size.to_bytes(3, "big") + (time & 0xFFFFFF).to_bytes(3, "big") + bytes([time >> 24, 0, 0, 0])


def back_pointer(size):
    return struct.pack(">I", TAG_HEADER + size)


def tag(kind, time, data):
    return tag_header(kind, time, len(data)) + data + back_pointer(len(data))


def read_tags(path):
    """All tags of an undamaged file: (kind, time, data)."""
    with open(path, "rb") as file:
        whole = file.read()
    place, tags = HEADER_SIZE + BACK_POINTER, []
    while place + TAG_HEADER <= len(whole):
        size = int.from_bytes(whole[place + 1 : place + 4], "big")
        time = int.from_bytes(whole[place + 4 : place + 7], "big") | whole[place + 7] << 24
        begin = place + TAG_HEADER
        tags.append((whole[place], time, whole[begin : begin + size]))
        place = begin + size + BACK_POINTER
    return tags


def is_config(kind, data):
    return (kind == AUDIO and data[0] >> 4 == 10 and data[1] == 0) or (kind == VIDEO and data[0] & 15 == 7 and data[1] != 1)


def is_keyframe(kind, data):
    return kind == VIDEO and data[0] >> 4 == 1


def string(text):
    return struct.pack(">H", len(text)) + text.encode()


def numbers(values):
    return b"\x0a" + struct.pack(">I", len(values)) + b"".join(b"\0" + struct.pack(">d", value) for value in values)


def metadata(keyframes=()):
    """onMetaData with an index of `keyframes`: (time in ms, file position). Without keyframes there is no index."""
    body = string("width") + b"\0" + struct.pack(">d", 320)
    if keyframes:
        body += string("keyframes") + b"\x03" + string("filepositions") + numbers([place for _, place in keyframes])
        body += string("times") + numbers([time / 1000 for time, _ in keyframes]) + b"\0\0\x09"
    return b"\x02" + string("onMetaData") + b"\x08" + struct.pack(">I", 1) + body + b"\0\0\x09"


class Writer:
    """Writes tags and records the positions of keyframes; can leave most of a tag's data as a hole."""

    def __init__(self, path):
        self.file = open(path, "wb")
        self.file.write(FILE_HEADER)
        self.keyframes = []

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.file.truncate(max(self.file.tell(), self.file.seek(0, 2)))
        self.file.close()

    def tag(self, kind, time, data):
        if is_keyframe(kind, data) and not is_config(kind, data):
            self.keyframes.append((time, self.file.tell()))
        self.file.write(tag(kind, time, data))

    def sparse_tag(self, kind, time, start, size):
        """Writes a tag of `size` data bytes; all but `start` is left as a hole."""
        self.file.write(tag_header(kind, time, size) + start)
        self.file.seek(size - len(start), 1)
        self.file.write(back_pointer(size))


def repeated(base, count, length):
    """Repeats the frames of `base`, which is `length` ms long: `count` tags, the configuration only once."""
    head = [entry for entry in base if is_config(entry[0], entry[2])]
    body = [entry for entry in base if entry[0] != SCRIPT and not is_config(entry[0], entry[2])]
    yield from head
    for n in range(count):
        kind, time, data = body[n % len(body)]
        yield kind, time + n // len(body) * length, data
