"""A window that the daemon and ffmpeg record together, and how each of them is stopped."""

import os
import pathlib
import re
import shutil
import signal
import subprocess
import time

from . import boxes, machine, recorders


class Pair:
    def __init__(self, binaries, size, fps):
        self.machine = machine.Machine(binaries, size, fps=fps)

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
        index, fragment = boxes.index_bytes(self.ours), boxes.last_fragment_bytes(self.ours)
        return {"ours_bytes": self.ours.stat().st_size, "ours_index": index, "ours_last_fragment": fragment,
                "ours_may_grow": index + boxes.HEADER + fragment, "ffmpeg_bytes": self.ffmpeg.movie.stat().st_size,
                "ffmpeg_index": boxes.index_bytes(self.ffmpeg.movie), "ours_seconds": seconds(self.ours),
                "ffmpeg_seconds": seconds(self.ffmpeg.movie)}


def written(pid):
    """Bytes handed to write calls of every kind but those of sockets' own, all threads (proc(5), `wchar`)."""
    for line in pathlib.Path(f"/proc/{pid}/io").read_text().splitlines():
        if line.startswith("wchar:"):
            return int(line.split()[1])
    raise RuntimeError(f"process {pid} tells nothing of what it writes")


def seconds(path):
    out = subprocess.run(["ffprobe", "-v", "error", "-show_entries", "format=duration", "-of", "csv=p=0", str(path)],
                         check=True, capture_output=True, text=True)
    return float(out.stdout)
