"""The two recorders that are compared. Each is started on a machine, records its window and hands over a movie."""

import pathlib
import re
import shutil
import signal

from . import machine as machines

# What linux/media/VideoEncoder.cpp gives libx264 (`describe` and `tune`), as options of ffmpeg's command line. The bit
# rate comes from the daemon's log.
ENCODER = ("-pix_fmt yuv420p -c:v libx264 -threads 2 -preset ultrafast -tune zerolatency -profile:v high -g 60 -bf 0 "
           "-b:v {rate} -maxrate {rate} -bufsize {rate} -crf 20 -forced-idr 1 "
           "-x264-params 8x8dct=1:cabac=1:force-cfr=1:scenecut=0:keyint-min=1 "
           "-color_primaries smpte170m -color_trc smpte170m -colorspace smpte170m -color_range tv "
           "-chroma_sample_location center").split()


class Daemon:
    name = "ours"

    def __init__(self, machine, _rate=None, variables=None):
        """`variables` are added to its environment."""
        self.machine = machine
        self.process = machine.start([machine.binaries / "lumacastd"], "daemon.log", variables)
        socket = machine.folder / "runtime/lumacast/com.orvane.lumacastd.sock"
        machines.wait_for("the daemon", socket.exists)

    def begin(self):
        answer = self.machine.ask("start")
        if not answer.startswith("started "):
            raise RuntimeError(f"start: {answer}\n{self.machine.log('daemon.log')}")

    def finish(self, movie):
        answer = self.machine.ask("stop")
        stopped = re.fullmatch(r"stopped frame \d+ (/.*)", answer)
        if not stopped:
            raise RuntimeError(f"stop: {answer}\n{self.machine.log('daemon.log')}")
        shutil.copy(stopped.group(1), movie)

    def bit_rate(self):
        return int(re.findall(r"bit rate set to (\d+)", self.machine.log("daemon.log"))[-1])


class Ffmpeg:
    name = "ffmpeg"

    def __init__(self, machine, rate):
        self.machine, self.movie = machine, machine.folder / "ffmpeg.mp4"
        self.process = None
        self.command = ["ffmpeg", "-nostdin", "-hide_banner", "-loglevel", "warning", "-f", "x11grab",
                        "-window_id", machine.window, "-draw_mouse", "0", "-video_size", machine.size,
                        "-framerate", "60", "-i", machine.environment["DISPLAY"]]
        self.command += [word.format(rate=rate) for word in ENCODER] + [str(self.movie)]

    def begin(self):
        self.process = self.machine.start(self.command, "ffmpeg.log")
        machines.wait_for("ffmpeg's movie", lambda: self.movie.exists() or self.process.poll() is not None)
        if self.process.poll() is not None:
            raise RuntimeError("ffmpeg: " + self.machine.log("ffmpeg.log"))

    def finish(self, movie):
        machines.end(self.process, signal.SIGINT)
        pathlib.Path(movie).write_bytes(self.movie.read_bytes())
