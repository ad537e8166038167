"""Splits FLV files into tags and rewrites them."""


def split_tags(data):
    """The file header, and each tag with its back-pointer."""
    header, position, tags = data[:13], 13, []
    while position < len(data):
        tags.append(data[position:position + 15 + int.from_bytes(data[position + 1:position + 4], "big")])
        position += len(tags[-1])
    return header, tags


def retag(tag, payload):
    """The tag with another payload and a matching back-pointer."""
    return tag[:1] + len(payload).to_bytes(3, "big") + tag[4:11] + payload + (11 + len(payload)).to_bytes(4, "big")
