"""What a movie file is made of. linux/media/mp4/README.md draws it."""

import struct

FILE_START = 48  # bytes before the movie box of a recording under way
HEADER = 8       # of the box that the index is appended in


def within(path, begin=0, end=None):
    """Type, offset and size of the boxes one after the other."""
    with open(path, "rb") as file:
        end = end or path.stat().st_size
        while begin + 8 <= end:
            file.seek(begin)
            size, kind = struct.unpack(">I4s", file.read(8))
            if size == 1:
                size = struct.unpack(">Q", file.read(8))[0]
            if size < 8 or begin + size > end:
                raise RuntimeError(f"{path}: the box at {begin} does not fit")
            yield kind.decode("latin-1"), begin, size
            begin += size


def index_bytes(path):
    return sum(size for kind, _, size in within(path) if kind == "moov")


def last_fragment_bytes(path):
    """The fragments that a recording was made of lie within the media of the finished movie."""
    begin, size = next((begin, size) for kind, begin, size in within(path) if kind == "mdat")
    index = next(begin for kind, begin, _ in within(path) if kind == "moov")
    fragments = [(kind, place, size) for kind, place, size in within(path, FILE_START, min(begin + size, index - 8))]
    last = max(place for kind, place, _ in fragments if kind == "moof")
    return sum(size for _, place, size in fragments if place >= last)


def pictures(path):
    """How many pictures the movie's index has."""
    count = 0
    for track in inside(path, "moov", "trak"):
        media = list(inside(path, "mdia", "minf", begin=track))
        if any(kind == "vmhd" for place in media for kind, _, _ in within(path, *place)):
            for begin, _ in inside(path, "mdia", "minf", "stbl", "stsz", begin=track):
                with open(path, "rb") as file:
                    file.seek(begin + 8)  # version, flags and the size that all have
                    count += struct.unpack(">I", file.read(4))[0]
    return count


def inside(path, *kinds, begin=(0, None)):
    """Where the contents of boxes in boxes begin and end, the path of their types given."""
    for kind, place, size in within(path, *begin):
        if kind == kinds[0]:
            content = (place + HEADER, place + size)
            if len(kinds) == 1:
                yield content
            else:
                yield from inside(path, *kinds[1:], begin=content)
