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


class Machine:
    def __init__(self, binaries, size, kind="moving"):
        self.binaries, self.size = pathlib.Path(binaries).resolve(), size
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix="lumacast-bench-"))
        self.children = []
        try:
            self._make_folders()
            self._start_display()
            self._start_application(kind)
        except BaseException:
            self.close()
            raise

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def close(self):
        for child in reversed(self.children):
            end(child)
        shutil.rmtree(self.folder, ignore_errors=True)

    def start(self, command, log, **options):
        with open(self.folder / log, "wb") as errors:
            options.setdefault("stdout", errors)
            options.setdefault("stdin", subprocess.DEVNULL)
            child = subprocess.Popen(command, env=self.environment, stderr=errors, **options)
        self.children.append(child)
        return child

    def log(self, name):
        return (self.folder / name).read_text(errors="replace")

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
        (self.folder / "data/applications/org.lumacast.SelfRecorder.desktop").write_text(
            f"[Desktop Entry]\nType=Application\nName=Self Recorder\nExec={self.binaries / 'self_recorder'}\n")

    def _start_display(self):
        reading, writing = os.pipe()
        with os.fdopen(reading) as answer:
            try:
                self.display = self.start(["Xvfb", "-displayfd", str(writing), "-noreset", "-nolisten", "tcp",
                                           "-screen", "0", f"{self.size}x24"], "xvfb.log", pass_fds=[writing])
            finally:
                os.close(writing)
            number = answer.readline().strip()
        if not number:
            raise RuntimeError("Xvfb did not start: " + self.log("xvfb.log"))
        self.environment["DISPLAY"] = ":" + number

    def _start_application(self, kind):
        command = [str(self.binaries / "self_recorder"), "--size", self.size, "--fps", "60", "--name", "Self Recorder"]
        self.application = self.start(command + MOTION[kind], "application.log",
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
