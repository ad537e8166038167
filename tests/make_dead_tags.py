"""Puts 150 tags without a frame, more than one request passes, into an FLV file: its first video tag, the configuration.

usage: make_dead_tags.py FILE OUTPUT
"""
import pathlib
import sys

from flv import split_tags

header, tags = split_tags(pathlib.Path(sys.argv[1]).read_bytes())
config = next(tag for tag in tags if tag[0] == 9)
pathlib.Path(sys.argv[2]).write_bytes(b"".join([header, *tags[:20], *[config] * 150, *tags[20:]]))
