"""Troubles that are put beside a recording, one after the other, and what became of it."""

import os
import pathlib
import re
import shutil
import signal
import subprocess
import time

from . import machine, meters, movies, recorders, requests, sounding

RATE = 200          # state requests a second of another application
BEFORE, AFTER = 1.0, 2.0  # seconds of recording around a trouble
TRICKLERS = 40      # processes that send messages byte by byte
HOUR, DAY = 3600, 86400


class Scene:
    """A machine with sound on which a daemon runs that can be troubled, an application that asks, and hostile ones."""

    def __init__(self, binaries, size, fps):
        self.on = sounding.SoundingMachine(binaries, size, fps, ["--tone", "440"])
        try:
            self.asker = requests.Clients(self.on, 1, "Asker")
            self.hostile = self.on.install_copies(self.on.binaries / "hostile_peer", "Hostile", TRICKLERS)
            movies_folder = self.on.folder / "state/lumacast/root/private/var/mobile/Library/Lumacast"
            self.flags = {name: self.on.folder / name for name in ("encoder", "disk", "ahead", "behind")}
            self.daemon = recorders.Daemon(self.on, variables={
                "LD_PRELOAD": f"{self.on.binaries / 'troubled_daemon.so'}:{self.on.binaries / 'slow_disk.so'}",
                "LC_DISK": str(movies_folder), "LC_DISK_STALLED": str(self.flags["disk"]),
                "LC_ENCODER_STALLED": str(self.flags["encoder"]), "LC_CLOCK_AHEAD": str(self.flags["ahead"]),
                "LC_CLOCK_BEHIND": str(self.flags["behind"])})
            if self.asker.connect():
                raise RuntimeError("a client was not served: " + self.on.log("clients.log"))
            # The first recording makes what stays: the encoder's and the display's own descriptors.
            self.daemon.begin()
            time.sleep(BEFORE)
            self.daemon.finish(self.on.folder / "warm.mp4")
        except BaseException:
            self.on.close()
            raise

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.on.close()

    def lines(self):
        return self.on.log("daemon.log").splitlines()


class Nothing:
    name = "nothing"

    def begin(self, scene):
        pass

    def end(self, scene):
        """What the trouble itself says of it, one line."""
        return ""


class Peers(Nothing):
    """Processes of bench/hostile_peer.cpp, each an application of its own."""

    def __init__(self, name, kind, count=1):
        self.name, self.kind, self.count = name, kind, count

    def begin(self, scene):
        runtime = scene.on.folder / "runtime/lumacast"
        self.children = [scene.on.start([program, self.kind, runtime], "hostile.log", stdin=subprocess.PIPE,
                                        stdout=subprocess.PIPE, text=True) for program in scene.hostile[:self.count]]

    def end(self, scene):
        for child in self.children:
            child.stdin.close()
        answers = [[int(word) for word in child.stdout.readline().split()] for child in self.children]
        for child in self.children:
            child.wait()
        made, ended, refused, taken, read = (sum(column) for column in zip(*answers))
        return (f"{made} connections, {ended} of them ended by the daemon, {refused} not made; {taken / 1e6:.2f} MB sent, "
                f"{read / 1e6:.2f} MB read")


class Flag(Nothing):
    """Something that lasts as long as a file is there."""

    def __init__(self, name, flag):
        self.name, self.flag = name, flag

    def begin(self, scene):
        scene.flags[self.flag].touch()

    def end(self, scene):
        scene.flags[self.flag].unlink()
        return ""


class ClockJump(Nothing):
    """A file's size is by how many seconds the daemon's wall clock is off."""

    def __init__(self, name, flag, seconds):
        self.name, self.flag, self.seconds = name, flag, seconds

    def begin(self, scene):
        scene.flags[self.flag].touch()
        os.truncate(scene.flags[self.flag], self.seconds)

    def end(self, scene):
        scene.flags[self.flag].unlink()  # and back
        return ""


class SoundServerGoes(Nothing):
    name = "the sound server is killed, and comes back"

    def begin(self, scene):
        machine.end(scene.on.sound, signal.SIGKILL)

    def end(self, scene):
        scene.on.start_sound()
        return ""


