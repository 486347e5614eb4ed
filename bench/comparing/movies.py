"""What a recorded movie holds, and how like what was drawn it is."""

import array
import json
import re
import subprocess

FFMPEG = ["ffmpeg", "-hide_banner", "-nostdin", "-y", "-loglevel", "error"]
SAMPLE = 30  # pictures whose likeness is measured
SILENT = 33  # of 32768, the largest sample of what counts as silence: 60 dB below full


def probe(movie):
    """What ffprobe says of the picture track."""
    fields = "codec_name,profile,level,pix_fmt,width,height,duration,bit_rate,nb_read_packets"
    out = subprocess.run(["ffprobe", "-v", "error", "-select_streams", "v:0", "-count_packets", "-show_entries",
                          f"stream={fields}", "-of", "json", str(movie)], check=True, capture_output=True, text=True)
    stream = json.loads(out.stdout)["streams"][0]
    return {"codec": stream["codec_name"], "profile": stream["profile"], "level": stream["level"],
            "pix_fmt": stream["pix_fmt"], "size": f"{stream['width']}x{stream['height']}",
            "seconds": float(stream["duration"]), "bit_rate": int(stream["bit_rate"]),
            "pictures": int(stream["nb_read_packets"])}


def encoder_options(movie):
    """What the encoder wrote of its options into the stream."""
    found = re.search(rb"x264 - core .*? - options: ([^\0\x80]*)", movie.read_bytes(), re.S)
    if not found:
        return None
    return dict(option.split("=", 1) for option in found.group(1).decode().split() if "=" in option)


def option_line(ours, theirs):
    """What differs between two movies' options, in words."""
    if not ours or not theirs:
        return "the encoder's options could not be read from the movies"
    different = [f"{key}: {ours.get(key)} / {theirs.get(key)}" for key in sorted(ours.keys() | theirs.keys())
                 if ours.get(key) != theirs.get(key)]
    return f"encoder options in the stream: {len(ours)}, different: {'; '.join(different) or 'none'}"


def numbers(binaries, movie):
    """The frame number in each picture, None where none can be read."""
    out = subprocess.run([str(binaries / "scene_pictures"), "numbers", str(movie)], check=True, capture_output=True,
                         text=True)
    return [None if number == "-" else int(number) for _, number in map(str.split, out.stdout.splitlines())]


def lost(seen, first, last):
    """How many of the frames with these numbers, both ends too, are in no picture. `seen` is what `numbers` answered."""
    inside = {number for number in seen if number and first <= number <= last}
    return last - first + 1 - len(inside)


def silent_seconds(movie):
    """How much of the sound is silence, in steps of a tenth of a second; all of it where there is no sound."""
    rate = 8000
    out = subprocess.run(["ffmpeg", "-v", "error", "-i", str(movie), "-vn", "-ac", "1", "-ar", str(rate), "-f", "s16le", "-"],
                         check=True, capture_output=True).stdout
    samples, step = array.array("h", out[:len(out) // 2 * 2]), rate // 10
    tenths = [samples[begin:begin + step] for begin in range(0, len(samples), step)]
    return sum(max(map(abs, tenth)) < SILENT for tenth in tenths) / 10 if tenths else probe(movie)["seconds"]


def spread(items):
    """At most SAMPLE of them, evenly."""
    if len(items) <= SAMPLE:
        return list(items)
    return [items[round(index * (len(items) - 1) / (SAMPLE - 1))] for index in range(SAMPLE)]


def ssim(binaries, movie, size, sample, kind="moving"):
    """Structural similarity (ffmpeg's filter) of pictures with what was drawn: sample is (index in the movie, frame
    number). Judged is what lies above the clock of the scene, as the time that it showed is not known any more."""
    drawn = subprocess.run([str(binaries / "scene_pictures"), "redraw", size, *(["--part"] if kind == "part" else []), *(str(number) for _, number in sample)],
                           check=True, capture_output=True).stdout
    width = int(size.split("x")[0])
    area = f"{width}:{len(drawn) // (width * 4 * len(sample))}"
    chosen = "+".join(f"eq(n,{index})" for index, _ in sample)
    graph = (f"[0:v]select='{chosen}',setpts=N/60/TB,crop={area}:0:0,settb=1/60[movie];"
             "[1:v]scale=flags=bicubic+accurate_rnd:out_color_matrix=bt601:out_range=tv,format=yuv420p,"
             "setpts=N/60/TB,settb=1/60[drawn];[movie][drawn]ssim")
    raw = ["-f", "rawvideo", "-pix_fmt", "bgr0", "-video_size", area.replace(":", "x"), "-framerate", "60"]
    out = subprocess.run(["ffmpeg", "-hide_banner", "-i", str(movie), *raw, "-i", "pipe:0", "-lavfi", graph,
                          "-f", "null", "-"], check=True, input=drawn, capture_output=True)
    found = re.search(r"SSIM Y:([\d.]+).*All:([\d.]+)", out.stderr.decode())
    return {"luma": float(found.group(1)), "all": float(found.group(2)), "pictures": len(sample)}
