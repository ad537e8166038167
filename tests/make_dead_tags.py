"""Puts 150 tags without a frame, more than one request passes, into an FLV file: its first video tag, the configuration.

usage: make_dead_tags.py FILE OUTPUT
"""
import pathlib
import sys

data = pathlib.Path(sys.argv[1]).read_bytes()
tags, at = [], 13
while at < len(data):
    tags.append(data[at : at + int.from_bytes(data[at + 1 : at + 4], "big") + 15])
    at += len(tags[-1])
config = next(tag for tag in tags if tag[0] == 9)
pathlib.Path(sys.argv[2]).write_bytes(b"".join([data[:13], *tags[:20], *[config] * 150, *tags[20:]]))
