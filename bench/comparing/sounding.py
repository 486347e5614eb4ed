"""A machine with a sound server of its own and an application that can be heard."""

import subprocess

from . import machine


class SoundingMachine(machine.Machine):
    """`application` are more options of examples/self_recorder; {folder} in them is the machine's folder."""

    def __init__(self, binaries, size, fps, application):
        self.fps, self.options = fps, application
        super().__init__(binaries, size)

    def _start_display(self):
        super()._start_display()
        pulse = self.folder / "pulse"
        pulse.mkdir(mode=0o700)
        socket = pulse / "native"
        self.environment["PULSE_RUNTIME_PATH"] = str(pulse)
        self.start(["pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit", "--use-pid-file=no",
                    "-L", "module-null-sink sink_name=null0 rate=48000 norewinds=1",
                    "-L", "module-native-protocol-unix auth-cookie-enabled=0"], "sound.log")
        machine.wait_for("the sound server", socket.exists)
        self.environment["PULSE_SERVER"] = f"unix:{socket}"

    def _start_application(self, kind):
        options = [option.format(folder=self.folder) for option in self.options]
        self.application = self.start([str(self.binaries / "self_recorder"), "--size", self.size, "--fps", str(self.fps),
                                       "--name", "Self Recorder", *options], "application.log",
                                      stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True, bufsize=1)
        self.window = self.application.stdout.readline().strip()
        machine.wait_for("the first frame", lambda: self.frame() > self.fps)
