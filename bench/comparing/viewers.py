"""A media server and a web server (docs/live-server.conf in one nginx, one worker), and viewers of a stream."""

import os
import pathlib
import re
import selectors
import socket
import struct
import subprocess
import time

from . import machine, meters

ROOT = pathlib.Path(__file__).resolve().parents[2]
SEGMENTS = 12         # files that viewers go round in
READ = 1 << 20        # bytes that a viewer takes out of its socket at a time, at most


def free_port():
    with socket.socket() as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


class Server(machine.Household):
    """nginx on one core, as the documentation has it; `sendfile` or not."""

    def __init__(self, core, sendfile):
        super().__init__("lumacast-viewers-")
        for name in ("live/hls", "live/rtmp", "cache", "temp"):
            (self.folder / name).mkdir(parents=True)
        self.rtmp, self.origin, self.edge = (free_port() for _ in range(3))
        try:
            self._start(core, sendfile)
        except BaseException:
            self.close()
            raise

    def _start(self, core, sendfile):
        text = (ROOT / "docs/live-server.conf").read_text()
        own = {"/srv/live": f"{self.folder}/live", "/var/cache/live": f"{self.folder}/cache", "1935": str(self.rtmp),
               "8080": str(self.origin), "8000": str(self.edge)}
        if not sendfile:
            own["sendfile on;"] = "sendfile off;"
        if any(place not in text for place in own):
            raise RuntimeError("docs/live-server.conf is another one by now")
        text = re.sub("|".join(map(re.escape, own)), lambda found: own[found.group(0)], text)
        temporary = "".join(f"  {kind}_temp_path {self.folder}/temp/{kind};\n"
                            for kind in ("client_body", "proxy", "fastcgi", "uwsgi", "scgi"))
        text = text.replace("http {\n", "http {\n  access_log off;\n  keepalive_requests 1000000;\n" + temporary)
        user = "user root;\n" if os.getuid() == 0 else ""
        (self.folder / "nginx.conf").write_text(
            f"daemon off;\nmaster_process off;\npid {self.folder}/nginx.pid;\n{user}" + text)
        self.process = self.start(["taskset", "-c", str(core), "/usr/sbin/nginx", "-p", self.folder, "-c",
                                   self.folder / "nginx.conf", "-e", self.folder / "error.log"])
        machine.wait_for("nginx", lambda: (self.folder / "nginx.pid").exists() or self.process.poll() is not None)
        if self.process.poll() is not None:
            raise RuntimeError("nginx: " + (self.folder / "error.log").read_text())

    def start(self, command):
        return self.spawn(command, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)

    def put_segments(self, size):
        for number in range(SEGMENTS):
            (self.folder / f"live/hls/{number}.m4s").write_bytes(os.urandom(size))


class HttpViewer:
    """Asks for a segment each `every` seconds over one connection, as a player with a full buffer does."""

    def __init__(self, port, first):
        self.socket = socket.create_connection(("127.0.0.1", port))
        self.number, self.left, self.head, self.asked = first, 0, b"", None

    def ask(self, due):
        self.number += 1
        self.asked, self.head = due, b""
        self.socket.sendall(f"GET /hls/{self.number % SEGMENTS}.m4s HTTP/1.1\r\nHost: live\r\n\r\n".encode())

    def read(self):
        """Takes what is there; answers its bytes, and whether that was the end of a segment."""
        if self.left == 0:
            self.head += self.socket.recv(4096)
            head, end, body = self.head.partition(b"\r\n\r\n")
            if not end:
                return 0, False
            if not head.startswith(b"HTTP/1.1 200"):
                raise RuntimeError(head.decode(errors="replace"))
            length = next(int(line.split(b":")[1]) for line in head.split(b"\r\n") if line.lower().startswith(b"content-length"))
            self.left = length - len(body)
            return len(body), self.left == 0
        got = discard(self.socket, min(self.left, READ))
        self.left -= got
        return got, self.left == 0


def discard(connection, most):
    """Takes bytes out of a TCP socket without copying them (tcp(7), MSG_TRUNC)."""
    got = connection.recv_into(NOWHERE, most, socket.MSG_TRUNC)
    if got == 0:
        raise RuntimeError("the server has ended a connection")
    return got


NOWHERE = bytearray(READ)


