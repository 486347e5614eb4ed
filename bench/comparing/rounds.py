"""One recording on a machine of its own, measured."""

import statistics
import time

from . import meters, movies
from .machine import Machine

SETTLE = 2.0  # seconds before a stretch is measured: starting is not what is compared
PROFILE = 6  # seconds behind a stretch in which the encoder's part is sampled
ENCODER = "libx264"


class Stretch:
    """Some seconds, looked at from outside."""

    def __init__(self, machine, recorder, seconds):
        display = machine.display.pid
        pids = [recorder, display] if recorder else [display]
        memory = []
        begin, frame = time.monotonic(), machine.frame()
        before = {pid: (meters.cpu_seconds(pid), meters.Threads(pid)) for pid in pids}
        for second in range(1, int(seconds) + 1):
            time.sleep(max(0.0, begin + second - time.monotonic()))
            if second < seconds:  # reading memory costs the reader only, but not at the very end
                memory.append([meters.pss(pid) for pid in pids])
        after = {pid: (meters.cpu_seconds(pid), meters.Threads(pid)) for pid in pids}
        self.first, self.last = frame + 1, machine.frame()
        self.seconds = time.monotonic() - begin
        self.load = meters.load()
        self.cpu = {pid: after[pid][1].seconds_since(before[pid][1]) for pid in pids}
        self.ticks = {pid: after[pid][0] - before[pid][0] for pid in pids}
        self.threads = after[pids[0]][1].by_name_since(before[pids[0]][1])
        self.switches_by_name = after[pids[0]][1].switches_by_name_since(before[pids[0]][1])
        self.switches = after[pids[0]][1].switches_since(before[pids[0]][1])
        self.pss = {pid: statistics.median(column) for pid, column in zip(pids, zip(*memory))}
        self.memory = memory

    @property
    def drawn(self):
        return self.last - self.first + 1


def record(kind, make, settings, rate, movie):
    """Everything about one recording but its likeness, as a dictionary of figures."""
    with Machine(settings.binaries, settings.size, kind) as machine:
        recorder = make(machine, rate)
        time.sleep(SETTLE)
        alone = Stretch(machine, None, settings.seconds)
        recorder.begin()
        time.sleep(SETTLE)
        during = Stretch(machine, recorder.process.pid, settings.seconds)
        encoder = meters.share_of(recorder.process.pid, ENCODER, PROFILE)
        recorder.finish(movie)
        if recorder.name == "ours":
            rate = recorder.bit_rate()
        figures = costs(machine.display.pid, recorder.process.pid, alone, during, kind)
    figures |= {"kind": kind, "recorder": recorder.name, "rate": rate, "movie": movies.probe(movie),
                "options": movies.encoder_options(movie), "command": getattr(recorder, "command", None),
                "encoder_share": encoder, "recorder_cpu_without_encoder": figures["recorder_cpu"] * (1 - encoder)}
    figures["numbers"] = movies.numbers(settings.binaries, movie)
    figures |= contents(figures, during, kind)
    return figures


def costs(display, recorder, alone, during, kind):
    # A busy machine draws fewer frames: what the display spends without recording is counted per frame drawn.
    scale = during.drawn / alone.drawn if kind != "still" and alone.drawn > 0 else during.seconds / alone.seconds
    return {
        "seconds": during.seconds, "load": during.load, "drawn_alone": alone.drawn,
        "recorder_cpu": during.cpu[recorder], "recorder_cpu_ticks": during.ticks[recorder],
        "display_cpu_gross": during.cpu[display], "display_cpu_alone": alone.cpu[display],
        "display_cpu_share": during.cpu[display] - alone.cpu[display] * scale,
        "recorder_pss": during.pss[recorder],
        "peak_recorder_pss": max(of_recorder for of_recorder, _ in during.memory),
        "peak_memory": max(sum(both) for both in during.memory) - alone.pss[display],
        # Planes and images are shared with the display, which keeps a picture of a redirected window besides.
        "memory": during.pss[recorder] + during.pss[display] - alone.pss[display],
        "wakeups_per_second": during.switches / during.seconds, "threads": during.threads,
        "switches": during.switches_by_name,
    }


def contents(figures, during, kind):
    """Which of the frames drawn in the stretch are in the movie. The pictures of a still window all have one number, so
    those of the stretch are counted by the movie's own length."""
    numbers = figures["numbers"]
    if kind == "still":
        pictures = figures["movie"]["pictures"] * during.seconds / figures["movie"]["seconds"]
        return {"drawn": 1, "distinct": len(set(numbers) - {None}), "pictures": pictures,
                "unreadable": numbers.count(None)}
    inside = [number for number in numbers if number and during.first <= number <= during.last]
    return {"drawn": during.drawn, "distinct": len(set(inside)), "pictures": len(inside),
            "unreadable": numbers.count(None), "first": during.first, "last": during.last}


def sample(kind, ours, theirs):
    """Pictures of both movies to be judged: (index, frame number) each. Where the window moves, the same frames."""
    both = [ours["numbers"], theirs["numbers"]]
    if kind == "still":
        return [[(index, numbers[index]) for index in movies.spread(range(len(numbers))) if numbers[index]]
                for numbers in both]
    common = sorted((set(both[0]) & set(both[1])) - {None})
    if not common:
        raise RuntimeError("the two movies have no frame in common")
    return [[(numbers.index(number), number) for number in movies.spread(common)] for numbers in both]
