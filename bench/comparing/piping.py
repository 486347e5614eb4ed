"""A PipeWire server of a comparison's own."""

import pathlib
import socket

from . import machine

CLIENT = ("protocol-native", "client-node", "adapter", "metadata")


def configuration(modules, **properties):
    lines = {"properties": {"support.dbus": "false"} | properties,
             "spa-libs": {"support.*": "support/libspa-support", "videoconvert.*": "videoconvert/libspa-videoconvert"}}
    text = "".join(f"context.{part} = {{ {' '.join(f'{key} = {value}' for key, value in values.items())} }}\n"
                   for part, values in lines.items())
    names = " ".join(f"{{ name = libpipewire-module-{name} }}" for name in modules)
    return f"{text}context.modules = [ {names} ]\n"


class PipeWireMachine(machine.Machine):
    """Without a display and without an application. No process of it asks for more priority than others have, so that
    what is compared does not either."""

    def __init__(self, binaries):
        super().__init__(binaries, "")

    def _start_display(self):
        folder = self.folder / "config/pipewire"
        folder.mkdir()
        (folder / "client.conf").write_text(configuration(CLIENT))
        (folder / "pipewire.conf").write_text(configuration(
            (*CLIENT, "access", "link-factory"), **{"core.daemon": "true", "core.name": "pipewire-0"}))
        self.environment["PIPEWIRE_DEBUG"] = "1"  # errors: it warns of the priority that it is not given
        self.start(["pipewire"], "pipewire.log")
        machine.wait_for("PipeWire", lambda: answers(self.folder / "runtime/pipewire-0"))

    def start_application(self):
        pass


def answers(path: pathlib.Path):
    with socket.socket(socket.AF_UNIX) as end:
        return end.connect_ex(str(path)) == 0
