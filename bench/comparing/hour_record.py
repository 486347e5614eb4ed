"""The recording of an hour: makes it, and writes down what is known of it from outside."""

import csv
import json
import pathlib
import shutil
import threading
import time

from . import meters, recorders, sounding

BEEP_EVERY = 30     # frames
SAMPLE_EVERY = 10   # seconds
PAUSE_LASTS = 3     # seconds
COLUMNS = ["seconds", "pss", "own", "descriptors", "threads", "movie_bytes", "load"]


class Sampler(threading.Thread):
    """Counts what the daemon has, every ten seconds until it is told to end. One row each in `path`, at once: bytes of
    memory, what is shared divided among its users (`own`: what is no file's), descriptors, threads."""

    def __init__(self, daemon, state, path):
        super().__init__(daemon=True)
        self.process, self.state, self.path = daemon, state, path
        self.ending = threading.Event()
        self.begin = time.monotonic()

    def run(self):
        with open(self.path, "w", newline="", buffering=1) as out:
            rows = csv.writer(out)
            rows.writerow(COLUMNS)
            count = 0
            while self.process.poll() is None:
                rows.writerow(self.sample())
                count += 1
                if self.ending.wait(max(0.0, self.begin + count * SAMPLE_EVERY - time.monotonic())):
                    return

    def sample(self):
        movies = sum(path.stat().st_size for path in self.state.rglob("*.mp4"))
        return [f"{time.monotonic() - self.begin:.1f}", *meters.holdings(self.process.pid).values(), movies, meters.load()]


def asked(on, command):
    """The answer to a command, when it was asked and when it was answered (s, monotonic)."""
    before = time.monotonic()
    answer = on.ask(command)
    if answer.startswith("error"):
        raise RuntimeError(f"{command}: {answer}\n{on.log('daemon.log')[-4000:]}")
    return answer, before, time.monotonic()


def frame_in(answer):
    words = answer.split()
    return int(words[words.index("frame") + 1])


def record(binaries, settings, folder):
    """Leaves `movie.mp4`, `frames.txt`, `samples.csv` and `recorded.json` in the folder."""
    events = []
    with sounding.SoundingMachine(binaries, settings.size, settings.fps,
                                  ["--beep-every", str(BEEP_EVERY), "--frames-log", "{folder}/frames.txt"]) as on:
        daemon = recorders.Daemon(on, None)
        loads = [meters.load()]

        def note(command):
            answer, before, after = asked(on, command)
            events.append({"command": command, "asked": before, "answered": after, "frame": frame_in(answer)})
            return answer

        note("start")
        begin = time.monotonic()
        sampler = Sampler(daemon.process, pathlib.Path(on.environment["XDG_STATE_HOME"]), folder / "samples.csv")
        sampler.start()
        for minute in range(1, settings.minutes + 1):
            last = minute == settings.minutes
            time.sleep(max(0.0, begin + minute * 60 - (0 if last else PAUSE_LASTS) - time.monotonic()))
            if last:
                break
            note("pause")
            time.sleep(max(0.0, begin + minute * 60 - time.monotonic()))
            note("frame")  # the one on the screen at the end of a pause belongs to the movie again
            note("resume")
        sampler.ending.set()
        sampler.join()
        stopped = note("stop")
        loads.append(meters.load())
        movie = stopped.split(" ", 3)[3]
        shutil.copy(movie, folder / "movie.mp4")
        shutil.copy(on.folder / "frames.txt", folder / "frames.txt")
        shutil.copy(on.folder / "daemon.log", folder / "daemon.log")
        words = on.ask("beeps").split()
        beeps = dict(zip(["played", "late", "left out", "underflows"],
                         [int(word) for word in words if word.isdigit()]))
        (folder / "recorded.json").write_text(json.dumps(
            {"machine": meters.machine(), "size": settings.size, "fps": settings.fps, "minutes": settings.minutes,
             "load": loads, "events": events, "beeps": beeps}, indent=1) + "\n")
