"""A machine of the comparison's own: directories, a display, the recorded application, the daemon. Everything it starts
is ended by pid."""

import os
import pathlib
import re
import shutil
import signal
import subprocess
import tempfile
import time

ROOT = pathlib.Path(__file__).resolve().parents[2]
MOTION = {"moving": [], "still": ["--still"], "part": ["--part"]}  # the application's option for each kind of window
PATIENCE = 30  # seconds that anything may take to appear


def wait_for(what, condition):
    end = time.monotonic() + PATIENCE
    while True:
        answer = condition()
        if answer:
            return answer
        if time.monotonic() > end:
            raise RuntimeError(f"waited in vain for {what}")
        time.sleep(0.02)


class Household:
    """A folder of its own, and children that are ended with it."""

    def __init__(self, prefix):
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix=prefix))
        self.children = []

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def close(self):
        for child in reversed(self.children):
            end(child)
        shutil.rmtree(self.folder, ignore_errors=True)

    def spawn(self, command, **options):
        child = subprocess.Popen([str(word) for word in command], **options)
        self.children.append(child)
        return child


class Machine(Household):
    """`options` are more of examples/self_recorder's; {folder} in them is the machine's folder."""

    def __init__(self, binaries, size, kind="moving", fps=60, options=()):
        self.binaries, self.size, self.fps = pathlib.Path(binaries).resolve(), size, fps
        self.options = [*MOTION[kind], *options]
        super().__init__("lumacast-bench-")
        try:
            self._make_folders()
            self._start_display()
            self.start_application()
        except BaseException:
            self.close()
            raise

    def start(self, command, log, variables=None, **options):
        """`variables` are this process's own. The log goes on where one of that name is."""
        with open(self.folder / log, "ab") as errors:
            options.setdefault("stdout", errors)
            options.setdefault("stdin", subprocess.DEVNULL)
            return self.spawn(command, env=self.environment | (variables or {}), stderr=errors, **options)

    def install(self, identifier, name, program):
        """Makes a program an application."""
        (self.folder / f"data/applications/{identifier}.desktop").write_text(
            f"[Desktop Entry]\nType=Application\nName={name}\nExec={program}\n")

    def log(self, name):
        return (self.folder / name).read_text(errors="replace")

    def install_copies(self, program, prefix, count):
        """Makes one program so many applications, and answers where each is. To be done before the daemon starts: it looks
        again only now and then."""
        folder = self.folder / "programs" / prefix
        folder.mkdir(parents=True)
        shutil.copy(program, folder / "program")
        copies = [folder / f"{prefix}{number}" for number in range(count)]
        for copy in copies:
            os.link(folder / "program", copy)
            self.install(f"org.lumacast.{copy.name}", copy.name, copy)
        return copies

    def _make_folders(self):
        self.environment = {"PATH": os.environ.get("PATH", ""), "HOME": str(self.folder), "LANG": "C",
                            "WAYLAND_DISPLAY": ""}
        for variable in ("RUNTIME_DIR", "CONFIG_HOME", "DATA_HOME", "STATE_HOME", "CACHE_HOME"):
            path = self.folder / variable.split("_")[0].lower()
            path.mkdir(mode=0o700)
            self.environment[f"XDG_{variable}"] = str(path)
        (self.folder / "config/lumacast").mkdir()
        (self.folder / "config/lumacast/com.orvane.lumacastd.conf").write_text("LCSuppressAlert=true\n")
        shutil.copytree(ROOT / "resources/Lumacast.bundle", self.folder / "data/lumacast/Lumacast.bundle")
        (self.folder / "data/applications").mkdir()
        self.install("org.lumacast.SelfRecorder", "Self Recorder", self.binaries / "self_recorder")

    def _start_display(self):
        self.environment["DISPLAY"] = ":" + self.start_display()

    def start_display(self, number=None):
        """Also again, after its end, with the same number. Answers its number."""
        reading, writing = os.pipe()
        with os.fdopen(reading) as answer:
            try:
                self.display = self.start(["Xvfb", *([f":{number}"] if number else []), "-displayfd", str(writing), "-noreset",
                                           "-nolisten", "tcp", "-screen", "0", f"{self.size}x24"], "xvfb.log",
                                          pass_fds=[writing])
            finally:
                os.close(writing)
            number = answer.readline().strip()
        if not number:
            raise RuntimeError("Xvfb did not start: " + self.log("xvfb.log"))
        return number

    def start_application(self):
        """Also again, after its end."""
        options = [option.format(folder=self.folder) for option in self.options]
        self.application = self.start([self.binaries / "self_recorder", "--size", self.size, "--fps", str(self.fps),
                                       "--name", "Self Recorder", *options], "application.log",
                                      stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True, bufsize=1)
        self.window = re.fullmatch(r"window (0x[0-9a-f]+)", self.application.stdout.readline().strip()).group(1)
        wait_for("the first frame", lambda: self.frame() > 0)

    def ask(self, command):
        for _ in range(20):
            self.application.stdin.write(command + "\n")
            answer = self.application.stdout.readline().strip()
            while answer.startswith("event "):
                answer = self.application.stdout.readline().strip()
            # A desktop that does not say within 100 ms who is in front says "nobody"; on a busy machine one asks again.
            if command != "start" or not answer.startswith("error -5803"):
                return answer
        return answer

    def frame(self):
        """The number of the frame that the window shows."""
        return int(self.ask("frame").removeprefix("frame "))


def end(child, how=signal.SIGTERM):
    """Ends a child and waits for it."""
    if child.poll() is None:
        child.send_signal(how)
        try:
            child.wait(PATIENCE)
        except subprocess.TimeoutExpired:
            child.kill()
            child.wait()
    for pipe in (child.stdin, child.stdout):
        if pipe:
            try:
                pipe.close()
            except BrokenPipeError:
                pass
