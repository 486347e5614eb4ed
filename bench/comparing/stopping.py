"""A window that the daemon and ffmpeg record together, and how each of them is stopped."""

import os
import pathlib
import re
import shutil
import signal
import struct
import subprocess
import time

from . import machine, recorders

# linux/media/mp4/README.md draws the file.
FILE_START = 48  # bytes before the movie box of a recording under way
BOX_HEADER = 8   # of the box that the index is appended in


class PacedMachine(machine.Machine):
    """Its application draws so many frames a second."""

    def __init__(self, binaries, size, fps):
        self.fps = fps
        super().__init__(binaries, size)

    def _start_application(self, kind):
        self.application = self.start([str(self.binaries / "self_recorder"), "--size", self.size, "--fps", str(self.fps),
                                       "--name", "Self Recorder"], "application.log", stdin=subprocess.PIPE,
                                      stdout=subprocess.PIPE, text=True, bufsize=1)
        self.window = re.fullmatch(r"window (0x[0-9a-f]+)", self.application.stdout.readline().strip()).group(1)
        machine.wait_for("the first frame", lambda: self.frame() > 0)


class Pair:
    def __init__(self, binaries, size, fps):
        self.machine = PacedMachine(binaries, size, fps)

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.machine.close()

    def begin(self):
        self.daemon = recorders.Daemon(self.machine, None)
        self.daemon.begin()
        self.ffmpeg = recorders.Ffmpeg(self.machine, self.daemon.bit_rate())
        self.ffmpeg.command[self.ffmpeg.command.index("-framerate") + 1] = str(self.machine.fps)
        self.ffmpeg.begin()

    def stop_ours(self):
        """From the application's asking for the stop to its having the finished movie's name."""
        recording = next(pathlib.Path(self.machine.environment["XDG_STATE_HOME"]).rglob("*.mp4"))
        size, calls = recording.stat().st_size, written(self.daemon.process.pid)
        begin = time.monotonic()
        answer = self.machine.ask("stop")
        took = time.monotonic() - begin
        calls = written(self.daemon.process.pid) - calls
        stopped = re.fullmatch(r"stopped frame \d+ (/.*)", answer)
        if not stopped:
            raise RuntimeError(f"stop: {answer}\n{self.machine.log('daemon.log')}")
        self.ours = self.machine.folder / "ours.mp4"
        shutil.copy(stopped.group(1), self.ours)
        return {"ours_ms": took * 1000, "ours_written": calls, "ours_grew": self.ours.stat().st_size - size}

    def stop_ffmpeg(self):
        """From the interrupt to the end of its process; by `q` it would look for the key ten times a second only."""
        process = self.ffmpeg.process
        size, calls = self.ffmpeg.movie.stat().st_size, written(process.pid)
        begin = time.monotonic()
        process.send_signal(signal.SIGINT)
        os.waitid(os.P_PID, process.pid, os.WEXITED | os.WNOWAIT)
        took = time.monotonic() - begin
        calls = written(process.pid) - calls  # it has ended, and is still there to be asked
        process.wait()
        return {"ffmpeg_ms": took * 1000, "ffmpeg_written": calls,
                "ffmpeg_grew": self.ffmpeg.movie.stat().st_size - size}

    def contents(self):
        """What the two files are made of; fails when ours is no whole movie."""
        checked = subprocess.run([str(self.machine.binaries / "check_movie"), str(self.ours), "--allow-repeats", "1000000"],
                                 capture_output=True, text=True)
        if checked.returncode != 0:
            raise RuntimeError("our movie: " + checked.stderr)
        index, fragment = index_bytes(self.ours), last_fragment_bytes(self.ours)
        return {"ours_bytes": self.ours.stat().st_size, "ours_index": index, "ours_last_fragment": fragment,
                "ours_may_grow": index + BOX_HEADER + fragment, "ffmpeg_bytes": self.ffmpeg.movie.stat().st_size,
                "ffmpeg_index": index_bytes(self.ffmpeg.movie), "ours_seconds": seconds(self.ours),
                "ffmpeg_seconds": seconds(self.ffmpeg.movie)}


def written(pid):
    """Bytes handed to write calls of every kind but those of sockets' own, all threads (proc(5), `wchar`)."""
    for line in pathlib.Path(f"/proc/{pid}/io").read_text().splitlines():
        if line.startswith("wchar:"):
            return int(line.split()[1])
    raise RuntimeError(f"process {pid} tells nothing of what it writes")


def boxes(path, begin=0, end=None):
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
    return sum(size for kind, _, size in boxes(path) if kind == "moov")


def last_fragment_bytes(path):
    """The fragments that a recording was made of lie within the media of the finished movie."""
    begin, size = next((begin, size) for kind, begin, size in boxes(path) if kind == "mdat")
    index = next(begin for kind, begin, _ in boxes(path) if kind == "moov")
    fragments = [(kind, place, size) for kind, place, size in boxes(path, FILE_START, min(begin + size, index - 8))]
    last = max(place for kind, place, _ in fragments if kind == "moof")
    return sum(size for _, place, size in fragments if place >= last)


def seconds(path):
    out = subprocess.run(["ffprobe", "-v", "error", "-show_entries", "format=duration", "-of", "csv=p=0", str(path)],
                         check=True, capture_output=True, text=True)
    return float(out.stdout)
