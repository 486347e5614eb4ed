"""Reads what bench/allocation_counter.cpp counts, and finds out whose allocations those are."""

import collections
import dataclasses
import itertools
import pathlib
import re
import struct
import subprocess

DEPTH = 28
SITE = struct.Struct(f"=QQQ{DEPTH}Q")
# What is between a caller and the heap, and says nothing about who it is.
RUNTIME = ("libc.so", "libstdc++", "libgcc_s", "ld-linux", "allocation_counter")
# Calls that end in these are not for us to make cheaper.
ENCODERS = ("libavcodec", "libx264")


class Counts:
    """The counts at one moment, by place."""

    def __init__(self, file):
        content = pathlib.Path(file).read_bytes()
        self.lost = struct.unpack_from("=Q", content)[0]
        self.sites = {}
        for index, (key, count, thread, *frames) in enumerate(SITE.iter_unpack(content[8:])):
            if key:
                self.sites[index] = (count, thread, tuple(frame for frame in frames if frame))

    def since(self, earlier):
        """[(how many, thread, frames)] of what has been counted between the two."""
        if self.lost != earlier.lost:
            raise RuntimeError("there are more places than can be counted")
        grown = ((count - earlier.sites.get(index, (0,))[0], thread, frames)
                 for index, (count, thread, frames) in self.sites.items())
        return [one for one in grown if one[0]]


class Process:
    """What a process's addresses mean, as long as it lives."""

    def __init__(self, pid, program):
        self.program = str(program)
        self.maps, bases = [], {}
        for line in pathlib.Path(f"/proc/{pid}/maps").read_text().splitlines():
            span, _, _, _, _, *path = line.split(maxsplit=5)
            if path and path[0].startswith("/"):
                begin, end = (int(address, 16) for address in span.split("-"))
                base = bases.setdefault(path[0], begin)
                self.maps.append((begin, end, base, path[0]))
        self.names = {int(task.name): (task / "comm").read_text().strip()
                      for task in pathlib.Path(f"/proc/{pid}/task").iterdir()}
        self.lines = {}

    def locate(self, frame):
        """The file that a return address is in, and the call's address in it."""
        return next(((path, frame - 1 - base) for begin, end, base, path in self.maps if begin <= frame < end),
                    ("?", 0))

    def explain(self, frames):
        """Looks up functions and lines of our program, all at once."""
        located = map(self.locate, frames)
        addresses = sorted({address for path, address in located if path == self.program})
        out = subprocess.run(["addr2line", "-aCfi", "-e", self.program], check=True, text=True, capture_output=True,
                             input="\n".join(map(hex, addresses))).stdout
        for block in re.split(r"^0x", out, flags=re.M)[1:]:
            address, *lines = block.splitlines()
            found = [(function, place) for function, place in zip(lines[::2], lines[1::2])
                     if "/usr/include" not in place and "??" not in place]
            if found:
                function, place = found[0]
                place = re.sub(r"^.*?/(src|linux|client)/", r"\1/", place.partition(" (")[0])
                self.lines[int(address, 16)] = f"{shortened(function)} {place}"


def shortened(function):
    """Without arguments, of templates and of functions, and without our own namespace."""
    for bracket in (r"\(anonymous namespace\)::", r"lumacast::", r" const$", r"\[abi:cxx11\]", r"\[clone.*"):
        function = re.sub(bracket, "", function)
    before = None
    while before != function:
        before, function = function, re.sub(r"<[^<>]*>|\((?!\))[^()]*\)", "", function)
    name = function.replace("operator()()", "operator()").replace("()", "").replace("::operator()", " lambda")
    return "a function object" if "_Function_handler" in name else name


@dataclasses.dataclass
class Allocation:
    """A place with how often it was allocated at."""
    count: int
    thread: str
    owner: str     # "ours", or the library that took it for itself
    via: str       # the library that our innermost function called, or nothing
    chain: tuple   # our functions on the way, the innermost first

    def whose(self):
        return f"{self.owner}, by {self.via}" if self.owner == "ours" and self.via else self.owner


def explained(process, found):
    """Allocations on threads that run our code, and those on others'."""
    process.explain({frame for _, _, frames in found for frame in frames})
    places = {frames: [process.locate(frame) for frame in frames] for _, _, frames in found}
    threads = {thread for _, thread, frames in found if any(path == process.program for path, _ in places[frames])}
    ours, others = [], []
    for count, thread, frames in found:
        at = places[frames]
        chain = tuple(process.lines[address] for path, address in at
                      if path == process.program and address in process.lines)
        name = process.names.get(thread, "ended")
        if chain and name == pathlib.Path(process.program).name:
            name = chain[-1].split()[0]  # it has no name of its own: what it runs
        libraries = called(process.program, [path for path, _ in at])
        whose = owner(libraries, is_called=bool(chain))
        (ours if thread in threads else others).append(
            Allocation(count, name, whose, libraries[-1] if libraries else "", chain[:3]))
    return ours, others


def called(program, paths):
    """The libraries between the heap and our innermost function, or all where there is none of ours."""
    names = [pathlib.Path(path).name for path in itertools.takewhile(lambda path: path != program, paths)]
    return [name.partition(".so")[0] for name in names if not name.startswith(RUNTIME)]


def owner(libraries, is_called):
    """Ours is what we allocate, and what functions of libraries allocate that we call, but for encoders."""
    if not is_called:
        return libraries[0] if libraries else "the C library"
    return next((name for name in libraries if name.startswith(ENCODERS)), "ours")


def by(allocations, key):
    counts = collections.Counter()
    for allocation in allocations:
        counts[key(allocation)] += allocation.count
    return counts.most_common()
