"""What processes cost, as the kernel counts it."""

import collections
import os
import pathlib
import subprocess
import tempfile
import subprocess
import time

TICK = 1 / os.sysconf("SC_CLK_TCK")


def cpu_seconds(pid):
    """utime + stime of all threads, those that have ended too; steps of a clock tick."""
    fields = pathlib.Path(f"/proc/{pid}/stat").read_text().rpartition(")")[2].split()
    return (int(fields[11]) + int(fields[12])) * TICK


def timed(command):
    """Runs a command to its end: seconds, seconds on a processor, most bytes of memory."""
    before = time.monotonic()
    child = subprocess.Popen(command)
    _, status, used = os.wait4(child.pid, 0)
    child.returncode = os.waitstatus_to_exitcode(status)
    if child.returncode != 0:
        raise RuntimeError(f"{command[0]} ended with {child.returncode}")
    return {"wall": time.monotonic() - before, "cpu": used.ru_utime + used.ru_stime, "memory": used.ru_maxrss * 1024}


class Threads:
    """The living threads of a process at one moment: name, seconds on a processor, voluntary switches."""

    def __init__(self, pid):
        self.of = {}
        for task in pathlib.Path(f"/proc/{pid}/task").iterdir():
            try:
                name = (task / "comm").read_text().strip()
                seconds = int((task / "schedstat").read_text().split()[0]) / 1e9
                status = (task / "status").read_text()
            except (FileNotFoundError, ProcessLookupError):
                continue  # it has just ended
            switches = int(status.partition("\nvoluntary_ctxt_switches:")[2].split()[0])
            self.of[int(task.name)] = (name, seconds, switches)

    def seconds_since(self, earlier):
        return sum(self._since(earlier, 1))

    def switches_since(self, earlier):
        return sum(self._since(earlier, 2))

    def by_name_since(self, earlier):
        """Seconds per thread, those of one name told apart by a number."""
        seconds, seen = {}, collections.Counter()
        for task, (name, spent, _) in sorted(self.of.items()):
            seen[name] += 1
            seconds[f"{name} {seen[name]}"] = spent - earlier.of.get(task, ("", 0, 0))[1]
        return seconds

    def switches_by_name_since(self, earlier):
        """Voluntary switches of all threads of one name."""
        switches = collections.Counter()
        for task, (name, _, count) in self.of.items():
            switches[name] += count - earlier.of.get(task, ("", 0, 0))[2]
        return dict(switches)

    def _since(self, earlier, field):
        return (values[field] - earlier.of.get(task, ("", 0, 0))[field] for task, values in self.of.items())


def share_of(pid, library, seconds):
    """Which share of a process's time on a processor passes within a library, sampled for so long."""
    with tempfile.TemporaryDirectory(prefix="lumacast-bench-perf-") as folder:
        data = pathlib.Path(folder) / "perf.data"
        subprocess.run(["perf", "record", "-q", "-e", "cpu-clock", "-F", "997", "-o", data, "-p", str(pid), "--", "sleep",
                        str(seconds)], check=True, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        told = subprocess.run(["perf", "report", "-i", data, "--stdio", "--sort", "dso", "-t", ";"], check=True,
                              capture_output=True, text=True).stdout
    lines = [line.split(";") for line in told.splitlines() if ";" in line and not line.startswith("#")]
    if not lines:
        raise RuntimeError("perf saw nothing of the process")
    return sum(float(share.strip(" %")) for share, name in lines if name.strip().startswith(library)) / 100


def pss(pid):
    """Bytes of memory, what is shared divided among its users."""
    return memory(pid)[0]


def memory(pid):
    """(PSS, of it what is no file's), bytes. Others may map parts of programs and libraries too, which are files: that
    share changes as they come and go."""
    sizes = {line.split(":")[0]: int(line.split()[1]) * 1024
             for line in pathlib.Path(f"/proc/{pid}/smaps_rollup").read_text().splitlines()[1:]}
    return sizes["Pss"], sizes["Pss_Anon"] + sizes["Pss_Shmem"]


def holdings(pid):
    """What a process has: memory in bytes, descriptors, threads."""
    pss_bytes, own = memory(pid)
    return {"pss": pss_bytes, "own": own, "descriptors": len(os.listdir(f"/proc/{pid}/fd")),
            "threads": len(os.listdir(f"/proc/{pid}/task"))}


def load():
    return float(pathlib.Path("/proc/loadavg").read_text().split()[0])


def machine():
    """What the figures were measured on, one line."""
    model = next((line.partition(":")[2].strip() for line in pathlib.Path("/proc/cpuinfo").read_text().splitlines()
                  if line.startswith("model name")), "unknown processor")
    return f"{len(os.sched_getaffinity(0))} cores, {model}, {os.uname().sysname} {os.uname().release.split('-')[0]}"