def all_troubles():
    """In the order in which they are made; the display's end comes apart."""
    return [
        Nothing(),
        Peers("200 hellos that come byte by byte", "hello-trickle"),
        Peers(f"{TRICKLERS} applications' messages byte by byte", "trickle", TRICKLERS),
        Peers("connections that come and go", "connections"),
        Peers("messages without end", "messages"),
        Peers("requests, hundreds at once", "requests"),
        Peers("one that does not read", "deaf"),
        Peers("bytes that are no messages", "garbage"),
        ClockJump("the wall clock jumps an hour ahead, and back", "ahead", HOUR),
        ClockJump("the wall clock jumps back a day, and ahead again", "behind", DAY),
        Flag("the encoder hangs", "encoder"),
        Flag("the disk hangs", "disk"),
        SoundServerGoes(),
    ]


def with_trouble(scene, trouble, seconds):
    """One recording with a trouble in it; the figures of its row."""
    on, pid = scene.on, scene.daemon.process.pid
    before, known = meters.holdings(pid), len(scene.lines())
    scene.daemon.begin()
    time.sleep(BEFORE)
    first = on.frame() + 1
    trouble.begin(scene)
    scene.asker.begin(RATE, seconds)
    most = before
    end = time.monotonic() + seconds
    while time.monotonic() < end:
        now = meters.holdings(pid)
        most = {name: max(most[name], now[name]) for name in most}
        time.sleep(0.1)
    asked = scene.asker.end()
    last_in_it = on.frame()
    said = trouble.end(scene)
    time.sleep(AFTER)
    last = on.frame()
    movie = on.folder / "movie.mp4"
    begin = time.monotonic()
    scene.daemon.finish(movie)
    stop = time.monotonic() - begin
    seen = movies.numbers(on.binaries, movie)
    return {"trouble": trouble.name, "seconds": seconds, "drawn": last - first + 1, "lost": movies.lost(seen, first, last),
            "lost_in_it": movies.lost(seen, first, last_in_it), "silent_s": movies.silent_seconds(movie),
            "movie_s": movies.probe(movie)["seconds"], "stop_ms": stop * 1000, "said": said, "load": meters.load(),
            "lines": counted(scene.lines()[known:]), "grew_most": most["own"] - before["own"],
            "before": before, "after": settled(pid, before)} | asked


def settled(pid, before):
    """What the daemon has once descriptors and threads are no more than before, or after ten seconds."""
    end = time.monotonic() + 10
    while True:
        now = meters.holdings(pid)
        if all(now[name] <= before[name] for name in ("descriptors", "threads")) or time.monotonic() > end:
            return now
        time.sleep(0.1)


def counted(lines):
    """How often the daemon logged each kind of refusal or error; what differs between two of a kind is left out."""
    kinds = {}
    for line in lines:
        again = re.match(r"(\w+) repeated (\d+) times: (.*)", line)
        count, line = (int(again.group(2)), again.group(1) + " " + again.group(3)) if again else (1, line)
        if line.startswith("error") or "refused" in line or "dropped" in line:
            kind = re.sub(r"\d+", "N", line)
            kinds[kind] = kinds.get(kind, 0) + count
    return kinds


def display_goes(scene):
    """The display server is killed under a recording, and comes back; the application goes with it and comes back too."""
    on, known = scene.on, len(scene.lines())
    scene.daemon.begin()
    time.sleep(BEFORE)
    recording = next((on.folder / "state").rglob("*.mp4"))
    copy = on.folder / "until then.mp4"
    os.link(recording, copy)  # what is on the disk, whoever removes the name
    drawn = on.frame()
    machine.end(on.display, signal.SIGKILL)
    machine.end(on.application)
    scene.asker.begin(RATE, BEFORE)
    asked = scene.asker.end()
    kept = recording.exists()
    whole = on.folder / "whole.mp4"
    shutil.copy(copy, whole)
    seen = movies.numbers(on.binaries, whole)
    begin = time.monotonic()
    on.start_display(on.environment["DISPLAY"].lstrip(":"))
    on.start_application()
    came_back = time.monotonic()
    scene.daemon.begin()
    started = time.monotonic()
    first = on.frame() + 1
    time.sleep(AFTER)
    last = on.frame()
    scene.daemon.finish(whole)
    lost = movies.lost(movies.numbers(on.binaries, whole), first, last)
    return {"trouble": "the display server is killed, and comes back", "seen_until": max(filter(None, seen), default=0),
            "drawn_until": drawn, "movie_kept": kept, "came_back_s": came_back - begin, "start_s": started - came_back,
            "drawn": last - first + 1, "lost": lost, "lines": counted(scene.lines()[known:]), "load": meters.load()} | asked
