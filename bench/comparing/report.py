"""The table, and what was met and missed."""

import statistics

from . import movies

# The most that ours may be of ffmpeg's.
CPU = {"moving": 0.7, "part": 0.5, "still": 0.03}
WITHOUT_ENCODER, WITHOUT_ENCODER_MS = 0.3, 3.0
MEMORY = 0.8
# The most of a still window's recording, beyond what its pictures take.
BESIDES_CORE, BESIDES_WAKEUPS = 0.005, 5
# The daemon's threads that work for pictures. The encoder's, whose own threads have its name, works for the sound too: that
# is not told apart.
PICTURE_THREADS = ("lc-frames", "lc-encoder")


def milliseconds_per_picture(field):
    return lambda figures: 1000 * figures[field] / max(figures["pictures"], 1)


def milliseconds_per_second(field):
    return lambda figures: 1000 * figures[field] / figures["seconds"]


def both(unit):
    return lambda figures: unit("recorder_cpu")(figures) + unit("display_cpu_share")(figures)


def without_encoder(figures):
    return 1000 * (figures["recorder_cpu_without_encoder"] + figures["display_cpu_share"]) / max(figures["pictures"], 1)


def besides_core(figures):
    return sum(seconds for name, seconds in figures["threads"].items()
               if not name.startswith(PICTURE_THREADS)) / figures["seconds"]


def besides_wakeups(figures):
    return sum(count for name, count in figures["switches"].items()
               if not name.startswith(PICTURE_THREADS)) / figures["seconds"]


def per_frame(figures):
    return 1000 * (figures["recorder_cpu"] + figures["display_cpu_share"]) / max(figures["distinct"], 1)


def cost_lines(unit, name):
    return [
        (f"recorder, CPU ms/{name}", unit("recorder_cpu"), "{:.3f}"),
        (f"display server's share, CPU ms/{name}", unit("display_cpu_share"), "{:.3f}"),
        (f"display server gross, CPU ms/{name}", unit("display_cpu_gross"), "{:.3f}"),
        (f"recorder + share, CPU ms/{name}", both(unit), "{:.3f}"),
    ]


def lines(kind):
    """(what, how to read it from the figures, format)"""
    costs = cost_lines(milliseconds_per_picture, "picture")
    if kind == "still":
        costs = cost_lines(milliseconds_per_second, "second") + costs
    else:
        # On a machine that has no time ffmpeg writes pictures again that it did not grab again: those are cheap.
        costs.append(("recorder + share, CPU ms/distinct frame", per_frame, "{:.3f}"))
        costs.append(("encoder's share of the recorder's CPU", lambda f: f["encoder_share"], "{:.3f}"))
        costs.append(("recorder + share without the encoder, CPU ms/picture", without_encoder, "{:.3f}"))
    return costs + [
        ("pictures recorded per second", lambda f: f["pictures"] / f["seconds"], "{:.2f}"),
        ("frames drawn", lambda f: f["drawn"], "{:.0f}"),
        ("of them in the movie", lambda f: f["distinct"], "{:.0f}"),
        ("lost", lambda f: f["drawn"] - f["distinct"], "{:.0f}"),
        ("pictures without a readable number", lambda f: f["unreadable"], "{:.0f}"),
        ("wake-ups per second", lambda f: f["wakeups_per_second"], "{:.1f}"),
        ("recorder's memory, PSS MiB", lambda f: f["recorder_pss"] / 2**20, "{:.1f}"),
        ("memory with the display's growth, MiB", lambda f: f["memory"] / 2**20, "{:.1f}"),
        ("recorder's memory at its peak", lambda f: f["peak_recorder_pss"] / 2**20, "{:.1f}"),
        ("with the display's growth, at its peak", lambda f: f["peak_memory"] / 2**20, "{:.1f}"),
        ("bit rate, kbit/s", lambda f: f["movie"]["bit_rate"] / 1000, "{:.0f}"),
        ("SSIM, luma", lambda f: f["ssim"]["luma"], "{:.4f}"),
        ("SSIM, all planes", lambda f: f["ssim"]["all"], "{:.4f}"),
        ("pictures judged by SSIM", lambda f: f["ssim"]["pictures"], "{:.0f}"),
        ("load average", lambda f: f["load"], "{:.2f}"),
    ]


