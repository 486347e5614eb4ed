"""The table, and what was met and missed."""

import statistics

from . import movies

# The most that ours may be of ffmpeg's.
MOVING_CPU = 0.8
STILL_CPU = 0.1


def milliseconds_per_picture(field):
    return lambda figures: 1000 * figures[field] / max(figures["pictures"], 1)


def milliseconds_per_second(field):
    return lambda figures: 1000 * figures[field] / figures["seconds"]


def both(unit):
    return lambda figures: unit("recorder_cpu")(figures) + unit("display_cpu_share")(figures)


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
    return costs + [
        ("pictures recorded per second", lambda f: f["pictures"] / f["seconds"], "{:.2f}"),
        ("frames drawn", lambda f: f["drawn"], "{:.0f}"),
        ("of them in the movie", lambda f: f["distinct"], "{:.0f}"),
        ("lost", lambda f: f["drawn"] - f["distinct"], "{:.0f}"),
        ("pictures without a readable number", lambda f: f["unreadable"], "{:.0f}"),
        ("wake-ups per second", lambda f: f["wakeups_per_second"], "{:.1f}"),
        ("recorder's memory, PSS MiB", lambda f: f["recorder_pss"] / 2**20, "{:.1f}"),
        ("memory with the display's growth, MiB", lambda f: f["memory"] / 2**20, "{:.1f}"),
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
    moving = kind == "moving"
    unit = milliseconds_per_picture if moving else milliseconds_per_second
    limit = MOVING_CPU if moving else STILL_CPU
    ratio = median(pairs, 0, both(unit)) / median(pairs, 1, both(unit))
    luma = [round(median(pairs, side, lambda figures: figures["ssim"]["luma"]), 3) for side in (0, 1)]
    return [
        {"what": f"recorder + share, CPU per {'picture' if moving else 'second'}, ours / ffmpeg",
         "value": round(ratio, 4), "target": f"<= {limit}", "met": ratio <= limit},
        {"what": "SSIM of luma to three decimals, ours",
         "value": luma[0], "target": f">= {luma[1]}", "met": luma[0] >= luma[1]},
    ]


def show(kind, pairs):
    print(f"\n{kind} window, {len(pairs)} rounds of {pairs[0][0]['seconds']:.0f} s;", end=" ")
    print("medians, then each round ours/ffmpeg\n")
    print(f"| {'':<42} | {'ours':>9} | {'ffmpeg':>9} | {'ratio':>6} | rounds")
    print(f"|{'-' * 44}|{'-' * 11}|{'-' * 11}|{'-' * 8}|{'-' * 8}")
    for what, read, form in lines(kind):
        ours, theirs = median(pairs, 0, read), median(pairs, 1, read)
        ratio = f"{ours / theirs:6.3f}" if theirs else f"{'-':>6}"
        each = "  ".join(f"{form.format(read(one))}/{form.format(read(other))}" for one, other in pairs)
        print(f"| {what:<42} | {form.format(ours):>9} | {form.format(theirs):>9} | {ratio} | {each}")
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
