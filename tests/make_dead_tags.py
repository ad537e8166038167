"""Inserts 150 tags without a frame, more than one request skips, into an FLV file: copies of its first video tag, the
configuration. Also adds a title.

usage: make_dead_tags.py FILE OUTPUT
"""
import pathlib
import sys

from flv import retag, split_tags

header, tags = split_tags(pathlib.Path(sys.argv[1]).read_bytes())
config = next(tag for tag in tags if tag[0] == 9)
title = retag(tags[0], b"\2\0\x0aonMetaData\x08\0\0\0\1\0\5title\2\0\7A title\0\0\x09")
pathlib.Path(sys.argv[2]).write_bytes(b"".join([header, title, *tags[:20], *[config] * 150, *tags[20:]]))
