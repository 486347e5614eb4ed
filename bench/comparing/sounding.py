"""A machine with a sound server of its own and an application that can be heard."""

from . import machine


class SoundingMachine(machine.Machine):
    def __init__(self, binaries, size, fps, application):
        super().__init__(binaries, size, fps=fps, options=application)

    def _start_display(self):
        super()._start_display()
        pulse = self.folder / "pulse"
        pulse.mkdir(mode=0o700)
        self.environment["PULSE_RUNTIME_PATH"] = str(pulse)
        self.environment["PULSE_SERVER"] = f"unix:{pulse}/native"
        self.start_sound()

    def start_sound(self):
        """Also again, after its end: at the same address."""
        socket = self.folder / "pulse/native"
        socket.unlink(missing_ok=True)
        self.sound = self.start(["pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit",
                                 "--use-pid-file=no", "--realtime=no",
                                 "-L", "module-null-sink sink_name=null0 rate=48000 norewinds=1",
                                 "-L", "module-native-protocol-unix auth-cookie-enabled=0"], "sound.log")
        machine.wait_for("the sound server", socket.exists)

    def start_application(self):
        super().start_application()
        machine.wait_for("the first second", lambda: self.frame() > self.fps)
