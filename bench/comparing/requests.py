"""Applications that ask the daemon for its state at a steady rate, or are only connected (bench/state_load.cpp)."""

import subprocess
import time

AHEAD = 0.05  # seconds from telling the clients to their first request


class Clients:
    """`count` applications, told apart by the daemon by their programs. To be made before the daemon starts; `connect`
    starts them."""

    def __init__(self, machine, count, prefix="Client"):
        self.machine = machine
        self.programs = machine.install_copies(machine.binaries / "state_load", prefix, count)
        self.children = []

    def connect(self, count=None):
        """Starts so many more, all at once, and waits for each to have been answered once. Answers how many were not."""
        begin = len(self.children)
        end = len(self.programs) if count is None else begin + count
        runtime = self.machine.folder / "runtime/lumacast"
        for program in self.programs[begin:end]:
            self.children.append(self.machine.start([program, runtime], "clients.log", stdin=subprocess.PIPE,
                                                    stdout=subprocess.PIPE, text=True, bufsize=1))
        return sum(child.stdout.readline().strip() != "ready" for child in self.children[begin:end])

    def ask(self, rate, seconds, children=None):
        """Requests at `rate` a second, shared out among the clients; answers what came of them."""
        self.begin(rate, seconds, children)
        return self.end()

    def begin(self, rate, seconds, children=None):
        self.asking, self.seconds = children or self.children, seconds
        each = rate / len(self.asking)
        begin = time.monotonic_ns() + int(AHEAD * 1e9)
        for number, child in enumerate(self.asking):
            # One after the other, not all at the same moment.
            child.stdin.write(f"load {each} {seconds} {begin + int(number / rate * 1e9)}\n")

    def end(self):
        answers = [child.stdout.readline().split() for child in self.asking]
        if not all(answers):
            raise RuntimeError("a client was lost: " + self.machine.log("clients.log")[-1000:])
        times = {}
        for answer in answers:
            for step in answer[3:]:
                microseconds, count = step.split(":")
                times[float(microseconds)] = times.get(float(microseconds), 0) + int(count)
        due, in_time = (sum(int(answer[field]) for answer in answers) for field in (0, 1))
        return {"due": due, "offered_per_s": due / self.seconds, "reached_per_s": in_time / self.seconds,
                "woke_late_us": max(float(answer[2]) for answer in answers)} | quantiles(times)


def quantiles(times):
    """p50, p99 and the longest of {us: count}, in us."""
    count, seen = sum(times.values()), 0
    found = {}
    for value in sorted(times):
        seen += times[value]
        for name, part in (("p50_us", 0.5), ("p99_us", 0.99)):
            if name not in found and seen >= part * count:
                found[name] = value
        found["max_us"] = value
    return found
