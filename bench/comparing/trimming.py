"""Trims of a movie by our exporter and by ffmpeg."""

import collections
import dataclasses
import json
import os
import subprocess
import time

from . import meters, movies, recorders

RATE = 5_000_000  # the daemon's choice for this size
COMPARED = 20     # seconds of each copy that are decoded


@dataclasses.dataclass
class Cut:
    what: str
    begin: float

    def __str__(self):
        return self.what


def cuts(seconds):
    """None begins with a key frame, of which there is one each second."""
    all_of_them = [Cut("keeps the last minute", seconds - 60.4), Cut("keeps the last half", seconds / 2 + 0.3),
                   Cut("removes the first second", 1.4)]
    return [cut for cut in all_of_them if 0 < cut.begin < seconds]


def make_movie(binaries, folder, minutes):
    """A minute is encoded as the daemon does, repeated, and written by our writer."""
    minute, repeated, movie = folder / "minute.mp4", folder / "repeated.mp4", folder / "movie.mp4"
    encoder = [word.format(rate=RATE) for word in recorders.ENCODER]
    subprocess.run([*movies.FFMPEG, "-f", "lavfi", "-i", "testsrc2=size=1920x1080:rate=60:duration=60",
                    "-f", "lavfi", "-i", "sine=441:sample_rate=44100:duration=60", *encoder,
                    "-c:a", "aac", "-b:a", "128k", "-ac", "2", str(minute)], check=True)
    subprocess.run([*movies.FFMPEG, "-stream_loop", str(minutes - 1), "-i", str(minute), "-c", "copy", str(repeated)],
                   check=True)
    subprocess.run([str(binaries / "export_movie"), "trim", str(repeated), str(movie), "0"], check=True)
    repeated.unlink()
    return movie


def probe(movie):
    """Of all tracks, and what a player shows of the first stretch."""
    out = subprocess.run(["ffprobe", "-v", "error", "-count_packets", "-show_entries",
                          "stream=codec_name,duration,nb_read_packets", "-of", "json", str(movie)],
                         check=True, capture_output=True, text=True)
    tracks = [(track["codec_name"], float(track["duration"]), int(track["nb_read_packets"]))
              for track in json.loads(out.stdout)["streams"]]
    return {"bytes": movie.stat().st_size, "tracks (seconds, samples)":
            ", ".join(f"{name} ({seconds:.3f}, {samples})" for name, seconds, samples in tracks)}


def pictures(movie):
    """Hashes of what is shown in the first stretch. What a decoder complains about ends the comparison."""
    out = subprocess.run(["ffmpeg", "-hide_banner", "-nostdin", "-v", "error", "-xerror", "-t", str(COMPARED), "-i",
                          str(movie), "-map", "0:v", "-fps_mode", "passthrough", "-f", "framemd5", "-"],
                         check=True, capture_output=True, text=True)
    return collections.Counter(line.split(",")[-1].strip() for line in out.stdout.splitlines()
                               if not line.startswith("#"))


class Trims:
    def __init__(self, binaries, movie, folder):
        self.binaries, self.movie = binaries, movie
        self.made = {"ours": folder / "ours.mp4", "ffmpeg": folder / "ffmpeg.mp4"}
        whole = movies.probe(movie)
        self.seconds = whole["seconds"]
        kind = subprocess.run(["stat", "-f", "-c", "%T", str(folder)], check=True, capture_output=True, text=True)
        self.about = f"{probe(movie)}, {whole['size']}, written to a {kind.stdout.strip()}"

    def ours(self, cut):
        """Brings its file and the file's name onto the disk before it ends."""
        target = self._prepare("ours")
        figures = meters.timed([str(self.binaries / "export_movie"), "trim", str(self.movie), str(target),
                                f"{cut.begin:.3f}"])
        return figures | {"synced": figures["wall"]}

    def theirs(self, cut):
        target = self._prepare("ffmpeg")
        figures = meters.timed([*movies.FFMPEG, "-ss", f"{cut.begin:.3f}", "-i", str(self.movie), "-map", "0",
                                "-c", "copy", str(target)])
        before = time.monotonic()
        file = os.open(target, os.O_RDONLY)
        os.fsync(file)
        os.close(file)
        return figures | {"synced": figures["wall"] + time.monotonic() - before}

    def likeness(self):
        """Of the last copies made."""
        shown = {side: pictures(movie) for side, movie in self.made.items()}
        both = (shown["ours"] & shown["ffmpeg"]).total()
        return {side: probe(movie) | {f"pictures decoded of {COMPARED} s": shown[side].total(),
                                      "the same in both": both} for side, movie in self.made.items()}

    def _prepare(self, side):
        """The movie is in memory, and nothing waits to be written."""
        self.made[side].unlink(missing_ok=True)
        for written in self.made.values():
            if written.exists():
                with open(written, "rb") as file:
                    os.fsync(file.fileno())
        with open(self.movie, "rb") as file:
            while file.read(1 << 20):
                pass
        return self.made[side]
