"""The start of a recording by either recorder, with the moments that bench/encoder_stamps.cpp notes."""

import time

from . import machine, recorders

RECORDED = 0.5  # seconds of each recording


class Stamps:
    """The moments of one start, in ms since the wish for it; each process's first of a kind counts."""

    def __init__(self, on):
        self.file = on.folder / "stamps"
        on.environment |= {"LD_PRELOAD": str(on.binaries / "encoder_stamps.so"), "LC_ENCODER_STAMPS": str(self.file)}

    def begin(self):
        self.file.unlink(missing_ok=True)
        self.started = time.monotonic_ns()

    def since(self, moment):
        return (moment - self.started) / 1e6

    def read(self, pid):
        """Waits for the first coded picture."""
        def moments():
            found = {}
            for line in self.file.read_text().splitlines() if self.file.exists() else []:
                process, moment, stamp = line.split()
                if int(process) == pid:
                    found.setdefault(moment, self.since(int(stamp)))
            return found if "packet" in found else None
        return machine.wait_for("the first coded picture", moments)


class Starter:
    def start(self):
        self.stamps.begin()
        self.begin()
        answered = time.monotonic_ns()
        figures = {"answered": self.stamps.since(answered)} | self.stamps.read(self.recorder.process.pid)
        time.sleep(RECORDED)
        self.recorder.finish(self.movie)
        return figures


class Ours(Starter):
    """The daemon, which runs: what counts is from the application's being told to ask for the start."""

    def __init__(self, on):
        self.stamps, self.movie = Stamps(on), on.folder / "ours.mp4"
        self.recorder = self.daemon = recorders.Daemon(on, None)

    def begin(self):
        self.recorder.begin()


class Theirs(Starter):
    """ffmpeg, which is started."""

    def __init__(self, on, rate):
        self.stamps, self.movie = Stamps(on), on.folder / "theirs.mp4"
        self.recorder = recorders.Ffmpeg(on, rate)

    def begin(self):
        self.recorder.movie.unlink(missing_ok=True)
        self.recorder.begin()


def until(moment):
    """Of what was there before the wish, as the daemon's libraries, none."""
    return lambda figures: figures.get(moment, 0.0)


def between(one, other):
    return lambda figures: figures[other] - figures[one]