def median(pairs, side, read):
    return statistics.median(read(pair[side]) for pair in pairs)


def verdicts(kind, pairs):
    """What was aimed at: text, value, limit, whether it was met. A ratio is that of the medians."""
    unit = milliseconds_per_second if kind == "still" else milliseconds_per_picture
    luma = [round(median(pairs, side, lambda figures: figures["ssim"]["luma"]), 3) for side in (0, 1)]

    def most(what, value, limit):
        return {"what": what, "value": round(value, 4), "target": f"<= {limit}", "met": value <= limit}

    def ratio(what, read, limit):
        return most(what + ", ours / ffmpeg", median(pairs, 0, read) / median(pairs, 1, read), limit)

    found = [ratio(f"recorder + share, CPU per {'second' if kind == 'still' else 'picture'}", both(unit), CPU[kind])]
    if kind == "moving":
        found += [ratio("without the encoder, CPU per picture", without_encoder, WITHOUT_ENCODER),
                  most("without the encoder, CPU ms per picture", median(pairs, 0, without_encoder), WITHOUT_ENCODER_MS),
                  ratio("recorder's memory at its peak", lambda figures: figures["peak_recorder_pss"], MEMORY),
                  ratio("with the display's growth", lambda figures: figures["peak_memory"], MEMORY)]
    elif kind == "still":
        found += [most("share of a core besides the pictures", median(pairs, 0, besides_core), BESIDES_CORE),
                  most("wake-ups a second besides the pictures'", median(pairs, 0, besides_wakeups), BESIDES_WAKEUPS)]
    return found + [{"what": "SSIM of luma to three decimals, ours", "value": luma[0], "target": f">= {luma[1]}",
                     "met": luma[0] >= luma[1]}]


def show(kind, pairs):
    print(f"\n{kind} window, {len(pairs)} rounds of {pairs[0][0]['seconds']:.0f} s;", end=" ")
    print("medians, then each round ours/ffmpeg\n")
    print(f"| {'':<53} | {'ours':>9} | {'ffmpeg':>9} | {'ratio':>6} | rounds")
    print(f"|{'-' * 55}|{'-' * 11}|{'-' * 11}|{'-' * 8}|{'-' * 8}")
    for what, read, form in lines(kind):
        ours, theirs = median(pairs, 0, read), median(pairs, 1, read)
        ratio = f"{ours / theirs:6.3f}" if theirs else f"{'-':>6}"
        each = "  ".join(f"{form.format(read(one))}/{form.format(read(other))}" for one, other in pairs)
        print(f"| {what:<53} | {form.format(ours):>9} | {form.format(theirs):>9} | {ratio} | {each}")
    print()
    for verdict in verdicts(kind, pairs):
        word = "met   " if verdict["met"] else "MISSED"
        print(f"{word}  {verdict['what']}: {verdict['value']}, target {verdict['target']}")
    show_likeness(pairs)


def show_likeness(pairs):
    """What shows that the two files are alike, from the last round."""
    ours, theirs = pairs[-1]
    print()
    for figures in (ours, theirs):
        print(f"{figures['recorder']:<7} " + "  ".join(f"{key} {value}" for key, value in figures["movie"].items()))
    print(movies.option_line(ours["options"], theirs["options"]))
    print("command " + " ".join(theirs["command"]))
    for figures in (ours, theirs):
        print(f"threads of {figures['recorder']}, CPU s: " + "  ".join(
            f"{name} {seconds:.2f}" for name, seconds in sorted(figures["threads"].items(), key=lambda item: -item[1])))