def watch_http(server, port, count, every, seconds):
    """So many viewers, the segments of each due at fixed times; answers what it cost the server and how late they were."""
    viewers = [HttpViewer(port, number) for number in range(count)]
    with selectors.DefaultSelector() as ready:
        for viewer in viewers:
            ready.register(viewer.socket, selectors.EVENT_READ, viewer)
        begin = time.monotonic()
        due = sorted(((begin + every * number / count, number) for number in range(count)), reverse=True)
        total, took, late, before = 0, [], 0, meters.Threads(server.process.pid)
        while (now := time.monotonic()) < begin + seconds:
            while due and due[-1][0] <= now:
                at, number = due.pop()
                if viewers[number].asked is None:
                    viewers[number].ask(at)
                else:
                    late += 1  # the one before is not there yet
                due.insert(0, (at + every, number))
            for key, _ in ready.select(max(0.0, due[-1][0] - time.monotonic())):
                got, whole = key.data.read()
                total += got
                if whole:
                    took.append(time.monotonic() - key.data.asked)
                    key.data.asked = None
        lasted = time.monotonic() - begin
        cpu = meters.Threads(server.process.pid).seconds_since(before)
    for viewer in viewers:
        viewer.socket.close()
    took.sort()
    return {"viewers": count, "bytes": total, "seconds": lasted, "cpu": cpu, "late": late,
            "p99_ms": 1000 * took[len(took) * 99 // 100] if took else None, "segments": len(took)}


class RtmpViewer:
    """Plays /live/bench; what comes is thrown away."""

    def __init__(self, port):
        self.socket = socket.create_connection(("127.0.0.1", port))
        self.socket.sendall(b"\x03" + bytes(1536))
        self._read(1 + 1536)
        self.socket.sendall(bytes(1536))
        self._read(1536)
        self._call("connect", 1, 0, amf_object({"app": "live", "tcUrl": f"rtmp://127.0.0.1:{port}/live"}))
        self._call("createStream", 2, 0, b"\x05")
        self._call("play", 3, 1, b"\x05" + amf_text("bench"))

    def _read(self, count):
        while count:
            count -= discard(self.socket, min(count, READ))

    def _call(self, name, transaction, stream, rest):
        body = amf_text(name) + b"\x00" + struct.pack(">d", transaction) + rest
        head = struct.pack(">B", 3) + bytes(3) + len(body).to_bytes(3, "big") + b"\x14" + struct.pack("<I", stream)
        chunks = [body[at:at + 128] for at in range(0, len(body), 128)]
        self.socket.sendall(head + b"\xc3".join(chunks))


def amf_text(text):
    return b"\x02" + struct.pack(">H", len(text)) + text.encode()


def amf_object(entries):
    fields = b"".join(struct.pack(">H", len(key)) + key.encode() + amf_text(value) for key, value in entries.items())
    return b"\x03" + fields + b"\x00\x00\x09"


def publish(server, movie):
    """Pushes a movie, again and again, in its own time."""
    pusher = server.start(["ffmpeg", "-nostdin", "-v", "error", "-re", "-stream_loop", "-1", "-i", movie, "-c", "copy", "-f",
                           "flv", f"rtmp://127.0.0.1:{server.rtmp}/live/bench"])
    machine.wait_for("the stream", lambda: list((server.folder / "live/rtmp").glob("*.m3u8")) or pusher.poll() is not None)
    if pusher.poll() is not None:
        raise RuntimeError("ffmpeg does not publish")


def watch_rtmp(server, count, seconds):
    viewers = [RtmpViewer(server.rtmp) for _ in range(count)]
    total = 0
    with selectors.DefaultSelector() as ready:
        for viewer in viewers:
            ready.register(viewer.socket, selectors.EVENT_READ, viewer)
        begin = time.monotonic()
        while time.monotonic() < begin + 2:  # what a player is sent first
            for key, _ in ready.select(0.1):
                discard(key.data.socket, READ)
        before, begin = meters.Threads(server.process.pid), time.monotonic()
        while time.monotonic() < begin + seconds:
            for key, _ in ready.select(0.1):
                total += discard(key.data.socket, READ)
        lasted = time.monotonic() - begin
        cpu = meters.Threads(server.process.pid).seconds_since(before)
    for viewer in viewers:
        viewer.socket.close()
    return {"viewers": count, "bytes": total, "seconds": lasted, "cpu": cpu}
