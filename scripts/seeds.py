"""Running the simulation's tests over ranges of seeds: what scripts/simulate and scripts/mutants share."""
import os
import pathlib
import shutil
import subprocess
import tempfile
import time

ROOT = pathlib.Path(__file__).resolve().parent.parent
SEEDED = "InAnyOfManySeeds"


class CanNotRun(Exception):
    """Not a seed that is bad: the simulation itself can't be built or run."""


def git(root, *arguments):
    done = subprocess.run(["git", "-C", root, *arguments], capture_output=True, text=True)
    return done.stdout.strip() if done.returncode == 0 else ""


def build(root, targets):
    """Configures and builds for release in `root`."""
    launcher = ["-DCMAKE_CXX_COMPILER_LAUNCHER=ccache"] if shutil.which("ccache") else []
    for command in (["cmake", "--preset", "release", *launcher],
                    ["cmake", "--build", "--preset", "release", "--target", *targets]):
        done = subprocess.run(command, cwd=root, capture_output=True, text=True)
        if done.returncode != 0:
            raise CanNotRun("the build failed:\n" + (done.stdout + done.stderr)[-4000:])


def seeded_tests(binary, wanted=None):
    """The names of the tests that go through seeds and of which a part is wanted, in that order."""
    done = subprocess.run([binary, "--gtest_list_tests"], capture_output=True, text=True, timeout=60)
    tests, suite = [], ""
    for line in done.stdout.splitlines():
        if line and not line[0].isspace():
            suite = line.split()[0]
        elif line.strip().endswith(SEEDED):
            tests.append(suite + line.strip())
    if not tests:
        raise CanNotRun(f"{binary} has no test that goes through seeds")
    chosen = []
    for part in wanted or [""]:
        found = [test for test in tests if part in test]
        if not found:
            raise CanNotRun(f"no test is called {part}: there are {', '.join(tests)}")
        chosen += [test for test in found if test not in chosen]
    return chosen


class Runner:
    """Runs ranges of seeds, and can be stopped from another thread."""

    def __init__(self, binary, hang):
        self.binary, self.hang = binary, hang
        self.children = set()
        self.stopping = False

    def first_bad(self, test, first, last, processor=None):
        """Runs the seeds until one is bad: (it, "failed", "crashed" or "hung", what was printed), or None."""
        with tempfile.TemporaryDirectory(prefix="simulate-") as scratch:
            mark, log = pathlib.Path(scratch, "seed"), pathlib.Path(scratch, "log")
            mark.write_text("0\n")
            kind = self.run(test, first, last, mark, log, processor)
            seed, text = int(mark.read_text() or 0), log.read_text(errors="replace")
        if self.stopping or (not kind and seed == last):
            return None
        if not first <= seed <= last:
            raise CanNotRun(f"{test} ended {kind or 'well'} without having run the seeds from {first}:\n{text[-2000:]}")
        return seed, kind or "ended early", text

    def run(self, test, first, last, mark, log, processor):
        """None when all went well, else how the seed in the mark ended."""
        environment = {**os.environ, "LC_FIRST_SEED": str(first), "LC_SEEDS": str(last - first + 1),
                       "LC_SEED_MARK": str(mark)}
        environment.pop("LC_SEED", None)
        command = [str(self.binary), f"--gtest_filter={test}", "--gtest_brief=1"]
        if processor is not None:
            command = ["taskset", "-c", str(processor), *command]
        with open(log, "wb") as output:
            child = subprocess.Popen(command, env=environment, stdin=subprocess.DEVNULL, stdout=output,
                                     stderr=subprocess.STDOUT)
            self.children.add(child)
            seen, since = None, time.monotonic()
            try:
                while True:
                    try:
                        status = child.wait(1)
                        return None if status == 0 else "crashed" if status < 0 or status >= 128 else "failed"
                    except subprocess.TimeoutExpired:
                        pass
                    now = mark.read_text()
                    if now != seen:
                        seen, since = now, time.monotonic()
                    elif time.monotonic() - since > self.hang:
                        return "hung"
            finally:
                if child.poll() is None:
                    child.kill()
                    child.wait()
                self.children.discard(child)

    def stop(self):
        self.stopping = True
        for child in list(self.children):
            child.kill()
